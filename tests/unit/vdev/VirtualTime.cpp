// Time on an emulated node: poll time-outs are recorded and can be expired at
// once, blocking reads end after the driver's read time-out or when expired,
// non-blocking reads do not wait.
#include <poll.h>

#include <atomic>
#include <thread>

#include "vdev/VdevTest.h"

using VirtualTime = VdevTest;

namespace {

mfp_to_t WithReadTimeouts(uint32_t prn, uint32_t scan) {
    mfp_to_t to = vdev::Timeouts();
    to.ul_prn_read_to = prn;
    to.ul_scan_read_to = scan;
    return to;
}

}  // namespace

TEST_F(VirtualTime, PollTimeoutsAreRecordedPerNodeInCallOrder) {
    UniqueFd prn = Open(vdev::kPrn);
    UniqueFd scan = Open(vdev::kScan);
    int pipefd[2];
    ASSERT_EQ(pipe(pipefd), 0);
    UniqueFd r(pipefd[0]), w(pipefd[1]);

    pollfd p{prn.get(), POLLIN, 0};
    EXPECT_EQ(poll(&p, 1, 0), 0);
    vdev::ExpirePoll(vdev::kPrn);
    EXPECT_EQ(poll(&p, 1, 5000), 0);
    // A poll over a pipe and both nodes counts once for each node.
    pollfd three[3] = {{r.get(), POLLIN, 0}, {scan.get(), POLLIN, 0}, {prn.get(), POLLIN, 0}};
    vdev::HostWrite(vdev::kScan, "s");
    EXPECT_EQ(poll(three, 3, 300000), 1);
    EXPECT_EQ(three[1].revents, POLLIN);
    EXPECT_EQ(three[0].revents, 0);

    EXPECT_EQ(vdev::PollTimeouts(vdev::kPrn), (std::vector<int>{0, 5000, 300000}));
    EXPECT_EQ(vdev::PollTimeouts(vdev::kScan), (std::vector<int>{300000}));
}

TEST_F(VirtualTime, BlockedPollIsExpiredAtOnceFromAnotherThread) {
    UniqueFd fd = Open(vdev::kPrn);
    std::atomic<int> result{-2};
    std::atomic<long> tookMs{-1};
    std::thread poller([&] {
        pollfd p{fd.get(), POLLIN, 0};
        auto start = std::chrono::steady_clock::now();
        result = poll(&p, 1, 300000);
        tookMs = ElapsedMs(start);
    });
    ASSERT_TRUE(WaitUntil([] { return vdev::PollTimeouts(vdev::kPrn).size() == 1; }));
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
    EXPECT_EQ(result.load(), -2) << "poll must block until expired";
    vdev::ExpirePoll(vdev::kPrn);
    poller.join();
    EXPECT_EQ(result.load(), 0);
    EXPECT_LT(tookMs.load(), 5000);
    EXPECT_EQ(vdev::PollTimeouts(vdev::kPrn), std::vector<int>{300000});
}

TEST_F(VirtualTime, ExpiryCountsAccumulateAndDoNotHideData) {
    UniqueFd fd = Open(vdev::kPrn);
    pollfd p{fd.get(), POLLIN, 0};
    vdev::ExpirePoll(vdev::kPrn, 2);
    EXPECT_EQ(poll(&p, 1, -1), 0);
    vdev::HostWrite(vdev::kPrn, "d");
    EXPECT_EQ(poll(&p, 1, -1), 1) << "pending data wins over an expiry";
    char c;
    ASSERT_EQ(read(fd.get(), &c, 1), 1);
    EXPECT_EQ(poll(&p, 1, -1), 0) << "the second expiry is still there";

    // Real time-outs still work when nothing is expired.
    auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(poll(&p, 1, 30), 0);
    EXPECT_GE(ElapsedMs(start), 25);
}

TEST_F(VirtualTime, InstantTimeoutsEndEveryWaitUntilSwitchedOff) {
    vdev::SetTimeouts(WithReadTimeouts(0, 0));
    UniqueFd fd = Open(vdev::kScan);
    vdev::SetInstantTimeouts(vdev::kScan, true);
    pollfd p{fd.get(), POLLIN, 0};
    char buf[4];
    for (int i = 0; i < 3; ++i) {
        EXPECT_EQ(poll(&p, 1, -1), 0);
        EXPECT_EQ(read(fd.get(), buf, sizeof buf), 0);
    }
    vdev::SetInstantTimeouts(vdev::kScan, false);
    EXPECT_EQ(poll(&p, 1, 20), 0);
    vdev::HostWrite(vdev::kScan, "ab");
    EXPECT_EQ(read(fd.get(), buf, sizeof buf), 2);
}

TEST_F(VirtualTime, BlockingReadReturnsZeroAfterTheDriversReadTimeout) {
    vdev::SetTimeouts(WithReadTimeouts(80, 0));
    UniqueFd fd = Open(vdev::kPrn);
    char buf[2];
    auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(read(fd.get(), buf, sizeof buf), 0);
    long took = ElapsedMs(start);
    EXPECT_GE(took, 75);
    EXPECT_LT(took, 3000);
}

TEST_F(VirtualTime, TimeoutSetThroughTheIoctlGovernsTheRead) {
    UniqueFd fd = Open(vdev::kPrn);
    mfp_to_t to{};
    ASSERT_EQ(ioctl(fd.get(), IOCNR_GET_MFP_TO, &to), 0);
    to.ul_prn_read_to = 40;
    ASSERT_EQ(ioctl(fd.get(), IOCNR_SET_MFP_TO, &to), 0);
    char buf[2];
    auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(read(fd.get(), buf, sizeof buf), 0);
    EXPECT_GE(ElapsedMs(start), 35);
    EXPECT_LT(ElapsedMs(start), 3000);
}

TEST_F(VirtualTime, BlockedReadIsExpiredFromAnotherThread) {
    vdev::SetTimeouts(WithReadTimeouts(0, 0));
    UniqueFd fd = Open(vdev::kPrn);
    std::atomic<ssize_t> result{-2};
    std::thread reader([&] {
        char buf[2];
        result = read(fd.get(), buf, sizeof buf);
    });
    ASSERT_TRUE(WaitUntil([] { return vdev::ReadSizes(vdev::kPrn).size() == 1; }));
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
    EXPECT_EQ(result.load(), -2) << "read must block until expired";
    vdev::ExpireRead(vdev::kPrn);
    reader.join();
    EXPECT_EQ(result.load(), 0);

    // An expiry given before the read ends it at once, and only one read.
    vdev::ExpireRead(vdev::kPrn);
    char c;
    EXPECT_EQ(read(fd.get(), &c, 1), 0);
    vdev::HostWrite(vdev::kPrn, "z");
    EXPECT_EQ(read(fd.get(), &c, 1), 1);
}

TEST_F(VirtualTime, PollExpiryDoesNotEndAReadAndViceVersa) {
    vdev::SetTimeouts(WithReadTimeouts(60, 0));
    UniqueFd fd = Open(vdev::kPrn);
    vdev::ExpirePoll(vdev::kPrn);
    char c;
    auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(read(fd.get(), &c, 1), 0);
    EXPECT_GE(ElapsedMs(start), 55) << "a poll expiry must not end a read";
    pollfd p{fd.get(), POLLIN, 0};
    start = std::chrono::steady_clock::now();
    EXPECT_EQ(poll(&p, 1, 5000), 0);
    EXPECT_LT(ElapsedMs(start), 2000) << "the poll expiry was still pending";

    vdev::SetTimeouts(WithReadTimeouts(5000, 0));
    vdev::ExpireRead(vdev::kPrn);
    start = std::chrono::steady_clock::now();
    EXPECT_EQ(poll(&p, 1, 30), 0);
    EXPECT_GE(ElapsedMs(start), 25) << "a read expiry must not end a poll";
    start = std::chrono::steady_clock::now();
    EXPECT_EQ(read(fd.get(), &c, 1), 0);
    EXPECT_LT(ElapsedMs(start), 2500) << "the read expiry was still pending";
}

TEST_F(VirtualTime, NonBlockingReadFailsAtOnceWithEagain) {
    vdev::SetTimeouts(WithReadTimeouts(0, 0));
    UniqueFd fd = Open(vdev::kPrn, O_RDWR | O_NONBLOCK);
    char c;
    errno = 0;
    EXPECT_EQ(read(fd.get(), &c, 1), -1);
    EXPECT_EQ(errno, EAGAIN);
    ASSERT_EQ(fcntl(fd.get(), F_SETFL, 0), 0);
    vdev::ExpireRead(vdev::kPrn);
    EXPECT_EQ(read(fd.get(), &c, 1), 0) << "blocking again after F_SETFL";
}

TEST_F(VirtualTime, RecordedPollTimeoutsStayBoundedAndKeepTheNewest) {
    UniqueFd fd = Open(vdev::kPrn);
    pollfd p{fd.get(), POLLIN, 0};
    for (size_t i = 0; i < vdev::kRecordLimit; ++i) ASSERT_EQ(poll(&p, 1, 0), 0);
    EXPECT_EQ(vdev::PollTimeouts(vdev::kPrn).size(), vdev::kRecordLimit);
    vdev::ExpirePoll(vdev::kPrn);
    ASSERT_EQ(poll(&p, 1, 4321), 0);
    std::vector<int> kept = vdev::PollTimeouts(vdev::kPrn);
    EXPECT_LE(kept.size(), vdev::kRecordLimit / 2 + 1);
    EXPECT_EQ(kept.back(), 4321);
    EXPECT_EQ(vdev::PollCalls(vdev::kPrn), vdev::kRecordLimit + 1) << "the count is not bounded";
    EXPECT_EQ(vdev::PollCalls(vdev::kScan), 0u);
}
