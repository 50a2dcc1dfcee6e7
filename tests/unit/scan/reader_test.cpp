// The scan reader's life: opening and closing the node from Java threads, the
// configuration event, idling while it may not read, and a close and re-open
// while the host keeps sending.
#include <sys/msg.h>

#include <atomic>
#include <thread>

#include "ScanFixture.h"
#include "support/WaitUntil.h"

extern "C" {
jint Java_com_tarnwel_vbk_common_qz_services_usbadapter_USBAdapterPrintAndScanJNIService_USBScanDrvOpen(JNIEnv *,
                                                                                                       jobject);
jint Java_com_tarnwel_vbk_common_qz_services_usbadapter_USBAdapterPrintAndScanJNIService_USBScanDrvClose(JNIEnv *,
                                                                                                        jobject);
void Java_com_tarnwel_vbk_common_qz_services_usbadapter_USBAdapterPrintAndScanJNIService_readScanMsg(JNIEnv *, jobject,
                                                                                                     jobject);
}

namespace {

jint DrvOpen() { return Java_com_tarnwel_vbk_common_qz_services_usbadapter_USBAdapterPrintAndScanJNIService_USBScanDrvOpen(nullptr, nullptr); }
jint DrvClose() { return Java_com_tarnwel_vbk_common_qz_services_usbadapter_USBAdapterPrintAndScanJNIService_USBScanDrvClose(nullptr, nullptr); }

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
    Java_com_tarnwel_vbk_common_qz_services_usbadapter_USBAdapterPrintAndScanJNIService_readScanMsg(nullptr, nullptr,
                                                                                                    nullptr);
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
    TMessageBuf rest{};
    EXPECT_EQ(msgrcv(queue, &rest, MSGBUF_TEXT_SIZE, 0, IPC_NOWAIT), MSGBUF_TEXT_SIZE);
    EXPECT_EQ(rest.status, 0x07);
    msgctl(queue, IPC_RMID, nullptr);
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
        Send({Bytes({0x1B, 0xA8, 0, 0})});
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
        Drain();
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
        Send({head});
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
        using Forwards = std::vector<std::pair<std::string, std::string>>;
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
    ASSERT_TRUE(WaitUntil([&] { return LoggerHost_Count("[USBAdp Scan] USBAdpScan_TAVIK_Light() End\n") == kPackets; }));
    stop = true;
    reader.join();
    std::vector<std::pair<std::string, std::string>> expected;
    for (const std::string &p : packets) expected.emplace_back("taviklight", p);
    EXPECT_EQ(Forwarded(), expected);
    EXPECT_FALSE(LoggerHost_Contains("not supported"));
}

}  // namespace
