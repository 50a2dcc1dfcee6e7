// Data on an emulated node: read boundaries follow host transfers, large
// transfers arrive whole over several reads, poll readiness matches what a read
// would return, and device writes reach the host side.
#include <poll.h>
#include <sys/socket.h>

#include <numeric>
#include <string>
#include <thread>
#include <vector>

#include "vdev/VdevTest.h"

using Transfers = VdevTest;

TEST_F(Transfers, ReadReturnsOneHostTransferAtATime) {
    UniqueFd fd = Open(vdev::kPrn);
    ASSERT_TRUE(fd);
    vdev::HostWrite(vdev::kPrn, "\x1b%-12345X");
    vdev::HostWrite(vdev::kPrn, "@PJL");
    vdev::HostWrite(vdev::kPrn, std::string("\0\x01", 2));

    char buf[64];
    ASSERT_EQ(read(fd.get(), buf, sizeof buf), 9);
    EXPECT_EQ(std::string(buf, 9), "\x1b%-12345X");
    ASSERT_EQ(read(fd.get(), buf, sizeof buf), 4);
    EXPECT_EQ(std::string(buf, 4), "@PJL");
    ASSERT_EQ(read(fd.get(), buf, sizeof buf), 2);
    EXPECT_EQ(std::string(buf, 2), std::string("\0\x01", 2));
    EXPECT_EQ(vdev::PendingHostBytes(vdev::kPrn), 0u);
}

TEST_F(Transfers, LargeTransferIsDeliveredCompletelyOverSeveralReads) {
    UniqueFd fd = Open(vdev::kPrn);
    std::vector<uint8_t> big(300000);
    std::iota(big.begin(), big.end(), 0);  // wraps: position-dependent bytes
    vdev::HostWrite(vdev::kPrn, big.data(), big.size());
    vdev::HostWrite(vdev::kPrn, "next");

    // The reader's pattern: two bytes, then large reads.
    std::vector<uint8_t> got(2);
    ASSERT_EQ(read(fd.get(), got.data(), 2), 2);
    std::vector<uint8_t> chunk(0x10000);
    while (got.size() < big.size()) {
        pollfd p{fd.get(), POLLIN, 0};
        ASSERT_EQ(poll(&p, 1, 0), 1) << "remainder of a transfer must keep the node readable";
        ssize_t n = read(fd.get(), chunk.data(), chunk.size());
        ASSERT_GT(n, 0);
        got.insert(got.end(), chunk.begin(), chunk.begin() + n);
    }
    EXPECT_EQ(got, big);
    // The next transfer was not merged into the last read of the big one.
    char buf[16];
    ASSERT_EQ(read(fd.get(), buf, sizeof buf), 4);
    EXPECT_EQ(std::string(buf, 4), "next");
    EXPECT_EQ(vdev::ReadSizes(vdev::kPrn).front(), 2u);
}

TEST_F(Transfers, PollIsReadyExactlyWhileDataIsPending) {
    UniqueFd fd = Open(vdev::kPrn);
    pollfd p{fd.get(), POLLIN, 0};
    EXPECT_EQ(poll(&p, 1, 0), 0);
    vdev::HostWrite(vdev::kPrn, "abc");
    ASSERT_EQ(poll(&p, 1, 0), 1);
    EXPECT_TRUE(p.revents & POLLIN);
    char buf[8];
    ASSERT_EQ(read(fd.get(), buf, 2), 2);
    EXPECT_EQ(poll(&p, 1, 0), 1);
    ASSERT_EQ(read(fd.get(), buf, 8), 1);
    EXPECT_EQ(buf[0], 'c');
    EXPECT_EQ(poll(&p, 1, 0), 0);
}

TEST_F(Transfers, ZeroLengthTransferMakesOneReadReturnZero) {
    UniqueFd fd = Open(vdev::kPrn);
    vdev::HostWrite(vdev::kPrn, "", 0);
    vdev::HostWrite(vdev::kPrn, "x");
    char buf[4];
    EXPECT_EQ(read(fd.get(), buf, sizeof buf), 0);
    EXPECT_EQ(read(fd.get(), buf, sizeof buf), 1);
}

TEST_F(Transfers, TransfersQueuedBeforeOpenWaitForTheReader) {
    vdev::HostWrite(vdev::kScan, "\x1b\xa8");
    UniqueFd fd = Open(vdev::kScan);
    char buf[4];
    ASSERT_EQ(read(fd.get(), buf, sizeof buf), 2);
    EXPECT_EQ(static_cast<uint8_t>(buf[1]), 0xA8);
}

TEST_F(Transfers, DeviceWritesReachTheHostInOrder) {
    UniqueFd prn = Open(vdev::kPrn);
    UniqueFd scan = Open(vdev::kScan);
    ASSERT_EQ(write(prn.get(), "hello ", 6), 6);
    ASSERT_EQ(write(prn.get(), "host", 4), 4);
    ASSERT_EQ(write(scan.get(), "S", 1), 1);
    std::vector<uint8_t> got = vdev::HostRead(vdev::kPrn);
    EXPECT_EQ(std::string(got.begin(), got.end()), "hello host");
    EXPECT_TRUE(vdev::HostRead(vdev::kPrn).empty()) << "HostRead removes what it returns";
    EXPECT_EQ(vdev::HostRead(vdev::kScan), std::vector<uint8_t>{'S'});
}

TEST_F(Transfers, BytesSentPastVdevStillReachTheHost) {
    UniqueFd fd = Open(vdev::kPrn);
    std::string big(10000, 'q');
    ASSERT_EQ(send(fd.get(), big.data(), big.size(), 0), static_cast<ssize_t>(big.size()));
    ASSERT_EQ(send(fd.get(), "", 0, 0), 0);
    ASSERT_EQ(send(fd.get(), "end", 3, 0), 3);
    std::vector<uint8_t> got = vdev::HostRead(vdev::kPrn);
    EXPECT_EQ(std::string(got.begin(), got.end()), big + "end");
}

TEST_F(Transfers, HostReadAtLeastWaitsForAnotherThreadsWrites) {
    UniqueFd fd = Open(vdev::kPrn);
    std::vector<uint8_t> big(1 << 20, 0x5A);  // larger than any socket buffer
    std::thread writer([&] {
        ASSERT_EQ(write(fd.get(), big.data(), big.size()), static_cast<ssize_t>(big.size()));
        ASSERT_EQ(write(fd.get(), "!", 1), 1);
    });
    std::vector<uint8_t> got = vdev::HostReadAtLeast(vdev::kPrn, big.size() + 1, 5000);
    writer.join();
    ASSERT_EQ(got.size(), big.size() + 1);
    EXPECT_EQ(got.back(), '!');
}

TEST_F(Transfers, BlockedReadWakesOnAHostTransfer) {
    UniqueFd fd = Open(vdev::kPrn);
    mfp_to_t to = vdev::Timeouts();
    to.ul_prn_read_to = 0;  // no driver time-out
    vdev::SetTimeouts(to);
    std::string got;
    std::thread reader([&] {
        char buf[16];
        ssize_t n = read(fd.get(), buf, sizeof buf);
        if (n > 0) got.assign(buf, n);
    });
    ASSERT_TRUE(WaitUntil([] { return vdev::ReadSizes(vdev::kPrn).size() == 1; }));
    vdev::HostWrite(vdev::kPrn, "wake");
    reader.join();
    EXPECT_EQ(got, "wake");
}
