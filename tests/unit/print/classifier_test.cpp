// The classifier on the emulated print node: which class two bytes select,
// what is handed back for print delivery, and the four application packets
// that share ESC 0x91.
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
        for (const std::string &t : rest)
            if (!t.empty()) vdev::HostWrite(vdev::kPrn, t);
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

// Which class two bytes select; the scan family and the applications behind
// ESC 0x91 answer on the print node.
TEST_F(Classifier, SelectorByteChoosesTheClass) {
    const struct {
        const char *first2;
        TUSBAdp_ParserID id;
        bool answersOnPrintNode;
        const char *line;
    } rows[] = {
        {"\x1b$", enVLX_PARSER, true, "[USBAdp] Hostapp Type[1]: VLX\n"},
        {"\x1b%", enPJL_PARSER, false, "[USBAdp] Hostapp Type[6]: PJL\n"},
        {"\x1bw", enMAA_PARSER, false, "[USBAdp] Hostapp Type[5]: MAA\n"},
        {"\x1b\x91", enIDS_PARSER, true, "[USBAdp] Hostapp Type[2]: IDS\n"},
        {"\x1b\x9a", enS2A_PARSER, true, "[USBAdp] Hostapp Type[3]: SCAN2PC\n"},
        {"\x1b\xa8", enPCSCAN_PARSER, true, "[USBAdp] Hostapp Type[0]: PC_SCAN\n"},
        {"\x1b\xaa", enTAVIK_LIGHT_PARSER, true, "[USBAdp] Hostapp Type[4]: TAVIK_LIGHT\n"},
        {"\x1b\x45", enOther, false, "[USBAdp] Hostapp Type[10]: OTHERS\n"},
        {"%\x1b", enOther, false, "[USBAdp] Hostapp Type[10]: OTHERS\n"},
    };
    for (const auto &r : rows) {
        SCOPED_TRACE(r.line);
        LoggerHost_StartCapture();
        slDeviceHndl = -7;
        EXPECT_EQ(Classify(r.first2).id, r.id);
        EXPECT_EQ(LoggerHost_Count(r.line), 1);
        EXPECT_EQ(slDeviceHndl.load() == fdPrn.load(), r.answersOnPrintNode);
    }
}

// What is not a host application goes back to print delivery (result -1) with
// the bytes taken for the decision, and nothing more is taken off the node.
TEST_F(Classifier, PrintDataIsHandedBackWithTheBytesTaken) {
    const std::string pjl = "-12345X@PJL JOB NAME=\"a\"\r\n" + std::string(100, 'p');
    const struct {
        const char *first2, *rest;  // the reader has taken first2; rest is on the node
        S32 result, firmRes;        // firmRes: bytes handed back, missing ones zero
        size_t left;                // still on the node
        const char *line;
    } rows[] = {
        {"\x1b\x45", "rest of the page", -1, 2, 16, "[USBAdp] Host print job without PJL command\n"},
        {"\x1b%", pjl.c_str(), -1, 80, pjl.size() - 78, "[USBAdp] Bytes read in FirmWareDownload: 80\n"},
        {"\x1b%", "-12345X@PJL\r\n", -1, 15, 0, nullptr},
        // ESC w that is no MAA session: at most the eight bytes of a start command.
        {"\x1bw", "MAAS", -1, 6, 0, "[USBAdp] Not MAA packet: 6\n"},
        {"\x1bw", "MAASTARX and more", -1, 10, 9, nullptr},
        {"\x1bw", "", -2, 0, 0, "[USBAdp] MAA - No Data read\n"},
        // A short application header is taken as 16 bytes regardless.
        {"\x1b\x91", "abc", -1, 16, 0, nullptr},
    };
    for (const auto &r : rows) {
        SCOPED_TRACE(testing::PrintToString(std::string(r.first2) + r.rest));
        Restart(true);
        LoggerHost_StartCapture();
        Outcome o = Classify(r.first2, {r.rest});
        EXPECT_EQ(o.result, r.result);
        if (r.result == -1) {
            std::string want = (r.first2 + std::string(r.rest)).substr(0, static_cast<size_t>(r.firmRes));
            want.resize(static_cast<size_t>(r.firmRes), '\0');
            EXPECT_EQ(o.handedBack, want);
        }
        EXPECT_EQ(vdev::PendingHostBytes(vdev::kPrn) + Wait_PutBackLeft(fdPrn), r.left);
        ExpectLoggedOnce(r.line);
    }
}

// The application packets behind ESC 0x91, each one transfer to Java of its
// header and body; AMPV has no body, whatever its length says. An empty DCU
// body, Java refusing the transfer and an unknown application send nothing.
// A body that cannot be read (a read error on the node) fails DCU, and sends
// the ND and FAXD headers back to print data.
TEST_F(Classifier, ApplicationPacketIsOneTransferOfHeaderAndBody) {
    const struct {
        U8 app;
        S32 length;
        const char *body;  // sent behind the header
        S32 answer;        // Java's answer to the application calls
        S32 result;
        const char *type;  // of the transfer; nullptr: none
        const char *line, *line2;
        bool unreadable = false;
    } rows[] = {
        {0x07, 5, "<dcu>", 0, 0, "dcu", "[USBAdp] [DCU] DCU Packet length: 5\n", "[USBAdp] DCU packet\n"},
        {0x07, 0, "", 0, -2, nullptr, "[USBAdp] [DCU] slDCUPacketLen[0] <= 0\n",
         "[USBAdp] Error in sending DCU packet\n"},
        {0x0D, 0, "", 0, 0, "networkrds", "[USBAdp] [ND] ND Sub Request  length: 0\n", nullptr},
        {0x0D, 3, "abc", 0, 0, "networkrds", nullptr, nullptr},
        {0x0E, 0, "", 0, 0, "faxd", "[USBAdp] [FAXD] FAXD Sub Request length: 0\n", nullptr},
        {0x06, 1000, "", 0, 0, "ampv", nullptr, nullptr},
        {0x0D, 0, "", -1, -2, nullptr, "[USBAdp] [ND] Error in Sending ND AppType\n",
         "[USBAdp] Error in sending ND packet\n"},
        {0x55, 4, "tail", 0, -1, nullptr, "[USBAdp] [DCU] pubCommand[7]: 0x55\n", nullptr},
        {0x07, 10, "", 0, -2, nullptr, "[USBAdp] Error in sending DCU packet\n", nullptr, true},
        {0x0D, 10, "", 0, -1, nullptr, nullptr, nullptr, true},
        {0x0E, 10, "", 0, -1, nullptr, nullptr, nullptr, true},
    };
    for (const auto &r : rows) {
        SCOPED_TRACE(testing::Message() << "app " << int{r.app} << ", length " << r.length);
        Restart(true);
        LoggerHost_StartCapture();
        if (r.unreadable) {
            ASSERT_EQ(::fcntl(fdPrn, F_SETFL, O_NONBLOCK), 0);  // reads fail instead of waiting
        }
        rec::appAnswer = r.answer;
        const std::string hdr = AppHeader(r.app, r.length);
        Outcome o = Classify(hdr.substr(0, 2), {hdr.substr(2), r.body});
        EXPECT_EQ(o.result, r.result);
        const auto apps = rec::Apps();
        if (r.type) {
            ASSERT_EQ(apps.size(), 1u);
            EXPECT_EQ(apps[0].type, r.type);
            EXPECT_EQ(apps[0].writes, (*r.body ? std::vector<std::string>{hdr, r.body} : std::vector{hdr}));
            EXPECT_TRUE(apps[0].closed);
        } else if (r.answer == 0) {
            EXPECT_TRUE(apps.empty());
        }
        EXPECT_TRUE(rec::Jobs().empty());
        EXPECT_EQ(o.handedBack, r.result == -1 ? hdr : "");
        EXPECT_EQ(vdev::PendingHostBytes(vdev::kPrn), r.result == -1 ? std::strlen(r.body) : 0u);
        ExpectLoggedOnce(r.line);
        ExpectLoggedOnce(r.line2);
    }
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

// What the host had sent of a body is gone with the cable: the packet is
// dropped, and its header is no print job either.
TEST_F(Classifier, BodyCutByACablePullIsDroppedAndMakesNoPrintJob) {
    const std::pair<U8, std::string> rows[] = {{0x07, "DCU"}, {0x0D, "ND"}, {0x0E, "FAXD"}};
    for (const auto &[app, tag] : rows) {
        SCOPED_TRACE(tag);
        Restart();
        vdev::HostWrite(vdev::kPrn, AppHeader(app, 10));
        vdev::HostWrite(vdev::kPrn, "part");
        IsDisconnected = 1;  // the pull comes while the reader waits for the rest
        USBAdapter_ReadPass();
        IsDisconnected = 0;
        EXPECT_TRUE(rec::Events().empty());
        EXPECT_EQ(LoggerHost_Count("[USBAdp] [" + tag + "] Body cut after 4 of 10 bytes, packet dropped\n"), 1);
        EXPECT_EQ(LoggerHost_Count("[USBAdp] Error in executing Host App\n"), 1);
        LoggerHost_StartCapture();
    }
}

}  // namespace
