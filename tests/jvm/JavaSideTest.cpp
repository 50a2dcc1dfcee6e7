// The recording fixtures driven through JNI the way the library drives them:
// what their journal says must be what happened, or the tests built on it
// could pass on a wrong library.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <vector>

#include "Fixtures.h"
#include "JvmHarness.h"

namespace {

using ::testing::ElementsAre;

// SHA-256 of "abc".
constexpr const char *kAbcSha256 = "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad";

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

class JavaSide : public ::testing::Test {
protected:
    void SetUp() override {
        fixtures::Reset();
        daemon_ = jvm::New(fixtures::kRecordingDaemon);
        ASSERT_NE(daemon_, nullptr);
    }
    void TearDown() override {
        for (jobject h : handlers_)
            if (h) jvm::Env()->DeleteLocalRef(h);
    }

    // What RegisterJob does; the handler is released at the end of the test.
    jobject NewJob(const char *name) {
        JNIEnv *env = jvm::Env();
        jstring s = jvm::Str(env, name);
        jobject handler = jvm::CallObject(daemon_, "processPrintCommand",
                                          "(Ljava/lang/String;)Lcom/tarnwel/vbk/ca/plugin/usbadapter/print/"
                                          "USBPrintFileStreamHandler;",
                                          s);
        env->DeleteLocalRef(s);
        handlers_.push_back(handler);
        return handler;
    }

    jobject daemon_ = nullptr;
    std::vector<jobject> handlers_;
};

TEST_F(JavaSide, HandlerCopiesEachChunkBeforeTheReaderReusesItsMemory) {
    jobject handler = NewJob("/halvard/spool/tmp/usbPrint_1.prn");
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
}

TEST_F(JavaSide, EndOfDataIsOrderedBeforeTheNextCallBack) {
    jobject first = NewJob("a");
    char abc[] = "abc";
    PassChunk(first, abc, 3);
    EndOfData(first);
    NewJob("b");

    EXPECT_THAT(fixtures::EventLines(),
                ElementsAre("processPrintCommand:a", "addBufferToList:0:3", "endOfData:0", "processPrintCommand:b"));
    EXPECT_EQ(fixtures::JobSha256(0), kAbcSha256);
    EXPECT_EQ(fixtures::Sha256("abc"), kAbcSha256);
    EXPECT_TRUE(fixtures::AwaitJobEnded(0, 0));
    EXPECT_FALSE(fixtures::AwaitJobEnded(1, 20));
}

TEST_F(JavaSide, SwitchesFireAsToldAndAreJournaled) {
    // A throw loses only the chunk it fired on, once.
    jobject handler = NewJob("job");
    fixtures::ThrowOn("addBufferToList", 1);
    char data[] = "0123456789";
    EXPECT_EQ(PassChunk(handler, data, 4), "java.lang.IllegalStateException: injected failure in addBufferToList");
    EXPECT_EQ(PassChunk(handler, data + 4, 6), "");
    EXPECT_EQ(fixtures::JobBytes(0), "456789");
    EXPECT_EQ(fixtures::Calls("addBufferToList"), 2);

    // A null answer opens no job while it is on.
    fixtures::ReturnNull("processPrintCommand");
    EXPECT_EQ(NewJob("refused"), nullptr);
    fixtures::ReturnNull("processPrintCommand", false);
    EXPECT_NE(NewJob("accepted"), nullptr);
    EXPECT_EQ(fixtures::JobCount(), 2);
    EXPECT_THAT(fixtures::EventLines(),
                ElementsAre("processPrintCommand:job", "addBufferToList:0:4!throw", "addBufferToList:0:6",
                            "processPrintCommand:refused!null", "processPrintCommand:accepted"));
}

}  // namespace
