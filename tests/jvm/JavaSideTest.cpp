// The Java classes the library calls back, driven through JNI the way the
// library drives them: the job handler's copy of reader memory, the recording
// fixtures and their switches, and the reference service's output files.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "Fixtures.h"
#include "JvmHarness.h"
#include "support/TempRoot.h"

namespace {

using ::testing::ElementsAre;

constexpr const char *kHandlerSig = "(Ljava/lang/String;)Lcom/tarnwel/vbk/ca/plugin/usbadapter/print/USBPrintFileStreamHandler;";
// SHA-256 of "abc".
constexpr const char *kAbcSha256 = "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad";

std::string ReadFile(const std::string &path) {
    std::ifstream in(path, std::ios::binary);
    std::ostringstream all;
    all << in.rdbuf();
    return all.str();
}

std::vector<std::string> Lines(const std::string &text) {
    std::vector<std::string> lines;
    std::istringstream in(text);
    for (std::string line; std::getline(in, line);) lines.push_back(line);
    return lines;
}

// What PassData does: a direct buffer over native memory, passed to addBufferToList.
// Returns the Java exception the call threw ("" when none).
std::string PassChunk(jobject handler, void *data, size_t size) {
    JNIEnv *env = jvm::Env();
    jobject buf = env->NewDirectByteBuffer(data, static_cast<jlong>(size));
    jclass cls = env->GetObjectClass(handler);
    jmethodID add = env->GetMethodID(cls, "addBufferToList", "(Ljava/nio/ByteBuffer;)V");
    env->DeleteLocalRef(cls);
    EXPECT_NE(add, nullptr);
    if (add) env->CallVoidMethod(handler, add, buf);
    std::string ex = jvm::TakeException(env);
    env->DeleteLocalRef(buf);
    return ex;
}

// What NotifyEndOfData does.
void EndOfData(jobject handler) {
    JNIEnv *env = jvm::Env();
    jclass cls = env->GetObjectClass(handler);
    jfieldID status = env->GetFieldID(cls, "fileParsingStatus", "I");
    env->DeleteLocalRef(cls);
    ASSERT_NE(status, nullptr);
    env->SetIntField(handler, status, 1);
}

jobject NewJob(jobject daemon, const char *name) {
    JNIEnv *env = jvm::Env();
    jstring s = jvm::Str(env, name);
    jobject handler = jvm::CallObject(daemon, "processPrintCommand", kHandlerSig, s);
    env->DeleteLocalRef(s);
    return handler;
}

jobject NewAppStream(jobject daemon, const char *type) {
    JNIEnv *env = jvm::Env();
    jstring s = jvm::Str(env, type);
    jobject stream = jvm::CallObject(daemon, "processData", "(Ljava/lang/String;)Ljava/io/OutputStream;", s);
    env->DeleteLocalRef(s);
    return stream;
}

void WriteApp(jobject stream, const std::string &bytes) {
    JNIEnv *env = jvm::Env();
    jbyteArray a = jvm::ByteArray(env, bytes);
    jvm::CallVoid(stream, "write", "([B)V", a);
    env->DeleteLocalRef(a);
}

bool HasMethod(jobject obj, const char *name, const char *sig) {
    JNIEnv *env = jvm::Env();
    jclass cls = env->GetObjectClass(obj);
    jmethodID mid = env->GetMethodID(cls, name, sig);
    env->DeleteLocalRef(cls);
    jvm::TakeException(env);  // NoSuchMethodError
    return mid != nullptr;
}

std::vector<int> IntArray(jobject arr) {
    JNIEnv *env = jvm::Env();
    auto a = static_cast<jintArray>(arr);
    std::vector<jint> raw(static_cast<size_t>(env->GetArrayLength(a)));
    env->GetIntArrayRegion(a, 0, static_cast<jsize>(raw.size()), raw.data());
    return {raw.begin(), raw.end()};
}

class JavaSide : public ::testing::Test {
protected:
    void SetUp() override {
        fixtures::Reset();
        daemon_ = jvm::New(fixtures::kRecordingDaemon);
        ASSERT_NE(daemon_, nullptr);
    }
    jobject daemon_ = nullptr;
};

TEST_F(JavaSide, HandlerCopiesEachChunkBeforeTheReaderReusesItsMemory) {
    jobject handler = NewJob(daemon_, "/halvard/spool/tmp/usbPrint_1.prn");
    ASSERT_NE(handler, nullptr);
    char reader[8] = "ABCDEFG";
    EXPECT_EQ(PassChunk(handler, reader, 7), "");
    std::memcpy(reader, "xyzxyzx", 7);  // the reader's next read lands in the same memory
    EXPECT_EQ(PassChunk(handler, reader, 3), "");
    EXPECT_EQ(PassChunk(handler, reader, 0), "");  // a zero-length chunk is still a call
    EXPECT_FALSE(fixtures::JobEnded(0));
    EndOfData(handler);

    EXPECT_EQ(fixtures::JobCount(), 1);
    EXPECT_EQ(fixtures::JobFileName(0), "/halvard/spool/tmp/usbPrint_1.prn");
    EXPECT_EQ(fixtures::JobBytes(0), "ABCDEFGxyz");
    EXPECT_THAT(fixtures::JobChunkSizes(0), ElementsAre(7, 3, 0));
    EXPECT_EQ(fixtures::JobByteCount(0), 10);
    EXPECT_TRUE(fixtures::JobEnded(0));
    EXPECT_THAT(fixtures::EventLines(),
                ElementsAre("processPrintCommand:/halvard/spool/tmp/usbPrint_1.prn", "addBufferToList:0:7",
                            "addBufferToList:0:3", "addBufferToList:0:0", "endOfData:0"));
    jvm::Env()->DeleteLocalRef(handler);
}

TEST_F(JavaSide, EndOfDataIsOrderedBeforeTheNextCallBack) {
    jobject first = NewJob(daemon_, "a");
    char abc[] = "abc";
    PassChunk(first, abc, 3);
    EndOfData(first);
    jobject second = NewJob(daemon_, "b");

    EXPECT_THAT(fixtures::EventLines(),
                ElementsAre("processPrintCommand:a", "addBufferToList:0:3", "endOfData:0", "processPrintCommand:b"));
    EXPECT_EQ(fixtures::JobSha256(0), kAbcSha256);
    EXPECT_EQ(fixtures::Sha256("abc"), kAbcSha256);
    EXPECT_FALSE(fixtures::JobEnded(1));
    EXPECT_TRUE(fixtures::AwaitJobEnded(0, 0));
    EXPECT_FALSE(fixtures::AwaitJobEnded(1, 20));
    JNIEnv *env = jvm::Env();
    env->DeleteLocalRef(first);
    env->DeleteLocalRef(second);
}

TEST_F(JavaSide, ThrowSwitchFiresOnceAndLosesOnlyThatChunk) {
    jobject handler = NewJob(daemon_, "job");
    fixtures::ThrowOn("addBufferToList", 1);
    char data[] = "0123456789";
    EXPECT_EQ(PassChunk(handler, data, 4), "java.lang.IllegalStateException: injected failure in addBufferToList");
    EXPECT_EQ(PassChunk(handler, data + 4, 6), "");

    EXPECT_EQ(fixtures::JobBytes(0), "456789");
    EXPECT_EQ(fixtures::Calls("addBufferToList"), 2);
    EXPECT_THAT(fixtures::EventLines(),
                ElementsAre("processPrintCommand:job", "addBufferToList:0:4!throw", "addBufferToList:0:6"));
    jvm::Env()->DeleteLocalRef(handler);
}

TEST_F(JavaSide, NullSwitchMakesTheDaemonAnswerNull) {
    fixtures::ReturnNull("processPrintCommand");
    fixtures::ReturnNull("processData");
    EXPECT_EQ(NewJob(daemon_, "job"), nullptr);
    EXPECT_EQ(NewAppStream(daemon_, "faxd"), nullptr);
    fixtures::ReturnNull("processPrintCommand", false);
    jobject handler = NewJob(daemon_, "job2");
    EXPECT_NE(handler, nullptr);

    EXPECT_EQ(fixtures::JobCount(), 1);
    EXPECT_EQ(fixtures::AppCount(), 0);
    EXPECT_THAT(fixtures::EventLines(),
                ElementsAre("processPrintCommand:job!null", "processData:faxd!null", "processPrintCommand:job2"));
    jvm::Env()->DeleteLocalRef(handler);
}

TEST_F(JavaSide, AppStreamKeepsEveryWriteAndTheClose) {
    jobject stream = NewAppStream(daemon_, "networkrds");
    ASSERT_NE(stream, nullptr);
    WriteApp(stream, std::string("\x1b\x9a\x00\x01", 4));
    WriteApp(stream, "payload");
    EXPECT_FALSE(fixtures::AppClosed(0));
    jvm::CallVoid(stream, "close", "()V");

    EXPECT_EQ(fixtures::AppCount(), 1);
    EXPECT_EQ(fixtures::AppType(0), "networkrds");
    EXPECT_EQ(fixtures::AppBytes(0), std::string("\x1b\x9a\x00\x01payload", 11));
    EXPECT_EQ(fixtures::AppWriteCount(0), 2);
    EXPECT_TRUE(fixtures::AppClosed(0));
    EXPECT_THAT(fixtures::EventLines(), ElementsAre("processData:networkrds", "write:0:4", "write:0:7", "close:0"));
    jvm::Env()->DeleteLocalRef(stream);
}

TEST_F(JavaSide, StatusAndInterpretersFollowTheirSwitches) {
    EXPECT_EQ(jvm::CallInt(daemon_, "getPrinterStatus", "()I"), 1);
    jobject ids = jvm::CallObject(daemon_, "getInstalledInterpreter", "()[I");
    ASSERT_NE(ids, nullptr);
    EXPECT_EQ(IntArray(ids), (std::vector<int>{1, 2, 3, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0}));
    jvm::Env()->DeleteLocalRef(ids);

    fixtures::SetPrinterStatus(2);
    fixtures::SetInterpreters({7, 8});
    EXPECT_EQ(jvm::CallInt(daemon_, "getPrinterStatus", "()I"), 2);
    ids = jvm::CallObject(daemon_, "getInstalledInterpreter", "()[I");
    EXPECT_EQ(IntArray(ids), (std::vector<int>{7, 8}));
    jvm::Env()->DeleteLocalRef(ids);
    EXPECT_EQ(fixtures::Calls("getPrinterStatus"), 2);
    EXPECT_EQ(fixtures::Calls("getInstalledInterpreter"), 2);
}

TEST_F(JavaSide, StringRepliesAndTheMaaObject) {
    JNIEnv *env = jvm::Env();
    jstring cmd = jvm::Str(env, "EngineFeedTest(1,2)");
    auto reply = static_cast<jstring>(
        jvm::CallObject(daemon_, "maaEngMaaStrNormalTest", "(Ljava/lang/String;)Ljava/lang/String;", cmd));
    EXPECT_EQ(jvm::Text(env, reply), "NG: no engine");
    env->DeleteLocalRef(reply);
    fixtures::SetReply("maaEngMaaStrNormalTest", "line1\r\nline2");
    reply = static_cast<jstring>(
        jvm::CallObject(daemon_, "maaEngMaaStrNormalTest", "(Ljava/lang/String;)Ljava/lang/String;", cmd));
    EXPECT_EQ(jvm::Text(env, reply), "line1\r\nline2");
    env->DeleteLocalRef(reply);
    env->DeleteLocalRef(cmd);

    jobject maa = jvm::New(fixtures::kRecordingMaa);
    ASSERT_NE(maa, nullptr);
    jclass stringClass = jvm::Class("java/lang/String");
    jobjectArray args = env->NewObjectArray(2, stringClass, nullptr);
    jstring a0 = jvm::Str(env, "1"), a1 = jvm::Str(env, "abc");
    env->SetObjectArrayElement(args, 0, a0);
    env->SetObjectArrayElement(args, 1, a1);
    const char *sig = "(Ljava/lang/String;[Ljava/lang/String;)Ljava/lang/String;";
    jstring known = jvm::Str(env, "SetUIEnable"), unknown = jvm::Str(env, "FanTest");
    reply = static_cast<jstring>(jvm::CallObject(maa, "runUsbFunctionCall", sig, known, args));
    EXPECT_EQ(jvm::Text(env, reply), "SetUIEnable = OK");
    env->DeleteLocalRef(reply);
    EXPECT_EQ(jvm::CallObject(maa, "runUsbFunctionCall", sig, unknown, args), nullptr);
    fixtures::SetReply("runUsbFunctionCall", "spider:ABC");
    reply = static_cast<jstring>(jvm::CallObject(maa, "runUsbFunctionCall", sig, unknown, args));
    EXPECT_EQ(jvm::Text(env, reply), "spider:ABC");
    for (jobject o : {static_cast<jobject>(reply), static_cast<jobject>(known), static_cast<jobject>(unknown),
                      static_cast<jobject>(a0), static_cast<jobject>(a1), static_cast<jobject>(args)})
        env->DeleteLocalRef(o);

    EXPECT_THAT(fixtures::EventLines(),
                ElementsAre("maaEngMaaStrNormalTest:EngineFeedTest(1,2)", "maaEngMaaStrNormalTest:EngineFeedTest(1,2)",
                            "runUsbFunctionCall:SetUIEnable:1,abc", "runUsbFunctionCall:FanTest:1,abc",
                            "runUsbFunctionCall:FanTest:1,abc"));
}

// A method the library looks up must be missing on the runtime class itself.
TEST_F(JavaSide, DaemonVariantsLackTheirMethodsOnTheRuntimeClass) {
    jobject withoutCommand = jvm::New(fixtures::kDaemonWithoutPrintCommand);
    jobject bare = jvm::New(fixtures::kDaemonWithoutUpcalls);
    ASSERT_NE(withoutCommand, nullptr);
    ASSERT_NE(bare, nullptr);
    const std::vector<std::pair<const char *, const char *>> upcalls = {
        {"processData", "(Ljava/lang/String;)Ljava/io/OutputStream;"},
        {"getPrinterStatus", "()I"},
        {"getInstalledInterpreter", "()[I"},
        {"getCapXmlSize", "()I"},
        {"getCapXmlData", "()Ljava/lang/String;"},
        {"getPrintImage", "()[B"},
        {"getMcSerial", "()Ljava/lang/String;"},
        {"checkMcSerialInConf", "()I"},
        {"maaUSBSetSerialNumber", "(Ljava/lang/String;)Ljava/lang/String;"},
        {"maaUSBSetSnNoPowerOff", "(Ljava/lang/String;)Ljava/lang/String;"},
        {"maaEngMaaStrNormalTest", "(Ljava/lang/String;)Ljava/lang/String;"},
        {"maaEngMaaImageStabilization", "(Ljava/lang/String;)Ljava/lang/String;"},
        {"maaEngMaaOpcodeFTCATest", "(Ljava/lang/String;)Ljava/lang/String;"},
        {"maaCheckCPUTemperatureStart", "()Ljava/lang/String;"},
        {"maaCheckCPUTemperatureEnd", "()Ljava/lang/String;"},
    };
    EXPECT_TRUE(HasMethod(daemon_, "processPrintCommand", kHandlerSig));
    EXPECT_FALSE(HasMethod(withoutCommand, "processPrintCommand", kHandlerSig));
    EXPECT_FALSE(HasMethod(bare, "processPrintCommand", kHandlerSig));
    for (const auto &[name, sig] : upcalls) {
        EXPECT_TRUE(HasMethod(daemon_, name, sig)) << name;
        EXPECT_TRUE(HasMethod(withoutCommand, name, sig)) << name;
        EXPECT_FALSE(HasMethod(bare, name, sig)) << name;
    }
    // All three can enter the reader.
    JNIEnv *env = jvm::Env();
    for (jobject d : {daemon_, withoutCommand, bare})
        EXPECT_TRUE(env->IsInstanceOf(d, jvm::Class(jvm::kPrintAndScanService)));
    EXPECT_TRUE(env->IsInstanceOf(daemon_, jvm::Class(jvm::kPrintDaemon)));
}

class ReferenceService : public ::testing::Test {
protected:
    void SetUp() override {
        JNIEnv *env = jvm::Env();
        jstring key = jvm::Str(env, "usbadapter.outdir"), value = jvm::Str(env, out_.path().c_str());
        jobject old = jvm::CallStaticObject("java/lang/System", "setProperty",
                                            "(Ljava/lang/String;Ljava/lang/String;)Ljava/lang/String;", key, value);
        for (jobject o : {old, static_cast<jobject>(key), static_cast<jobject>(value)})
            if (o) env->DeleteLocalRef(o);
        service_ = jvm::New(jvm::kReferenceService);
        ASSERT_NE(service_, nullptr);
    }

    std::string Journal() const { return ReadFile(out_.path() + "/journal.jsonl"); }

    // Waits (real time) until the journal holds `lines` lines.
    std::vector<std::string> AwaitJournal(size_t lines) const {
        auto end = std::chrono::steady_clock::now() + std::chrono::seconds(5);
        std::vector<std::string> now = Lines(Journal());
        while (now.size() < lines && std::chrono::steady_clock::now() < end) {
            std::this_thread::sleep_for(std::chrono::milliseconds(2));
            now = Lines(Journal());
        }
        return now;
    }

    TempRoot out_;
    jobject service_ = nullptr;
};

TEST_F(ReferenceService, WritesEachJobToItsFileAndJournalsItsEnd) {
    jobject job = NewJob(service_, "/halvard/spool/tmp/usbPrint_\"1\".prn");
    ASSERT_NE(job, nullptr);
    char reader[4] = "abc";
    EXPECT_EQ(PassChunk(job, reader, 1), "");
    reader[0] = 'Z';  // reused reader memory must not reach the file
    EXPECT_EQ(PassChunk(job, reader + 1, 2), "");
    EXPECT_THAT(Lines(Journal()),
                ElementsAre(R"({"event":"job-start","job":1,"name":"/halvard/spool/tmp/usbPrint_\"1\".prn"})"));
    EndOfData(job);

    // No call-back follows the end of a job: the service's own poll finds it.
    std::vector<std::string> lines = AwaitJournal(2);
    ASSERT_EQ(lines.size(), 2u);
    EXPECT_EQ(lines[1], std::string(R"({"event":"job-end","job":1,"bytes":3,"sha256":")") + kAbcSha256 +
                            R"(","file":"job-001.prn"})");
    EXPECT_EQ(ReadFile(out_.path() + "/job-001.prn"), "abc");

    jobject second = NewJob(service_, "next");
    EndOfData(second);
    lines = AwaitJournal(4);
    ASSERT_EQ(lines.size(), 4u);
    EXPECT_EQ(lines[2], R"({"event":"job-start","job":2,"name":"next"})");
    EXPECT_EQ(lines[3], R"({"event":"job-end","job":2,"bytes":0,"sha256":")"
                        R"(e3b0c44298fc1c149afbf4c8996fb92427ae41e4649b934ca495991b7852b855","file":"job-002.prn"})");
    EXPECT_EQ(ReadFile(out_.path() + "/job-002.prn"), "");
    jvm::Env()->DeleteLocalRef(job);
    jvm::Env()->DeleteLocalRef(second);
}

TEST_F(ReferenceService, WritesEachApplicationTransferToItsFile) {
    jobject stream = NewAppStream(service_, "scan2pc");
    ASSERT_NE(stream, nullptr);
    WriteApp(stream, "ab");
    WriteApp(stream, "c");
    jvm::CallVoid(stream, "close", "()V");
    jobject other = NewAppStream(service_, "../faxd");  // a type never makes a path
    jvm::CallVoid(other, "close", "()V");

    EXPECT_EQ(ReadFile(out_.path() + "/app-001-scan2pc.bin"), "abc");
    EXPECT_TRUE(std::filesystem::exists(out_.path() + "/app-002-___faxd.bin"));
    std::vector<std::string> lines = Lines(Journal());
    ASSERT_EQ(lines.size(), 4u);
    EXPECT_EQ(lines[0], R"({"event":"app-start","app":1,"type":"scan2pc"})");
    EXPECT_EQ(lines[1], std::string(R"({"event":"app-end","app":1,"type":"scan2pc","bytes":3,"sha256":")") +
                            kAbcSha256 + R"(","file":"app-001-scan2pc.bin"})");
    EXPECT_EQ(lines[2], R"({"event":"app-start","app":2,"type":"../faxd"})");
    jvm::Env()->DeleteLocalRef(stream);
    jvm::Env()->DeleteLocalRef(other);
}

TEST_F(ReferenceService, JournalsQueriesAndSerialNumbers) {
    EXPECT_EQ(jvm::CallInt(service_, "getPrinterStatus", "()I"), 1);
    JNIEnv *env = jvm::Env();
    jstring serial = jvm::Str(env, "ABC1234567");
    auto reply = static_cast<jstring>(
        jvm::CallObject(service_, "maaUSBSetSerialNumber", "(Ljava/lang/String;)Ljava/lang/String;", serial));
    EXPECT_EQ(jvm::Text(env, reply), "ABC1234567");
    env->DeleteLocalRef(reply);
    reply = static_cast<jstring>(jvm::CallObject(service_, "getMcSerial", "()Ljava/lang/String;"));
    EXPECT_EQ(jvm::Text(env, reply), "ABC1234567");
    env->DeleteLocalRef(reply);
    env->DeleteLocalRef(serial);

    EXPECT_THAT(Lines(Journal()),
                ElementsAre(R"({"event":"call","method":"getPrinterStatus","reply":"1"})",
                            R"({"event":"call","method":"maaUSBSetSerialNumber","arg":"ABC1234567","reply":"ABC1234567"})",
                            R"({"event":"call","method":"getMcSerial","reply":"ABC1234567"})"));
}

}  // namespace
