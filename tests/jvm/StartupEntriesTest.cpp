// The service's first two entries through a real JVM, called from the service's
// own threads: the Java strings and the entries' own log lines. What the queue
// module does with files and queues is a unit test of its own.
#include <sys/msg.h>

#include <gtest/gtest.h>

#include <filesystem>
#include <string>
#include <vector>

#include "JvmHarness.h"
#include "LoggerHost.h"
#include "support/MsgQueue.h"
#include "support/TempRoot.h"
#include "usbadapter/mfpbridge.h"

namespace {

class StartupEntries : public ::testing::Test {
protected:
    void SetUp() override {
        LoggerHost_StartCapture();
        service_ = jvm::New(jvm::kPrintAndScanService);
        ASSERT_NE(service_, nullptr);
    }
    void TearDown() override { RemoveQueues(root_); }

    // Both entries, each on a thread of its own as the service calls them.
    void Start(const char *model) {
        jvm::RunOnThread(
            [&](JNIEnv *) {  // CallVoid fails the test on any Java exception
                jvm::CallVoid(service_, "creatPrnScanMsgQs", "(Ljava/lang/String;)V", jvm::Str(model).get());
            },
            "service-start");
        jvm::RunOnThread([&](JNIEnv *) { jvm::CallVoid(service_, "initDevice", "()V"); }, "service-init");
    }

    TempRoot root_;
    jobject service_ = nullptr;
};

// The queues made and the init message posted, or each failure logged by the
// entries themselves and nothing thrown.
TEST_F(StartupEntries, CreateQueuesThenPostTheInitMessageOrLogWhatFailed) {
    const struct {
        const char *model;
        const char *removed;              // under the root, before the calls
        std::vector<const char *> lines;  // logged once each
    } cases[] = {
        {nullptr, nullptr, {"[USBAdp] pubmodelName returns NULL\n"}},
        {"TW-4020 MFP", nullptr, {"[USBAdp] Exit JNI_creatPrnScanMsgQs()\n", "[USBAdp]Exit JNI_initDevice()\n"}},
        {"TW-4020 MFP", "/halvard/spool/tmp", {"[USBAdp] Error in creating PrnScanMsgQs\n",
         "[USBAdp][USB]Prn_msgQ message can't be send. \n", "[USBAdp] Error in JNI_initDevice\n"}},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.lines.front());
        LoggerHost_StartCapture();
        RemoveQueues(root_);
        if (c.removed) std::filesystem::remove_all(root_ / c.removed);
        Start(c.model);
        for (const char *line : c.lines) EXPECT_EQ(LoggerHost_Count(line), 1) << line;
        const bool made = c.model && !c.removed;
        EXPECT_EQ(LoggerHost_Contains("Exit JNI_"), made);
        EXPECT_EQ(std::filesystem::exists(root_ / kQueueKeyFile), made);
        if (!made) continue;
        EXPECT_FALSE(LoggerHost_Contains("Error"));
        const int printQ = QueueOf(root_, 5);
        EXPECT_EQ(LoggerHost_Count("[USBAdp][USB]Prn_MsgQ created with message queue id : " + std::to_string(printQ) +
                                   "\n"),
                  1);
        EXPECT_EQ(TakeQueueStatus(printQ), MFP_DEV_INIT);
        EXPECT_EQ(TakeQueueStatus(QueueOf(root_, 6)), std::nullopt);
    }
}

}  // namespace
