// SIGIO raised for a notification only to an owner that switched on O_ASYNC
// (never for arriving data), and a handler that may interrupt vdev itself.
#include <poll.h>
#include <pthread.h>
#include <signal.h>

#include <atomic>
#include <thread>

#include "vdev/VdevTest.h"

namespace {

std::atomic<int> gHandlerFd{-1};
std::atomic<int> gSignals{0};
std::atomic<int> gNotified{0};     // GET_NOTIF successes inside the handler
std::atomic<int> gLastNotif{-1};

void OnSigio(int) {
    int saved = errno;
    ++gSignals;
    mfp_notif_t n{};
    if (ioctl(gHandlerFd.load(), MFP_IOC_GET_NOTIF, &n) == 0) {
        gLastNotif = n.ub_notif;
        ++gNotified;
    }
    errno = saved;
}

mfp_notif_t Notif(uint8_t code, int32_t intf = eMfp_Notif_Prn) {
    mfp_notif_t n{};
    n.ub_notif = code;
    n.ub_intf = intf;
    return n;
}

class Notifications : public VdevTest {
protected:
    void SetUp() override {
        VdevTest::SetUp();
        gSignals = gNotified = 0;
        gLastNotif = -1;
        struct sigaction sa {};
        sa.sa_handler = OnSigio;
        sigemptyset(&sa.sa_mask);
        ASSERT_EQ(sigaction(SIGIO, &sa, &old_), 0);
    }
    void TearDown() override {
        // Reset first: no descriptor may raise SIGIO once the default action is back.
        VdevTest::TearDown();
        sigaction(SIGIO, &old_, nullptr);
        gHandlerFd = -1;
    }
    struct sigaction old_ {};
};

}  // namespace

TEST_F(Notifications, SigioIsRaisedOnlyWithOasyncAndAnOwner) {
    UniqueFd fd = Open(vdev::kPrn);
    gHandlerFd = fd.get();

    vdev::QueueNotification(vdev::kPrn, Notif(MFP_DEV_RESET));  // neither
    ASSERT_EQ(fcntl(fd.get(), F_SETOWN, getpid()), 0);
    vdev::QueueNotification(vdev::kPrn, Notif(MFP_DEV_RESET));  // owner only
    EXPECT_EQ(vdev::Owner(vdev::kPrn), getpid());
    EXPECT_FALSE(vdev::AsyncEnabled(vdev::kPrn));

    ASSERT_EQ(fcntl(fd.get(), F_SETOWN, 0), 0);
    int flags = fcntl(fd.get(), F_GETFL);
    ASSERT_EQ(fcntl(fd.get(), F_SETFL, flags | O_ASYNC), 0);
    vdev::QueueNotification(vdev::kPrn, Notif(MFP_DEV_RESET));  // O_ASYNC only
    EXPECT_TRUE(vdev::AsyncEnabled(vdev::kPrn));

    ASSERT_EQ(fcntl(fd.get(), F_SETOWN, getpid()), 0);
    EXPECT_EQ(fcntl(fd.get(), F_GETOWN), getpid());
    vdev::HostWrite(vdev::kPrn, "data that a plain socket would signal");
    char buf[64];
    ASSERT_GT(read(fd.get(), buf, sizeof buf), 0);
    vdev::QueueNotification(vdev::kPrn, Notif(MFP_DEV_CONFIGURED));  // both
    ASSERT_TRUE(WaitUntil([] { return gSignals.load() >= 1; }));
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
    EXPECT_EQ(gSignals.load(), 1);
    EXPECT_EQ(gNotified.load(), 1);
    EXPECT_EQ(gLastNotif.load(), MFP_DEV_RESET) << "the handler gets the oldest pending notification";
    EXPECT_EQ(vdev::PendingNotifications(vdev::kPrn), 3u);
}

// The handler runs on a thread that is busy inside vdev (holding its lock at
// times); GET_NOTIF must still be served every time.
TEST_F(Notifications, HandlerInterruptingAThreadInsideVdevDoesNotDeadlock) {
    UniqueFd fd = Open(vdev::kPrn);
    gHandlerFd = fd.get();
    ASSERT_EQ(fcntl(fd.get(), F_SETOWN, getpid()), 0);
    ASSERT_EQ(fcntl(fd.get(), F_SETFL, O_ASYNC), 0);

    std::atomic<bool> stop{false};
    std::thread busy([&] {
        // Only this thread takes SIGIO.
        char c;
        while (!stop) {
            vdev::HostWrite(vdev::kPrn, "b");
            (void)read(fd.get(), &c, 1);
            (void)vdev::PollTimeouts(vdev::kPrn);
            (void)vdev::Ioctls();
        }
    });
    sigset_t set;
    sigemptyset(&set);
    sigaddset(&set, SIGIO);
    pthread_sigmask(SIG_BLOCK, &set, nullptr);

    constexpr int kRounds = 200;
    bool ok = true;
    for (int i = 0; i < kRounds && ok; ++i) {
        vdev::QueueNotification(vdev::kPrn, Notif(MFP_DEV_CONFIGURED));
        ok = WaitUntil([&] { return gNotified.load() == i + 1; }, 5000);
    }
    if (!ok) {
        ADD_FAILURE() << "SIGIO handler stuck after " << gNotified.load() << " notifications";
        std::abort();  // the busy thread cannot be joined
    }
    stop = true;
    busy.join();
    pthread_sigmask(SIG_UNBLOCK, &set, nullptr);
    EXPECT_EQ(gNotified.load(), kRounds);
    size_t fromHandler = 0;
    for (const vdev::IoctlCall &c : vdev::Ioctls(vdev::kPrn)) {
        if (c.request == MFP_IOC_GET_NOTIF && c.result == 0) ++fromHandler;
    }
    EXPECT_EQ(fromHandler, static_cast<size_t>(kRounds)) << "calls made in the handler are recorded";
}

// A cable pull loses what the host had in flight on both interfaces; other
// notifications leave the transfers alone.
TEST_F(Notifications, DisconnectDiscardsUnreadHostTransfersOnEveryBridgeNode) {
    UniqueFd prn = Open(vdev::kPrn);
    UniqueFd scan = Open(vdev::kScan);
    char buf[16];
    for (uint8_t code : {uint8_t{MFP_DEV_CONFIGURED}, uint8_t{MFP_DEV_RESET}, uint8_t{MFP_DEV_DISCONNECT}}) {
        SCOPED_TRACE(int{code});
        vdev::HostWrite(vdev::kPrn, "MAASTART");
        vdev::HostWrite(vdev::kPrn, "more");
        vdev::HostWrite(vdev::kScan, "scan");
        ASSERT_EQ(::read(prn.get(), buf, 3), 3);  // part of the first transfer taken
        vdev::QueueNotification(vdev::kPrn, Notif(code, eMfp_Notif_Both));
        const bool pulled = code == MFP_DEV_DISCONNECT;
        EXPECT_EQ(vdev::PendingHostBytes(vdev::kPrn), pulled ? 0u : 9u);
        EXPECT_EQ(vdev::PendingHostBytes(vdev::kScan), pulled ? 0u : 4u);
        pollfd p{prn.get(), POLLIN, 0};
        EXPECT_EQ(::poll(&p, 1, 0), pulled ? 0 : 1) << "readiness follows the transfers";
        // What the host sends after the pull arrives as usual.
        vdev::Reset();
        prn = Open(vdev::kPrn);
        scan = Open(vdev::kScan);
        vdev::HostWrite(vdev::kPrn, "next");
        EXPECT_EQ(::read(prn.get(), buf, sizeof buf), 4);
    }
}
