// Each scan protocol read by its own length rule and forwarded whole, on the
// scan node through the reader's selector table: what Java receives, what is
// left in the channel, and the lines for what is refused.
#include <cerrno>
#include <thread>

#include "ScanFixture.h"
#include "common/ByteOrder.h"
#include "support/WaitUntil.h"

namespace {

std::string Scan2AppHeader(int kind, U32 xmlSize) {
    std::string h = Bytes({0x1B, 0x9A, kind, 0x55, 0, 0, 0, 0});
    WriteBE32(reinterpret_cast<U8 *>(h.data()) + 4, xmlSize);
    return h;
}
const std::string kIds = Bytes({0x1B, 0x91, 0, 0, 0, 0, 0, 3, 0, 0, 0, 1, 0, 0, 0, 0});

struct Case {
    const char *name;
    std::vector<std::string> transfers;                         // what the host sends
    std::vector<std::pair<std::string, std::string>> forwarded;  // what Java gets
    std::vector<const char *> lines;                            // logged once each
    size_t leftOver;  // bytes the reader takes for new packets afterwards
};

TEST_F(ScanTest, EachProtocolForwardsExactlyItsPacket) {
    const std::string pcscan0 = Bytes({0x1B, 0xA8, 0x10, 0x00});
    const std::string setWindow = Bytes({0x1B, 0xA8, 0x24, 0x13}) + std::string(0x15, 'w');
    const std::string light255 = Bytes({0x1B, 0xAA, 0x01, 0xFF}) + std::string(255, 'L');
    const std::string xml20 = "<apps><a>scan</a></apps>";
    const Case cases[] = {
        {"pc-scan L 0", {pcscan0}, {{"pcscan", pcscan0}}, {"[USBAdp Scan] slPCScanCDBSize: 4\n"}, 0},
        {"pc-scan set window takes L + 2",
         {setWindow},
         {{"pcscan", setWindow}},
         {"[USBAdp Scan] PCScan packet size for SET WINDOW PARAMETER (1B A8 24 13): 21\n"},
         0},
        {"pc-scan in pieces", {"\x1b\xa8", "\x10\x05", "ab", "cde"}, {{"pcscan", "\x1b\xa8\x10\x05" "abcde"}}, {}, 0},
        {"pc-scan 1B A8 24 FE is refused, its bytes stay",
         {Bytes({0x1B, 0xA8, 0x24, 0xFE})},
         {},
         {"[USBAdp Scan] slPacketSize[0x100] > 0xFF\n", "[USBAdp Scan] USBAdpScan_PCScan() failed\n"},
         0},
        {"light protocol L 255 fills the buffer", {light255}, {{"taviklight", light255}},
         {"[USBAdp Scan] slTAVIK_Light_command_size: 259\n"}, 0},
        {"scan-to-application kind 1 is its header",
         {Scan2AppHeader(1, 0x40)},
         {{"scan2pc", Scan2AppHeader(1, 0x40)}},
         {"[USBAdp Scan] USB Get User Selected List sent\n"},
         0},
        {"kind 0 with an XML of 5 forwards only the header",
         {Scan2AppHeader(0, 5), "<a/>\n"},
         {{"scan2pc", Scan2AppHeader(0, 5)}},
         {"[USBAdp Scan] USB Send Application List sent\n"},
         0},
        {"kind 3 forwards header and XML",
         {Scan2AppHeader(3, static_cast<U32>(xml20.size())), xml20.substr(0, 7), xml20.substr(7)},
         {{"scan2pc", Scan2AppHeader(3, static_cast<U32>(xml20.size())) + xml20}},
         {},
         0},
        {"ID-scan", {kIds}, {{"ids", kIds}}, {}, 0},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        rec::Clear();
        LoggerHost_StartCapture();
        Send(c.transfers);
        Drain();
        EXPECT_EQ(Forwarded(), c.forwarded);
        for (const char *line : c.lines) EXPECT_EQ(LoggerHost_Count(line), 1) << line;
        EXPECT_EQ(vdev::PendingHostBytes(vdev::kScan), c.leftOver);
        EXPECT_EQ(Reply(), "");
    }
}

TEST_F(ScanTest, WhatNoHandlerTakesIsLoggedAndDropped) {
    struct Row {
        std::string transfer;
        const char *line;
    } rows[] = {
        {Bytes({0x1B, 0x77}), "[USBAdp Scan] HostApp not supported [0x1b 0x77]\n"},
        {Bytes({0x41, 0x1B}), "[USBAdp Scan] HOSTApp not supported [0x41 0x1b]\n"},
        {Bytes({0x1B}), "[USBAdp Scan] HostApp not supported [0x1b 0]\n"},  // one byte, judged on the cleared rest
        {Bytes({0x7F}), "[USBAdp Scan] HOSTApp not supported [0x7f 0]\n"},
        {kIds.substr(0, 15) + "\x01", "[USBAdp Scan] Not IDS header\n"},
    };
    for (const Row &r : rows) {
        SCOPED_TRACE(r.line);
        rec::Clear();
        LoggerHost_StartCapture();
        Send({r.transfer});
        Drain();
        EXPECT_EQ(LoggerHost_Count(r.line), 1);
        EXPECT_TRUE(rec::Events().empty());
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

TEST_F(ScanTest, ShortIdScanHeaderIsZeroFilledToSixteen) {
    // 1B 91 and 5 bytes: the handler compares a 16-byte buffer whose last 9 are 0.
    Send({kIds.substr(0, 7)});
    Drain();
    EXPECT_EQ(LoggerHost_Count("[USBAdp Scan] IDS packet length: 7\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp Scan] Not IDS packet\n"), 1);
    // All but byte 7 (3) and 11 (1) of the header are 0: those two are missing.
    EXPECT_TRUE(rec::Events().empty());
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
        Send({r.packet});
        Drain();
        EXPECT_EQ(LoggerHost_Count(r.line), 1);
        EXPECT_EQ(call, r.failAt) << "went on after the refusal";
    }
}

TEST_F(ScanTest, AbsurdXmlLengthIsAFailedAllocationAndTheReaderGoesOn) {
    for (U32 size : {0xFFFFFFFFu, 0x80000000u, SCAN2APP_XML_MAX + 1}) {
        rec::Clear();
        LoggerHost_StartCapture();
        Send({Scan2AppHeader(0, size), Bytes({0x1B, 0xA8, 0, 0})});
        Drain();
        EXPECT_EQ(LoggerHost_Count("[USBAdp Scan] Error in allocation for pubAppXML, errno: 12\n"), 1);
        EXPECT_EQ(Forwarded(), (std::vector<std::pair<std::string, std::string>>{{"pcscan", Bytes({0x1B, 0xA8, 0, 0})}}));
    }
}

TEST_F(ScanTest, PacketCutByCloseOrCableIsDroppedWhole) {
    for (bool cable : {false, true}) {
        SCOPED_TRACE(cable ? "cable" : "close");
        rec::Clear();
        LoggerHost_StartCapture();
        Send({Bytes({0x1B, 0xA8, 0x01, 0x10}), "half"});
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

}  // namespace
