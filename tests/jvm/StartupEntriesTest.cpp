// The service's first two entries through a real JVM: creatPrnScanMsgQs
// (report file, key file, queues) and initDevice (the initialisation message).
// What the queue module does with files and queues is a unit test of its own;
// here: the Java strings, the JNI entries' own log lines, and the entries
// called from the service's threads.
#include <dlfcn.h>
#include <sys/msg.h>

#include <gtest/gtest.h>

#include <cstring>
#include <filesystem>
#include <fstream>
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

std::string ReadFile(const std::string &path) {
    std::ifstream in(path, std::ios::binary);
    std::ostringstream all;
    all << in.rdbuf();
    return all.str();
}

bool Exists(const std::string &path) { return std::filesystem::exists(path); }

class StartupEntries : public ::testing::Test {
protected:
    void SetUp() override {
        LoggerHost_StartCapture();
        service_ = jvm::New(jvm::kPrintAndScanService);
        ASSERT_NE(service_, nullptr);
    }
    void TearDown() override { RemoveQueues(root_); }

    void CreateQueues(const char *model) {
        JNIEnv *env = jvm::Env();
        jstring name = jvm::Str(env, model);
        jvm::CallVoid(service_, "creatPrnScanMsgQs", "(Ljava/lang/String;)V", name);
        if (name) env->DeleteLocalRef(name);
    }

    void InitDevice() { jvm::CallVoid(service_, "initDevice", "()V"); }

    TempRoot root_;
    jobject service_ = nullptr;
};

TEST_F(StartupEntries, CreatesReportLineKeyFileAndTwoQueues) {
    CreateQueues("TW-4020 MFP");

    EXPECT_EQ(ReadFile(root_ / kReportFile), "0000-00000000000\tTW-4020 MFP");
    EXPECT_TRUE(Exists(root_ / kQueueKeyFile));
    int printQ = QueueOf(root_, 5), scanQ = QueueOf(root_, 6);
    ASSERT_GE(printQ, 0);
    ASSERT_GE(scanQ, 0);
    EXPECT_NE(printQ, scanQ);
    EXPECT_EQ(LoggerHost_Count("[USBAdp][USB]Prn_MsgQ created with message queue id : " + std::to_string(printQ) +
                               "\n"),
              1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Exit JNI_creatPrnScanMsgQs()\n"), 1);
    EXPECT_FALSE(LoggerHost_Contains("Error"));
}

TEST_F(StartupEntries, MissingKeyFileDirectoryFailsWithItsLogLines) {
    std::filesystem::remove_all(root_ / "/halvard/spool/tmp");

    CreateQueues("TW-4020 MFP");

    EXPECT_EQ(LoggerHost_Count("[USBAdp][USB]Error Cannot open file for ftok key: " + (root_ / kQueueKeyFile) +
                               ", errno: 2\n"),
              1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Error in creating PrnScanMsgQs\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Exit JNI_creatPrnScanMsgQs()\n"), 0);
    EXPECT_FALSE(LoggerHost_Contains("message queue id"));
}

TEST_F(StartupEntries, NullModelNameIsLoggedAndNothingIsThrown) {
    CreateQueues(nullptr);  // CallVoid fails the test on any Java exception

    EXPECT_EQ(LoggerHost_Count("[USBAdp] pubmodelName returns NULL\n"), 1);
    EXPECT_FALSE(Exists(root_ / kReportFile));
    EXPECT_FALSE(Exists(root_ / kQueueKeyFile));
    EXPECT_FALSE(LoggerHost_Contains("JNI_creatPrnScanMsgQs"));
}

TEST_F(StartupEntries, InitDevicePostsOneEightByteDeviceInitOnThePrintQueue) {
    std::ofstream(root_ / kQueueKeyFile).flush();
    RemoveQueues(root_);
    // The Java service makes these calls from its own threads.
    jvm::RunOnThread([&](JNIEnv *) { CreateQueues("TW-4020 MFP"); }, "service-start");
    jvm::RunOnThread([&](JNIEnv *) { InitDevice(); }, "service-init");

    int printQ = QueueOf(root_, 5);
    ASSERT_GE(printQ, 0);
    struct {
        long mtype;
        unsigned char text[8];
    } msg{};
    ASSERT_EQ(msgrcv(printQ, &msg, sizeof msg.text, 0, IPC_NOWAIT), 8);  // the status and four bytes without meaning
    EXPECT_EQ(msg.mtype, 1);
    S32 status;
    std::memcpy(&status, msg.text, sizeof status);
    EXPECT_EQ(status, MFP_DEV_INIT);
    EXPECT_EQ(TakeQueueStatus(printQ), std::nullopt);
    EXPECT_EQ(TakeQueueStatus(QueueOf(root_, 6)), std::nullopt);
    EXPECT_EQ(LoggerHost_Count("[USBAdp]Exit JNI_initDevice()\n"), 1);
}

TEST_F(StartupEntries, InitDeviceWithoutQueuesLogsTheFailedSend) {
    InitDevice();

    EXPECT_EQ(LoggerHost_Count("[USBAdp][USB]Prn_msgQ message can't be send. \n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Error in JNI_initDevice\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp]Exit JNI_initDevice()\n"), 0);
}

// The library that Java loaded must log through the same stand-in the test
// captures from: one Logger_PrintDelay in the process.
TEST_F(StartupEntries, LibraryLoadedByJavaSharesTheTestsLogger) {
    void *lib = dlopen(USBADAPTER_SONAME, RTLD_NOLOAD | RTLD_NOW);
    ASSERT_NE(lib, nullptr) << "the service class did not load libusbadapter.so";
    void *seenByLibrary = dlsym(lib, "Logger_PrintDelay");
    dlclose(lib);
    EXPECT_EQ(seenByLibrary, reinterpret_cast<void *>(&Logger_PrintDelay));
}

}  // namespace
