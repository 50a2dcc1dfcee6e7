// Which descriptors vdev takes: absent nodes, foreign descriptors passed
// through untouched (also under a number a node had before), and what Reset()
// does to the model and to descriptors still held.
#include <poll.h>
#include <stdlib.h>
#include <sys/ioctl.h>
#include <sys/stat.h>

#include <atomic>
#include <string>
#include <thread>

#include "vdev/VdevTest.h"

using Nodes = VdevTest;

TEST_F(Nodes, AbsentNodeFailsToOpenWithEnoent) {
    vdev::SetPresent(vdev::kScan, false);
    errno = 0;
    EXPECT_EQ(open(vdev::kScan, O_RDWR), -1);
    EXPECT_EQ(errno, ENOENT);
    EXPECT_EQ(vdev::OpenCount(vdev::kScan), 0);
    UniqueFd prn = Open(vdev::kPrn);
    EXPECT_TRUE(prn) << "the other node is still there";
    vdev::SetPresent(vdev::kScan, true);
    EXPECT_TRUE(Open(vdev::kScan));
    EXPECT_TRUE(Open(vdev::kScan));
    EXPECT_EQ(vdev::Opens(vdev::kScan), 2u) << "only successful opens count, closed ones included";
}

TEST_F(Nodes, ForeignDescriptorsAreUntouched) {
    // The number a closed node had, handed out again by the kernel.
    int nodeNumber = Open(vdev::kPrn).get();
    char dir[] = "/tmp/vdev-foreign-XXXXXX";
    ASSERT_TRUE(mkdtemp(dir));
    std::string file = std::string(dir) + "/f";
    {
        UniqueFd f(open(file.c_str(), O_RDWR | O_CREAT | O_TRUNC, 0600));
        ASSERT_TRUE(f);
        ASSERT_EQ(write(f.get(), "regular", 7), 7);
        ASSERT_EQ(lseek(f.get(), 0, SEEK_SET), 0);
        char buf[16];
        EXPECT_EQ(read(f.get(), buf, sizeof buf), 7) << "a file read is not cut to transfers";
        struct stat st;
        ASSERT_EQ(fstat(f.get(), &st), 0);
        EXPECT_EQ(st.st_mode & 0777, 0600u) << "open's mode argument is passed on";
    }
    EXPECT_EQ(unlink(file.c_str()), 0);
    EXPECT_EQ(rmdir(dir), 0);

    int pfd[2];
    ASSERT_EQ(pipe(pfd), 0);
    UniqueFd r(pfd[0]), w(pfd[1]);
    ASSERT_EQ(r.get(), nodeNumber);
    // F_SETFL reaches a pipe: a read of the empty pipe now fails at once.
    ASSERT_EQ(fcntl(r.get(), F_SETFL, O_NONBLOCK), 0);
    EXPECT_TRUE(fcntl(r.get(), F_GETFL) & O_NONBLOCK);
    char c;
    EXPECT_EQ(read(r.get(), &c, 1), -1);
    EXPECT_EQ(errno, EAGAIN);
    ASSERT_EQ(write(w.get(), "pp", 2), 2);
    int queued = 0;
    ASSERT_EQ(ioctl(r.get(), FIONREAD, &queued), 0);
    EXPECT_EQ(queued, 2);
    pollfd p{r.get(), POLLIN, 0};
    EXPECT_EQ(poll(&p, 1, 0), 1);
    EXPECT_EQ(read(r.get(), &c, 1), 1);
    errno = 0;
    EXPECT_EQ(ioctl(r.get(), IOCNR_GET_MFP_TO, &queued), -1) << "bridge requests mean nothing to a pipe";
    EXPECT_NE(errno, 0);

    EXPECT_TRUE(vdev::Ioctls().empty());
    EXPECT_TRUE(vdev::PollTimeouts(vdev::kPrn).empty());
    EXPECT_TRUE(vdev::HostRead(vdev::kPrn).empty());
    // Other paths under /dev are not emulated.
    errno = 0;
    EXPECT_EQ(open("/dev/usb/mfp_prn2", O_RDWR), -1);
    EXPECT_EQ(errno, ENOENT);
}

TEST_F(Nodes, ResetForgetsTheModelAndKillsHeldDescriptors) {
    UniqueFd fd = Open(vdev::kPrn);
    vdev::SetTimeouts(mfp_to_t{0, 0, 0, 0});
    mfp_to_t to{};
    ASSERT_EQ(ioctl(fd.get(), IOCNR_GET_MFP_TO, &to), 0);
    ASSERT_EQ(fcntl(fd.get(), F_SETOWN, getpid()), 0);
    ASSERT_EQ(write(fd.get(), "w", 1), 1);
    vdev::QueueNotification(vdev::kPrn, mfp_notif_t{MFP_DEV_RESET, {}, eMfp_Notif_Prn});
    vdev::ExpirePoll(vdev::kPrn, 3);
    vdev::SetPresent(vdev::kScan, false);
    vdev::FailIoctl(vdev::kPrn, IOCNR_GET_MFP_TO, EIO);

    // A reader blocked without a time-out is released by the reset.
    std::atomic<ssize_t> blocked{-2};
    std::thread reader([&] {
        char buf[16];
        blocked = read(fd.get(), buf, sizeof buf);
    });
    ASSERT_TRUE(WaitUntil([] { return vdev::ReadSizes(vdev::kPrn).size() == 1; }));
    vdev::HostWrite(vdev::kPrn, "stale");
    reader.join();
    ASSERT_EQ(blocked.load(), 5);
    blocked = -2;
    std::thread reader2([&] {
        char c;
        blocked = read(fd.get(), &c, 1);
    });
    ASSERT_TRUE(WaitUntil([] { return vdev::ReadSizes(vdev::kPrn).size() == 2; }));
    vdev::Reset();
    reader2.join();
    EXPECT_EQ(blocked.load(), 0);

    EXPECT_EQ(vdev::OpenCount(vdev::kPrn), 0);
    EXPECT_EQ(vdev::ReadCalls(vdev::kPrn), 0u);
    EXPECT_TRUE(vdev::Ioctls().empty());
    EXPECT_EQ(vdev::PendingNotifications(vdev::kPrn), 0u);
    EXPECT_EQ(vdev::PendingHostBytes(vdev::kPrn), 0u);
    EXPECT_TRUE(vdev::HostRead(vdev::kPrn).empty());
    EXPECT_EQ(vdev::Owner(vdev::kPrn), 0);
    EXPECT_EQ(U32{vdev::Timeouts().ul_prn_read_to}, U32{vdev::kInitialTimeouts.ul_prn_read_to});
    EXPECT_TRUE(Open(vdev::kScan)) << "all nodes are present again";

    // The old descriptor is dead: reads end, writes and ioctls fail.
    char c;
    EXPECT_EQ(read(fd.get(), &c, 1), 0);
    EXPECT_EQ(write(fd.get(), "x", 1), -1);
    EXPECT_EQ(errno, EIO);
    EXPECT_EQ(ioctl(fd.get(), IOCNR_GET_MFP_TO, &to), -1);
    EXPECT_EQ(errno, EIO);
    mfp_notif_t n{};
    EXPECT_EQ(ioctl(fd.get(), MFP_IOC_GET_NOTIF, &n), -1);
    EXPECT_EQ(errno, EIO);
    pollfd p{fd.get(), POLLIN, 0};
    EXPECT_EQ(poll(&p, 1, 1000), 1);
    EXPECT_TRUE(p.revents & POLLHUP);

    // A new descriptor sees a fresh model: no expiries, failures or data left.
    UniqueFd fresh = Open(vdev::kPrn);
    vdev::HostWrite(vdev::kPrn, "new");
    EXPECT_EQ(read(fresh.get(), &c, 1), 1);
    EXPECT_EQ(c, 'n');
    EXPECT_EQ(ioctl(fresh.get(), IOCNR_GET_MFP_TO, &to), 0);
    pollfd q{fresh.get(), POLLIN, 0};
    auto start = std::chrono::steady_clock::now();
    vdev::HostRead(vdev::kPrn);
    char rest[4];
    ASSERT_EQ(read(fresh.get(), rest, sizeof rest), 2);
    EXPECT_EQ(poll(&q, 1, 20), 0);
    EXPECT_GE(ElapsedMs(start), 15) << "expiries did not survive the reset";
    EXPECT_EQ(vdev::OpenCount(vdev::kPrn), 1);
    fd.reset();  // closing a dead descriptor leaves the new one alone
    EXPECT_EQ(vdev::OpenCount(vdev::kPrn), 1);
}
