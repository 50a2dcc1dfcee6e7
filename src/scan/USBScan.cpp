#include "scan/USBScan.h"

#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <memory>

#include "adapter/USB.h"
#include "common/ByteOrder.h"
#include "common/Log.h"
#include "common/Wait.h"
#include "print/USBPrint.h"
#include "scan/scan_thread.h"
#include "vendor/VLX_Main.h"

thread_local std::atomic<S32> slDeviceHndl{0};

namespace {

constexpr S32 kPacketSize = 259;   // 4 header bytes + a length byte's worth
constexpr S32 kMaxLength = 0xFF;
constexpr U8 kSetWindow = 0x24;
constexpr S32 kScan2AppHeader = 8;
constexpr ssize_t kCut = -2;

// The three steps of one forwarded transfer and their failure lines.
struct Forwarding {
    const char *appType;
    const char *typeFailed;
    const char *bufferFailed;
    const char *endFailed;
};

const Forwarding kPCScan{"pcscan", "[USBAdp Scan] [PCScan] Error in Sending pcscan AppType\n",
                         "[USBAdp Scan] [PCScan] Error in sending pcscan buffer\n",
                         "[USBAdp Scan] [PCScan] Error in Notify End of pcscan job\n"};
const Forwarding kTavikLight{"taviklight", "[USBAdp Scan] [TAVIK_LIGHT] Error in Sending taviklight AppType\n",
                             "[USBAdp Scan] [TAVIK_LIGHT] Error in Sending taviklight buffer\n",
                             "[USBAdp Scan] [TAVIK_LIGHT] Error in Notify End of taviklight job\n"};
const Forwarding kIds{"ids", "[USBAdp Scan] [IDS] Error in Sending ids AppType\n",
                      "[USBAdp Scan] [IDS] Error in sending ids buffer\n",
                      "[USBAdp Scan] [IDS] Error in Notify End of ids job\n"};
// The header's failure line differs from the XML's ("Sending", capital S).
const Forwarding kScan2App{"scan2pc", "[USBAdp Scan] [Scan2PC] Error in Sending scan2pc AppType\n",
                           "[USBAdp Scan] [Scan2PC] Error in Sending scan2pc buffer\n",
                           "[USBAdp Scan] [Scan2PC] Error in Notify End of scan2pc job\n"};
constexpr const char kScan2AppXmlFailed[] = "[USBAdp Scan] [Scan2PC] Error in sending scan2pc buffer\n";

// One read of up to `size` bytes (a short read is kept); a signal resumes it
// unless the channel is gone, which fails it with EINTR.
ssize_t readOnce(S32 fd, U8 *buf, size_t size) { return Wait_Read(fd, buf, size, USBAdpScan_PacketGone); }

// Reads exactly `size` bytes. A read of 0 (the driver's time-out) waits on
// for the host; kCut when the channel went away before the rest came.
ssize_t readAll(S32 fd, U8 *buf, size_t size, const char *what) {
    size_t got = 0;
    while (got < size) {
        ssize_t n = readOnce(fd, buf + got, size - got);
        if ((n < 0 && errno == EINTR) || (n == 0 && USBAdpScan_PacketGone())) {
            USBADP_LOG(ERROR, "[USBAdp Scan] %s packet cut after %ld of %ld bytes, dropped\n", what,
                       static_cast<long>(got), static_cast<long>(size));
            return kCut;
        }
        if (n < 0) return n;
        got += static_cast<size_t>(n);
    }
    return static_cast<ssize_t>(got);
}

bool forward(const Forwarding &f, U8 *packet, S32 size) {
    const TPrintDelivery &d = USBPrint_Delivery();
    const char *failed = nullptr;
    if (d.SendAppType(f.appType) < 0)
        failed = f.typeFailed;
    else if (d.SendAppBuf(f.appType, packet, size) < 0)
        failed = f.bufferFailed;
    else if (d.NotifyAppEnd(f.appType) < 0)
        failed = f.endFailed;
    if (failed) USBADP_LOG(ERROR, "%s", failed);
    return failed == nullptr;
}

}  // namespace

bool USBAdpScan_PacketGone(void) {
    if (IsDisconnected.load()) return true;
    const S32 fd = slDeviceHndl.load();
    return fd == fdScan.load() ? g_IsScanCanClose.load() != 0 : hibernation_flag.load() != 0;
}

S32 USBAdpScan_PCScan(U8 *pubCommand) {
    const S32 fd = slDeviceHndl.load();
    USBADP_LOG(INFO, "[USBAdp Scan] USBAdpScan_PCScan() Begin, slDeviceHndl: %ld\n", static_cast<long>(fd));
    U8 packet[kPacketSize] = {};
    std::memcpy(packet, pubCommand, 2);
    if (readOnce(fd, packet + 2, 2) < 0) {
        USBADP_LOG(ERROR, "[USBAdp Scan] Error in reading PCScan operation code, errno: %d\n", errno);
        return -2;
    }
    S32 slPacketSize = packet[3];
    USBADP_LOG(INFO, "[USBAdp Scan] PCScan packet size: %d\n", slPacketSize);
    if (packet[2] == kSetWindow) {
        slPacketSize += 2;
        USBADP_LOG(INFO, "[USBAdp Scan] PCScan packet size for SET WINDOW PARAMETER (1B A8 24 13): %ld\n",
                   static_cast<long>(slPacketSize));
    }
    if (slPacketSize > kMaxLength) {
        USBADP_LOG(ERROR, "[USBAdp Scan] slPacketSize[%#x] > 0xFF\n", static_cast<unsigned>(slPacketSize));
        return -2;
    }
    ssize_t n = readAll(fd, packet + 4, static_cast<size_t>(slPacketSize), "PCScan");
    if (n == kCut) return -2;
    if (n < 0) {
        USBADP_LOG(ERROR, "[USBAdp Scan] Error in reading PCScan data, errno: %d\n", errno);
        return -2;
    }
    const S32 slPCScanCDBSize = 4 + slPacketSize;
    USBADP_LOG(INFO, "[USBAdp Scan] slPCScanCDBSize: %ld\n", static_cast<long>(slPCScanCDBSize));
    if (!forward(kPCScan, packet, slPCScanCDBSize)) return -2;
    USBADP_LOG(INFO, "[USBAdp Scan] USBAdpScan_PCScan() End\n");
    return 0;
}

void USBAdpScan_TAVIK_Light(U8 *pubCommand) {
    const S32 fd = slDeviceHndl.load();
    USBADP_LOG(INFO, "[USBAdp Scan] USBAdpScan_TAVIK_Light() Begin, slDeviceHndl: %ld\n", static_cast<long>(fd));
    U8 packet[kPacketSize] = {};
    std::memcpy(packet, pubCommand, 2);
    ssize_t n = readOnce(fd, packet + 2, 2);
    if (n < 0) {
        USBADP_LOG(ERROR, "[USBAdp Scan] Error in reading TAVIK Light operation code, errno: %d\n", errno);
        return;
    }
    S32 total = 2 + static_cast<S32>(n);
    const S32 length = packet[3];
    USBADP_LOG(INFO, "[USBAdp Scan] TAVIK Light Packet size: %ld\n", static_cast<long>(length));
    if (length > kMaxLength) {  // a length byte cannot say more; kept for the rule's sake
        USBADP_LOG(ERROR, "[USBAdp Scan] TAVIK Light Packet[%#x] > 0xFF\n", static_cast<unsigned>(length));
        return;
    }
    n = readAll(fd, packet + total, static_cast<size_t>(length), "TAVIK Light");
    if (n == kCut) return;
    if (n < 0) {
        USBADP_LOG(ERROR, "[USBAdp Scan] Error in reading TAVIK Light packet, errno: %d\n", errno);
        return;
    }
    total += length;
    USBADP_LOG(INFO, "[USBAdp Scan] slTAVIK_Light_command_size: %ld\n", static_cast<long>(total));
    if (forward(kTavikLight, packet, total)) USBADP_LOG(INFO, "[USBAdp Scan] USBAdpScan_TAVIK_Light() End\n");
}

void USBAdpScan_Scan2App(U8 *pubCommand) {
    // The header is read from the handler's channel like the rest: from the
    // print channel a read on the scan node would take another stream's bytes.
    const S32 fd = slDeviceHndl.load();
    USBADP_LOG(INFO, "[USBAdp Scan] USBAdpScan_Scan2App() Begin, slDeviceHndl: %ld\n", static_cast<long>(fd));
    U8 header[kScan2AppHeader] = {};
    std::memcpy(header, pubCommand, 2);
    ssize_t n = readOnce(fd, header + 2, kScan2AppHeader - 2);
    if (n < 0) {
        USBADP_LOG(ERROR, "[USBAdp Scan] Error in reading Scan2App header, errno: %d\n", errno);
        return;
    }
    if (n < kScan2AppHeader - 2)
        USBADP_LOG(ERROR, "[USBAdp Scan] Full Scan2App header not read, slRet:%ld\n", static_cast<long>(n));
    USBADP_LOG(INFO, "[USBAdp Scan] Scan2App, aubBuf[2]: %d\n", header[2]);

    const bool withXml = header[2] == 0 || header[2] == 3;
    const U32 slXMLSize = withXml ? ReadBE32(header + 4) : 0;
    std::unique_ptr<U8, decltype(&std::free)> xml(nullptr, &std::free);
    if (withXml) {
        USBADP_LOG(INFO, "[USBAdp Scan] slXMLSize: %d\n", static_cast<int>(slXMLSize));
        if (slXMLSize >= 1) {
            // The host chooses the length: beyond the limit it is an
            // allocation that failed, and the reader goes on.
            if (slXMLSize <= SCAN2APP_XML_MAX) xml.reset(static_cast<U8 *>(std::malloc(slXMLSize)));
            if (!xml) {
                USBADP_LOG(ERROR, "[USBAdp Scan] Error in allocation for pubAppXML, errno: %d\n",
                           slXMLSize <= SCAN2APP_XML_MAX ? errno : ENOMEM);
                return;
            }
            n = readAll(fd, xml.get(), slXMLSize, "Scan2App XML");
            if (n == kCut) return;
            if (n < 0) {
                USBADP_LOG(ERROR, "[USBAdp Scan] Error in reading XML, errno: %d\n", errno);
                return;
            }
        }
        USBADP_LOG(INFO, "[USBAdp Scan] slXMLSize: %ld\n", static_cast<long>(slXMLSize));
    }

    const TPrintDelivery &d = USBPrint_Delivery();
    const char *failed = nullptr;
    if (d.SendAppType(kScan2App.appType) < 0) {
        failed = kScan2App.typeFailed;
    } else if (d.SendAppBuf(kScan2App.appType, header, kScan2AppHeader) < 0) {
        failed = kScan2App.bufferFailed;
    } else if (slXMLSize > kScan2AppHeader &&
               d.SendAppBuf(kScan2App.appType, xml.get(), static_cast<S32>(slXMLSize)) < 0) {
        // An XML of 8 bytes or less was read but is not forwarded.
        failed = kScan2AppXmlFailed;
    } else {
        xml.reset();
        if (d.NotifyAppEnd(kScan2App.appType) < 0) failed = kScan2App.endFailed;
    }
    if (failed) {
        USBADP_LOG(ERROR, "%s", failed);
        return;
    }
    USBADP_LOG(INFO, withXml ? "[USBAdp Scan] USB Send Application List sent\n"
                             : "[USBAdp Scan] USB Get User Selected List sent\n");
    USBADP_LOG(INFO, "[USBAdp Scan] USBAdpScan_Scan2App() End\n");
}

S32 USBAdpScan_IDS(U8 *pubCommand) {
    USBADP_LOG(INFO, "[USBAdp Scan] USBAdpScan_IDS() Begin, slDeviceHndl: %ld\n",
               static_cast<long>(slDeviceHndl.load()));
    // The ID-scan packet is the print-image request's header, whole.
    if (std::memcmp(pubCommand, imageHeader, IMAGE_HEADER_SIZE) != 0) {
        USBADP_LOG(ERROR, "[USBAdp Scan] Not IDS packet\n");
        return -1;
    }
    return forward(kIds, pubCommand, IMAGE_HEADER_SIZE) ? 0 : -2;
}

S32 USBAdpScan_VLX(U8 *pubCommand) {
    const S32 fd = slDeviceHndl.load();
    USBADP_LOG(INFO, "[USBAdp Scan] USBAdpScan_VLX() Begin, slDeviceHndl: %ld\n", static_cast<long>(fd));
    U8 header[VLX_HEADER_SIZE] = {};
    std::memcpy(header, pubCommand, 2);
    ssize_t n = readOnce(fd, header + 2, VLX_HEADER_SIZE - 2);
    if (n < 0) {
        USBADP_LOG(ERROR, "[USBAdp Scan] Error in reading VLX header, errno: %d\n", errno);
        return -1;
    }
    if (n < VLX_HEADER_SIZE - 2)
        USBADP_LOG(ERROR, "[USBAdp Scan] Full VLX header not read, slRet: %ld\n", static_cast<long>(n));
    USBADP_LOG(INFO, "[USBAdp Scan] slRet: %ld\n", static_cast<long>(n));
    U8 vlx_command[IMAGE_HEADER_SIZE] = {};
    S32 slRet = Vlx_Cap_Xml(fd, header, VLX_HEADER_SIZE, vlx_command);
    if (slRet != 0) {
        USBADP_LOG(ERROR, "[USBAdp Scan] VLX request not served, slRet: %ld\n", static_cast<long>(slRet));
        const S32 held = slRet > 0 && slRet <= IMAGE_HEADER_SIZE ? slRet : VLX_HEADER_SIZE;
        for (S32 i = 0; i < held; ++i) USBADP_LOG(DEBUG, "[USBAdp] vlx_command[%d]: %#x\n", i, vlx_command[i]);
    } else {
        USBADP_LOG(INFO, "[USBAdp Scan] VLX command success\n");
    }
    USBADP_LOG(INFO, "[USBAdp Scan] USBAdpScan_VLX() End\n");
    return slRet;
}
