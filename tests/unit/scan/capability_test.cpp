// Capability and print-image requests without a Java side: what is
// recognised, what is handed back to the caller, the size reply's bytes; and
// the scan handlers reached from the print channel, answering there and
// leaving the next print job whole.
#include <fcntl.h>
#include <unistd.h>

#include <cstring>

#include "ScanFixture.h"

namespace {

struct CapResult {
    S32 result;
    std::string held;  // what vlx_command holds (result bytes) when the result is a count
};

CapResult Cap(S32 fd, const std::string &command) {
    U8 vlx_command[16];
    std::memset(vlx_command, 0xEE, sizeof vlx_command);
    std::string copy = command;
    CapResult r{Vlx_Cap_Xml(fd, reinterpret_cast<U8 *>(copy.data()), static_cast<S32>(copy.size()), vlx_command), {}};
    if (r.result > 0) r.held.assign(reinterpret_cast<char *>(vlx_command), static_cast<size_t>(r.result));
    return r;
}

using Capability = ScanTest;

TEST_F(Capability, RequestsAreRecognisedByTheirLeadingBytes) {
    const S32 fd = fdScan.load();
    const std::string f5 = Bytes({0x1B, 0x24, 0xF5, 0, 0, 0, 0, 0, 0, 0});
    struct Row {
        const char *name;
        std::string command;
        std::string behind;  // host bytes pending behind the command
        S32 result;
        std::string held;
        size_t left;         // host bytes still pending afterwards
    } rows[] = {
        {"code 7 is swallowed", Bytes({0x1B, 0x24, 0xF4, 0x07, 9, 9, 9, 9, 9, 9}), "xyz", 0, "", 3},
        {"F5 is no request: six more are read", f5, "ABCDEFGH", 16, f5 + "ABCDEF", 2},
        {"a short read is counted", f5, "AB", 12, f5 + "AB", 0},
        {"nothing more comes", f5, "", 10, f5, 0},
        {"image request without a print daemon", Bytes({0x1B, 0x91, 0, 0, 0, 0, 0, 3, 0, 0}),
         Bytes({0, 1, 0, 0, 0, 0}), 0, "", 0},
        {"no bytes", "", "xy", -1, "", 2},
    };
    vdev::SetInstantTimeouts(vdev::kScan, true);
    for (const Row &r : rows) {
        SCOPED_TRACE(r.name);
        if (!r.behind.empty()) vdev::HostWrite(vdev::kScan, r.behind);
        CapResult got = Cap(fd, r.command);
        EXPECT_EQ(got.result, r.result);
        if (r.result > 0) {
            EXPECT_EQ(got.held, r.held);
        }
        EXPECT_EQ(vdev::PendingHostBytes(vdev::kScan), r.left);
        EXPECT_EQ(Reply(), "");
        char rest[64];
        while (vdev::PendingHostBytes(vdev::kScan) > 0) ASSERT_GT(::read(fd, rest, sizeof rest), 0);
    }
    EXPECT_EQ(LoggerHost_Count("\r\nread 0 bytes so returning [10]\n"), 1);
    EXPECT_EQ(LoggerHost_Count("Setter Image Query Success\r\n"), 1);
}

TEST_F(Capability, SizeReplyIsTheHeaderWithTheSizeBigEndian) {
    const std::pair<U32, std::string> rows[] = {
        {0x1234, Bytes({0x1B, 0x24, 0xF4, 0, 0, 0, 0, 0, 0x12, 0x34})},
        {0, Bytes({0x1B, 0x24, 0xF4, 0, 0, 0, 0, 0, 0, 0})},
        {0xFFFFFFFF, Bytes({0x1B, 0x24, 0xF4, 0, 0, 0, 0xFF, 0xFF, 0xFF, 0xFF})},
    };
    ulDrvHandle = static_cast<U32>(fdScan.load());
    for (const auto &[size, reply] : rows) {
        CapXmlSizeWrite(size);
        EXPECT_EQ(Reply(), reply);
    }
}

// The print reader over the print node with the scan node open too.
class PrintChannelScan : public ReaderTest {};

TEST_F(PrintChannelScan, HandlersAnswerOnThePrintChannelAndTheNextJobIsWhole) {
    const int scan = ::open(vdev::kScan, O_RDWR);  // a scan channel that must stay untouched
    ASSERT_GE(scan, 0);
    const std::string job = kUel + "@PJL JOB\r\n" + std::string(500, 'j') + kUel;
    const std::string pcscan = Bytes({0x1B, 0xA8, 0x24, 0x01, 'p', 'q', 'r'});
    const std::string light = Bytes({0x1B, 0xAA, 0x02, 0x02, 'l', 'm'});
    const std::string s2a = Bytes({0x1B, 0x9A, 0x01, 0, 0, 0, 0, 7});
    const std::string swallowed = Bytes({0x1B, 0x24, 0xF4, 0x07, 0, 0, 0, 0, 0, 0});
    Send({pcscan, job, light, s2a, swallowed, job});
    const auto apps = rec::Apps();
    ASSERT_EQ(apps.size(), 3u);
    const std::pair<const char *, std::string> expected[] = {{"pcscan", pcscan}, {"taviklight", light}, {"scan2pc", s2a}};
    for (size_t i = 0; i < 3; ++i) {
        EXPECT_EQ(apps[i].type, expected[i].first);
        std::string all;
        for (const std::string &w : apps[i].writes) all += w;
        EXPECT_EQ(all, expected[i].second);
    }
    const auto jobs = rec::Jobs();
    ASSERT_EQ(jobs.size(), 2u);
    EXPECT_EQ(jobs[0].bytes, job);
    EXPECT_EQ(jobs[1].bytes, job);
    EXPECT_EQ(vdev::ReadCalls(vdev::kScan), 0u);
    EXPECT_TRUE(vdev::HostRead(vdev::kPrn).empty());
    ::close(scan);
}

}  // namespace
