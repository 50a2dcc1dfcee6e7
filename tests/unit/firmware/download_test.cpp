// FirmWareDownload as the classifier calls it: the emulated print node on one
// side, an update manager on loopback on the other.
#include <chrono>

#include "FirmwareFixture.h"
#include "adapter/Classifier.h"

namespace fwtest {
namespace {

using peers::UmMisbehaviour;

// The manager's answers after the checksum: verdict, "$PRO", progress pairs
// (type in the manager's byte order), "$END".
std::string Verdict(uint32_t v) {
    std::string s(4, '\0');
    WriteBE32(reinterpret_cast<uint8_t *>(s.data()), v);
    return s;
}
std::string Progress(uint32_t type, int8_t p) {
    std::string s(5, '\0');
    std::memcpy(s.data(), &type, 4);
    s[4] = static_cast<char>(p);
    return s;
}

// One download and what it leaves: the result, the header handed back as data
// (at most 80 bytes), what stays on the channel for the print reader, the
// lines logged, all within 3 s; a next job the host sends afterwards arrives
// whole.
TEST_F(FirmwareTest, DownloadEndsBoundedAndLeavesTheRestToTheReader) {
    // kUnreached: a manager listens but must not be connected to; kNobody: a
    // port nothing listens on.
    enum Peer { kNone, kManager, kUnreached, kNobody };
    const std::string almost = Header("E7", 4), pcl = "\x1b%-12345X@PJL ENTER LANGUAGE=PCL\r\n";
    const std::string job = pcl + "next job", notFw = "Not a FirmWare\r\n", flush = "Data Read Error: can't Flush\n";
    const std::string body = RandomBytes(3000, 9), image = Header("E8", 500) + RandomBytes(500, 11);
    struct Row {
        const char *what;
        Peer peer;
        std::string stream;
        std::vector<size_t> cuts;  // transfers after the first two bytes, the remainder in one
        S32 result, firmware;      // a positive result: bytes of the stream from handedAt handed back
        size_t handedAt, left;     // left: trailing bytes of the stream still on the channel
        std::vector<std::pair<std::string, int>> lines;  // logged that many times
        bool cablePulled = false;
    } rows[] = {
        // Not firmware: the header comes back, the rest waits for the print reader.
        {"FIRMWARE= without blanks", kNone, "\x1b%-12345X@PJL\r\n@PJL FIRMWARE=E7  " + std::string(60, 'x'), {78},
         80, 0, 0, 13, {{notFw, 1}}},
        {"first byte after ESC", kNone, "\x1b&" + almost.substr(2), {}, 80, 0, 0, 0, {{notFw, 1}}},
        {"CR LF swapped", kNone, almost.substr(0, 13) + "\n\r" + almost.substr(15), {}, 80, 0, 0, 0, {{notFw, 1}}},
        {"last blank", kNone, almost.substr(0, 30) + "x" + almost.substr(31), {}, 80, 0, 0, 0, {{notFw, 1}}},
        {"lower-case pjl", kNone, almost.substr(0, 9) + "@pjl" + almost.substr(13), {}, 80, 0, 0, 0, {{notFw, 1}}},
        {"a print job", kNone, pcl + std::string(100, 'p'), {78}, 80, 0, 0, 54, {{notFw, 1}}},
        {"a UEL alone", kNone, "\x1b%-12345X", {}, 9, 0, 0, 0, {}},
        {"nothing behind ESC %", kNone, "\x1b%", {}, 2, 0, 0, 0,
         {{"Read Failed\r\n", 1}, {"\r\nread 0 bytes so returning [2]\n", 1}}},
        // Failures before the body: the body is discarded, the job behind it stays.
        {"unavailable type", kUnreached, Header("0E7 ", 3000) + body + job, {78, 3000}, -1, 1, 0, job.size(),
         {{"Firmware Type Unknown\r\n", 1}}},
        {"garbage id", kUnreached, Header("\x01\xfe??", 3000) + body + job, {78, 3000}, -1, 1, 0, job.size(),
         {{"Firmware Type Unknown\r\n", 1}}},
        {"no manager", kNobody, Header("E7", 3000) + body + job, {78, 3000}, -1, 1, 0, job.size(),
         {{"can't connect to a server!!!\n", 1}, {"Socket Initialization failed\r\n", 1}}},
        // Cut or over-announced bodies take nothing more.
        {"announced more than sent", kManager, Header("E7", 10000) + body, {78}, -1, 1, 0, 0, {{flush, 5}}},
        {"cable pulled inside the body", kManager, Header("E7", 10000) + body, {78}, -1, 1, 0, 0, {{flush, 1}}, true},
        {"size 0x7fffffff", kManager, Header("E7", 0x7FFFFFFF) + body.substr(0, 100), {78}, -1, 1, 0, 0, {{flush, 5}}},
        // Negative as a count: nothing is taken as body, so the bytes behind
        // the header are the next header, here not firmware.
        {"size 0xffffffff", kManager, Header("E7", 0xFFFFFFFF) + body.substr(0, 100), {78}, 80, 1, 80, 20,
         {{flush, 0}}},
        // What follows the last image decides the end.
        {"nothing after the image", kManager, image, {78, 500}, 0, 1, 0, 0, {}},
        {"a short read after the image", kManager, image + std::string(40, 's'), {78, 500}, 0, 1, 0, 0, {}},
        {"79 bytes after the image", kManager, image + std::string(79, 's'), {78, 500}, 0, 1, 0, 0, {}},
        {"a header after the image that is not firmware", kManager,
         image + (pcl + std::string(60, 'q')).substr(0, 80), {78, 500}, 80, 1, image.size(), 0, {}},
    };
    for (const Row &r : rows) {
        SCOPED_TRACE(r.what);
        ReopenNode();
        LoggerHost_StartCapture();
        if (r.peer == kManager || r.peer == kUnreached) StartManager();
        if (r.peer == kNobody) UsePort(1);
        IsDisconnected = r.cablePulled;
        const auto t0 = std::chrono::steady_clock::now();
        Outcome o = Download(r.stream, r.cuts);
        EXPECT_LT(std::chrono::steady_clock::now() - t0, std::chrono::seconds(3));
        IsDisconnected = 0;
        EXPECT_EQ(o.result, r.result);
        EXPECT_EQ(o.firmware, r.firmware);
        EXPECT_EQ(o.handedBack, r.result > 0 ? r.stream.substr(r.handedAt, static_cast<size_t>(r.result)) : "");
        for (const auto &[line, times] : r.lines) EXPECT_EQ(LoggerHost_Count(line), times) << line;
        if (r.peer == kUnreached) {
            EXPECT_EQ(manager_.Connections(), 0);
        }
        EXPECT_EQ(TakePending(), r.stream.substr(r.stream.size() - r.left));
        manager_.Stop();
        vdev::HostWrite(vdev::kPrn, "next job");
        EXPECT_EQ(TakePending(), "next job");
    }
}

TEST_F(FirmwareTest, CommandLengthOfEightyIsRefusedAndSeventyNineReadsOneByte) {
    const std::string stream = Header("0...", 0) + "next job";
    Outcome o = Download(stream, {}, 80);
    EXPECT_EQ(o.result, -1);
    EXPECT_EQ(o.firmware, 0);
    EXPECT_EQ(LoggerHost_Count("Command Length seems greater than header size (80)\r\n"), 1);
    // Nothing is discarded: the channel still holds what followed.
    EXPECT_TRUE(vdev::ReadSizes(vdev::kPrn).empty());

    ReopenNode();
    o = Download(std::string(79, 'x') + "yz", {1}, 79);
    EXPECT_EQ(vdev::ReadSizes(vdev::kPrn).at(0), 1u);
    EXPECT_EQ(o.result, 80);
    EXPECT_EQ(o.handedBack, std::string(79, 'x') + "y");
    EXPECT_EQ(vdev::PendingHostBytes(vdev::kPrn), 1u);
}

TEST_F(FirmwareTest, ImagesReachTheManagerWithChainedChecksums) {
    StartManager();
    struct Row {
        const char *what;
        std::vector<Image> images;
    } rows[] = {
        {"one image", {{"E7  ", RandomBytes(5000, 1)}}},
        {"odd body length", {{"ec1 ", RandomBytes(1023, 2)}}},
        {"empty body", {{"ED", ""}}},
        {"two images", {{"E1", RandomBytes(70000, 3)}, {"EE4", RandomBytes(333, 4)}}},
        {"three, one empty", {{"E5", RandomBytes(10, 5)}, {"E6", ""}, {"EB", RandomBytes(4097, 6)}}},
    };
    size_t seen = 0;
    int ends = 0;
    for (const Row &r : rows) {
        SCOPED_TRACE(r.what);
        LoggerHost_StartCapture();
        Outcome o = DownloadImages(r.images);
        EXPECT_EQ(o.result, 0);
        EXPECT_EQ(o.firmware, 1);
        EXPECT_EQ(LoggerHost_Count("FirmWare Update Done....Rebooting\r\n"), 1);
        ASSERT_TRUE(manager_.WaitFor([&] { return manager_.Ends() == ends + 1; }, 3000));
        ++ends;
        std::vector<peers::UmImage> got = manager_.Images();
        ASSERT_EQ(got.size(), seen + r.images.size());
        for (size_t i = 0; i < r.images.size(); ++i) {
            const peers::UmImage &im = got[seen + i];
            EXPECT_EQ(im.type, Convert_FW_SubSID(reinterpret_cast<const U8 *>(r.images[i].id.c_str())));
            EXPECT_EQ(im.size, r.images[i].body.size());
            EXPECT_TRUE(im.checksumOk);
            // Only a later image of the file starts from the previous checksum.
            EXPECT_EQ(im.chained, i > 0);
            EXPECT_EQ(ReadFile(im.file), r.images[i].body);
        }
        EXPECT_EQ(ReadFile(TEMP_FW_IMAGE), r.images.back().body);
        seen = got.size();
    }
    EXPECT_TRUE(manager_.Errors().empty());
    // Progress as the manager reported it, named by type.
    EXPECT_EQ(LoggerHost_Count("fw type UI\tProgress 40%\r\n"), 1);
    EXPECT_EQ(LoggerHost_Count("fw type UI\tProgress 100%\r\n"), 1);
}

// Pieces of any length from the host, odd ones splitting words: the manager
// gets the body whole and checksummed, standard output the marks of 1 KiB
// blocks (68 whole and one short).
TEST_F(FirmwareTest, BodyInOddPiecesArrivesWholeWithItsMarks) {
    StartManager();
    const std::string body = RandomBytes(70001, 16);
    Outcome o = Download(Header("E9", static_cast<uint32_t>(body.size())) + body, {78, 1, 3, 4095, 65537});
    EXPECT_EQ(o.result, 0);
    EXPECT_EQ(o.out, "Convert\n" + std::string(64, '#') + "\n" + std::string(5, '#') + "\n");
    ASSERT_EQ(manager_.Images().size(), 1u);
    EXPECT_TRUE(manager_.Images()[0].checksumOk);
    EXPECT_EQ(ReadFile(manager_.Images()[0].file), body);
    EXPECT_EQ(ReadFile(TEMP_FW_IMAGE), body);
}

TEST_F(FirmwareTest, ManagerAnswersDecideTheOutcome) {
    const uint32_t scan = SCAN;
    const std::string tail = "$PRO" + Progress(scan, 50) + Progress(scan, 100) + "$END";
    struct Row {
        const char *what;
        std::string answers;
        S32 result;
        const char *line;  // logged once ("" for none)
    } rows[] = {
        {"verdict 1", Verdict(1) + tail, 0, "FirmWare Update Done....Rebooting\r\n"},
        {"verdict 0 continues", Verdict(0) + tail, 0, "Response got is 0x0000\r\n"},
        {"verdict 3 continues", Verdict(3) + tail, 0, "Response got is 0x0003\r\n"},
        {"verdict 2 stops", Verdict(2) + tail, -1, "Invalid CheckSum Error\r\n"},
        {"no $PRO", Verdict(1) + "$PRX" + tail.substr(4), -1, "PROGRESS not received\r\n"},
        {"progress -1", Verdict(1) + "$PRO" + Progress(scan, 20) + Progress(scan, -1), -1,
         "Download of FirmWare Failed\r\n"},
        {"progress above 100 ends it", Verdict(1) + "$PRO" + Progress(scan, 120) + "$END", 0,
         "fw type SCAN\tProgress 120%\r\n"},
        {"garbage instead of $END", Verdict(1) + "$PRO" + Progress(scan, 100) + "$ENX", -1, ""},
        {"silence after progress", Verdict(1) + "$PRO" + Progress(scan, 10), -1, "Download of FirmWare Failed\r\n"},
        {"silence after the verdict", Verdict(1), -1, "PROGRESS not received\r\n"},
    };
    for (const Row &r : rows) {
        SCOPED_TRACE(r.what);
        LoggerHost_StartCapture();
        const std::string body = RandomBytes(100, 7);
        std::string want = "$IMG" + Verdict(SCAN) + Verdict(100) + body;
        ScriptedPeer peer(r.answers, want.size() + 2);
        UsePort(peer.port());
        Outcome o = DownloadImages({{"E7", body}});
        EXPECT_EQ(o.result, r.result);
        EXPECT_EQ(o.firmware, 1);
        if (*r.line) {
            EXPECT_EQ(LoggerHost_Count(r.line), 1);
        }
        EXPECT_EQ(LoggerHost_Count("FirmWare Update Done....Rebooting\r\n"), r.result == 0 ? 1 : 0);
        // The requests in order; "$END" only when the verdict let it go on.
        const std::string got = peer.finish();
        ASSERT_GE(got.size(), want.size() + 2);
        EXPECT_EQ(got.substr(0, want.size()), want);
        const bool ended = got.size() == want.size() + 6 && got.substr(want.size() + 2) == "$END";
        EXPECT_EQ(ended, std::string(r.what) != "verdict 2 stops");
    }
}

// A manager that sends reports below 100 for ever is heard all along (each
// report is within the receive wait); only the bound on the whole progress
// phase, shortened here, ends it. The others fail or pass well inside it (the
// verdicts and progress the manager may give are the scripted peer's above).
TEST_F(FirmwareTest, MisbehavingManagerFailsTheDownloadWithinItsTimeOuts) {
    UpdateManager_SetProgressLimitMs(600);
    struct Row {
        UmMisbehaviour m;
        S32 result;
        const char *line;
    } rows[] = {
        {UmMisbehaviour::Silence, -1, "PROGRESS not received\r\n"},
        {UmMisbehaviour::EarlyClose, -1, "PROGRESS not received\r\n"},
        {UmMisbehaviour::SlowProgress, 0, "FirmWare Update Done....Rebooting\r\n"},  // 4 pairs, 50 ms apart
        {UmMisbehaviour::EndlessProgress, -1, "PROGRESS not done within 0 s\r\n"},
    };
    for (const Row &r : rows) {
        SCOPED_TRACE(peers::UmMisbehaviourName(r.m));
        LoggerHost_StartCapture();
        StartManager(r.m);
        auto t0 = std::chrono::steady_clock::now();
        Outcome o = DownloadImages({{"E7", RandomBytes(3000, 8)}});
        const auto took = std::chrono::steady_clock::now() - t0;
        EXPECT_LT(took, std::chrono::seconds(3));
        EXPECT_EQ(o.result, r.result);
        EXPECT_EQ(LoggerHost_Count(r.line), 1);
        if (r.m == UmMisbehaviour::EndlessProgress) {
            EXPECT_GE(took, std::chrono::milliseconds(600));
            EXPECT_EQ(LoggerHost_Count("timeout!!!\n"), 0);
            EXPECT_GE(LoggerHost_Count("fw type SCAN\tProgress 1%\r\n"), 1);
            EXPECT_TRUE(manager_.WaitFor([&] { return manager_.Active() == 0; }, 3000)) << "the manager is let go";
        }
        manager_.Stop();
    }
}

// The print reader's view: the classifier's firmware branch, then a print job.
TEST_F(FirmwareTest, ClassifierReportsTheDownloadAndTheReaderGoesOn) {
    StartManager();
    fdPrn = fd_;
    struct Row {
        std::string id;
        S32 result;
        const char *line;
    } rows[] = {
        {"E7", 0, "[USBAdp] Firmware download success\n"},
        {"3...", -2, "[USBAdp] Firmware download failed\n"},
    };
    for (const Row &r : rows) {
        LoggerHost_StartCapture();
        const std::string file = Header(r.id, 10) + RandomBytes(10, 12);
        vdev::HostWrite(vdev::kPrn, file.substr(2, 78));
        vdev::HostWrite(vdev::kPrn, file.substr(80));
        U8 cmd[COMMAND_SIZE] = {0x1B, '%'};
        U8 fw[FRM_DETECT_BUFFER_SIZE];
        S32 firmRes = -9;
        TUSBAdp_ParserID id;
        testing::internal::CaptureStdout();  // the marks and words, kept out of the log
        EXPECT_EQ(USBAdpater_StartDataClassifier(cmd, fw, &firmRes, &id), r.result);
        testing::internal::GetCapturedStdout();
        EXPECT_EQ(LoggerHost_Count(r.line), 1);
        // The download took its file and nothing of the job behind it.
        vdev::HostWrite(vdev::kPrn, "next job");
        EXPECT_EQ(TakePending(), "next job");
    }
    fdPrn = 0;
}

// A process survives many firmware files, successful or refused.
TEST_F(FirmwareTest, ThousandDownloadsLeaveNoDescriptorBehind) {
    StartManager();
    // The manager answers at once; only a loaded machine is slow, and a
    // time-out here would count as a failed download.
    UpdateManager_SetWaitMs(2000);
    const std::vector<Image> images = {{"E7", RandomBytes(64, 13)}, {"E1", RandomBytes(33, 14)}};
    DownloadImages(images);  // first use may open what stays for good (logging)
    ASSERT_TRUE(manager_.WaitFor([&] { return manager_.Active() == 0; }, 3000));
    const int before = OpenDescriptors();
    int ok = 0;
    for (int i = 0; i < 1000; ++i) {
        manager_.SetMisbehaviour(i % 2 ? UmMisbehaviour::ChecksumError : UmMisbehaviour::None);
        ok += DownloadImages(images).result == 0;
        // After a refused first image the rest of the file is the reader's.
        TakePending();
    }
    EXPECT_EQ(ok, 500);
    EXPECT_EQ(manager_.Images().size(), 1000u + 500u + 2u);
    ASSERT_TRUE(manager_.WaitFor([&] { return manager_.Active() == 0; }, 3000));
    EXPECT_EQ(OpenDescriptors(), before);
}

}  // namespace
}  // namespace fwtest
