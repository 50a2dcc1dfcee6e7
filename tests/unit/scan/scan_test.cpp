// The scan channel over the emulated scan node, application transfers going to
// the print recorder instead of Java: each protocol's length rule and what Java
// receives, capability and print-image requests, refusals and read errors, and
// the reader's life (open and close from Java threads, the configuration event,
// idling, a close while the host keeps sending).
#include <atomic>
#include <cstring>
#include <thread>

#include "common/ByteOrder.h"
#include "print/PrintRecorder.h"
#include "scan/USBScan.h"
#include "scan/scan_thread.h"
#include "support/Bytes.h"
#include "support/MsgQueue.h"
#include "support/WaitUntil.h"
#include "vendor/VLX_Main.h"

#define SCAN_JNI(name) Java_com_tarnwel_vbk_common_qz_services_usbadapter_USBAdapterPrintAndScanJNIService_##name
extern "C" {
jint SCAN_JNI(USBScanDrvOpen)(JNIEnv *, jobject);
jint SCAN_JNI(USBScanDrvClose)(JNIEnv *, jobject);
void SCAN_JNI(readScanMsg)(JNIEnv *, jobject, jobject);
}

namespace {

using Forwards = std::vector<std::pair<std::string, std::string>>;

// Each transfer as Java got it: type and all bytes written.
Forwards Forwarded() {
    Forwards out;
    for (const rec::App &a : rec::Apps()) {
        std::string all;
        for (const std::string &w : a.writes) all += w;
        EXPECT_TRUE(a.closed) << a.type << " transfer not closed";
        out.emplace_back(a.type, all);
    }
    return out;
}

// The print reader's fixture with the scan node open too; the scan tests send
// on the scan node and turn the scan reader.
class ScanTest : public ReaderTest {
protected:
    void SetUp() override {
        ReaderTest::SetUp();
        g_IsScanCanClose = 0;
        fdScan = -1;
        ASSERT_EQ(USBAdpScan_Openfd(), 1);
        slDeviceHndl = fdScan.load();
    }
    void TearDown() override {
        if (fdScan > 0) ::close(fdScan);
        fdScan = -1;
        g_IsScanCanClose = 0;
        ReaderTest::TearDown();
    }

    static void ScanSend(const std::vector<std::string> &transfers) {
        for (const std::string &t : transfers) vdev::HostWrite(vdev::kScan, t);
    }
    // Reader turns until the host's bytes are all taken (bounded).
    static void ScanDrain() {
        for (int turns = 0; vdev::PendingHostBytes(vdev::kScan) > 0; ++turns) {
            ASSERT_LT(turns, 10000) << "the reader stopped taking host data";
            USBAdpScan_ReadTurn();
        }
    }
    static std::string Reply() {
        auto r = vdev::HostRead(vdev::kScan);
        return std::string(r.begin(), r.end());
    }
};

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
        std::string command = r.command;
        U8 held[16];  // what the command buffer holds when the result is a count
        std::memset(held, 0xEE, sizeof held);
        EXPECT_EQ(Vlx_Cap_Xml(fd, reinterpret_cast<U8 *>(command.data()), static_cast<S32>(command.size()), held),
                  r.result);
        if (r.result > 0) {
            EXPECT_EQ(std::string(reinterpret_cast<char *>(held), static_cast<size_t>(r.result)), r.held);
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

// The print reader over the print node; the scan channel must stay untouched.
using PrintChannelScan = ScanTest;

TEST_F(PrintChannelScan, HandlersAnswerOnThePrintChannelAndTheNextJobIsWhole) {
    const std::string job = kUel + "@PJL JOB\r\n" + std::string(500, 'j') + kUel;
    const std::string pcscan = Bytes({0x1B, 0xA8, 0x24, 0x01, 'p', 'q', 'r'});
    const std::string light = Bytes({0x1B, 0xAA, 0x02, 0x02, 'l', 'm'});
    const std::string s2a = Bytes({0x1B, 0x9A, 0x01, 0, 0, 0, 0, 7});
    const std::string swallowed = Bytes({0x1B, 0x24, 0xF4, 0x07, 0, 0, 0, 0, 0, 0});
    Send({pcscan, job, light, s2a, swallowed, job});
    EXPECT_EQ(Forwarded(), (Forwards{{"pcscan", pcscan}, {"taviklight", light}, {"scan2pc", s2a}}));
    const auto jobs = rec::Jobs();
    ASSERT_EQ(jobs.size(), 2u);
    EXPECT_EQ(jobs[0].bytes, job);
    EXPECT_EQ(jobs[1].bytes, job);
    EXPECT_EQ(vdev::ReadCalls(vdev::kScan), 0u);
    EXPECT_TRUE(vdev::HostRead(vdev::kPrn).empty());
}



std::string Scan2AppHeader(int kind, U32 xmlSize) {
    std::string h = Bytes({0x1B, 0x9A, kind, 0x55, 0, 0, 0, 0});
    WriteBE32(reinterpret_cast<U8 *>(h.data()) + 4, xmlSize);
    return h;
}
const std::string kIds = Bytes({0x1B, 0x91, 0, 0, 0, 0, 0, 3, 0, 0, 0, 1, 0, 0, 0, 0});

// Each protocol forwards exactly its packet; what no handler takes, or a length
// past what can be held, is logged and dropped, and the reader goes on.
TEST_F(ScanTest, EachProtocolForwardsExactlyItsPacketAndDropsTheRest) {
    const std::string pcscan0 = Bytes({0x1B, 0xA8, 0x10, 0x00});
    const std::string setWindow = Bytes({0x1B, 0xA8, 0x24, 0x13}) + std::string(0x15, 'w');
    const std::string light255 = Bytes({0x1B, 0xAA, 0x01, 0xFF}) + std::string(255, 'L');
    const std::string xml20 = "<apps><a>scan</a></apps>";
    const std::string s2a20 = Scan2AppHeader(3, static_cast<U32>(xml20.size()));
    const char *noXml = "[USBAdp Scan] Error in allocation for pubAppXML, errno: 12\n";
    const struct {
        const char *name;
        std::vector<std::string> transfers;  // what the host sends
        Forwards forwarded;                  // what Java gets
        std::vector<const char *> lines;     // logged once each
    } cases[] = {
        {"pc-scan L 0", {pcscan0}, {{"pcscan", pcscan0}}, {"[USBAdp Scan] slPCScanCDBSize: 4\n"}},
        {"pc-scan set window takes L + 2", {setWindow}, {{"pcscan", setWindow}},
         {"[USBAdp Scan] PCScan packet size for SET WINDOW PARAMETER (1B A8 24 13): 21\n"}},
        {"pc-scan in pieces", {"\x1b\xa8", "\x10\x05", "ab", "cde"}, {{"pcscan", "\x1b\xa8\x10\x05" "abcde"}}, {}},
        {"pc-scan 1B A8 24 FE is refused", {Bytes({0x1B, 0xA8, 0x24, 0xFE})}, {},
         {"[USBAdp Scan] slPacketSize[0x100] > 0xFF\n", "[USBAdp Scan] USBAdpScan_PCScan() failed\n"}},
        {"light protocol L 255 fills the buffer", {light255}, {{"taviklight", light255}},
         {"[USBAdp Scan] slTAVIK_Light_command_size: 259\n"}},
        {"scan-to-application kind 1 is its header", {Scan2AppHeader(1, 0x40)}, {{"scan2pc", Scan2AppHeader(1, 0x40)}},
         {"[USBAdp Scan] USB Get User Selected List sent\n"}},
        {"kind 0 with an XML of 5 forwards only the header", {Scan2AppHeader(0, 5), "<a/>\n"},
         {{"scan2pc", Scan2AppHeader(0, 5)}}, {"[USBAdp Scan] USB Send Application List sent\n"}},
        {"kind 3 forwards header and XML", {s2a20, xml20.substr(0, 7), xml20.substr(7)}, {{"scan2pc", s2a20 + xml20}},
         {}},
        {"ID-scan", {kIds}, {{"ids", kIds}}, {}},
        {"XML length 0xFFFFFFFF", {Scan2AppHeader(0, 0xFFFFFFFFu), pcscan0}, {{"pcscan", pcscan0}}, {noXml}},
        {"XML length 0x80000000", {Scan2AppHeader(0, 0x80000000u), pcscan0}, {{"pcscan", pcscan0}}, {noXml}},
        {"XML length past the limit", {Scan2AppHeader(0, SCAN2APP_XML_MAX + 1), pcscan0}, {{"pcscan", pcscan0}},
         {noXml}},
        {"1B 77", {Bytes({0x1B, 0x77})}, {}, {"[USBAdp Scan] HostApp not supported [0x1b 0x77]\n"}},
        {"41 1B", {Bytes({0x41, 0x1B})}, {}, {"[USBAdp Scan] HOSTApp not supported [0x41 0x1b]\n"}},
        // One byte, judged on the cleared rest.
        {"1B alone", {Bytes({0x1B})}, {}, {"[USBAdp Scan] HostApp not supported [0x1b 0]\n"}},
        {"7F alone", {Bytes({0x7F})}, {}, {"[USBAdp Scan] HOSTApp not supported [0x7f 0]\n"}},
        {"ID-scan, last byte 1", {kIds.substr(0, 15) + "\x01"}, {}, {"[USBAdp Scan] Not IDS header\n"}},
        // 1B 91 and 5 bytes, zero-filled to 16: bytes 7 (3) and 11 (1) are missing.
        {"ID-scan cut", {kIds.substr(0, 7)}, {}, {"[USBAdp Scan] Not IDS packet\n"}},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.name);
        rec::Clear();
        LoggerHost_StartCapture();
        ScanSend(c.transfers);
        ScanDrain();
        EXPECT_EQ(Forwarded(), c.forwarded);
        for (const char *line : c.lines) EXPECT_EQ(LoggerHost_Count(line), 1) << line;
        EXPECT_EQ(Reply(), "");
    }
}

TEST_F(ScanTest, IdScanWithAnyByteChangedIsRefused) {
    for (size_t i = 2; i < kIds.size(); ++i) {
        std::string header = kIds;
        header[i] = static_cast<char>(header[i] ^ 0x40);
        EXPECT_EQ(USBAdpScan_IDS(reinterpret_cast<U8 *>(header.data())), -1) << "byte " << i;
    }
    EXPECT_TRUE(rec::Events().empty());
    std::string header = kIds;
    EXPECT_EQ(USBAdpScan_IDS(reinterpret_cast<U8 *>(header.data())), 0);
}

TEST_F(ScanTest, JavaRefusalsEndTheTransferWithItsLine) {
    struct Row {
        std::string packet;
        const char *line;
        int failAt;  // 1 type, 2 first buffer, 3 XML buffer, 4 end
    } rows[] = {
        {Bytes({0x1B, 0xA8, 0, 0}), "[USBAdp Scan] [PCScan] Error in Sending pcscan AppType\n", 1},
        {Bytes({0x1B, 0xA8, 0, 0}), "[USBAdp Scan] [PCScan] Error in sending pcscan buffer\n", 2},
        {Bytes({0x1B, 0xAA, 0, 0}), "[USBAdp Scan] [TAVIK_LIGHT] Error in Notify End of taviklight job\n", 3},
        {kIds, "[USBAdp Scan] [IDS] Error in sending ids buffer\n", 2},
        {Scan2AppHeader(0, 9) + "123456789", "[USBAdp Scan] [Scan2PC] Error in Sending scan2pc buffer\n", 2},
        {Scan2AppHeader(0, 9) + "123456789", "[USBAdp Scan] [Scan2PC] Error in sending scan2pc buffer\n", 3},
        {Scan2AppHeader(0, 9) + "123456789", "[USBAdp Scan] [Scan2PC] Error in Notify End of scan2pc job\n", 4},
    };
    static int call, failAt;
    static const TPrintDelivery failing = {
        rec::RegisterJob, rec::PassData, rec::NotifyEndOfData,
        [](const char *t) { return ++call == failAt ? -1 : rec::SendAppType(t); },
        [](const char *t, U8 *b, S32 n) { return ++call == failAt ? -1 : rec::SendAppBuf(t, b, n); },
        [](const char *t) { return ++call == failAt ? -1 : rec::NotifyAppEnd(t); }};
    USBPrint_SetDelivery(&failing);
    for (const Row &r : rows) {
        SCOPED_TRACE(r.line);
        call = 0;
        failAt = r.failAt;
        LoggerHost_StartCapture();
        ScanSend({r.packet});
        ScanDrain();
        EXPECT_EQ(LoggerHost_Count(r.line), 1);
        EXPECT_EQ(call, r.failAt) << "went on after the refusal";
    }
}

TEST_F(ScanTest, PacketCutByCloseOrCableIsDroppedWhole) {
    for (bool cable : {false, true}) {
        SCOPED_TRACE(cable ? "cable" : "close");
        rec::Clear();
        LoggerHost_StartCapture();
        ScanSend({Bytes({0x1B, 0xA8, 0x01, 0x10}), "half"});
        // The host stops; the reader waits out driver time-outs until the channel goes.
        std::thread closer([cable] {
            WaitUntil([] { return vdev::PendingHostBytes(vdev::kScan) == 0; });
            if (cable)
                IsDisconnected = 1;
            else
                g_IsScanCanClose = 1;
            vdev::ExpireRead(vdev::kScan);
        });
        USBAdpScan_ReadTurn();
        closer.join();
        EXPECT_TRUE(rec::Events().empty());
        EXPECT_EQ(LoggerHost_Count("[USBAdp Scan] PCScan packet cut after 4 of 16 bytes, dropped\n"), 1);
        EXPECT_EQ(LoggerHost_Count("[USBAdp Scan] USBAdpScan_PCScan() failed\n"), 1);
        IsDisconnected = 0;
        g_IsScanCanClose = 0;
    }
}

TEST_F(ScanTest, ReadErrorsEndTheHandlerWithTheirLine) {
    struct Row {
        U8 selector;
        const char *line;
    } rows[] = {
        {0xA8, "[USBAdp Scan] Error in reading PCScan operation code, errno: 9\n"},
        {0xAA, "[USBAdp Scan] Error in reading TAVIK Light operation code, errno: 9\n"},
        {0x9A, "[USBAdp Scan] Error in reading Scan2App header, errno: 9\n"},
        {0x24, "[USBAdp Scan] Error in reading VLX header, errno: 9\n"},
    };
    slDeviceHndl = 999;  // not a descriptor: EBADF
    for (const Row &r : rows) {
        U8 first2[2] = {0x1B, r.selector};
        switch (r.selector) {
        case 0xA8: EXPECT_EQ(USBAdpScan_PCScan(first2), -2); break;
        case 0xAA: USBAdpScan_TAVIK_Light(first2); break;
        case 0x9A: USBAdpScan_Scan2App(first2); break;
        default: EXPECT_EQ(USBAdpScan_VLX(first2), -1); break;
        }
        EXPECT_EQ(LoggerHost_Count(r.line), 1) << r.line;
    }
    EXPECT_TRUE(rec::Events().empty());
}



jint DrvOpen() { return SCAN_JNI(USBScanDrvOpen)(nullptr, nullptr); }
jint DrvClose() { return SCAN_JNI(USBScanDrvClose)(nullptr, nullptr); }

using ScanReader = ScanTest;

TEST_F(ScanReader, OpenAndCloseEntries) {
    // Close before any open.
    ::close(fdScan);
    fdScan = -1;
    EXPECT_EQ(DrvClose(), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp Scan] fdScan[-1] < 0\n"), 1);
    EXPECT_EQ(g_IsScanCanClose.load(), 1);

    // Open twice keeps the first descriptor.
    EXPECT_EQ(DrvOpen(), 1);
    const S32 first = fdScan.load();
    EXPECT_EQ(g_IsScanCanClose.load(), 0);
    EXPECT_EQ(DrvOpen(), 1);
    EXPECT_EQ(fdScan.load(), first);
    EXPECT_EQ(vdev::OpenCount(vdev::kScan), 1);

    EXPECT_EQ(DrvClose(), 1);
    EXPECT_EQ(fdScan.load(), -1);
    EXPECT_EQ(vdev::OpenCount(vdev::kScan), 0);

    vdev::SetPresent(vdev::kScan, false);
    EXPECT_EQ(DrvOpen(), -1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp Scan] Scan channel not present(/dev/usb/mfp_scan), errno:2\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp Scan] Native method USBAdpScan_Openfd() failed\n"), 1);

    // readScanMsg returns to Java when the node cannot be opened.
    LoggerHost_StartCapture();
    SCAN_JNI(readScanMsg)(nullptr, nullptr, nullptr);
    EXPECT_EQ(LoggerHost_Count("[USBAdp Scan] (env(0) == NULL) || (p_scan_obj(0) == NULL)\n"), 1);
}

TEST_F(ScanReader, EventsBeforeConfigurationAreIgnoredOneByOne) {
    const int queue = msgget(IPC_PRIVATE, IPC_CREAT | 0600);
    ASSERT_GE(queue, 0);
    globalScanMsgQ = queue;
    for (S32 status : {MFP_DEV_DISCONNECT, 0x05, MFP_DEV_CONFIGURED, 0x07}) {
        TMessageBuf m{};
        m.mtype = 1;
        m.status = status;
        ASSERT_EQ(msgsnd(queue, &m, MSGBUF_TEXT_SIZE, IPC_NOWAIT), 0);
    }
    EXPECT_FALSE(USBAdpScan_TakeEvent());
    EXPECT_FALSE(USBAdpScan_TakeEvent());
    EXPECT_TRUE(USBAdpScan_TakeEvent());
    EXPECT_EQ(LoggerHost_Count("[USBAdp Scan] Unknown event:13\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp Scan] Unknown event:5\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp Scan] Received MFP_DEV_CONFIGURED event\n"), 1);
    // What follows stays in the queue: the scan side reads no more events.
    EXPECT_EQ(TakeQueueStatus(queue), 0x07);
    RemoveQueue(queue);
    globalScanMsgQ = -1;
}

TEST_F(ScanReader, IdlesWithoutTouchingTheNodeUntilItMayRead) {
    struct Row {
        U8 configured, closed;
        const char *line;
    } rows[] = {
        {0, 0, "[USBAdp Scan] g_IsScanCanClose: 0, IsConfigured: 0\n"},
        {1, 1, "[USBAdp Scan] g_IsScanCanClose: 1, IsConfigured: 1\n"},
    };
    for (const Row &r : rows) {
        SCOPED_TRACE(r.line);
        LoggerHost_StartCapture();
        IsConfigured = r.configured;
        g_IsScanCanClose = r.closed;
        ScanSend({Bytes({0x1B, 0xA8, 0, 0})});
        std::atomic<bool> done{false};
        std::thread reader([&] {
            USBAdpScan_ReadTurn();
            done = true;
        });
        ASSERT_TRUE(WaitUntil([&] { return LoggerHost_Count(r.line) == 1; }));
        // An idle turn lasts its second unless reading may resume.
        std::this_thread::sleep_for(std::chrono::milliseconds(60));
        EXPECT_FALSE(done.load());
        IsConfigured = 1;
        g_IsScanCanClose = 0;
        EXPECT_TRUE(WaitUntil([&] { return done.load(); }, 500));
        reader.join();
        EXPECT_EQ(vdev::ReadCalls(vdev::kScan), 0u);
        EXPECT_EQ(vdev::PollCalls(vdev::kScan), 0u);
        EXPECT_TRUE(rec::Events().empty());
        ScanDrain();
        EXPECT_EQ(rec::Apps().size(), 1u);
        rec::Clear();
        vdev::Reset();
        fdScan = -1;
        ASSERT_EQ(USBAdpScan_Openfd(), 1);
    }
}

// A close waits for the packet the reader is in: it is read whole when the
// rest comes, dropped whole when it does not.
TEST_F(ScanReader, CloseWaitsForThePacketInProgress) {
    const std::string head = Bytes({0x1B, 0xAA, 0x07, 0x05});
    for (bool restComes : {true, false}) {
        SCOPED_TRACE(restComes ? "rest comes" : "host silent");
        rec::Clear();
        ScanSend({head});
        std::thread reader([] { USBAdpScan_ReadTurn(); });
        ASSERT_TRUE(WaitUntil([] { return vdev::PendingHostBytes(vdev::kScan) == 0; }));
        std::atomic<jint> closed{0};
        std::thread closer([&] { closed = DrvClose(); });
        ASSERT_TRUE(WaitUntil([] { return g_IsScanCanClose.load() == 1; }));
        std::this_thread::sleep_for(std::chrono::milliseconds(30));
        EXPECT_EQ(closed.load(), 0) << "closed under the reader";
        EXPECT_EQ(vdev::OpenCount(vdev::kScan), 1);
        if (restComes)
            vdev::HostWrite(vdev::kScan, "body!");
        else
            vdev::ExpireRead(vdev::kScan);
        reader.join();
        closer.join();
        EXPECT_EQ(closed.load(), 1);
        EXPECT_EQ(fdScan.load(), -1);
        const Forwards expected = restComes ? Forwards{{"taviklight", head + "body!"}} : Forwards{};
        EXPECT_EQ(Forwarded(), expected);
        ASSERT_EQ(DrvOpen(), 1);
    }
}

// The host sends packets without pause, each in two transfers, while Java
// closes and re-opens the channel: every packet reaches Java whole and in order.
TEST_F(ScanReader, CloseAndReopenWhileTheHostSendsTakesNoPacketHalf) {
    constexpr int kPackets = 200;
    std::vector<std::string> packets;
    for (int i = 0; i < kPackets; ++i) {
        std::string body(static_cast<size_t>(1 + i % 40), static_cast<char>('a' + i % 26));
        body[0] = static_cast<char>(i);
        packets.push_back(Bytes({0x1B, 0xAA, 0x07, static_cast<int>(body.size())}) + body);
    }
    std::atomic<bool> stop{false};
    std::thread reader([&] {
        while (!stop) USBAdpScan_ReadTurn();
    });
    std::thread host([&] {
        // Cut after the selector or after the length: the two reads the
        // protocol makes before the body.
        for (size_t i = 0; i < packets.size(); ++i) {
            const size_t cut = i % 2 ? 2 : 4;
            vdev::HostWrite(vdev::kScan, packets[i].substr(0, cut));
            std::this_thread::sleep_for(std::chrono::microseconds(50));
            vdev::HostWrite(vdev::kScan, packets[i].substr(cut));
        }
    });
    int cycles = 0;
    while (vdev::PendingHostBytes(vdev::kScan) > 0 || cycles < 20) {
        ASSERT_EQ(DrvClose(), 1);
        EXPECT_EQ(fdScan.load(), -1);
        std::this_thread::sleep_for(std::chrono::microseconds(300));
        ASSERT_EQ(DrvOpen(), 1);
        ++cycles;
        ASSERT_LT(cycles, 100000);
        std::this_thread::sleep_for(std::chrono::microseconds(200));
    }
    host.join();
    ASSERT_TRUE(WaitUntil([&] { return vdev::PendingHostBytes(vdev::kScan) == 0; }));
    ASSERT_TRUE(WaitUntil([] { return LoggerHost_Count("[USBAdp Scan] USBAdpScan_TAVIK_Light() End\n") == kPackets; }));
    stop = true;
    reader.join();
    Forwards expected;
    for (const std::string &p : packets) expected.emplace_back("taviklight", p);
    EXPECT_EQ(Forwarded(), expected);
    EXPECT_FALSE(LoggerHost_Contains("not supported"));
}

}  // namespace
