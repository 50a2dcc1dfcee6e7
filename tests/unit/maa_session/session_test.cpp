// The session protocol as a host sees it: start and stop handshake, command
// lines, special commands, saved-command mode and a pulled cable; and the
// session when the channel misbehaves: signals landing in its waits (the
// bridge's SIGIO reaches whatever thread the kernel picks), a channel that
// reports readiness and gives nothing, and a cable pulled in the middle of a
// start command. (The signal cases pin a departure: signals are not time-outs.)
#include <thread>

#include "maa_session/SessionFixture.h"
#include "support/CpuTime.h"
#include "support/SignalStorm.h"
#include "support/WaitUntil.h"

namespace maasession {
namespace {

TEST_F(SessionTest, StartCommandDecidesWhoOwnsTheBytes) {
    struct Row {
        const char *name;
        std::vector<std::string> transfers;
        int silences;
        S32 ret;
        std::string command;  // prefix of the classifier's buffer afterwards
        std::string wire;
        size_t left;          // host bytes the hook did not take: on the node or put back
        int wait;             // each poll's time-out: five minutes until the host was once silent
    } rows[] = {
        {"start, stop", {"MAASTART", "MAA-STOP\r"}, 0, 0, "\x1bw", kAck + kAck, 0, 300000},
        {"split start, LF", {"MAAST", "ART", "MAA-STOP\n"}, 0, 0, "\x1bw", kAck + kAck, 0, 300000},
        {"stop with more behind", {"MAASTART", "MAA-STOPPED\r"}, 0, 0, "\x1bw", kAck + kAck, 0, 300000},
        {"wrong start", {"MAASTARX and more"}, 0, 8, "\x1bwMAASTARX", "", 9, 300000},
        {"short start", {"MAAS"}, 1, 4, "\x1bwMAAS", "", 0, 300000},
        {"silence", {}, 1, -1, "\x1bw", "", 0, 5000},
    };
    for (const Row &r : rows) {
        SCOPED_TRACE(r.name);
        Outcome o = Session(r.transfers, r.silences);
        EXPECT_EQ(o.ret, r.ret);
        EXPECT_EQ(o.command.substr(0, r.command.size()), r.command);
        EXPECT_EQ(o.wire, r.wire);
        EXPECT_EQ(vdev::PendingHostBytes(vdev::kPrn) + Wait_PutBackLeft(fd), r.left);
        const std::vector<int> waits = vdev::PollTimeouts(vdev::kPrn);
        EXPECT_EQ(waits, std::vector<int>(std::max<size_t>(waits.size(), 1), r.wait));
        Reopen();
    }
}

TEST(CheckCommand, BalanceOfQuotesParenthesesAndBrackets) {
    struct Row { const char *line; U32 ok; } rows[] = {
        {"123", 0}, {"\t9x", 0}, {"x9", 1}, {"  f(1)", 1}, {"f(1;", 0}, {"f(\"(\")", 0},
        {"f(1); g(2)", 1}, {"f(1;2)", 0}, {"a[1] = f(2)", 1}, {"f[1)", 0}, {")(", 1},
        {"\"a\" \"b\"", 1}, {"", 1},
    };
    for (const Row &r : rows) EXPECT_EQ(MAA_CheckCommand(reinterpret_cast<const U8 *>(r.line)), r.ok) << r.line;
}

TEST_F(SessionTest, LineEndsAtCrLfOrTheLimitAndTakesEightRawBytesBehindAHash) {
    struct Row { const char *name; std::string sent; std::vector<std::string> lines; } rows[] = {
        {"CR and LF", "ab\r\ncd\n", {"ab", "", "cd"}},
        {"limit", std::string(1030, 'a') + "\r", {std::string(1025, 'a'), "aaaaa"}},
        {"hash, raw CR last", "x#\r\n\0y\0\0\0\rz\r"s, {"x#\r\n\0y\0\0\0\r"s, "z"}},
        {"hash, last raw byte twice", "#abcdefghij\r", {"#abcdefghhij"}},
    };
    for (const Row &r : rows) {
        SCOPED_TRACE(r.name);
        vdev::HostWrite(vdev::kPrn, r.sent);
        for (const std::string &want : r.lines) {
            U8 buf[MAA_LINE_BUFFER_SIZE];
            Bounded([&] { return MAA_ReadLine(static_cast<U32>(fd), buf); });
            // The line's length: where the terminator was written.
            size_t len = want.size();
            EXPECT_EQ(std::string(reinterpret_cast<char *>(buf), len + 1), want + '\0');
        }
        EXPECT_EQ(vdev::PendingHostBytes(vdev::kPrn), 0u);
    }
}

TEST_F(SessionTest, DownloadSendsItsAddressAndTakesExactlyTheAnnouncedBytes) {
    const std::string raw = "\nMAA-STOP\r\0#$%(\n"s;
    ASSERT_EQ(raw.size(), 16u);
    U32 address = 0;
    std::string early;  // what the host had received when it sent the peeks
    Outcome o = Session({"MAASTART", Special(MAA_FILE_TRANS_H2T, 16) + raw.substr(0, 5), raw.substr(5) + "probe(4)\r"},
                        0, [&] {
                            early = Str(vdev::HostReadAtLeast(vdev::kPrn, 12, 5000));
                            address = WordAt(early, 8);
                            vdev::HostWrite(vdev::kPrn, PeekLine(address, 16) + PeekLine(address, 17) + "MAA-STOP\r");
                        });
    EXPECT_EQ(o.ret, 0);
    ASSERT_GE(early.size(), 12u);
    EXPECT_EQ(early.substr(0, 8), kAck);
    EXPECT_GE(address, MAA_ADDR_BASE);
    EXPECT_EQ(early.substr(12) + o.wire, Frame(1, 4, "probe 4") + Frame(1, 1, raw) + Frame(1, 1, "unreachable") + kAck)
        << "the line behind the file is whole; the buffer is exactly the announced size";
}

// A download the host stops sending in the middle ends at the time-out; what
// did not arrive reads as zero bytes.
TEST_F(SessionTest, DownloadCutByATimeOutLeavesZerosWhereNothingArrived) {
    std::string early;
    Outcome o = Session({"MAASTART", Special(MAA_FILE_TRANS_H2T, 10) + "abcd"}, 0, [&] {
        early = Str(vdev::HostReadAtLeast(vdev::kPrn, 12, 5000));
        vdev::ExpirePoll(vdev::kPrn, 1);
        WaitUntil([] { return vdev::ExpiredPolls(vdev::kPrn) == 1; }, 5000);
        vdev::HostWrite(vdev::kPrn, PeekLine(WordAt(early, 8), 10) + "MAA-STOP\r");
    });
    EXPECT_EQ(o.ret, 0);
    EXPECT_EQ(o.wire, Frame(1, 1, "abcd\0\0\0\0\0\0"s) + kAck);
    EXPECT_EQ(LoggerHost_Count("\r\n[MAA:MAA_ReadFile] Invalid DM Read Return(0)"), 1);
}

// Factory scripts download several files, then pass each address on: every
// download of a session stays addressable until the session ends.
TEST_F(SessionTest, EveryDownloadOfASessionStaysAddressableUntilItEnds) {
    const std::vector<std::string> files = {"first file", std::string(5000, 'b'), "third"};
    std::vector<U32> addresses;
    Outcome o = Session({"MAASTART"}, 0, [&] {
        EXPECT_EQ(Str(vdev::HostReadAtLeast(vdev::kPrn, 8, 5000)), kAck);
        for (const std::string &f : files) {
            vdev::HostWrite(vdev::kPrn, Special(MAA_FILE_TRANS_H2T, static_cast<U32>(f.size())) + f);
            addresses.push_back(WordAt(Str(vdev::HostReadAtLeast(vdev::kPrn, 4, 5000)), 0));
            ASSERT_NE(addresses.back(), 0u);
        }
        std::string lines;
        for (size_t i = files.size(); i-- > 0;) lines += PeekLine(addresses[i], static_cast<U32>(files[i].size()));
        vdev::HostWrite(vdev::kPrn, lines + "MAA-STOP\r");
    });
    EXPECT_EQ(o.ret, 0);
    EXPECT_EQ(o.wire, Frame(1, 1, files[2]) + Frame(1, 1, files[1]) + Frame(1, 1, files[0]) + kAck);
    EXPECT_EQ(MAA_DownloadTotal(), 0u) << "the session's downloads are freed when it ends";
    for (U32 a : addresses) EXPECT_EQ(MAA_AddrTranslate(a, 1), nullptr);
}

// A departure: a session holds at most 256 MiB of downloads; past that the
// allocation fails as memory would. Sizes only: nothing is written to them.
TEST(Downloads, SessionTotalIsCappedAndFreedWithTheSession) {
    MAA_DownloadFreeAll();
    U32 address = 0;
    for (int i = 0; i < 4; ++i) ASSERT_NE(MAA_DownloadAlloc(64u << 20, &address), nullptr) << i;
    EXPECT_EQ(MAA_DownloadTotal(), MAA_DOWNLOAD_TOTAL_MAX);
    EXPECT_EQ(MAA_DownloadAlloc(1, &address), nullptr);
    EXPECT_EQ(address, 0u);
    U32 size = 1;
    EXPECT_EQ(MAA_DownloadBuffer(&size), nullptr) << "a failed download is not the previous one";
    EXPECT_EQ(size, 0u);
    MAA_DownloadFreeAll();
    EXPECT_NE(MAA_DownloadAlloc(1, &address), nullptr);
    MAA_DownloadFreeAll();
}

TEST_F(SessionTest, SizeBytesThatUnbalanceTheLineMakeAnInvalidCommand) {
    Outcome o = Session({"MAASTART", "#$%\x04\x01(\0\0\r"s, "MAA-STOP\r"});
    EXPECT_EQ(o.wire, kAck + kAck);
    EXPECT_EQ(LoggerHost_Count("\r\n[MAA] Invalid Command"), 1);
    EXPECT_EQ(stCmdHeap.ulHeapPtr, nullptr) << "no buffer for a rejected command";
    EXPECT_EQ(enSpecialMode, MAA_NORMAL_CMD);
}

TEST_F(SessionTest, AutoSessionSavesItsLinesAndRunsThemSilentlyAfterTheStop) {
    MAA_SymbolAdd(ftarget_ppc, "a", MAA_SYM_UNDEF, 0, 0);
    MAA_SymbolAdd(ftarget_ppc, "b", MAA_SYM_UNDEF, 0, 0);
    Outcome o = Session({"MAASTART", Special(MAA_AUTO_MODE_START, 40), "a=1\r", "b=2\r", "probe(7)\r",
                         Special(MAA_AUTO_MODE_END, 0), "probe(8)\r", "MAA-STOP\r"});
    EXPECT_EQ(o.ret, 0);
    EXPECT_EQ(o.wire, kAck + kAck) << "an auto run writes nothing";
    // The saved-command buffer as written, with the NUL behind.
    EXPECT_EQ(std::string(reinterpret_cast<char *>(stCmdHeap.ulHeapPtr), stCmdHeap.ulHeapIndex + 1),
              "a=1\0\nb=2\0\nprobe(7)\0\nprobe(8)\0\n\0"s);
    EXPECT_EQ(stCmdHeap.ulHeapSize, 40u);
    EXPECT_EQ(probes, (std::vector<U32>{7, 8}));
    U32 a = 0, b = 0;
    MAA_AddrRead(MAA_SymbolFind("a")->ulAddress, 4, &a);
    MAA_AddrRead(MAA_SymbolFind("b")->ulAddress, 4, &b);
    EXPECT_EQ(a, 1u);
    EXPECT_EQ(b, 2u);
    EXPECT_EQ(enSpecialMode, MAA_NORMAL_CMD);
}

TEST_F(SessionTest, PulledCableEndsTheSessionAndDropsTheCutLine) {
    const std::string first = kAck + Frame(1, 1, "probe 1");
    Outcome o = Session({"MAASTART", "probe(1)\r", "probe(2"}, 0, [&] {
        EXPECT_EQ(Str(vdev::HostReadAtLeast(vdev::kPrn, first.size(), 5000)), first);
        for (int i = 0; i < 5000 && vdev::PendingHostBytes(vdev::kPrn) != 0; ++i)
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
        IsDisconnected = 1;
        vdev::ExpirePoll(vdev::kPrn, 1);
    });
    EXPECT_EQ(o.ret, 0);
    EXPECT_EQ(o.wire, "");
    EXPECT_EQ(probes, std::vector<U32>{1});
    EXPECT_EQ(LoggerHost_Count("\r\n[MAA:MAA_Hook] Cable Disconnected during MAA_ReadLine"), 1);
}

// A departure: the driver layer reads up to min(requested, 4096) bytes at a
// time; the line readers ask for one byte, so only downloads read ahead.
TEST_F(SessionTest, DriverLayerReadsWhatIsAskedUpToAPieceAndHidesWriteErrorsButNotADisconnect) {
    vdev::HostWrite(vdev::kPrn, "xyz");
    vdev::HostWrite(vdev::kPrn, std::string(5000, 'q'));
    struct Row {
        U32 ask;
        std::string got;
    } rows[] = {{1, "x"}, {3, "yz"}, {100000, std::string(4096, 'q')}, {0, "q"}, {9999, std::string(903, 'q')}};
    for (const Row &r : rows) {
        U8 *p = nullptr;
        U32 n = 0;
        ASSERT_EQ(DM_ReadDriver(static_cast<U32>(fd), &p, r.ask, &n, nullptr), DM_RET_OK) << r.ask;
        EXPECT_EQ(std::string(reinterpret_cast<char *>(p), n), r.got) << r.ask;
    }
    EXPECT_EQ(vdev::PendingHostBytes(vdev::kPrn), 0u);
    vdev::HostWrite(vdev::kPrn, "xy");

    U8 *p = nullptr;
    U32 n = 0;
    EXPECT_EQ(DM_WriteDriver(0xFFFFFFFF, HeaderResCmd, 8, &n, nullptr), DM_RET_OK);
    EXPECT_EQ(n, 8u);
    EXPECT_TRUE(LoggerHost_Contains("[MAA] WriteDriver: write (ret=-1,errno=9,"));

    IsDisconnected = 1;
    EXPECT_EQ(DM_WriteDriver(static_cast<U32>(fd), HeaderResCmd, 8, &n, nullptr), DM_RET_USB_DISCONNECTED);
    EXPECT_EQ(DM_ReadDriver(static_cast<U32>(fd), &p, 1, &n, nullptr), DM_RET_USB_DISCONNECTED);
    EXPECT_TRUE(vdev::HostRead(vdev::kPrn).empty());
    EXPECT_EQ(vdev::PendingHostBytes(vdev::kPrn), 2u);
}

// ---- signals and a channel that gives nothing ----------------------------------

class SessionSignals : public SessionTest {
protected:
    // The session under a SIGIO storm while `host` plays the host; the cable
    // is pulled if it is still running 10 s later.
    Outcome SessionUnderSignals(const std::function<void()> &host) {
        U8 cmd[COMMAND_SIZE] = {0x1B, 'w'};
        S32 ret = 0;
        UnderSignals([&] { ret = MAA_Hook(static_cast<U32>(fd), cmd); }, host, 10000, [] {
            IsDisconnected = 1;
            vdev::ExpirePoll(vdev::kPrn, 100);
        });
        return {ret, std::string(reinterpret_cast<char *>(cmd), sizeof cmd), Str(vdev::HostRead(vdev::kPrn))};
    }

    // The host sends `bytes` once the device has taken everything before them
    // and waited a little (so the device is inside its wait).
    static void SendLate(const std::string &bytes) {
        WaitUntil([] { return vdev::PendingHostBytes(vdev::kPrn) == 0; }, 5000);
        std::this_thread::sleep_for(std::chrono::milliseconds(60));
        vdev::HostWrite(vdev::kPrn, bytes);
    }
};

// A start command or a download arriving in pieces under signals: a signal
// taken for the end of the start command would refuse the session, a download
// cut short would run its rest as command lines.
TEST_F(SessionSignals, PiecesArrivingLateAreNotCutShort) {
    const std::string file = "probe(9)\rprobe(9)\rprobe(9)\r";
    const std::string announce = Special(MAA_FILE_TRANS_H2T, static_cast<U32>(file.size()));
    struct Row { const char *name; std::vector<std::string> pieces; U32 probe; size_t address; } rows[] = {
        {"start command", {"MAAST", "ART", "probe(2)\r", "MAA-STOP\r"}, 2, 0},
        {"download",
         {"MAASTART", announce + file.substr(0, 4), file.substr(4, 10), file.substr(14), "probe(5)\rMAA-STOP\r"}, 5, 4},
    };
    for (const Row &r : rows) {
        SCOPED_TRACE(r.name);
        Reopen();
        probes.clear();
        Outcome o = SessionUnderSignals([&] {
            for (const std::string &p : r.pieces) SendLate(p);
        });
        EXPECT_EQ(o.ret, 0);
        EXPECT_EQ(probes, std::vector<U32>{r.probe});
        const std::string tail = Frame(1, r.probe, "probe " + std::to_string(r.probe)) + kAck;
        ASSERT_EQ(o.wire.size(), kAck.size() + r.address + tail.size());
        EXPECT_EQ(o.wire.substr(0, kAck.size()), kAck);
        EXPECT_EQ(o.wire.substr(kAck.size() + r.address), tail);
    }
    EXPECT_GT(SignalStorm::Delivered(), 0);
}

// A channel that says it is ready and gives nothing: hung up (the node's
// descriptor is dead) or closed. The line reader waits out each poll period
// instead of asking again at once, and the pulled cable still ends it.
TEST_F(SessionTest, LineReaderDoesNotSpinOnAChannelThatGivesNothing) {
    const int closed = ::dup(fd);
    ::close(closed);
    const struct { const char *name; int handle; } rows[] = {{"hung up", fd}, {"closed", closed}};
    vdev::Reset();
    for (const auto &r : rows) {
        SCOPED_TRACE(r.name);
        IsDisconnected = 0;
        maa_session::slPollTimeout = MAA_POLL_TIMEOUT;
        U8 buf[MAA_LINE_BUFFER_SIZE];
        const WorkTime t = TimeUntilStopped([&] { MAA_ReadLine(static_cast<U32>(r.handle), buf); },
                                            [] { IsDisconnected = 1; }, 600);
        EXPECT_EQ(buf[0], 0);
        EXPECT_GE(t.wallMs, 500);
        EXPECT_LT(t.wallMs, 3000) << "the pulled cable is noticed while waiting";
        EXPECT_LT(t.cpuMs, t.wallMs / 5) << "the line reader spun";
    }
    IsDisconnected = 0;
}

// ---- the whole road through the print reader and the classifier -------------------

TEST_F(SessionRoad, WrongStartCommandIsPrintData) {
    Send({"\x1bwMAASTARX", "rest of the job"});
    auto jobs = rec::Jobs();
    ASSERT_EQ(jobs.size(), 1u);
    EXPECT_EQ(jobs[0].bytes, "\x1bwMAASTARXrest of the job");
    // Like any data the classifier hands back, it waits for the next transfer.
    EXPECT_EQ(jobs[0].chunks, std::vector<size_t>{25});
    EXPECT_TRUE(vdev::HostRead(vdev::kPrn).empty());
}

TEST_F(SessionRoad, SessionOwnsTheChannelUntilTheStop) {
    for (const char *t : {"\x1bwMAASTART", "probe(3)\r", "MAA-STOP\r", "after"}) vdev::HostWrite(vdev::kPrn, t);
    Bounded([] {
        USBAdapter_ReadPass();
        return 0;
    });
    EXPECT_EQ(Str(vdev::HostRead(vdev::kPrn)), kAck + Frame(1, 3, "probe 3") + kAck);
    EXPECT_TRUE(rec::Jobs().empty());
    EXPECT_EQ(LoggerHost_Count("[USBAdp] MAACommand executed\n"), 1);
    EXPECT_EQ(vdev::PendingHostBytes(vdev::kPrn), 5u) << "the bytes behind the stop are the reader's";
}

// The bridge loses what the host had in flight when the cable goes, so no rest
// of the start command is read as the beginning of the next job.
TEST_F(SessionRoad, StartCommandPulledMidwayLeavesTheNextPrintJobByteExact) {
    const std::string start = "\x1bwMAASTART";
    const std::string job = kUel + "@PJL JOB\r\npage" + kUel;
    LoggerHost_StopCapture();
    for (size_t k = 1; k < start.size(); ++k) {
        SCOPED_TRACE(testing::Message() << "pulled after " << k << " bytes");
        rec::Clear();
        ResetReader();
        IsConfigured = 1;
        IsDisconnected = 0;
        maa_session::slPollTimeout = MAA_POLL_TIMEOUT;
        vdev::SetInstantTimeouts(vdev::kPrn, false);
        vdev::HostWrite(vdev::kPrn, start.substr(0, k));
        std::thread puller([&, k] {
            // The reader has taken the first k bytes and waits for the rest;
            // the rest is in flight when the cable goes.
            WaitUntil([] { return vdev::PendingHostBytes(vdev::kPrn) == 0; }, 5000);
            std::this_thread::sleep_for(std::chrono::milliseconds(20));
            vdev::HostWrite(vdev::kPrn, start.substr(k));
            mfp_notif_t pull{};
            pull.ub_notif = MFP_DEV_DISCONNECT;
            pull.ub_intf = eMfp_Notif_Both;
            vdev::QueueNotification(vdev::kPrn, pull);
            IsConfigured = 0;
            IsDisconnected = 1;
            vdev::ExpirePoll(vdev::kPrn, 10);
        });
        USBAdapter_ReadPass();
        puller.join();
        USBAdapter_EndJobOnPark();
        const size_t before = rec::Jobs().size();

        // Plugged in again; the host sends a print job.
        IsDisconnected = 0;
        IsConfigured = 1;
        vdev::SetInstantTimeouts(vdev::kPrn, true);
        Send({job});
        auto jobs = rec::Jobs();
        ASSERT_EQ(jobs.size(), before + 1);
        EXPECT_EQ(jobs.back().bytes, job);
        EXPECT_TRUE(jobs.back().ended);
        EXPECT_EQ(vdev::PendingHostBytes(vdev::kPrn), 0u);
        vdev::Reset();
        fdPrn = ::open(vdev::kPrn, O_RDWR);
        if (HasFailure()) return;
    }
}

}  // namespace
}  // namespace maasession
