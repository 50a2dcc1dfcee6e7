// Notifications: the queue behind MFP_IOC_GET_NOTIF, SIGIO raised only for an
// owner that switched on O_ASYNC (never for arriving data), the model's view of
// F_SETOWN / F_SETFL / F_GETFL, and a handler that may interrupt vdev itself.
#include <poll.h>
#include <pthread.h>
#include <signal.h>

#include <atomic>
#include <stdexcept>
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

TEST_F(Notifications, GetNotifReturnsQueuedNotificationsOldestFirst) {
    UniqueFd fd = Open(vdev::kPrn);
    vdev::QueueNotification(vdev::kPrn, Notif(MFP_DEV_CONFIGURED, eMfp_Notif_Both));
    vdev::QueueNotification(vdev::kPrn, Notif(MFP_DEV_DISCONNECT));
    EXPECT_EQ(vdev::PendingNotifications(vdev::kPrn), 2u);
    EXPECT_EQ(vdev::PendingNotifications(vdev::kScan), 0u);

    mfp_notif_t n{};
    ASSERT_EQ(ioctl(fd.get(), MFP_IOC_GET_NOTIF, &n), 0);
    EXPECT_EQ(n.ub_notif, MFP_DEV_CONFIGURED);
    EXPECT_EQ(S32{n.ub_intf}, eMfp_Notif_Both);
    ASSERT_EQ(ioctl(fd.get(), MFP_IOC_GET_NOTIF, &n), 0);
    EXPECT_EQ(n.ub_notif, MFP_DEV_DISCONNECT);
    EXPECT_EQ(vdev::PendingNotifications(vdev::kPrn), 0u);
}

TEST_F(Notifications, GetNotifOnAnEmptyQueueFailsWithEagain) {
    UniqueFd fd = Open(vdev::kPrn);
    mfp_notif_t n{};
    n.ub_notif = 0x77;
    errno = 0;
    EXPECT_EQ(ioctl(fd.get(), MFP_IOC_GET_NOTIF, &n), -1);
    EXPECT_EQ(errno, EAGAIN);
    EXPECT_EQ(n.ub_notif, 0x77) << "a failed call leaves the record alone";
    // A notification for the other node is not this node's.
    vdev::QueueNotification(vdev::kScan, Notif(SCAN_COMMAND, eMfp_Notif_Scan));
    EXPECT_EQ(ioctl(fd.get(), MFP_IOC_GET_NOTIF, &n), -1);
    EXPECT_EQ(errno, EAGAIN);
}

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
    vdev::QueueNotification(vdev::kPrn, Notif(MFP_DEV_CONFIGURED));  // both
    ASSERT_TRUE(WaitUntil([] { return gSignals.load() >= 1; }));
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
    EXPECT_EQ(gSignals.load(), 1);
    EXPECT_EQ(gNotified.load(), 1);
    EXPECT_EQ(gLastNotif.load(), MFP_DEV_RESET) << "the handler gets the oldest pending notification";
    EXPECT_EQ(vdev::PendingNotifications(vdev::kPrn), 3u);
}

TEST_F(Notifications, ArrivingDataNeverRaisesSigio) {
    UniqueFd fd = Open(vdev::kPrn);
    gHandlerFd = fd.get();
    ASSERT_EQ(fcntl(fd.get(), F_SETOWN, getpid()), 0);
    ASSERT_EQ(fcntl(fd.get(), F_SETFL, O_ASYNC), 0);
    vdev::HostWrite(vdev::kPrn, "data that a plain socket would signal");
    pollfd p{fd.get(), POLLIN, 0};
    ASSERT_EQ(poll(&p, 1, 1000), 1);
    char buf[64];
    ASSERT_GT(read(fd.get(), buf, sizeof buf), 0);
    ASSERT_EQ(write(fd.get(), "x", 1), 1);
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
    EXPECT_EQ(gSignals.load(), 0);
}

TEST_F(Notifications, SigioStopsWhenTheOwnersDescriptorIsClosed) {
    UniqueFd fd = Open(vdev::kPrn);
    ASSERT_EQ(fcntl(fd.get(), F_SETOWN, getpid()), 0);
    ASSERT_EQ(fcntl(fd.get(), F_SETFL, O_ASYNC), 0);
    fd.reset();
    EXPECT_EQ(vdev::OpenCount(vdev::kPrn), 0);
    EXPECT_EQ(vdev::Owner(vdev::kPrn), 0);
    EXPECT_FALSE(vdev::AsyncEnabled(vdev::kPrn));
    vdev::QueueNotification(vdev::kPrn, Notif(MFP_DEV_RESET));
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
    EXPECT_EQ(gSignals.load(), 0);
}

TEST_F(Notifications, StatusFlagsAreTheModelsAndCanBeForced) {
    UniqueFd fd = Open(vdev::kPrn);
    EXPECT_EQ(fcntl(fd.get(), F_GETFL) & O_ACCMODE, O_RDWR);
    EXPECT_EQ(fcntl(fd.get(), F_GETFL) & (O_NONBLOCK | O_ASYNC), 0);

    // The opener's sequence: flags of another descriptor plus FASYNC.
    ASSERT_EQ(fcntl(fd.get(), F_SETFL, O_RDONLY | 0x2000), 0);
    EXPECT_EQ(fcntl(fd.get(), F_GETFL), O_RDWR | O_ASYNC) << "F_SETFL leaves the access mode alone";
    EXPECT_EQ(vdev::StatusFlags(vdev::kPrn), O_ASYNC);

    vdev::ForceStatusFlags(vdev::kPrn, O_NONBLOCK | O_ASYNC);
    EXPECT_EQ(fcntl(fd.get(), F_GETFL), O_RDWR | O_NONBLOCK | O_ASYNC);
    char c;
    EXPECT_EQ(read(fd.get(), &c, 1), -1) << "a forced O_NONBLOCK is real";
    EXPECT_EQ(errno, EAGAIN);
    ASSERT_EQ(fcntl(fd.get(), F_SETFL, O_ASYNC), 0);
    EXPECT_EQ(fcntl(fd.get(), F_GETFL), O_RDWR | O_ASYNC);
    EXPECT_EQ(vdev::StatusFlags(vdev::kPrn), O_ASYNC);

    // Commands the model does not keep reach the descriptor itself.
    ASSERT_EQ(fcntl(fd.get(), F_SETFD, FD_CLOEXEC), 0);
    EXPECT_EQ(fcntl(fd.get(), F_GETFD), FD_CLOEXEC);
}

TEST_F(Notifications, QueueRefusesMoreThanItsCapacity) {
    for (size_t i = 0; i < vdev::kNotificationCapacity; ++i) {
        vdev::QueueNotification(vdev::kScan, Notif(SCAN_COMMAND, eMfp_Notif_Scan));
    }
    EXPECT_THROW(vdev::QueueNotification(vdev::kScan, Notif(SCAN_COMMAND)), std::length_error);
    UniqueFd fd = Open(vdev::kScan);
    mfp_notif_t n{};
    ASSERT_EQ(ioctl(fd.get(), MFP_IOC_GET_NOTIF, &n), 0);
    vdev::QueueNotification(vdev::kScan, Notif(MFP_DEV_RESET));  // room again
    EXPECT_EQ(vdev::PendingNotifications(vdev::kScan), vdev::kNotificationCapacity);
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
