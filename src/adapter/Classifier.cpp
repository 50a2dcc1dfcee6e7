#include "adapter/Classifier.h"

#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>

#include "adapter/USB.h"
#include "adapter/prn_thread.h"
#include "common/ByteOrder.h"
#include "common/Log.h"
#include "common/Wait.h"
#include "firmware/FirmWareUpdate.h"
#include "maa/MAA_Hook.h"
#include "print/USBPrint.h"
#include "scan/USBScan.h"
#include "vendor/VLX_Main.h"

const U8 UELPattern[UEL_PATTERN_SIZE] = {0x1B, '%', '-', '1', '2', '3', '4', '5', 'X'};

const char aubHostApp[11][HOST_APP_NAME_SIZE] = {"PC_SCAN", "VLX", "IDS", "SCAN2PC", "TAVIK_LIGHT", "MAA",
                                                 "PJL",     "DCU", "AMPV", "ND",     "OTHERS"};

namespace {

constexpr U8 ESC = 0x1B;
constexpr S32 kSignatureSize = 10;
constexpr S32 kAppHeaderSize = 16;

// What sets the four application packets apart. Byte 7 of the signature is
// the application; the rest is shared.
struct AppKind {
    const char *tag;       // log tag, e.g. "DCU"
    const char *appType;   // application type handed to Java
    const char *function;  // the checker's name, for its log lines
    U8 signatureByte7;
    bool hasBody;          // false: header only (AMPV)
    bool emptyBodyAllowed; // length 0 sends the header alone (ND, FAXD)
    S32 unreadableAnswer;  // answer when the body cannot be taken
    const char *lengthFormat;
};

const AppKind kDCU{"DCU", "dcu", "USBADP_CheckDCUApp", 0x07, true, false, -2,
                   "[USBAdp] [DCU] DCU Packet length: %d\n"};
const AppKind kAMPV{"AMPV", "ampv", "USBADP_CheckAMPVApp", 0x06, false, false, -2, nullptr};
const AppKind kND{"ND", "networkrds", "USBADP_CheckNDApp", 0x0D, true, true, 0,
                  "[USBAdp] [ND] ND Sub Request  length: %d\n"};
const AppKind kFAXD{"FAXD", "faxd", "USBADP_CheckFAXDApp", 0x0E, true, true, 0,
                    "[USBAdp] [FAXD] FAXD Sub Request length: %d\n"};

// The body cannot be had once the host is gone or the channel is being closed;
// without this a silent host would hold the reader for ever.
bool channelGone() { return IsDisconnected.load() || hibernation_flag.load(); }

enum class BodyRead { Whole, Failed, Cut };

// Reads the whole body; Cut when the cable is pulled or the channel closed
// before it was all there.
BodyRead readBody(const AppKind &k, U8 *body, S32 len) {
    S32 got = 0;
    while (got < len) {
        ssize_t n = Wait_Read(fdPrn.load(), body + got, static_cast<size_t>(len - got), channelGone);
        int err = n < 0 ? errno : 0;
        char line[96];
        std::snprintf(line, sizeof line, "[USBAdp] [%s] read bytes from %s App, slRet: %%d\n", k.tag, k.tag);
        USBADP_LOG(DEBUG, line, static_cast<int>(n));
        if ((n < 0 && err == EINTR) || (n == 0 && channelGone())) {
            std::snprintf(line, sizeof line, "[USBAdp] [%s] Body cut after %%d of %%d bytes, packet dropped\n", k.tag);
            USBADP_LOG(ERROR, line, got, len);
            return BodyRead::Cut;
        }
        if (n < 0) {
            std::snprintf(line, sizeof line,
                          "[USBAdp] [%s] Error in reading from fdPrn, sl%sXMLPacketLen: %%d, errno: %%d\n", k.tag,
                          k.tag);
            USBADP_LOG(ERROR, line, len, err);
            return BodyRead::Failed;
        }
        // A read of 0 is the driver's time-out: the host may still send.
        got += static_cast<S32>(n);
    }
    return BodyRead::Whole;
}

void logWithTag(const AppKind &k, const char *format) {
    char line[128];
    std::snprintf(line, sizeof line, format, k.tag, k.tag);
    USBADP_LOG(ERROR, "%s", line);
}

S32 checkApp(const AppKind &k, U8 *hdr) {
    char line[128];
    std::snprintf(line, sizeof line, "[USBAdp] [%s] Start %s()\n", k.tag, k.function);
    USBADP_LOG(INFO, "%s", line);

    U8 signature[kSignatureSize] = {ESC, 0x91, 0, 0, 0, 0, 0, k.signatureByte7, 0, 0};
    if (std::memcmp(hdr, signature, kSignatureSize) != 0) {
        std::snprintf(line, sizeof line, "[USBAdp] [%s] pubCommand[%%d]: %%#x\n", k.tag);
        for (int i = 0; i < kSignatureSize; ++i) USBADP_LOG(DEBUG, line, i, hdr[i]);
        return 0;
    }
    if (k.emptyBodyAllowed) {
        std::snprintf(line, sizeof line, "[USBAdp] [%s] %s packet\n", k.tag, k.tag);
        USBADP_LOG(INFO, "%s", line);
    }

    S32 len = 0;
    std::unique_ptr<U8, decltype(&std::free)> body(nullptr, &std::free);
    if (k.hasBody) {
        len = static_cast<S32>(ReadBE32(hdr + 12));
        USBADP_LOG(INFO, k.lengthFormat, len);
        if (len <= 0 && !k.emptyBodyAllowed) {
            std::snprintf(line, sizeof line, "[USBAdp] [%s] sl%sPacketLen[%%d] <= 0\n", k.tag, k.tag);
            USBADP_LOG(ERROR, line, len);
            return -2;
        }
        if (len < 0) {
            // Not a length a host can mean; the header goes on as print data.
            std::snprintf(line, sizeof line, "[USBAdp] [%s] invalid length: %%d\n", k.tag);
            USBADP_LOG(ERROR, line, len);
            return k.unreadableAnswer;
        }
        if (len > 0) {
            body.reset(static_cast<U8 *>(std::malloc(static_cast<size_t>(len))));
            if (!body) {
                std::snprintf(line, sizeof line, "[USBAdp] [%s] Error in malloc for %sBuffer, len: %%d, errno: %%d\n",
                              k.tag, k.tag);
                USBADP_LOG(ERROR, line, len, errno);
                return k.unreadableAnswer;
            }
            switch (readBody(k, body.get(), len)) {
            case BodyRead::Whole: break;
            case BodyRead::Failed: return k.unreadableAnswer;
            // What the host had sent of it is gone with the cable: its header
            // alone must not become a print job.
            case BodyRead::Cut: return -2;
            }
        }
    }

    // Drop a stream left over from a transfer that failed half-way.
    ClearAppStream();
    const TPrintDelivery &d = USBPrint_Delivery();
    if (d.SendAppType(k.appType) < 0) {
        logWithTag(k, "[USBAdp] [%s] Error in Sending %s AppType\n");
        return -2;
    }
    if (d.SendAppBuf(k.appType, hdr, kAppHeaderSize) < 0) {
        logWithTag(k, "[USBAdp] [%s] Error in sending %s Header\n");
        return -2;
    }
    if (len > 0 && d.SendAppBuf(k.appType, body.get(), len) < 0) {
        logWithTag(k, k.emptyBodyAllowed ? "[USBAdp] [%s] Error in sending %s Sub Request packet\n"
                                         : "[USBAdp] [%s] Error in sending %s packet\n");
        return -2;
    }
    if (d.NotifyAppEnd(k.appType) < 0) {
        logWithTag(k, "[USBAdp] [%s] Error in Notify End of %s job\n");
        return -2;
    }
    std::snprintf(line, sizeof line, "[USBAdp] [%s] Exit %s()\n", k.tag, k.function);
    USBADP_LOG(INFO, "%s", line);
    return 1;
}

TUSBAdp_ParserID classOf(const U8 *pubCommand) {
    if (pubCommand[0] != ESC) return enOther;
    switch (pubCommand[1]) {
    case 0x24: return enVLX_PARSER;
    case 0x25: return enPJL_PARSER;
    case 0x77: return enMAA_PARSER;
    case 0x91: return enIDS_PARSER;
    case 0x9A: return enS2A_PARSER;
    case 0xA8: return enPCSCAN_PARSER;
    case 0xAA: return enTAVIK_LIGHT_PARSER;
    default: return enOther;
    }
}

// ESC 0x91 streams: a capability/IDS query, or one of the four application
// packets that share the selector, or else print data.
S32 classifyIds(U8 *pubCommand, U8 *pubfirmware_command, S32 *slfirmRes) {
    U8 aubBuf[kAppHeaderSize] = {};
    aubBuf[0] = pubCommand[0];
    aubBuf[1] = pubCommand[1];
    // One read; a short header is not completed.
    if (Wait_Read(fdPrn.load(), aubBuf + 2, VLX_HEADER - 2, channelGone) < 0) {
        USBADP_LOG(ERROR, "[USBAdp] Error in reading IDS header, errno: %d\n", errno);
        return -2;
    }
    ulDrvHandle = static_cast<U32>(fdPrn.load());
    // The header is taken as 16 bytes whatever was read: make the part that was
    // not read zero rather than left-overs of an earlier stream.
    std::memset(pubfirmware_command, 0, kAppHeaderSize);
    S32 slRet = Vlx_Cap_Xml(fdPrn.load(), aubBuf, VLX_HEADER, pubfirmware_command);
    if (slRet == 0) {
        USBADP_LOG(INFO, "[USBAdp] IDS execution is success\n");
        return 0;
    }
    USBADP_LOG(INFO, "[USBAdp] Not IDS parser, check for AMPV/DCU having same initial 2bytes, slRet: %ld\n",
               static_cast<long>(slRet));
    std::memcpy(aubBuf, pubfirmware_command, kAppHeaderSize);

    struct {
        S32 (*check)(U8 *);
        const char *done;
        const char *failed;
    } const checkers[] = {
        {USBADP_CheckDCUApp, "[USBAdp] DCU packet\n", "[USBAdp] Error in sending DCU packet\n"},
        {USBADP_CheckAMPVApp, "[USBAdp] AMPV packet\n", "[USBAdp] Error in sending AMPV packet\n"},
        {USBADP_CheckNDApp, "[USBAdp] ND packet\n", "[USBAdp] Error in sending ND packet\n"},
        {USBADP_CheckFAXDApp, "[USBAdp] FAXD packet\n", "[USBAdp] Error in sending FAXD packet\n"},
    };
    for (const auto &c : checkers) {
        S32 r = c.check(aubBuf);
        if (r == 1) {
            USBADP_LOG(INFO, "%s", c.done);
            return 0;
        }
        if (r == -2) {
            USBADP_LOG(ERROR, "%s", c.failed);
            return -2;
        }
    }
    std::memcpy(pubfirmware_command, aubBuf, kAppHeaderSize);
    *slfirmRes = kAppHeaderSize;
    return -1;
}

}  // namespace

TUSBAdp_ParserID USBAdp_ParserOf(const U8 *pubCommand) { return classOf(pubCommand); }

S32 USBADP_CheckDCUApp(U8 *hdr) { return checkApp(kDCU, hdr); }
S32 USBADP_CheckAMPVApp(U8 *hdr) { return checkApp(kAMPV, hdr); }
S32 USBADP_CheckNDApp(U8 *hdr) { return checkApp(kND, hdr); }
S32 USBADP_CheckFAXDApp(U8 *hdr) { return checkApp(kFAXD, hdr); }

S32 USBAdpater_StartDataClassifier(U8 *pubCommand, U8 *pubfirmware_command, S32 *slfirmRes,
                                   TUSBAdp_ParserID *enParserID) {
    USBADP_LOG(DEBUG, "[USBAdp] USBAdpater_StartDataClassifier Begin\n");
    const S32 slInitialBytes = 2;
    S32 slRet = -1;

    const TUSBAdp_ParserID id = classOf(pubCommand);
    switch (id) {
    case enVLX_PARSER:
        slDeviceHndl = fdPrn.load();
        slRet = USBAdpScan_VLX(pubCommand);
        break;
    case enMAA_PARSER: slRet = MAA_Hook(static_cast<U32>(fdPrn.load()), pubCommand); break;
    case enIDS_PARSER: slDeviceHndl = fdPrn.load(); break;
    case enS2A_PARSER:
        slDeviceHndl = fdPrn.load();
        USBAdpScan_Scan2App(pubCommand);
        break;
    case enPCSCAN_PARSER:
        slDeviceHndl = fdPrn.load();
        slRet = USBAdpScan_PCScan(pubCommand);
        break;
    case enTAVIK_LIGHT_PARSER:
        slDeviceHndl = fdPrn.load();
        USBAdpScan_TAVIK_Light(pubCommand);
        break;
    default: break;
    }
    *enParserID = id;
    USBADP_LOG(INFO, "[USBAdp] Hostapp Type[%d]: %s\n", static_cast<int>(id), aubHostApp[id]);

    switch (id) {
    case enMAA_PARSER:
        if (slRet > 0) {
            // The hand-back never exceeds the command buffer.
            if (slRet > COMMAND_SIZE - slInitialBytes) slRet = COMMAND_SIZE - slInitialBytes;
            USBADP_LOG(INFO, "[USBAdp] Not MAA packet: %d\n", slRet + slInitialBytes);
            std::memcpy(pubfirmware_command, pubCommand, static_cast<size_t>(slRet + slInitialBytes));
            *slfirmRes = slRet + slInitialBytes;
            return -1;
        }
        if (slRet == -1) {
            USBADP_LOG(ERROR, "[USBAdp] MAA - No Data read\n");
            return -2;
        }
        if (slRet == 0) USBADP_LOG(INFO, "[USBAdp] MAACommand executed\n");
        USBADP_LOG(DEBUG, "[USBAdp] USBAdpater_StartDataClassifier End\n");
        return 0;

    case enIDS_PARSER: return classifyIds(pubCommand, pubfirmware_command, slfirmRes);

    case enPJL_PARSER: {
        S32 isFirmware = 0;
        *slfirmRes = FirmWareDownload(fdPrn.load(), pubCommand, static_cast<U32>(slInitialBytes), pubfirmware_command,
                                      &isFirmware);
        if (isFirmware == 1 && *slfirmRes == 0) {
            USBADP_LOG(INFO, "[USBAdp] Firmware download success\n");
            return 0;
        }
        if (*slfirmRes == -1) {
            USBADP_LOG(ERROR, "[USBAdp] Firmware download failed\n");
            return -2;
        }
        USBADP_LOG(INFO, "[USBAdp] Bytes read in FirmWareDownload: %ld\n", static_cast<long>(*slfirmRes));
        return -1;
    }

    case enVLX_PARSER:
        if (slRet == 0)
            USBADP_LOG(INFO, "[USBAdp] VLX executed successfully\n");
        else
            USBADP_LOG(ERROR, "[USBAdp] VLX failed to execute\n");
        return 0;

    case enPCSCAN_PARSER:
        if (slRet == PCSCAN_FAIL) {
            USBADP_LOG(ERROR, "[USBAdp] PCSCAN operation failed\n");
            return -2;
        }
        return 0;

    case enS2A_PARSER:
    case enTAVIK_LIGHT_PARSER: return 0;

    default:
        USBADP_LOG(INFO, "[USBAdp] Host print job without PJL command\n");
        std::memcpy(pubfirmware_command, pubCommand, static_cast<size_t>(slInitialBytes));
        *slfirmRes = slInitialBytes;
        return -1;
    }
}

S32 CheckUELCommand(U8 *buffer, S32 size) {
    USBADP_LOG(DEBUG, "[USBAdp]Inside CheckUELCommand:::: size is [%d]\n", size);
    if (size <= 0) {
        USBADP_LOG(DEBUG, "[USBAdp]return FALSE :: Exiting with i [%d]\n", 0);
        return 0;
    }
    // memchr finds each ESC; only an ESC is looked at further. A mismatch ends
    // at a pattern byte, none of which is an ESC, so the search goes on right
    // behind the ESC.
    const U8 *const end = buffer + size;
    const U8 *esc = nullptr;
    for (const U8 *p = buffer; (p = static_cast<const U8 *>(std::memchr(p, ESC, static_cast<size_t>(end - p))));
         ++p) {
        esc = p;
        const size_t avail = static_cast<size_t>(end - p);
        if (avail >= UEL_PATTERN_SIZE) {
            if (p[1] != UELPattern[1] || std::memcmp(p + 2, UELPattern + 2, UEL_PATTERN_SIZE - 2) != 0) continue;
            UelPosition = static_cast<S32>(p - buffer);
            ++jobCounter;
            USBADP_LOG(DEBUG, "[USBAdp]return TRUE HITT jobCounter[%d]\n", jobCounter);
            USBADP_LOG(DEBUG, "[USBAdp]return TRUE HITT UelPosition[%d]\n", UelPosition);
            return 1;
        }
        size_t j = 1;
        while (j < avail && p[j] == UELPattern[j]) ++j;
        if (j < avail) continue;
        // The buffer ends inside the pattern: avail of its bytes are here.
        UelPosition = static_cast<S32>(p - buffer);
        splitPatternMarker = static_cast<S32>(avail);
        splitPatternFlag = 1;
        USBADP_LOG(DEBUG, "[USBAdp]splitPatternMarker : [%d]\n", splitPatternMarker);
        USBADP_LOG(DEBUG, "[USBAdp]returning false\n");
        return 0;
    }
    if (esc) UelPosition = static_cast<S32>(esc - buffer);
    USBADP_LOG(DEBUG, "[USBAdp]return FALSE :: Exiting with i [%d]\n", size);
    return 0;
}
