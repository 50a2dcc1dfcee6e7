// Job framing: the reader's turns over host transfers, seen as the jobs Java
// would get. The first rule everywhere: every byte the host sent as print data
// is passed exactly once, in order.
#include <chrono>
#include <functional>
#include <random>

#include "print/PrintRecorder.h"
#include "support/RandomBytes.h"

namespace {

// Host data the classifier must not take for an application: escapes are
// followed only by '%', another escape or 'E'; partial and spoiled UELs included.
std::string NoisyPayload(size_t size, unsigned seed) {
    static const std::string pieces[] = {"\x1b%-1234", "\x1b\x1b", "\x1b%-12345Y", "\x1b" "E", "\x1b%",
                                         "@PJL SET COPIES=2\r\n", "page text "};
    std::mt19937 rng(seed);
    std::string out;
    while (out.size() < size) {
        if (rng() % 3 == 0) out += pieces[rng() % std::size(pieces)];
        else out += static_cast<char>('a' + rng() % 26);
    }
    out.resize(size);
    while (!out.empty() && out.back() == '\x1b') out.back() = 'z';
    return out;
}

// Cuts `stream` at the given offsets into host transfers.
std::vector<std::string> CutAt(const std::string &stream, const std::vector<size_t> &cuts) {
    std::vector<std::string> out;
    size_t from = 0;
    for (size_t c : cuts) {
        out.push_back(stream.substr(from, c - from));
        from = c;
    }
    out.push_back(stream.substr(from));
    return out;
}

void ExpectJobs(const std::vector<std::string> &expected) {
    auto jobs = rec::Jobs();
    ASSERT_EQ(jobs.size(), expected.size());
    for (size_t i = 0; i < jobs.size(); ++i) {
        EXPECT_EQ(jobs[i].bytes, expected[i]) << "job " << i;
        EXPECT_TRUE(jobs[i].ended) << "job " << i;
    }
}

class Framing : public ReaderTest {
protected:
    // `stream` cut into two and three transfers at every pair of cuts (the second
    // one every `step` bytes), each sent to a fresh reader and node and then
    // `check`ed; with `silence`, after a turn with nothing pending.
    static void EveryCut(const std::string &stream, size_t step, bool silence, const std::function<void()> &check) {
        for (size_t c1 = 1; c1 < stream.size(); ++c1) {
            for (size_t c2 = c1; c2 < stream.size(); c2 += step) {
                SCOPED_TRACE(testing::Message() << "stream of " << stream.size() << ", cuts " << c1 << ", " << c2);
                Restart(true);
                Send(c1 == c2 ? CutAt(stream, {c1}) : CutAt(stream, {c1, c2}), silence);
                check();
                if (HasFailure()) return;
            }
        }
    }
};

// ---- single cases ----------------------------------------------------------

TEST_F(Framing, UelFramedJobInOneReadIsOneJobOfOnePass) {
    const std::string job = Framed("@PJL ENTER LANGUAGE=PCL\r\n" + std::string(200, 'x'));
    Send({job});
    ASSERT_EQ(rec::Events().size(), 3u);
    EXPECT_EQ(rec::Events()[0].kind, rec::Kind::Register);
    EXPECT_EQ(rec::Events()[1].kind, rec::Kind::Pass);
    EXPECT_EQ(rec::Events()[1].data, job);
    EXPECT_EQ(rec::Events()[2].kind, rec::Kind::End);
    // Back to the short wait after the closing UEL.
    EXPECT_EQ(vdev::PollTimeouts(vdev::kPrn), (std::vector<int>{5000, 5000}));
    EXPECT_EQ(LoggerHost_Count("[USBAdp]NotifyEndOfData() called -- 4\n"), 1);
}

TEST_F(Framing, OpenUelJobWaitsFiveMinutesAndSilenceEndsIt) {
    const std::string job = kUel + "@PJL\r\n" + std::string(100, 'y');
    Send({job}, false);
    ASSERT_EQ(rec::Jobs().size(), 1u);
    EXPECT_FALSE(rec::Jobs()[0].ended);
    Silence();
    Silence();
    ExpectJobs({job});
    EXPECT_EQ(vdev::PollTimeouts(vdev::kPrn), (std::vector<int>{5000, 300000, 5000}));
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Print channel poll timeout updated to 5sec\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp]NotifyEndOfData() called -- 2\n"), 1);
}

TEST_F(Framing, HeldUelBytesBecomeAJobOfTheirOwnAfterSilence) {
    for (size_t k = 1; k <= 8; ++k) {
        SCOPED_TRACE(k);
        Restart();
        LoggerHost_StartCapture();
        Send({Framed("A") + kUel.substr(0, k)});
        ExpectJobs({Framed("A"), kUel.substr(0, k)});
        EXPECT_EQ(LoggerHost_Count("[USBAdp] Going to call RegisterJob...New Job Created! 1\n"), 1);
    }
}

// Host transfers and the jobs they make. Data without a UEL is one job until
// silence, held UEL bytes included; a UEL behind data ends the job, unless it
// is last in the read and the job's first.
TEST_F(Framing, TransfersMakeTheJobsOfTheStream) {
    const struct {
        std::vector<std::string> transfers, jobs;
        bool silenceEnds;  // the last job is open until the silence after the transfers
        const char *line;
    } rows[] = {
        {{"Z"}, {"Z"}, true, nullptr},
        {{"Y", "ab", "c"}, {"Yabc"}, true, nullptr},
        {{"plain page data\x1b%-12"}, {"plain page data\x1b%-12"}, true,
         "[USBAdp]Held UEL bytes passed at end of job: [5]\n"},
        {{"end of a job\x1b%-12345X\x1b%-12345Xnext\x1b%-12345X"},
         {"end of a job\x1b%-12345X", "\x1b%-12345Xnext\x1b%-12345X"}, false, nullptr},
        {{"lead-in\x1b%-12345X", "body\x1b%-12345X"}, {"lead-in\x1b%-12345Xbody\x1b%-12345X"}, false, nullptr},
    };
    for (const auto &r : rows) {
        SCOPED_TRACE(r.jobs[0]);
        Restart();
        LoggerHost_StartCapture();
        Send(r.transfers, false);
        ASSERT_EQ(rec::Jobs().size(), r.jobs.size());
        EXPECT_EQ(rec::Jobs().back().ended, !r.silenceEnds);
        Silence();
        ExpectJobs(r.jobs);
        ExpectLoggedOnce(r.line);
    }
}

TEST_F(Framing, ShortPjlPrefixIsDeliveredWithoutAFurtherRead) {
    const std::string first = kUel + "@PJL\r\n";
    vdev::HostWrite(vdev::kPrn, first);
    vdev::HostWrite(vdev::kPrn, "more data");
    USBAdapter_ReadPass();
    EXPECT_EQ(vdev::ReadSizes(vdev::kPrn).size(), 1u);
    EXPECT_EQ(vdev::PendingHostBytes(vdev::kPrn), 9u);
    auto jobs = rec::Jobs();
    ASSERT_EQ(jobs.size(), 1u);
    EXPECT_EQ(jobs[0].chunks, (std::vector<size_t>{first.size()}));
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Data less than 80bytes: 15\n"), 1);
}

// An empty transfer reads as 0 bytes: it ends a job like a silence, at once,
// also when UEL bytes are held for it.
TEST_F(Framing, EmptyTransferEndsTheJobAtOnce) {
    const auto start = std::chrono::steady_clock::now();
    for (const char *data : {"page\x1b%-12", "more"}) {
        vdev::HostWrite(vdev::kPrn, data);
        vdev::HostWrite(vdev::kPrn, "");
        USBAdapter_ReadPass();
        USBAdapter_ReadPass();
    }
    ExpectJobs({"page\x1b%-12", "more"});
    EXPECT_EQ(vdev::ExpiredPolls(vdev::kPrn), 0u) << "a silence, not the empty transfer, ended a job";
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(2)) << "an empty transfer took a period";
}

TEST_F(Framing, RefusedJobDropsItsChunkAndTheNextChunkTriesAgain) {
    rec::registerAnswer = -1;
    Send({"dropped"}, false);
    EXPECT_EQ(rec::Delivered(), "");
    EXPECT_EQ(LoggerHost_Count("[USBAdp]returning back\n"), 1);
    rec::registerAnswer = 1;
    Send({"kept"});
    ExpectJobs({"kept"});

    // The same with framed jobs: the refused job's UEL is not counted for the next.
    rec::Clear();
    rec::registerAnswer = -1;
    Send({Framed("refused")}, false);
    rec::registerAnswer = 1;
    Send({Framed("accepted")});
    ExpectJobs({Framed("accepted")});

    // The refused chunk ends in a cut UEL behind eleven bytes of data; the next,
    // shorter chunk has no escape and is a job of its own, as it is.
    Restart();
    rec::registerAnswer = -1;
    Send({"longer data\x1b%"}, false);
    rec::registerAnswer = 1;
    Send({"ab"});
    ExpectJobs({"ab"});
}

// The reader takes a whole transfer at once; a host application that reads
// the node itself must still find the transfer's rest there, in order, and
// what it leaves is classified again, as if read from the node. A packet
// between jobs is no print data.
TEST_F(Framing, ApplicationsReadTheRestOfTheirTransfer) {
    auto header = [](char app, char len) { return std::string{'\x1b', '\x91', 0, 0, 0, 0, 0, app, 0, 0, 0, 0, 0, 0, 0, len}; };
    const std::string nd = header(0x0D, 4), bare = header(0x0D, 0), other = header(0x22, 0), big(3u << 19, 'b');
    struct Row {
        const char *what;
        std::vector<std::string> transfers;
        std::vector<std::string> appWrites;
        std::vector<std::string> jobs;
        std::vector<size_t> chunks;  // of the first job
    } const rows[] = {
        {"packet between two jobs", {Framed("one"), bare, Framed("two")}, {bare}, {Framed("one"), Framed("two")},
         {21}},
        {"packet and print data in one transfer", {nd + "body" + "print"}, {nd, "body"}, {"print"}, {5}},
        {"body cut across transfers", {nd + "bo", "dy" + Framed("x")}, {nd, "body"}, {Framed("x")}, {19}},
        {"unknown header is print data", {other + "data"}, {}, {other + "data"}, {20}},
        // Longer than one read of data: the first chunk is as long as before.
        {"unknown header, transfer longer than a read", {other + big}, {}, {other + big},
         {16 + (1u << 20), big.size() - (1u << 20)}},
    };
    LoggerHost_StopCapture();
    for (const Row &r : rows) {
        SCOPED_TRACE(r.what);
        rec::Clear();
        ResetReader();
        Send(r.transfers);
        auto apps = rec::Apps();
        ASSERT_EQ(apps.size(), r.appWrites.empty() ? 0u : 1u);
        if (!apps.empty()) {
            EXPECT_EQ(apps[0].writes, r.appWrites);
        }
        auto jobs = rec::Jobs();
        ASSERT_EQ(jobs.size(), r.jobs.size());
        for (size_t i = 0; i < jobs.size(); ++i) EXPECT_TRUE(jobs[i].bytes == r.jobs[i] && jobs[i].ended) << i;
        EXPECT_EQ(jobs[0].chunks, r.chunks);
    }
}

// ---- matrices: every cut ---------------------------------------------------

// Every cut, inside a UEL (after any of its bytes, the tail alone in a
// transfer or with more data behind it) or elsewhere, gives the jobs of the
// uncut stream, and no job waits for silence.
TEST_F(Framing, FramedJobsSurviveEveryCutIntoTwoAndThreeTransfers) {
    const std::vector<std::string> payloads = {NoisyPayload(23, 1), "", NoisyPayload(31, 2)};
    std::string stream;
    std::vector<std::string> expected;
    for (const std::string &p : payloads) {
        expected.push_back(Framed(p));
        stream += expected.back();
    }
    LoggerHost_StopCapture();
    EveryCut(stream, 1, false, [&] {
        ExpectJobs(expected);
        EXPECT_EQ(vdev::ExpiredPolls(vdev::kPrn), 0u) << "a job waited for silence";
    });
}

TEST_F(Framing, LooseStreamsPassEveryByteOnceWhereverTheyAreCut) {
    const std::vector<std::string> streams = {
        "lead" + kUel + kUel + NoisyPayload(20, 3) + kUel + "trail\x1b%-12",
        NoisyPayload(30, 4) + kUel + NoisyPayload(10, 5),
        kUel + "a" + kUel + "b" + kUel + "c" + kUel + kUel,
        "\x1b%-12345Y\x1b%-1234" + kUel + "\x1b\x1b%-12345X",
    };
    LoggerHost_StopCapture();
    for (const std::string &stream : streams) {
        EveryCut(stream, 3, true, [&] {
            EXPECT_EQ(rec::Delivered(), stream);
            for (const rec::Job &j : rec::Jobs()) EXPECT_TRUE(j.ended);
        });
        if (HasFailure()) return;
    }
}

// ---- the UEL detector: where a whole UEL lies, and how much of a UEL cut by
// the end of a buffer is present

class UelDetection : public ::testing::Test {
protected:
    void SetUp() override {
        LoggerHost_StartCapture();
        Clear();
    }
    static void Clear() {
        jobCounter = 0;
        splitPatternFlag = 0;
        splitPatternMarker = 0;
        UelPosition = -1;
    }

    static S32 Check(std::string bytes) {
        return CheckUELCommand(reinterpret_cast<U8 *>(bytes.data()), static_cast<S32>(bytes.size()));
    }
};

// Where the first whole UEL lies; a mismatch is scanned again from the
// mismatching byte. A UEL cut by the end of the buffer (a lone escape too) is
// no UEL: the answer is how many of its bytes are present.
TEST_F(UelDetection, FirstWholeUelIsFoundWhereverItLiesAndCounted) {
    struct Row {
        std::string bytes;
        S32 found, position, marker;  // answer, UelPosition, splitPatternMarker
    };
    std::vector<Row> rows = {
        {"\x1b%-12345X", 1, 0, 0},
        {"@PJL data \x1b%-12345Xtail", 1, 10, 0},
        {"ab\x1b%-12345Xcd\x1b%-12345X", 1, 2, 0},
        {"\x1b%-12345Y\x1b%-12345X", 1, 9, 0},
        {"\x1b%-12345\x1b%-12345X", 1, 8, 0},
        {"\x1b%-12345Y tail", 0, 0, 0},
        {"\x1b", 0, 0, 1},
    };
    for (int present = 1; present <= 8; ++present)
        rows.push_back({"job data" + kUel.substr(0, present), 0, 8, present});
    for (const Row &r : rows) {
        SCOPED_TRACE(testing::PrintToString(r.bytes));
        Clear();
        EXPECT_EQ(Check(r.bytes), r.found);
        EXPECT_EQ(UelPosition, r.position);
        EXPECT_EQ(jobCounter, r.found);
        EXPECT_EQ(splitPatternMarker, r.marker);
        EXPECT_EQ(splitPatternFlag, r.marker > 0 ? 1 : 0);
    }
    EXPECT_EQ(LoggerHost_Count("[USBAdp]return TRUE HITT UelPosition[10]\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp]splitPatternMarker : [7]\n"), 1);
}

TEST_F(UelDetection, SplitFlagIsLeftForTheReaderToClear) {
    EXPECT_EQ(Check("abc\x1b%-"), 0);
    EXPECT_EQ(splitPatternFlag, 1);
    EXPECT_EQ(Check("no escape here"), 0);
    EXPECT_EQ(splitPatternFlag, 1);
    EXPECT_EQ(splitPatternMarker, 3);
    EXPECT_EQ(Check(""), 0);
}

// ---- large jobs --------------------------------------------------------------

// Transfers of `size`; a transfer never starts with an escape, which would
// make the classifier look for a host application there.
std::vector<std::string> Transfers(const std::string &stream, size_t size) {
    std::vector<std::string> out;
    for (size_t at = 0; at < stream.size(); at += size) {
        out.push_back(stream.substr(at, size));
        if (at > 0 && out.back()[0] == '\x1b') out.back()[0] = 'A';
    }
    return out;
}

// A 40 MiB framed job in 1 MiB transfers, each passed in one chunk, and a 9 MiB
// unframed one in odd transfer sizes that ends in a held escape.
TEST_F(Framing, LargeJobsArriveWhole) {
    LoggerHost_StopCapture();
    std::vector<std::string> unframed = Transfers(RandomBytes(9u << 20, 7), (1u << 20) - 3);
    unframed.push_back("\x1b");
    const std::pair<std::vector<std::string>, size_t> cases[] = {
        {Transfers(Framed(RandomBytes((40u << 20) - 18, 42)), 1u << 20), 40}, {unframed, 0}};
    for (const auto &[transfers, chunks] : cases) {
        Restart();
        std::string stream;
        for (const std::string &t : transfers) stream += t;
        Send(transfers);
        auto jobs = rec::Jobs();
        ASSERT_EQ(jobs.size(), 1u);
        EXPECT_TRUE(jobs[0].bytes == stream) << "delivered " << jobs[0].bytes.size() << " of " << stream.size();
        EXPECT_TRUE(jobs[0].ended);
        EXPECT_TRUE(!chunks || jobs[0].chunks.size() == chunks) << jobs[0].chunks.size() << " chunks";
    }
}

}  // namespace
