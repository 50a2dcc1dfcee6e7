// Data and time on an emulated node: read boundaries follow host transfers, a
// large transfer arrives whole over several reads, device writes reach the
// host; waits end when another thread expires them or at the driver's read
// time-out.
#include <poll.h>
#include <sys/ioctl.h>

#include <atomic>
#include <numeric>
#include <string>
#include <thread>
#include <vector>

#include "vdev/VdevTest.h"

using Transfers = VdevTest;

TEST_F(Transfers, ReadsFollowHostTransfersAndALargeOneArrivesWhole) {
    UniqueFd fd = Open(vdev::kPrn);
    ASSERT_TRUE(fd);
    std::vector<uint8_t> big(300000);
    std::iota(big.begin(), big.end(), 0);  // wraps: position-dependent bytes
    vdev::HostWrite(vdev::kPrn, "\x1b%-12345X");
    vdev::HostWrite(vdev::kPrn, std::string("\0\x01", 2));
    vdev::HostWrite(vdev::kPrn, big.data(), big.size());
    vdev::HostWrite(vdev::kPrn, "next");

    char buf[64];
    ASSERT_EQ(read(fd.get(), buf, sizeof buf), 9);
    EXPECT_EQ(std::string(buf, 9), "\x1b%-12345X");
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

TEST_F(Transfers, WaitsEndWhenAnotherThreadExpiresThemOrAtTheReadTimeOut) {
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
    EXPECT_EQ(vdev::PollTimeouts(vdev::kPrn), std::vector<int>{300000});

    // The read time-out the driver is given ends a read with nothing pending.
    ASSERT_EQ(ioctl(fd.get(), IOCNR_GET_MFP_TO, &to), 0);
    to.ul_prn_read_to = 40;
    ASSERT_EQ(ioctl(fd.get(), IOCNR_SET_MFP_TO, &to), 0);
    char c;
    auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(read(fd.get(), &c, 1), 0);
    EXPECT_GE(ElapsedMs(start), 35);
    EXPECT_LT(ElapsedMs(start), 3000);
}
