// Start-up of the bridge (report file, key file, the two notification queues,
// the initialisation message) and the SIGIO handler, which turns driver
// notifications into queue messages and flags.
#include <fcntl.h>
#include <signal.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <thread>

#include <gtest/gtest.h>

#include "LoggerHost.h"
#include "adapter/USB.h"
#include "common/Log.h"
#include "support/Bytes.h"
#include "support/MsgQueue.h"
#include "vdev.h"

namespace {

// Each test under its own root; the queues it made are removed again.
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

// The queues are made on the key file with project ids 5 and 6; made again,
// the existing ones are reused with what they hold: the one initialisation
// message of eight bytes.
TEST_F(BridgeQueues, QueuesOnTheKeyFileAreReusedWithTheInitMessage) {
    ASSERT_EQ(USBAdapter_IF_CreatePrnScanMsgQs("M"), 1);
    const std::string keyFile = root / FTOK_FILE;
    ASSERT_TRUE(std::filesystem::exists(keyFile));
    EXPECT_EQ(globalPrnMsgQ.load(), msgget(ftok(keyFile.c_str(), 5), 0));
    EXPECT_EQ(globalScanMsgQ.load(), msgget(ftok(keyFile.c_str(), 6), 0));
    EXPECT_NE(globalPrnMsgQ.load(), globalScanMsgQ.load());
    EXPECT_TRUE(LoggerHost_Contains("[USBAdp][USB]Prn_MsgQ created with message queue id : "));
    EXPECT_TRUE(LoggerHost_Contains("[USBAdp][USB]Scan_MsgQ created with message queue id : "));

    const int first = globalPrnMsgQ;
    ASSERT_EQ(USBAdapter_IF_InitDevice(), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp][USB]Message sent for initialization.. \n"), 1);
    ASSERT_EQ(USBAdapter_IF_CreatePrnScanMsgQs("M"), 1);
    EXPECT_EQ(globalPrnMsgQ.load(), first);

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

// ---- the SIGIO handler --------------------------------------------------

mfp_notif_t Notif(U8 code, S32 forWhom) {
    mfp_notif_t n{};
    n.ub_notif = code;
    n.ub_intf = forWhom;
    return n;
}

class SignalHandler : public BridgeQueues {
protected:
    void SetUp() override {
        BridgeQueues::SetUp();
        vdev::Reset();
        ASSERT_EQ(USBAdapter_IF_CreatePrnScanMsgQs("M"), 1);
        fd = ::open(vdev::kPrn, O_RDWR);
        ASSERT_GT(fd, 0);
        fdPrn = fd;
        IsConfigured = 0;
        IsDisconnected = 0;
        bootUpFlag = 0;
    }
    void TearDown() override {
        fdPrn = 0;
        ::close(fd);
        BridgeQueues::TearDown();
    }
    // Delivers one notification the way the driver does and runs the handler.
    void Deliver(U8 code, S32 forWhom) {
        vdev::QueueNotification(vdev::kPrn, Notif(code, forWhom));
        PrnScanSighandler(SIGIO);
        Log_FlushDeferred();
    }
    std::optional<int> Print() { return TakeQueueStatus(globalPrnMsgQ); }
    std::optional<int> Scan() { return TakeQueueStatus(globalScanMsgQ); }

    int fd = -1;
};

// Where each notification goes, by its code and whom the driver says it is for.
TEST_F(SignalHandler, NotificationsAreRoutedByCodeAndRecipient) {
    constexpr int kNone = -1;
    const struct {
        U8 code;
        S32 forWhom;
        int print, scan;   // status posted on each queue, or kNone
        const char *line;  // logged once
        U8 configuredBefore = 0, configuredAfter = 1;
    } cases[] = {
        {MFP_DEV_RESET, eMfp_Notif_Prn, MFP_DEV_RESET, kNone,
         "[USBAdp] [print thread]Requested MFP_DEV_RESET message received!\n"},
        {MFP_DEV_RESET, eMfp_Notif_Scan, kNone, MFP_DEV_RESET, nullptr},
        {MFP_DEV_RESET, eMfp_Notif_Both, MFP_DEV_RESET, MFP_DEV_RESET, nullptr},
        // An unknown recipient still has its code processed, for scan.
        {MFP_DEV_RESET, 7, kNone, MFP_DEV_RESET, "[USBAdp] [print thread] Request not supported!/Unwanted signal\n"},
        {SCAN_COMMAND, eMfp_Notif_Scan, kNone, SCAN_COMMAND, nullptr, 0, 0},
        {SCAN_COMMAND, eMfp_Notif_Prn, kNone, kNone,
         "[USBAdp][print thread] This signal is meant for scan but is received in wrong mode.\n.", 0, 0},
        {SCAN_COMMAND, eMfp_Notif_Both, kNone, kNone,
         "[USBAdp][print thread] This signal is meant for scan but is received in wrong mode.\n.", 0, 0},
        {MFP_VENDOR_REQUEST, eMfp_Notif_Prn, kNone, kNone, "[USBAdp] [print thread] Request not supported 9\n", 0, 0},
        {MFP_DEV_DISCONNECT, eMfp_Notif_Both, kNone, kNone,
         "[USBAdp] [print thread] Requested MFP_DEV_DISCONNECT message received!\n", 1, 0},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(::testing::Message() << int{c.code} << " for " << c.forWhom);
        LoggerHost_StartCapture();
        IsConfigured = c.configuredBefore;
        Deliver(c.code, c.forWhom);
        EXPECT_EQ(Print().value_or(kNone), c.print);
        EXPECT_EQ(Scan().value_or(kNone), c.scan);
        if (c.line) {
            EXPECT_EQ(LoggerHost_Count(c.line), 1);
        }
        const bool pulled = c.code == MFP_DEV_DISCONNECT;
        EXPECT_EQ(IsConfigured.load(), c.configuredAfter);
        EXPECT_EQ(IsDisconnected.load(), pulled ? 1 : 0);
        EXPECT_EQ(MAA_IsUSBDisconnected(), pulled ? 1 : 0);
    }
}

TEST_F(SignalHandler, OnlyTheFirstConfigurationIsForwarded) {
    Deliver(MFP_DEV_CONFIGURED, eMfp_Notif_Both);
    EXPECT_EQ(Print(), MFP_DEV_CONFIGURED);
    EXPECT_EQ(Scan(), MFP_DEV_CONFIGURED);
    EXPECT_EQ(bootUpFlag.load(), 1);

    Deliver(MFP_DEV_DISCONNECT, eMfp_Notif_Both);
    EXPECT_EQ(IsConfigured.load(), 0);
    Deliver(MFP_DEV_CONFIGURED, eMfp_Notif_Both);
    EXPECT_EQ(Print(), std::nullopt);
    EXPECT_EQ(Scan(), std::nullopt);
    EXPECT_EQ(IsConfigured.load(), 1);
    EXPECT_EQ(IsDisconnected.load(), 0);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] [print thread] bootUpFlag == 1\n"), 1);
}

// A failed send keeps the request flags and does not count as the first
// configuration: once the queue is back, the next configuration is forwarded.
TEST_F(SignalHandler, FailedSendKeepsTheRequestFlagsAndTheConfigurationComesAgain) {
    const std::string failed = "[USBAdp] [print thread] Can't send message through Prn_MsgQ message queue.\n";
    RemoveQueue(globalPrnMsgQ);
    Deliver(MFP_DEV_CONFIGURED, eMfp_Notif_Prn);
    EXPECT_EQ(LoggerHost_Count(failed), 1);
    EXPECT_EQ(bootUpFlag.load(), 0);
    // The print flag survived, so a scan-only reset goes to the missing print queue again.
    Deliver(MFP_DEV_RESET, eMfp_Notif_Scan);
    EXPECT_EQ(Scan(), std::nullopt);
    EXPECT_EQ(LoggerHost_Count(failed), 2);

    ASSERT_EQ(USBAdapter_IF_CreatePrnScanMsgQs("M"), 1);
    Deliver(MFP_DEV_CONFIGURED, eMfp_Notif_Prn);
    EXPECT_EQ(Print(), MFP_DEV_CONFIGURED);
    EXPECT_EQ(bootUpFlag.load(), 1);
}

TEST_F(SignalHandler, FailedNotificationReadIsLoggedAndIgnored) {
    IsConfigured = 1;
    PrnScanSighandler(SIGIO);  // nothing pending: the driver answers with an error
    Log_FlushDeferred();
    EXPECT_EQ(LoggerHost_Count("ioctl[MFP_IOC_GET_NOTIF] failed.\n"), 1);
    EXPECT_EQ(IsConfigured.load(), 1);
    EXPECT_EQ(Print(), std::nullopt);
    EXPECT_EQ(Scan(), std::nullopt);
}

// The handler must not take the logger's lock: interrupt a thread that logs
// without pause, many times, and check every handler line arrives.
TEST_F(SignalHandler, RunsSafelyWhileAnotherThreadIsLogging) {
    Log_StartDeferredWorker();
    struct sigaction sa{};
    sa.sa_handler = PrnScanSighandler;
    sigemptyset(&sa.sa_mask);
    ASSERT_EQ(sigaction(SIGIO, &sa, nullptr), 0);

    std::atomic<bool> stop{false};
    std::atomic<pthread_t> loggerThread{};
    std::thread logger([&] {
        loggerThread = pthread_self();
        while (!stop) USBADP_LOG(INFO, "busy %d\n", 1);
    });
    while (!loggerThread.load()) std::this_thread::yield();

    constexpr int kSignals = 200;
    for (int i = 0; i < kSignals; ++i) {
        vdev::QueueNotification(vdev::kPrn, Notif(MFP_DEV_RESET, eMfp_Notif_Prn));
        pthread_kill(loggerThread.load(), SIGIO);
        // Drain as we go so the print queue never fills up, nor the deferred
        // log queue when the busy logger starves its worker on a loaded machine.
        for (int k = 0; k < 2000 && !Print(); ++k) std::this_thread::sleep_for(std::chrono::milliseconds(1));
        Log_FlushDeferred();
    }
    stop = true;
    logger.join();
    signal(SIGIO, SIG_IGN);
    Log_FlushDeferred();
    EXPECT_EQ(LoggerHost_Count("[USBAdp] [print thread]Requested MFP_DEV_RESET message received!\n"), kSignals);
    EXPECT_EQ(Log_DeferredDropped(), 0u);
}

}  // namespace
