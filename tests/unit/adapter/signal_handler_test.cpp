// The SIGIO handler: driver notifications become queue messages and flags.
#include <fcntl.h>
#include <signal.h>
#include <sys/msg.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <thread>

#include <gtest/gtest.h>

#include "LoggerHost.h"
#include "adapter/USB.h"
#include "common/Log.h"
#include "support/MsgQueue.h"
#include "support/TempRoot.h"
#include "vdev.h"

namespace {

mfp_notif_t Notif(U8 code, S32 forWhom) {
    mfp_notif_t n{};
    n.ub_notif = code;
    n.ub_intf = forWhom;
    return n;
}

class SignalHandler : public ::testing::Test {
protected:
    void SetUp() override {
        vdev::Reset();
        LoggerHost_StartCapture();
        ASSERT_EQ(USBAdapter_IF_CreatePrnScanMsgQs("M"), 1);
        fd = ::open(vdev::kPrn, O_RDWR);
        ASSERT_GT(fd, 0);
        fdPrn = fd;
        IsConfigured = 0;
        IsDisconnected = 0;
        bootUpFlag = 0;
    }
    void TearDown() override {
        RemoveQueue(globalPrnMsgQ);
        RemoveQueue(globalScanMsgQ);
        fdPrn = 0;
        ::close(fd);
    }
    // Delivers one notification the way the driver does and runs the handler.
    void Deliver(U8 code, S32 forWhom) {
        vdev::QueueNotification(vdev::kPrn, Notif(code, forWhom));
        PrnScanSighandler(SIGIO);
        Log_FlushDeferred();
    }
    std::optional<int> Print() { return TakeQueueStatus(globalPrnMsgQ); }
    std::optional<int> Scan() { return TakeQueueStatus(globalScanMsgQ); }

    TempRoot root;
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
