// The classifier on the emulated print node: which class two bytes select,
// what is handed back for print delivery, and the four application packets
// that share ESC 0x91.
#include <fcntl.h>

#include <cstring>
#include <thread>

#include "common/ByteOrder.h"
#include "print/PrintRecorder.h"
#include "scan/USBScan.h"
#include "support/WaitUntil.h"

namespace {

// A 16-byte application header: signature with byte 7 = app, body length BE.
std::string AppHeader(U8 app, S32 bodyLength) {
    std::string h = {'\x1b', '\x91', 0, 0, 0, 0, 0, static_cast<char>(app), 0, 0, 0x12, 0x34, 0, 0, 0, 0};
    WriteBE32(reinterpret_cast<U8 *>(h.data()) + 12, static_cast<U32>(bodyLength));
    return h;
}

struct Outcome {
    S32 result;
    S32 firmRes;
    TUSBAdp_ParserID id;
    std::string handedBack;  // firmRes bytes of the firmware buffer when result is -1
};

class Classifier : public ReaderTest {
protected:
    // The reader has taken `first2`; `rest` is what the host sends behind them.
    static Outcome Classify(const std::string &first2, const std::vector<std::string> &rest = {}) {
        for (const std::string &t : rest) vdev::HostWrite(vdev::kPrn, t);
        U8 cmd[COMMAND_SIZE] = {};
        std::memcpy(cmd, first2.data(), 2);
        U8 fw[FRM_DETECT_BUFFER_SIZE];
        std::memset(fw, 0xEE, sizeof fw);
        Outcome o{};
        o.firmRes = -99;
        o.id = static_cast<TUSBAdp_ParserID>(-1);
        o.result = USBAdpater_StartDataClassifier(cmd, fw, &o.firmRes, &o.id);
        if (o.result == -1 && o.firmRes >= 0 && o.firmRes <= FRM_DETECT_BUFFER_SIZE)
            o.handedBack.assign(reinterpret_cast<char *>(fw), static_cast<size_t>(o.firmRes));
        return o;
    }
};

TEST_F(Classifier, SelectorByteChoosesTheClass) {
    struct Row {
        std::string first2;
        TUSBAdp_ParserID id;
        const char *line;
    } rows[] = {
        {"\x1b$", enVLX_PARSER, "[USBAdp] Hostapp Type[1]: VLX\n"},
        {"\x1b%", enPJL_PARSER, "[USBAdp] Hostapp Type[6]: PJL\n"},
        {"\x1bw", enMAA_PARSER, "[USBAdp] Hostapp Type[5]: MAA\n"},
        {"\x1b\x91", enIDS_PARSER, "[USBAdp] Hostapp Type[2]: IDS\n"},
        {"\x1b\x9a", enS2A_PARSER, "[USBAdp] Hostapp Type[3]: SCAN2PC\n"},
        {"\x1b\xa8", enPCSCAN_PARSER, "[USBAdp] Hostapp Type[0]: PC_SCAN\n"},
        {"\x1b\xaa", enTAVIK_LIGHT_PARSER, "[USBAdp] Hostapp Type[4]: TAVIK_LIGHT\n"},
        {"\x1b\x45", enOther, "[USBAdp] Hostapp Type[10]: OTHERS\n"},
        {"%\x1b", enOther, "[USBAdp] Hostapp Type[10]: OTHERS\n"},
    };
    for (const Row &r : rows) {
        SCOPED_TRACE(r.line);
        LoggerHost_StartCapture();
        EXPECT_EQ(Classify(r.first2).id, r.id);
        EXPECT_EQ(LoggerHost_Count(r.line), 1);
    }
}

TEST_F(Classifier, ScanFamilyAnswersGoToThePrintNode) {
    for (const char *first2 : {"\x1b$", "\x1b\x9a", "\x1b\xa8", "\x1b\xaa"}) {
        slDeviceHndl = -7;
        Classify(first2);
        EXPECT_EQ(slDeviceHndl.load(), fdPrn.load());
    }
}

TEST_F(Classifier, UnknownSelectorIsPrintDataWithItsTwoBytes) {
    Outcome o = Classify("\x1b\x45", {"rest of the page"});
    EXPECT_EQ(o.result, -1);
    EXPECT_EQ(o.firmRes, 2);
    EXPECT_EQ(o.handedBack, "\x1b\x45");
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Host print job without PJL command\n"), 1);
    // Nothing beyond the two bytes was taken off the node.
    EXPECT_EQ(vdev::PendingHostBytes(vdev::kPrn), std::string("rest of the page").size());
}

TEST_F(Classifier, PjlStreamHandsBackUpToEightyHeaderBytes) {
    std::string stream = kUel + "@PJL JOB NAME=\"a\"\r\n" + std::string(100, 'p');
    Outcome o = Classify(stream.substr(0, 2), {stream.substr(2)});
    EXPECT_EQ(o.result, -1);
    EXPECT_EQ(o.id, enPJL_PARSER);
    EXPECT_EQ(o.firmRes, 80);
    EXPECT_EQ(o.handedBack, stream.substr(0, 80));
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Bytes read in FirmWareDownload: 80\n"), 1);
}

TEST_F(Classifier, ShortPjlStreamHandsBackWhatThereIs) {
    std::string shortJob = kUel + "@PJL\r\n";
    Outcome o = Classify(shortJob.substr(0, 2), {shortJob.substr(2)});
    EXPECT_EQ(o.result, -1);
    EXPECT_EQ(o.firmRes, static_cast<S32>(shortJob.size()));
    EXPECT_EQ(o.handedBack, shortJob);
}

TEST_F(Classifier, EscapeWHandsBackWhatFollowedWhenItIsNoMaaSession) {
    Outcome o = Classify("\x1bw", {"MAAS"});
    EXPECT_EQ(o.result, -1);
    EXPECT_EQ(o.firmRes, 6);
    EXPECT_EQ(o.handedBack, "\x1bwMAAS");
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Not MAA packet: 6\n"), 1);

    // At most the eight bytes of a start command are taken.
    o = Classify("\x1bw", {"MAASTARX and more"});
    EXPECT_EQ(o.handedBack, "\x1bwMAASTARX");
    EXPECT_EQ(vdev::PendingHostBytes(vdev::kPrn), std::string(" and more").size());
}

TEST_F(Classifier, EscapeWWithNothingBehindIsAFailure) {
    Outcome o = Classify("\x1bw");
    EXPECT_EQ(o.result, -2);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] MAA - No Data read\n"), 1);
}

// ---- the four application packets behind ESC 0x91 -----------------------------

TEST_F(Classifier, DcuPacketIsOneTransferOfHeaderAndBody) {
    std::string hdr = AppHeader(0x07, 5);
    Outcome o = Classify(hdr.substr(0, 2), {hdr.substr(2), "<dcu>"});
    EXPECT_EQ(o.result, 0);
    auto apps = rec::Apps();
    ASSERT_EQ(apps.size(), 1u);
    EXPECT_EQ(apps[0].type, "dcu");
    EXPECT_EQ(apps[0].writes, (std::vector<std::string>{hdr, "<dcu>"}));
    EXPECT_TRUE(apps[0].closed);
    EXPECT_TRUE(rec::Jobs().empty());
    EXPECT_EQ(LoggerHost_Count("[USBAdp] [DCU] DCU Packet length: 5\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] DCU packet\n"), 1);
}

TEST_F(Classifier, DcuWithEmptyBodyIsRefusedWhileNdAndFaxdSendTheHeaderAlone) {
    std::string dcu = AppHeader(0x07, 0);
    Outcome o = Classify(dcu.substr(0, 2), {dcu.substr(2)});
    EXPECT_EQ(o.result, -2);
    EXPECT_TRUE(rec::Apps().empty());
    EXPECT_EQ(LoggerHost_Count("[USBAdp] [DCU] slDCUPacketLen[0] <= 0\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Error in sending DCU packet\n"), 1);

    for (auto [app, type] : {std::pair<U8, std::string>{0x0D, "networkrds"}, {0x0E, "faxd"}}) {
        SCOPED_TRACE(type);
        rec::Clear();
        std::string hdr = AppHeader(app, 0);
        o = Classify(hdr.substr(0, 2), {hdr.substr(2)});
        EXPECT_EQ(o.result, 0);
        auto apps = rec::Apps();
        ASSERT_EQ(apps.size(), 1u);
        EXPECT_EQ(apps[0].type, type);
        EXPECT_EQ(apps[0].writes, (std::vector<std::string>{hdr}));
        EXPECT_TRUE(apps[0].closed);
    }
    EXPECT_EQ(LoggerHost_Count("[USBAdp] [ND] ND Sub Request  length: 0\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] [FAXD] FAXD Sub Request length: 0\n"), 1);
}

TEST_F(Classifier, AmpvIsHeaderOnlyAndNdCarriesItsBody) {
    std::string ampv = AppHeader(0x06, 1000);  // AMPV has no body: the length is not looked at
    Outcome o = Classify(ampv.substr(0, 2), {ampv.substr(2)});
    EXPECT_EQ(o.result, 0);
    std::string nd = AppHeader(0x0D, 3);
    o = Classify(nd.substr(0, 2), {nd.substr(2), "abc"});
    EXPECT_EQ(o.result, 0);
    auto apps = rec::Apps();
    ASSERT_EQ(apps.size(), 2u);
    EXPECT_EQ(apps[0].type, "ampv");
    EXPECT_EQ(apps[0].writes, (std::vector<std::string>{ampv}));
    EXPECT_EQ(apps[1].type, "networkrds");
    EXPECT_EQ(apps[1].writes, (std::vector<std::string>{nd, "abc"}));
    EXPECT_EQ(vdev::PendingHostBytes(vdev::kPrn), 0u);
}

TEST_F(Classifier, BodyWaitsOutDriverTimeOutsUntilItIsComplete) {
    vdev::SetInstantTimeouts(vdev::kPrn, false);
    std::string hdr = AppHeader(0x0E, 8);
    vdev::HostWrite(vdev::kPrn, hdr.substr(2));
    vdev::HostWrite(vdev::kPrn, "fax1");
    vdev::ExpireRead(vdev::kPrn, 3);  // three reads end in the driver's time-out first
    std::thread host([] {
        WaitUntil([] { return vdev::ReadSizes(vdev::kPrn).size() >= 7; }, 3000);
        vdev::HostWrite(vdev::kPrn, "fax2");
    });
    Outcome o = Classify(hdr.substr(0, 2));
    host.join();
    EXPECT_EQ(o.result, 0);
    auto apps = rec::Apps();
    ASSERT_EQ(apps.size(), 1u);
    EXPECT_EQ(apps[0].writes, (std::vector<std::string>{hdr, "fax1fax2"}));
    EXPECT_EQ(LoggerHost_Count("[USBAdp] [FAXD] read bytes from FAXD App, slRet: 0\n"), 3);
}

TEST_F(Classifier, UnreadableBodyFailsDcuButSendsNdAndFaxdHeadersToPrintData) {
    // A read error on the node: reads fail instead of waiting.
    ASSERT_EQ(::fcntl(fdPrn, F_SETFL, O_NONBLOCK), 0);
    std::string dcu = AppHeader(0x07, 10);
    Outcome o = Classify(dcu.substr(0, 2), {dcu.substr(2)});
    EXPECT_EQ(o.result, -2);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Error in sending DCU packet\n"), 1);

    for (U8 app : {U8{0x0D}, U8{0x0E}}) {
        SCOPED_TRACE(int{app});
        std::string hdr = AppHeader(app, 10);
        o = Classify(hdr.substr(0, 2), {hdr.substr(2)});
        EXPECT_EQ(o.result, -1);
        EXPECT_EQ(o.firmRes, 16);
        EXPECT_EQ(o.handedBack, hdr);
    }
    EXPECT_TRUE(rec::Apps().empty());
}

// What the host had sent of a body is gone with the cable: the packet is
// dropped, and its header is no print job either.
TEST_F(Classifier, BodyCutByACablePullIsDroppedAndMakesNoPrintJob) {
    const struct {
        U8 app;
        const char *line;
    } rows[] = {
        {0x07, "[USBAdp] [DCU] Body cut after 4 of 10 bytes, packet dropped\n"},
        {0x0D, "[USBAdp] [ND] Body cut after 4 of 10 bytes, packet dropped\n"},
        {0x0E, "[USBAdp] [FAXD] Body cut after 4 of 10 bytes, packet dropped\n"},
    };
    for (const auto &r : rows) {
        SCOPED_TRACE(int{r.app});
        rec::Clear();
        vdev::HostWrite(vdev::kPrn, AppHeader(r.app, 10));
        vdev::HostWrite(vdev::kPrn, "part");
        IsDisconnected = 1;  // the pull comes while the reader waits for the rest
        USBAdapter_ReadPass();
        IsDisconnected = 0;
        EXPECT_TRUE(rec::Events().empty());
        EXPECT_EQ(LoggerHost_Count(r.line), 1);
        EXPECT_EQ(LoggerHost_Count("[USBAdp] Error in executing Host App\n"), 1);
        LoggerHost_StartCapture();
    }
}

TEST_F(Classifier, JavaRefusingTheTransferIsAFailure) {
    rec::AppAnswer() = -1;
    std::string hdr = AppHeader(0x0D, 0);
    Outcome o = Classify(hdr.substr(0, 2), {hdr.substr(2)});
    EXPECT_EQ(o.result, -2);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] [ND] Error in Sending ND AppType\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Error in sending ND packet\n"), 1);
}

TEST_F(Classifier, UnknownApplicationHeaderIsPrintDataOfSixteenBytes) {
    std::string hdr = AppHeader(0x55, 4);
    Outcome o = Classify(hdr.substr(0, 2), {hdr.substr(2) + "tail"});
    EXPECT_EQ(o.result, -1);
    EXPECT_EQ(o.id, enIDS_PARSER);
    EXPECT_EQ(o.firmRes, 16);
    EXPECT_EQ(o.handedBack, hdr);
    EXPECT_TRUE(rec::Apps().empty());
    EXPECT_EQ(LoggerHost_Count("[USBAdp] [DCU] pubCommand[7]: 0x55\n"), 1);
}

TEST_F(Classifier, ShortHeaderIsStillSixteenBytesWithNothingOfEarlierStreams) {
    // Only 3 bytes follow ESC 0x91: the header is taken as 16 bytes regardless,
    // the missing ones zero.
    Outcome o = Classify("\x1b\x91", {"abc"});
    EXPECT_EQ(o.result, -1);
    EXPECT_EQ(o.firmRes, 16);
    EXPECT_EQ(o.handedBack, std::string("\x1b\x91" "abc") + std::string(11, '\0'));
}

}  // namespace
