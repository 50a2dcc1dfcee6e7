// The host client over a socket pair: the test plays the printer on the other
// end, writing the device's bytes and reading back what the client sent; and
// what the client checks before anything goes to the device.
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <ostream>
#include <string>
#include <thread>
#include <vector>

#include "MaaClient.h"
#include "support/MaaRecords.h"

namespace maahost {

void PrintTo(const Frame &f, std::ostream *os) {
    *os << "{kind " << static_cast<int>(f.kind) << ", status " << f.status << ", result " << f.result << ", "
        << f.data.size() << " bytes: " << Hex(f.data.substr(0, 16)) << (f.data.size() > 16 ? " ..." : "") << "}";
}

namespace {

constexpr int kTimeoutMs = 2000;  // never reached when the client is right
constexpr int kQuietMs = 300;
const std::string kStartCommand("\x1bwMAASTART", 10);

using maarec::BE32, maarec::kAck, maarec::Pattern, maarec::Special, maarec::Transfer;
// Device to host.
std::string Record(uint32_t cont, uint32_t result, const std::string &data) { return maarec::Frame(cont, result, data); }

Frame Result(uint32_t cont, uint32_t result, const std::string &data) {
    return {Frame::Kind::Result, cont, result, data};
}
Frame File(const std::string &data) { return {Frame::Kind::File, kOpT2H, 0, data}; }
Frame FileEnd() { return {Frame::Kind::FileEnd, kOpFileEnd, 0, ""}; }
// A transfer frame the device sent without its data.
Frame HeaderOnly(uint8_t op) {
    return {op == kOpT2H ? Frame::Kind::File : Frame::Kind::Transfer, op, 0, "", true};
}

bool SendAll(int fd, const std::string &bytes) {
    for (size_t at = 0; at < bytes.size();) {
        ssize_t n = ::send(fd, bytes.data() + at, bytes.size() - at, MSG_NOSIGNAL);
        if (n <= 0) return false;
        at += static_cast<size_t>(n);
    }
    return true;
}

// Up to n bytes, less when the other end stays silent for timeoutMs or leaves.
std::string ReadUpTo(int fd, size_t n, int timeoutMs) {
    std::string got;
    char buf[4096];
    while (got.size() < n) {
        pollfd p{fd, POLLIN, 0};
        if (::poll(&p, 1, timeoutMs) <= 0) break;
        ssize_t r = ::recv(fd, buf, std::min(sizeof buf, n - got.size()), 0);
        if (r <= 0) break;
        got.append(buf, static_cast<size_t>(r));
    }
    return got;
}

class ClientTest : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, sp), 0);
        channel = std::make_unique<FdChannel>(sp[0]);
    }
    void TearDown() override {
        // The device thread's reads end when the client's end goes away.
        ::shutdown(sp[0], SHUT_RDWR);
        if (device.joinable()) device.join();
        ::close(sp[0]);
        ::close(sp[1]);
    }

    // A fresh channel, for the next row of a table.
    void Reconnect() {
        TearDown();
        SetUp();
    }
    // The device on a thread of its own, with its end of the channel.
    void Device(std::function<void(int)> play) { device = std::thread(std::move(play), sp[1]); }
    // The device writes these bytes in pieces of `piece` bytes, each its own write.
    void DeviceSends(std::string bytes, size_t piece = 0) {
        Device([bytes = std::move(bytes), step = piece ? piece : std::string::npos](int fd) {
            for (size_t at = 0; at < bytes.size(); at += step) {
                if (!SendAll(fd, bytes.substr(at, step))) return;
                std::this_thread::sleep_for(std::chrono::microseconds(200));
            }
        });
    }
    // What the client has sent so far.
    std::string ClientSent() { return ReadUpTo(sp[1], 1 << 20, 50); }

    // Every frame until silence; *status is Collect's return. The device writes
    // at once, so silence is the end even on a slow machine.
    std::vector<Frame> Frames(Session &s, int *status) {
        std::vector<Frame> frames;
        *status = s.Collect([&](const Frame &f) { frames.push_back(f); }, kQuietMs, kQuietMs);
        return frames;
    }

    int sp[2] = {-1, -1};
    std::unique_ptr<FdChannel> channel;
    std::thread device;
};

TEST_F(ClientTest, HandshakesAndCommandsOnTheWire) {
    using Action = std::function<bool(Session &)>;
    const Action start = [](Session &s) { return s.Start(); }, stop = [](Session &s) { return s.Stop(); };
    struct Row {
        const char *name;
        std::string device;  // what the device answers
        Action action;
        bool ok;
        std::string sent;   // what the client sent
        std::string error;  // part of Error() when not ok
    } rows[] = {
        {"start acknowledged", kAck, start, true, kStartCommand, ""},
        {"start answered otherwise", "\x1bwMAA-NO", start, false, kStartCommand,
         "unexpected answer to the start command: 1b 77 4d 41 41 2d 4e 4f"},
        {"start unanswered", "", start, false, kStartCommand, "no acknowledgement of the start command"},
        {"stop acknowledged", kAck, stop, true, "MAA-STOP\r", ""},
        {"stop behind records of earlier lines", Record(0, 0, "late") + Record(1, 1, "") + kAck, stop, true,
         "MAA-STOP\r", ""},
        {"stop unanswered", "", stop, false, "MAA-STOP\r", "no acknowledgement of the stop command"},
        {"stop answered otherwise", "\x1bwMAA-NO", stop, false, "MAA-STOP\r", "unexpected answer to the stop command"},
        {"command line", "", [](Session &s) { return s.SendLine("Dump_File(\"/x\")"); }, true, "Dump_File(\"/x\")\r",
         ""},
        {"auto start", "", [](Session &s) { return s.SendSpecial(kOpAutoStart, 0x01020304); }, true,
         Special(kOpAutoStart, 0x01020304), ""},
        {"auto end", "", [](Session &s) { return s.SendSpecial(kOpAutoEnd, 0); }, true, Special(kOpAutoEnd, 0), ""},
        {"download unanswered", "", [](Session &s) { return s.Download("abc").has_value(); }, false,
         Special(kOpH2T, 3) + "abc", "no buffer address for the download"},
    };
    for (Row &r : rows) {
        SCOPED_TRACE(r.name);
        Reconnect();
        Session s(*channel, 200);
        DeviceSends(r.device);
        EXPECT_EQ(r.action(s), r.ok);
        EXPECT_EQ(Hex(ClientSent()), Hex(r.sent));
        if (!r.ok) {
            EXPECT_NE(s.Error().find(r.error), std::string::npos) << s.Error();
        }
    }
}

// Frames come out as the device sent them; a frame cut off is an error after
// the whole ones.
TEST_F(ClientTest, FramesComeOutAsTheDeviceSentThem) {
    const std::string big = Pattern(200000);  // more than one read of the client
    const std::string whole = Record(0, 0, "whole");
    struct Row { const char *name; std::string device; std::vector<Frame> frames; std::string error = ""; } rows[] = {
        {"records", Record(0, 0, "line 1\r\n") + Record(0, 3, "") + Record(1, 1, "done"),
         {Result(0, 0, "line 1\r\n"), Result(0, 3, ""), Result(1, 1, "done")}},
        {"record that is not sent on", Record(2, 9, "x"), {Result(2, 9, "x")}},
        {"files and their end", Transfer(kOpT2H, 10) + Pattern(10) + Transfer(kOpT2H, 0) + Transfer(kOpFileEnd, 0) +
                                    Record(1, 1, ""),
         {File(Pattern(10)), File(""), FileEnd(), Result(1, 1, "")}},
        {"file larger than a read", Transfer(kOpT2H, 200000) + big + Record(1, 1, "ok"),
         {File(big), Result(1, 1, "ok")}},
        {"end of files with a size field", Transfer(kOpFileEnd, 7) + Record(1, 1, ""), {FileEnd(), Result(1, 1, "")}},
        {"other transfer", Transfer(kOpAutoEnd, 3) + "abc", {Frame{Frame::Kind::Transfer, kOpAutoEnd, 0, "abc"}}},
        // A forwarded buffer: from its end of files on, transfer frames are 12
        // bytes only, whatever their size says; records keep their data.
        {"forwarded buffer",
         Record(0, 1, "abc") + Transfer(kOpT2H, 5) + Pattern(5) + Transfer(kOpFileEnd, 0) + Transfer(kOpT2H, 5) +
             Transfer(kOpT2H, 0x10000) + Record(0, 0, "more") + Transfer(kOpAutoEnd, 3) + Transfer(kOpFileEnd, 9) +
             Record(1, 1, "done"),
         {Result(0, 1, "abc"), File(Pattern(5)), FileEnd(), HeaderOnly(kOpT2H), HeaderOnly(kOpT2H),
          Result(0, 0, "more"), HeaderOnly(kOpAutoEnd), FileEnd(), Result(1, 1, "done")}},
        {"next statement's files after the final record",
         Transfer(kOpFileEnd, 0) + Transfer(kOpT2H, 4) + Record(1, 1, "") + Transfer(kOpT2H, 4) + "data" +
             Transfer(kOpFileEnd, 0) + Transfer(kOpT2H, 4) + Record(2, 0, "") + Transfer(kOpT2H, 2) + "xy",
         {FileEnd(), HeaderOnly(kOpT2H), Result(1, 1, ""), File("data"), FileEnd(), HeaderOnly(kOpT2H),
          Result(2, 0, ""), File("xy")}},
        {"cut header", whole + Record(1, 0, "abc").substr(0, 5), {Result(0, 0, "whole")},
         "frame header cut off: 00 00 00 01 00"},
        {"cut record data", whole + Record(1, 0, "abcdef").substr(0, 14), {Result(0, 0, "whole")},
         "frame of 6 bytes cut off after 2"},
        {"cut file data", whole + Transfer(kOpT2H, 100) + Pattern(10), {Result(0, 0, "whole")},
         "frame of 100 bytes cut off after 10"},
    };
    for (const Row &r : rows) {
        for (size_t piece : {size_t{0}, size_t{5}}) {
            if (piece != 0 && r.device.size() > 1000) continue;
            SCOPED_TRACE(std::string(r.name) + (piece ? ", in pieces of 5 bytes" : ""));
            Reconnect();
            Session s(*channel, r.error.empty() ? kTimeoutMs : 100);
            DeviceSends(r.device, piece);
            int status = 0;
            EXPECT_EQ(Frames(s, &status), r.frames);
            EXPECT_EQ(status, r.error.empty() ? static_cast<int>(r.frames.size()) : -1) << s.Error();
            if (!r.error.empty()) { EXPECT_NE(s.Error().find(r.error), std::string::npos) << s.Error(); }
        }
    }
}

TEST_F(ClientTest, CommandSendsTheLineAndCollectsItsRecords) {
    DeviceSends(Record(0, 0, "HIGH") + Record(1, 1, "File Read Complete"));
    Session s(*channel, kTimeoutMs);
    std::vector<std::string> lines;
    EXPECT_EQ(s.Command("Dump_File(0x01000000)", [&](const Frame &f) { lines.push_back(Describe(f)); }, kQuietMs,
                        kQuietMs),
              2);
    EXPECT_EQ(ClientSent(), "Dump_File(0x01000000)\r");
    EXPECT_EQ(lines, (std::vector<std::string>{"| HIGH", "= result 1: File Read Complete"}));
}

TEST_F(ClientTest, DownloadSendsSizeAndBytesAndReturnsTheAddress) {
    const std::string bytes = Pattern(70000);
    std::string received;
    Device([&](int fd) {
        received = ReadUpTo(fd, 9 + bytes.size(), kTimeoutMs);
        SendAll(fd, BE32(0x01000000));
    });
    Session s(*channel, kTimeoutMs);
    std::optional<uint32_t> address = s.Download(bytes);
    device.join();
    ASSERT_TRUE(address) << s.Error();
    EXPECT_EQ(*address, 0x01000000u);
    EXPECT_EQ(Hex(received.substr(0, 9)), Hex(Special(kOpH2T, 70000)));
    EXPECT_TRUE(received.substr(9) == bytes);
}

TEST(Describe, OneLinePerFrame) {
    struct Row { Frame frame; std::string line; } rows[] = {
        {Result(0, 0, "HIGH\r\n"), "| HIGH"},
        {Result(0, 4, "x"), "| x  (result 4)"},
        {Result(1, 1, ""), "= result 1"},
        {Result(1, 0, "File Open Error /nothing"), "= result 0: File Open Error /nothing"},
        {Result(2, 5, "y"), "? record 2 result 5: y"},
        {Result(1, 1, std::string("\x01\x02", 2)), "= result 1: <2 bytes> 01 02"},
        {Result(0, 0, std::string(40, '\x01')), "| <40 bytes> " + Hex(std::string(32, '\x01')) + " ..."},
        {File(Pattern(12)), "<file, 12 bytes>"},
        {FileEnd(), "<end of files>"},
        {Frame{Frame::Kind::Transfer, 5, 0, "abc"}, "<transfer 5, 3 bytes>"},
        {HeaderOnly(kOpT2H), "<file header without data, after the end of files>"},
        {HeaderOnly(5), "<transfer 5 header without data, after the end of files>"},
    };
    for (const Row &r : rows) EXPECT_EQ(Describe(r.frame), r.line);
}

TEST(CheckDownloadSize, RefusesWhatTheSizeFieldCannotHold) {
    struct Row { uint64_t size; bool refused; } rows[] = {
        {0, false}, {1, false}, {0xFFFFFFFFull, false},
        {0x100000000ull, true},  // 4 GiB would go out as 0
        {0x100000005ull, true},  // ... and this as 5
        {5ull << 30, true}, {UINT64_MAX, true},
    };
    for (const Row &r : rows) {
        SCOPED_TRACE(r.size);
        const std::string why = CheckDownloadSize(r.size);
        EXPECT_EQ(!why.empty(), r.refused) << why;
        if (r.refused) {
            EXPECT_EQ(why.rfind(std::to_string(r.size) + " bytes cannot be downloaded", 0), 0u) << why;
            EXPECT_NE(why.find("4 GiB"), std::string::npos) << why;
        }
    }
}

TEST(DropBlankLines, KeepsEveryLineTheAutoRunShouldReach) {
    using Lines = std::vector<std::string>;
    struct Row { const char *name; Lines script; Lines kept; } rows[] = {
        {"none blank", {"a=1", "probe(7)"}, {"a=1", "probe(7)"}},
        {"empty lines anywhere", {"", "a=1", "", "", "probe(7)", ""}, {"a=1", "probe(7)"}},
        {"spaces and tabs only", {" ", "\t \t", "a=1"}, {"a=1"}},
        {"blanks around a statement stay", {" a=1\t", "!put x.bin", "f($addr)"}, {" a=1\t", "!put x.bin", "f($addr)"}},
        {"all blank", {"", " "}, {}},
        {"empty script", {}, {}},
    };
    for (const Row &r : rows) {
        SCOPED_TRACE(r.name);
        Lines lines = r.script;
        EXPECT_EQ(DropBlankLines(&lines), r.script.size() - r.kept.size());
        EXPECT_EQ(lines, r.kept);
    }
}

TEST(CallsFunction, OnlyANameFollowedByAParenthesisOutsideTextsGetsTheLongWait) {
    struct Row { const char *line; bool calls; } rows[] = {
        {"MAA_SymbolDump()", true},
        {"x = Delay_ms (5)", true},
        {"*(char*)(0x01000000 + 36) = 0x74", false},  // casts and grouping
        {"a = (b + 1) * 2", false},
        {"x = 0x12(3)", false},                        // a number is no name
        {"s = \"f(1)\"", false},                      // inside a text
        {"s = \"a\\\"b(\" ; g(1)", true},            // an escaped quote does not end the text
        {"#$%\x01", false},
        {"", false},
    };
    for (const Row &r : rows) EXPECT_EQ(CallsFunction(r.line), r.calls) << r.line;
}

}  // namespace
}  // namespace maahost
