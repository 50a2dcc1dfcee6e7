// The service's first two entries through a real JVM: creatPrnScanMsgQs
// (report file, key file, queues) and initDevice (the initialisation message).
#include <dlfcn.h>
#include <sys/msg.h>
#include <sys/stat.h>

#include <gtest/gtest.h>

#include <cstring>
#include <filesystem>
#include <fstream>
#include <optional>
#include <regex>
#include <sstream>
#include <string>

#include "JvmHarness.h"
#include "LoggerHost.h"
#include "platform/Logger.h"
#include "support/MsgQueue.h"
#include "support/TempRoot.h"
#include "usbadapter/mfpbridge.h"

namespace {

constexpr const char *kReportFile = "/halvard/sys/statusinfo/usb_version.txt";
constexpr const char *kKeyFile = "/halvard/spool/tmp/testfile";

std::string ReadFile(const std::string &path) {
    std::ifstream in(path, std::ios::binary);
    std::ostringstream all;
    all << in.rdbuf();
    return all.str();
}

bool Exists(const std::string &path) { return std::filesystem::exists(path); }

// The queue the library made for project id `proj` on the root's key file, or -1.
int QueueOf(const TempRoot &root, int proj) {
    key_t key = ftok((root / kKeyFile).c_str(), proj);
    return key == -1 ? -1 : msgget(key, 0);
}

// Removes the root's two queues when the test ends, however it ends.
class QueuesRemoved {
public:
    explicit QueuesRemoved(const TempRoot &root) : root_(root) {}
    ~QueuesRemoved() {
        RemoveQueue(QueueOf(root_, 5));
        RemoveQueue(QueueOf(root_, 6));
    }

private:
    const TempRoot &root_;
};

// Makes the key file ahead of the library and drops queues that an earlier,
// crashed run left on the same keys (a reused inode gives the same key).
void FreshKeyFile(const TempRoot &root) {
    std::ofstream(root / kKeyFile).flush();
    RemoveQueue(QueueOf(root, 5));
    RemoveQueue(QueueOf(root, 6));
}

struct QueueState {
    unsigned long messages;
    unsigned long bytes;
};

QueueState StateOf(int id) {
    msqid_ds ds{};
    EXPECT_EQ(msgctl(id, IPC_STAT, &ds), 0);
    return {static_cast<unsigned long>(ds.msg_qnum), static_cast<unsigned long>(ds.__msg_cbytes)};
}

class StartupEntries : public ::testing::Test {
protected:
    void SetUp() override {
        LoggerHost_StartCapture();
        service_ = jvm::New(jvm::kPrintAndScanService);
        ASSERT_NE(service_, nullptr);
    }

    void CreateQueues(const char *model) {
        JNIEnv *env = jvm::Env();
        jstring name = jvm::Str(env, model);
        jvm::CallVoid(service_, "creatPrnScanMsgQs", "(Ljava/lang/String;)V", name);
        if (name) env->DeleteLocalRef(name);
    }

    void InitDevice() { jvm::CallVoid(service_, "initDevice", "()V"); }

    TempRoot root_;
    QueuesRemoved queues_{root_};
    jobject service_ = nullptr;
};

TEST_F(StartupEntries, CreatesReportLineKeyFileAndTwoQueues) {
    CreateQueues("TW-4020 MFP");

    EXPECT_EQ(ReadFile(root_ / kReportFile), "0000-00000000000\tTW-4020 MFP");
    EXPECT_TRUE(Exists(root_ / kKeyFile));
    int printQ = QueueOf(root_, 5), scanQ = QueueOf(root_, 6);
    ASSERT_GE(printQ, 0);
    ASSERT_GE(scanQ, 0);
    EXPECT_NE(printQ, scanQ);
    EXPECT_EQ(LoggerHost_Count("[USBAdp][USB]Prn_MsgQ created with message queue id : " + std::to_string(printQ) +
                               "\n"),
              1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp][USB]Scan_MsgQ created with message queue id : " + std::to_string(scanQ) +
                               "\n"),
              1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Exit JNI_creatPrnScanMsgQs()\n"), 1);
    EXPECT_FALSE(LoggerHost_Contains("Error"));
    // Fresh queues hold nothing.
    EXPECT_EQ(StateOf(printQ).messages, 0u);
    EXPECT_EQ(StateOf(scanQ).messages, 0u);
}

TEST_F(StartupEntries, LeavesAnExistingReportFileAsItIs) {
    const std::string earlier = "1234-56789012345\tEarlier Model\n";
    std::ofstream(root_ / kReportFile) << earlier;

    CreateQueues("TW-4020 MFP");

    EXPECT_EQ(ReadFile(root_ / kReportFile), earlier);
    EXPECT_GE(QueueOf(root_, 5), 0);
    EXPECT_GE(QueueOf(root_, 6), 0);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Exit JNI_creatPrnScanMsgQs()\n"), 1);
}

TEST_F(StartupEntries, ReusesQueuesOfAnEarlierRunWithWhatTheyHold) {
    FreshKeyFile(root_);
    key_t key1 = ftok((root_ / kKeyFile).c_str(), 5);
    int earlierQ = msgget(key1, IPC_CREAT | 0666);
    ASSERT_GE(earlierQ, 0);
    TMessageBuf left{};
    left.mtype = 1;
    left.status = MFP_DEV_CONFIGURED;
    ASSERT_EQ(msgsnd(earlierQ, &left, MSGBUF_TEXT_SIZE, IPC_NOWAIT), 0);

    CreateQueues("TW-4020 MFP");
    CreateQueues("TW-4020 MFP");  // a second start reuses them again

    EXPECT_EQ(QueueOf(root_, 5), earlierQ);
    EXPECT_EQ(LoggerHost_Count("[USBAdp][USB]Prn_MsgQ created with message queue id : " + std::to_string(earlierQ) +
                               "\n"),
              2);
    EXPECT_EQ(TakeQueueStatus(earlierQ), std::optional<int>(MFP_DEV_CONFIGURED));
    EXPECT_EQ(TakeQueueStatus(earlierQ), std::nullopt);
}

TEST_F(StartupEntries, MissingKeyFileDirectoryFailsWithItsLogLines) {
    std::filesystem::remove_all(root_ / "/halvard/spool/tmp");

    CreateQueues("TW-4020 MFP");

    EXPECT_EQ(LoggerHost_Count("[USBAdp][USB]Error Cannot open file for ftok key: " + (root_ / kKeyFile) +
                               ", errno: 2\n"),
              1);
    EXPECT_EQ(LoggerHost_Count("No tmp file /halvard/spool, errno: 2\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Error in creating PrnScanMsgQs\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Exit JNI_creatPrnScanMsgQs()\n"), 0);
    EXPECT_FALSE(LoggerHost_Contains("message queue id"));
    // The report line comes first and is written all the same.
    EXPECT_EQ(ReadFile(root_ / kReportFile), "0000-00000000000\tTW-4020 MFP");
}

TEST_F(StartupEntries, ReportFileThatCannotBeCreatedStopsBeforeTheQueues) {
    std::filesystem::remove_all(root_ / "/halvard/sys/statusinfo");

    CreateQueues("TW-4020 MFP");

    EXPECT_EQ(LoggerHost_Count("[USBAdp][USB]Error in opening file/File doesn't exist.\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Error in creating PrnScanMsgQs\n"), 1);
    EXPECT_FALSE(Exists(root_ / kKeyFile));
    EXPECT_FALSE(LoggerHost_Contains("Creating message queues"));
}

TEST_F(StartupEntries, NullModelNameIsLoggedAndNothingIsThrown) {
    CreateQueues(nullptr);  // CallVoid fails the test on any Java exception

    EXPECT_EQ(LoggerHost_Count("[USBAdp] pubmodelName returns NULL\n"), 1);
    EXPECT_FALSE(Exists(root_ / kReportFile));
    EXPECT_FALSE(Exists(root_ / kKeyFile));
    EXPECT_FALSE(LoggerHost_Contains("JNI_creatPrnScanMsgQs"));
}

TEST_F(StartupEntries, OverlongModelNameIsCutToTheReportLine) {
    const std::string model(80, 'M');

    CreateQueues(model.c_str());

    // 60-byte line buffer with its terminator: the placeholder and 42 characters.
    EXPECT_EQ(ReadFile(root_ / kReportFile), "0000-00000000000\t" + model.substr(0, 42));
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Exit JNI_creatPrnScanMsgQs()\n"), 1);
}

TEST_F(StartupEntries, InitDevicePostsOneEightByteDeviceInitOnThePrintQueue) {
    FreshKeyFile(root_);
    // The Java service makes these calls from its own threads.
    jvm::RunOnThread([&](JNIEnv *) { CreateQueues("TW-4020 MFP"); }, "service-start");
    jvm::RunOnThread([&](JNIEnv *) { InitDevice(); }, "service-init");

    int printQ = QueueOf(root_, 5), scanQ = QueueOf(root_, 6);
    ASSERT_GE(printQ, 0);
    QueueState state = StateOf(printQ);
    EXPECT_EQ(state.messages, 1u);
    EXPECT_EQ(state.bytes, 8u);  // the status and four bytes without meaning
    EXPECT_EQ(StateOf(scanQ).messages, 0u);

    struct {
        long mtype;
        unsigned char text[8];
    } msg{};
    ASSERT_EQ(msgrcv(printQ, &msg, sizeof msg.text, 0, IPC_NOWAIT), 8);
    EXPECT_EQ(msg.mtype, 1);
    S32 status;
    std::memcpy(&status, msg.text, sizeof status);
    EXPECT_EQ(status, MFP_DEV_INIT);

    EXPECT_EQ(LoggerHost_Count("[USBAdp][USB]Message sent for initialization.. \n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp]Exit JNI_initDevice()\n"), 1);
}

TEST_F(StartupEntries, InitDeviceWithoutQueuesLogsTheFailedSend) {
    InitDevice();

    std::regex values(R"(\[USBAdp\]\[USB\]-?\d+, 1, 0\n)");
    int matching = 0;
    for (const auto &line : LoggerHost_Captured()) matching += std::regex_match(line.text, values);
    EXPECT_EQ(matching, 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp][USB]Prn_msgQ message can't be send. \n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Error in JNI_initDevice\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp]Exit JNI_initDevice()\n"), 0);
}

// The library that Java loaded must log through the same stand-in the test
// captures from: one Logger_PrintDelay in the process.
TEST_F(StartupEntries, LibraryLoadedByJavaSharesTheTestsLogger) {
    void *lib = dlopen("libusbadapter.so", RTLD_NOW | RTLD_NOLOAD);
    ASSERT_NE(lib, nullptr) << "the service class did not load libusbadapter.so";
    void *seenByLibrary = dlsym(lib, "Logger_PrintDelay");
    dlclose(lib);
    EXPECT_EQ(seenByLibrary, reinterpret_cast<void *>(&Logger_PrintDelay));
}

}  // namespace
