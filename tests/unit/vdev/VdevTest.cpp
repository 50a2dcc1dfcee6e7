// Faults of the device double that would change what the simulator shows:
// bytes lost or merged across transfers, waits that end early, a cable pull that
// keeps what was in flight, SIGIO for data, a handler stuck inside the model,
// descriptor strings read past their size fields, and a foreign descriptor (the
// JVM's, when preloaded) taken for a node.
#include <fcntl.h>
#include <poll.h>
#include <pthread.h>
#include <signal.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <numeric>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "common/UniqueFd.h"
#include "support/WaitUntil.h"
#include "vdev.h"

namespace {

std::atomic<int> gHandlerFd{-1};
std::atomic<int> gSignals{0};
std::atomic<int> gNotified{0};  // GET_NOTIF successes inside the handler

void OnSigio(int) {
    int saved = errno;
    ++gSignals;
    mfp_notif_t n{};
    if (ioctl(gHandlerFd.load(), MFP_IOC_GET_NOTIF, &n) == 0) ++gNotified;
    errno = saved;
}

mfp_notif_t Notif(uint8_t code, int32_t intf = eMfp_Notif_Prn) {
    mfp_notif_t n{};
    n.ub_notif = code;
    n.ub_intf = intf;
    return n;
}

long MsSince(std::chrono::steady_clock::time_point since) {
    return static_cast<long>(
        std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::steady_clock::now() - since).count());
}

class Vdev : public ::testing::Test {
protected:
    void SetUp() override {
        vdev::Reset();
        gSignals = gNotified = 0;
        struct sigaction sa {};
        sa.sa_handler = OnSigio;
        sigemptyset(&sa.sa_mask);
        ASSERT_EQ(sigaction(SIGIO, &sa, &old_), 0);
    }
    void TearDown() override {
        // Reset first: no descriptor may raise SIGIO once the default action is back.
        vdev::Reset();
        sigaction(SIGIO, &old_, nullptr);
        gHandlerFd = -1;
    }
    static UniqueFd Open(const char *path) { return UniqueFd(::open(path, O_RDWR)); }
    struct sigaction old_ {};
};

TEST_F(Vdev, ReadsFollowHostTransfersAndALargeOneArrivesWhole) {
    UniqueFd fd = Open(vdev::kPrn);
    ASSERT_TRUE(fd);
    std::vector<uint8_t> big(300000);
    std::iota(big.begin(), big.end(), 0);  // wraps: position-dependent bytes
    vdev::HostWrite(vdev::kPrn, std::string("\0\x01", 2));
    vdev::HostWrite(vdev::kPrn, big.data(), big.size());
    vdev::HostWrite(vdev::kPrn, "next");

    char buf[64];
    ASSERT_EQ(read(fd.get(), buf, sizeof buf), 2);
    EXPECT_EQ(std::string(buf, 2), std::string("\0\x01", 2));
    // The reader's pattern: two bytes, then large reads.
    std::vector<uint8_t> got(2);
    ASSERT_EQ(read(fd.get(), got.data(), 2), 2);
    std::vector<uint8_t> chunk(0x10000);
    while (got.size() < big.size()) {
        pollfd p{fd.get(), POLLIN, 0};
        ASSERT_EQ(poll(&p, 1, 0), 1) << "the rest of a transfer keeps the node readable";
        ssize_t n = read(fd.get(), chunk.data(), chunk.size());
        ASSERT_GT(n, 0);
        got.insert(got.end(), chunk.begin(), chunk.begin() + n);
    }
    EXPECT_EQ(got, big);
    ASSERT_EQ(read(fd.get(), buf, sizeof buf), 4) << "the next transfer is not merged into the last read";
    EXPECT_EQ(std::string(buf, 4), "next");
    pollfd p{fd.get(), POLLIN, 0};
    EXPECT_EQ(poll(&p, 1, 0), 0);

    ASSERT_EQ(write(fd.get(), "hello ", 6), 6);
    ASSERT_EQ(write(fd.get(), "host", 4), 4);
    std::vector<uint8_t> back = vdev::HostRead(vdev::kPrn);
    EXPECT_EQ(std::string(back.begin(), back.end()), "hello host");
}

TEST_F(Vdev, WaitsEndWhenExpiredOrAtTheReadTimeOutNeverEarlier) {
    mfp_to_t to = vdev::Timeouts();
    to.ul_prn_read_to = 0;  // no driver time-out: only an expiry ends the read
    vdev::SetTimeouts(to);
    UniqueFd fd = Open(vdev::kPrn);
    std::atomic<int> polled{-2};
    std::atomic<ssize_t> readResult{-2};
    std::thread waiter([&] {
        pollfd p{fd.get(), POLLIN, 0};
        polled = poll(&p, 1, 300000);
        char buf[2];
        readResult = read(fd.get(), buf, sizeof buf);
    });
    ASSERT_TRUE(WaitUntil([] { return vdev::PollTimeouts(vdev::kPrn).size() == 1; }));
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
    EXPECT_EQ(polled.load(), -2) << "poll must block until expired";
    vdev::ExpirePoll(vdev::kPrn);
    ASSERT_TRUE(WaitUntil([] { return vdev::ReadSizes(vdev::kPrn).size() == 1; }));
    EXPECT_EQ(polled.load(), 0);
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
    EXPECT_EQ(readResult.load(), -2) << "read must block until expired";
    vdev::ExpireRead(vdev::kPrn);
    waiter.join();
    EXPECT_EQ(readResult.load(), 0);

    // The read time-out the library sets ends a read with nothing pending.
    to.ul_prn_read_to = 40;
    ASSERT_EQ(ioctl(fd.get(), IOCNR_SET_MFP_TO, &to), 0);
    char c;
    auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(read(fd.get(), &c, 1), 0);
    EXPECT_GE(MsSince(start), 35);
    EXPECT_LT(MsSince(start), 3000);
}

// A cable pull loses what the host had in flight on both interfaces; other
// notifications leave the transfers alone.
TEST_F(Vdev, OnlyACablePullDiscardsUnreadHostTransfersOnEveryNode) {
    for (uint8_t code : {uint8_t{MFP_DEV_CONFIGURED}, uint8_t{MFP_DEV_RESET}, uint8_t{MFP_DEV_DISCONNECT}}) {
        SCOPED_TRACE(int{code});
        vdev::Reset();
        UniqueFd prn = Open(vdev::kPrn), scan = Open(vdev::kScan);
        char buf[16];
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
        vdev::HostWrite(vdev::kPrn, "next");
        EXPECT_EQ(::read(prn.get(), buf, sizeof buf), pulled ? 4 : 5) << "what follows arrives as usual";
    }
}

TEST_F(Vdev, SigioOnlyForANotificationToAnOwnerWithOasync) {
    UniqueFd fd = Open(vdev::kPrn);
    gHandlerFd = fd.get();
    vdev::QueueNotification(vdev::kPrn, Notif(MFP_DEV_RESET));  // neither
    ASSERT_EQ(fcntl(fd.get(), F_SETOWN, getpid()), 0);
    vdev::QueueNotification(vdev::kPrn, Notif(MFP_DEV_RESET));  // owner only
    ASSERT_EQ(fcntl(fd.get(), F_SETOWN, 0), 0);
    ASSERT_EQ(fcntl(fd.get(), F_SETFL, fcntl(fd.get(), F_GETFL) | O_ASYNC), 0);
    vdev::QueueNotification(vdev::kPrn, Notif(MFP_DEV_RESET));  // O_ASYNC only
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
    EXPECT_EQ(vdev::PendingNotifications(vdev::kPrn), 3u);
}

// The handler runs on a thread that is busy inside vdev (holding its lock at
// times); GET_NOTIF must still be served every time.
TEST_F(Vdev, HandlerInterruptingAThreadInsideVdevDoesNotDeadlock) {
    UniqueFd fd = Open(vdev::kPrn);
    gHandlerFd = fd.get();
    ASSERT_EQ(fcntl(fd.get(), F_SETOWN, getpid()), 0);
    ASSERT_EQ(fcntl(fd.get(), F_SETFL, O_ASYNC), 0);
    std::atomic<bool> stop{false};
    std::thread busy([&] {  // the only thread that takes SIGIO
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
    for (int i = 0; i < kRounds; ++i) {
        vdev::QueueNotification(vdev::kPrn, Notif(MFP_DEV_CONFIGURED));
        if (!WaitUntil([&] { return gNotified.load() == i + 1; }, 5000)) {
            ADD_FAILURE() << "SIGIO handler stuck after " << gNotified.load() << " notifications";
            std::abort();  // the busy thread cannot be joined
        }
    }
    stop = true;
    busy.join();
    pthread_sigmask(SIG_UNBLOCK, &set, nullptr);
}

// The size fields alone bound what the driver copies, at call time: a model that
// read to the NUL would hide a wrong size from the library's tests.
TEST_F(Vdev, DescriptorStringsAreCopiedByTheirSizeFieldsAtCallTime) {
    UniqueFd fd = Open(vdev::kPrn);
    char mf[3] = {'A', 'C', 'M'};  // not terminated
    char pd[] = "MODEL 9\0tail";
    char serial[] = "SERIAL";
    std::string devId(300, 'D');  // longer than a byte size field could say
    desc_param_t d{};
    d.uwPid = 0x5678;
    d.ubMf_string_size = sizeof mf;
    d.ubPd_string_size = sizeof pd;
    d.ubSerial_string_size = 4;
    d.uwDev_id_1284_size = static_cast<U16>(devId.size() + 1);
    d.stDevStrID.pub_mf_string = reinterpret_cast<U8 *>(mf);
    d.stDevStrID.pub_pd_string = reinterpret_cast<U8 *>(pd);
    d.stDevStrID.pub_serial_string = reinterpret_cast<U8 *>(serial);
    d.stDevStrID.pub_dev_id_1284 = reinterpret_cast<U8 *>(devId.data());
    ASSERT_EQ(ioctl(fd.get(), IOCNR_SET_DESC_REQ, &d), 0);
    mf[0] = 'X';
    devId[0] = 'X';

    std::optional<vdev::DescriptorRequest> got = vdev::LastDescriptor();
    ASSERT_TRUE(got);
    EXPECT_EQ(got->manufacturer, "ACM");
    EXPECT_EQ(got->product, "MODEL 9");
    EXPECT_EQ(got->serial, "SERI");
    EXPECT_EQ(got->deviceId, std::string(300, 'D'));
    EXPECT_EQ(U16{got->param.uwPid}, 0x5678);
}

TEST_F(Vdev, ForeignDescriptorUnderANumberANodeHadIsUntouched) {
    int nodeNumber = Open(vdev::kPrn).get();
    int pfd[2];
    ASSERT_EQ(pipe(pfd), 0);
    UniqueFd r(pfd[0]), w(pfd[1]);
    ASSERT_EQ(r.get(), nodeNumber);
    ASSERT_EQ(fcntl(r.get(), F_SETFL, O_NONBLOCK), 0);
    char c;
    EXPECT_EQ(read(r.get(), &c, 1), -1) << "F_SETFL reached the pipe";
    EXPECT_EQ(errno, EAGAIN);
    ASSERT_EQ(write(w.get(), "pp", 2), 2);
    int queued = 0;
    ASSERT_EQ(ioctl(r.get(), FIONREAD, &queued), 0);
    EXPECT_EQ(queued, 2);
    EXPECT_EQ(read(r.get(), &c, 1), 1);
    EXPECT_TRUE(vdev::Ioctls().empty());
    EXPECT_TRUE(vdev::ReadSizes(vdev::kPrn).empty());

    // open's mode argument is passed on (root could read a file of mode 0 all the same).
    char dir[] = "/tmp/vdev-foreign-XXXXXX";
    ASSERT_TRUE(mkdtemp(dir));
    const std::string file = std::string(dir) + "/f";
    const mode_t mask = umask(0);
    UniqueFd f(open(file.c_str(), O_RDWR | O_CREAT, 0640));
    umask(mask);
    struct stat st;
    ASSERT_EQ(fstat(f.get(), &st), 0);
    EXPECT_EQ(st.st_mode & 0777, 0640u);
    unlink(file.c_str());
    rmdir(dir);
}

}  // namespace
