// Which descriptors vdev takes: node paths through every libc open variant,
// absent nodes, foreign descriptors passed through untouched, close, and what
// Reset() does to the model and to descriptors still held.
#include <poll.h>
#include <stdlib.h>
#include <sys/ioctl.h>
#include <sys/stat.h>

#include <atomic>
#include <stdexcept>
#include <string>
#include <thread>

#include "vdev/VdevTest.h"

extern "C" {
int __open_2(const char *path, int flags);
int __open64_2(const char *path, int flags);
ssize_t __read_chk(int fd, void *buf, size_t n, size_t buflen);
int __poll_chk(struct pollfd *fds, nfds_t n, int timeout, size_t fdslen);
int __ioctl_time64(int fd, unsigned long request, ...);
int __fcntl_time64(int fd, int cmd, ...);
}

using Nodes = VdevTest;

TEST_F(Nodes, EveryOpenVariantReachesTheModel) {
    std::vector<UniqueFd> fds;
    fds.emplace_back(open64(vdev::kPrn, O_RDWR));
    fds.emplace_back(openat(AT_FDCWD, vdev::kPrn, O_RDWR));
    fds.emplace_back(openat64(AT_FDCWD, vdev::kPrn, O_RDWR));
    fds.emplace_back(__open_2(vdev::kPrn, O_RDWR));
    fds.emplace_back(__open64_2(vdev::kPrn, O_RDWR));
    for (const UniqueFd &fd : fds) ASSERT_TRUE(fd);
    EXPECT_EQ(vdev::OpenCount(vdev::kPrn), 5);
    EXPECT_EQ(vdev::OpenCount(vdev::kScan), 0);

    // Fortified and 64-bit-time entry points serve the node as the plain ones.
    vdev::HostWrite(vdev::kPrn, "chk");
    pollfd p{fds[0].get(), POLLIN, 0};
    EXPECT_EQ(__poll_chk(&p, 1, 100, sizeof p), 1);
    char buf[8];
    EXPECT_EQ(__read_chk(fds[1].get(), buf, 2, sizeof buf), 2) << "descriptors of a node share its transfers";
    EXPECT_EQ(read(fds[2].get(), buf, sizeof buf), 1);
    EXPECT_EQ(buf[0], 'k');
    mfp_to_t to{};
    EXPECT_EQ(__ioctl_time64(fds[3].get(), IOCNR_GET_MFP_TO, &to), 0);
    EXPECT_EQ(U32{to.ul_prn_read_to}, U32{vdev::kInitialTimeouts.ul_prn_read_to});
    EXPECT_EQ(__fcntl_time64(fds[4].get(), F_SETFL, O_ASYNC), 0);
    EXPECT_EQ(fcntl64(fds[4].get(), F_GETFL) & O_ASYNC, O_ASYNC);
    EXPECT_EQ(vdev::Ioctls().size(), 1u);

    fds.clear();
    EXPECT_EQ(vdev::OpenCount(vdev::kPrn), 0);
}

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
}

TEST_F(Nodes, ForeignDescriptorsAreUntouched) {
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
    // Other paths under /dev are not emulated.
    errno = 0;
    EXPECT_EQ(open("/dev/usb/mfp_prn2", O_RDWR), -1);
    EXPECT_EQ(errno, ENOENT);
}

TEST_F(Nodes, DescriptorNumberReusedByAForeignOpenIsForeign) {
    UniqueFd node = Open(vdev::kPrn);
    int number = node.get();
    node.reset();
    int pfd[2];
    ASSERT_EQ(pipe(pfd), 0);
    UniqueFd r(pfd[0]), w(pfd[1]);
    ASSERT_TRUE(r.get() == number || w.get() == number) << "the kernel hands the lowest free number out again";
    ASSERT_EQ(write(w.get(), "xyz", 3), 3);
    char buf[8];
    EXPECT_EQ(read(r.get(), buf, sizeof buf), 3);
    EXPECT_TRUE(vdev::HostRead(vdev::kPrn).empty());
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

TEST_F(Nodes, UnknownPathsAreRefusedByTheApi) {
    EXPECT_THROW(vdev::HostWrite("/dev/usb/nothing", "x"), std::invalid_argument);
    EXPECT_THROW(vdev::OpenCount(nullptr), std::invalid_argument);
    EXPECT_NO_THROW(vdev::Ioctls(nullptr));
}
