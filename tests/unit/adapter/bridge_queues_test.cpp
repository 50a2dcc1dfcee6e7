// Start-up of the bridge: report file, key file and the two notification queues,
// and the initialisation message.
#include <fcntl.h>
#include <sys/ipc.h>
#include <sys/msg.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include <gtest/gtest.h>

#include "LoggerHost.h"
#include "adapter/USB.h"
#include "support/Bytes.h"
#include "support/MsgQueue.h"
#include "support/TempRoot.h"

namespace {

class BridgeQueues : public ::testing::Test {
protected:
    void SetUp() override {
        LoggerHost_StartCapture();
        globalPrnMsgQ = -1;
        globalScanMsgQ = -1;
    }
    void TearDown() override {
        RemoveQueue(globalPrnMsgQ);
        RemoveQueue(globalScanMsgQ);
    }
    TempRoot root;
};

TEST_F(BridgeQueues, ReportFileIsWrittenOnceWithThePlaceholderSerialAndTheModel) {
    const std::string longName(200, 'M');
    const std::string cut = "0000-00000000000\t" + longName.substr(0, USB_SERIAL_SIZE - 18);  // the report buffer
    const struct {
        const char *existing;  // null: no report file yet
        const char *model, *want;
    } cases[] = {
        {nullptr, "MX-4070N", "0000-00000000000\tMX-4070N"},
        {"1234-56789012345\tOLD-MODEL\n", "NEW-MODEL", "1234-56789012345\tOLD-MODEL\n"},
        {nullptr, longName.c_str(), cut.c_str()},
    };
    for (const auto &c : cases) {
        std::filesystem::remove(root / REPORT_FILE);
        if (c.existing) std::ofstream(root / REPORT_FILE, std::ios::binary) << c.existing;
        ASSERT_EQ(USBAdapter_IF_CreatePrnScanMsgQs(c.model), 1);
        EXPECT_EQ(ReadFile(root / REPORT_FILE), c.want) << c.model;
    }
}

TEST_F(BridgeQueues, QueuesUseTheKeyFileWithProjectIdsFiveAndSix) {
    ASSERT_EQ(USBAdapter_IF_CreatePrnScanMsgQs("M"), 1);
    const std::string keyFile = root / FTOK_FILE;
    ASSERT_TRUE(std::filesystem::exists(keyFile));
    EXPECT_EQ(globalPrnMsgQ.load(), msgget(ftok(keyFile.c_str(), 5), 0));
    EXPECT_EQ(globalScanMsgQ.load(), msgget(ftok(keyFile.c_str(), 6), 0));
    EXPECT_NE(globalPrnMsgQ.load(), globalScanMsgQ.load());
    EXPECT_TRUE(LoggerHost_Contains("[USBAdp][USB]Prn_MsgQ created with message queue id : "));
    EXPECT_TRUE(LoggerHost_Contains("[USBAdp][USB]Scan_MsgQ created with message queue id : "));
}

TEST_F(BridgeQueues, ExistingQueuesAreReusedWithWhatTheyHold) {
    ASSERT_EQ(USBAdapter_IF_CreatePrnScanMsgQs("M"), 1);
    const int first = globalPrnMsgQ;
    ASSERT_EQ(USBAdapter_IF_InitDevice(), 1);
    ASSERT_EQ(USBAdapter_IF_CreatePrnScanMsgQs("M"), 1);
    EXPECT_EQ(globalPrnMsgQ.load(), first);
    EXPECT_EQ(TakeQueueStatus(globalPrnMsgQ), MFP_DEV_INIT);
}

TEST_F(BridgeQueues, MissingDirectoryFailsCleanlyAndMakesNoQueue) {
    const std::string keyFile = root / FTOK_FILE;
    const std::string noKey = "[USBAdp][USB]Error Cannot open file for ftok key: " + keyFile + ", errno: 2\n";
    const struct {
        const char *removed;
        const char *line;  // logged once
        bool queuesTried;
    } cases[] = {
        // The report file comes first: no queue is even tried.
        {"/halvard/sys", "[USBAdp][USB]Error in opening file/File doesn't exist.\n", false},
        {"/halvard/spool", noKey.c_str(), true},
        {"/halvard/spool", "No tmp file /halvard/spool, errno: 2\n", true},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.line);
        LoggerHost_StartCapture();
        std::filesystem::remove_all(root / c.removed);
        EXPECT_EQ(USBAdapter_IF_CreatePrnScanMsgQs("M"), 0);
        EXPECT_EQ(LoggerHost_Count(c.line), 1);
        EXPECT_EQ(LoggerHost_Contains("Creating message queues"), c.queuesTried);
        EXPECT_FALSE(LoggerHost_Contains("message queue id"));
        EXPECT_EQ(globalPrnMsgQ.load(), -1);
        EXPECT_EQ(globalScanMsgQ.load(), -1);
        std::filesystem::create_directories(root / "/halvard/sys/statusinfo");
    }
}

TEST_F(BridgeQueues, InitDevicePostsOneInitMessageOfEightBytes) {
    ASSERT_EQ(USBAdapter_IF_CreatePrnScanMsgQs("M"), 1);
    ASSERT_EQ(USBAdapter_IF_InitDevice(), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp][USB]Message sent for initialization.. \n"), 1);

    struct {
        long mtype;
        unsigned char text[64];
    } raw{};
    ssize_t n = msgrcv(globalPrnMsgQ, &raw, sizeof raw.text, 0, IPC_NOWAIT);
    ASSERT_EQ(n, 8);
    EXPECT_EQ(raw.mtype, 1);
    EXPECT_EQ(raw.text[0] | raw.text[1] << 8 | raw.text[2] << 16 | raw.text[3] << 24, MFP_DEV_INIT);
    EXPECT_EQ(TakeQueueStatus(globalPrnMsgQ), std::nullopt);
    EXPECT_EQ(TakeQueueStatus(globalScanMsgQ), std::nullopt);
}

}  // namespace
