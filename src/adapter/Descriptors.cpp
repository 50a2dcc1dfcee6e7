#include "adapter/Descriptors.h"

#include <fcntl.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <iterator>
#include <string>

#include "adapter/ProductConfig.h"
#include "adapter/USB.h"
#include "common/FixedPath.h"
#include "common/Log.h"
#include "common/UniqueFd.h"
#include "print/USBPrint.h"

U8 aub_mf_string[USB_STRING_SIZE];
U8 aub_pd_string[USB_STRING_SIZE];
U8 aub_serial_str[USB_STRING_SIZE];
U8 aub_dev1284_str[DEV_ID_STRING_SIZE];
U8 manufacturingString[JAVA_NAME_SIZE];
U8 deviceClassName[JAVA_NAME_SIZE];

namespace {

constexpr size_t kMfgPartSize = 30;
constexpr size_t kCmdPartSize = 100;
constexpr size_t kClsPartSize = 30;
constexpr size_t kModePartSize = 30;
constexpr size_t kStatusPartSize = 30;
constexpr int kPrinterBusy = 2;
constexpr size_t kReportTextSize = 40;

// The command sets of the Device ID in their order, with their defaults; the
// model groups switch the optional ones on.
struct TCommandSet {
    const char *name;
    bool byDefault;
    bool xps;          // on for the XPS models
    bool pdfTiffJpeg;  // on for the PDF/TIFF/JPEG models
};
constexpr TCommandSet kCommandSets[] = {
    {"PCL5E", true, false, false}, {"PCL6", true, false, false}, {"POSTSCRIPT", true, false, false},
    {"PDF", false, false, true},   {"TIFF", false, false, true}, {"JPEG", false, false, true},
    {"FAX", true, false, false},   {"FWV", true, false, false},  {"QMDS", true, false, false},
    {"XPS", false, true, false},   {"EXT", true, false, false},  {"SBC", true, false, false},
};
constexpr size_t kCommandSlots = 15;
static_assert(std::size(kCommandSets) <= kCommandSlots);

const char *text(const U8 *s) { return reinterpret_cast<const char *>(s); }

// Appends src to the NUL-terminated dst of `size` bytes, cutting it so the
// terminator always fits. False when something was cut.
bool append(char *dst, size_t size, const char *src) {
    size_t used = strnlen(dst, size - 1);
    size_t n = std::strlen(src);
    size_t room = size - 1 - used;
    bool whole = n <= room;
    std::memcpy(dst + used, src, whole ? n : room);
    dst[used + (whole ? n : room)] = '\0';
    return whole;
}

// Java strings are held to their buffers on arrival, but the Device ID is
// built from several: whatever would not fit in 200 bytes is cut, and said so.
void buildDeviceId(bool askStatus) {
    USBADP_LOG(INFO, "[USBAdp] Start SetDeviceIDString()\n");
    char *id = reinterpret_cast<char *>(aub_dev1284_str);
    std::memset(aub_dev1284_str, 0, sizeof aub_dev1284_str);
    char mfg[kMfgPartSize] = {}, cmd[kCmdPartSize] = {}, cls[kClsPartSize] = {}, mode[kModePartSize] = {},
         status[kStatusPartSize] = {};
    bool whole = true;

    whole &= append(mfg, sizeof mfg, text(manufacturingString));
    whole &= append(mfg, sizeof mfg, ";");

    const bool xps = ProductConfig_InGroup(TModelGroup::Xps, aub_pd_string);
    const bool pdf = ProductConfig_InGroup(TModelGroup::PdfTiffJpeg, aub_pd_string);
    U8 flags[kCommandSlots] = {};
    int cmdCounter = 0;
    for (size_t i = 0; i < std::size(kCommandSets); ++i) {
        const TCommandSet &c = kCommandSets[i];
        flags[i] = (c.byDefault || (c.xps && xps) || (c.pdfTiffJpeg && pdf)) ? 1 : 0;
        cmdCounter += flags[i];
    }
    USBADP_LOG(DEBUG, "[USBAdp] cmdCounter:: %d\n", cmdCounter);
    int written = 0;
    for (size_t i = 0; i < std::size(kCommandSets); ++i) {
        if (!flags[i]) continue;
        whole &= append(cmd, sizeof cmd, kCommandSets[i].name);
        if (++written < cmdCounter) whole &= append(cmd, sizeof cmd, ",");
    }
    whole &= append(cmd, sizeof cmd, ";");

    whole &= append(cls, sizeof cls, text(deviceClassName));
    whole &= append(cls, sizeof cls, ";");
    append(mode, sizeof mode, "QML7,SCN;");

    int printerStatus = 1;
    if (askStatus) {
        printerStatus = static_cast<int>(fetchPrinterStatus());
        USBADP_LOG(DEBUG, "[USBAdp] printerStatus:: [%d]\n", printerStatus);
    }
    append(status, sizeof status, printerStatus == kPrinterBusy ? "BUSY;" : "IDLE;");

    USBADP_LOG(DEBUG, "[USBAdp] mfg: [%s] :: %d %d\n", mfg, static_cast<int>(sizeof mfg), static_cast<int>(std::strlen(mfg)));
    USBADP_LOG(DEBUG, "[USBAdp] cmd: [%s] :: %d %d\n", cmd, static_cast<int>(sizeof cmd), static_cast<int>(std::strlen(cmd)));
    USBADP_LOG(DEBUG, "[USBAdp] cls: [%s] :: %d %d\n", cls, static_cast<int>(sizeof cls), static_cast<int>(std::strlen(cls)));
    USBADP_LOG(DEBUG, "[USBAdp] mode: [%s] :: %d %d\n", mode, static_cast<int>(sizeof mode),
               static_cast<int>(std::strlen(mode)));
    USBADP_LOG(DEBUG, "[USBAdp] status: [%s] :: %d %d\n", status, static_cast<int>(sizeof status),
               static_cast<int>(std::strlen(status)));

    const size_t size = sizeof aub_dev1284_str;
    const char *model = text(aub_pd_string);
    for (const char *piece : {"MFG:", static_cast<const char *>(mfg), "CMD:", static_cast<const char *>(cmd), "MDL:",
                              model, ";", "CLS:", static_cast<const char *>(cls), "MODE:",
                              static_cast<const char *>(mode)})
        whole &= append(id, size, piece);
    if (ProductConfig_InGroup(TModelGroup::CidPcl6Color, aub_pd_string))
        whole &= append(id, size, "CID:NV_PCL6_Color;");
    else if (ProductConfig_InGroup(TModelGroup::CidPcl6Mono, aub_pd_string))
        whole &= append(id, size, "CID:NV_PCL6_BW;");
    if (ProductConfig_InGroup(TModelGroup::CidXpsColor, aub_pd_string))
        whole &= append(id, size, "CID:NV_XPS_Color;");
    else if (ProductConfig_InGroup(TModelGroup::CidXpsMono, aub_pd_string))
        whole &= append(id, size, "CID:NV_XPS_BW;");
    whole &= append(id, size, "STATUS:");
    whole &= append(id, size, status);
    if (!whole) USBADP_LOG(ERROR, "[USBAdp] Device ID cut to %d bytes\n", static_cast<int>(std::strlen(id)));

    USBADP_LOG(INFO, "[USBAdp] [%s]\n", id);
    USBADP_LOG(INFO, "[USBAdp] aub_dev1284_str, sizeof: %d::length: %d\n", static_cast<int>(size),
               static_cast<int>(std::strlen(id)));
    USBADP_LOG(INFO, "[USBAdp] Exit SetDeviceIDString()\n");
}

// Size field of a descriptor string: its length with the terminator.
template <size_t N>
size_t sizeWithNul(const U8 (&s)[N]) {
    return strnlen(text(s), N - 1) + 1;
}

bool sendDescriptors(U16 pid) {
    desc_param_t stDevParam;
    std::memset(&stDevParam, 0, sizeof stDevParam);
    stDevParam.uwVid = DEV_VENDOR_ID;
    stDevParam.uwPid = pid;
    stDevParam.uwLangID = USB_LANGUAGE_ID;
    // Buffers are NUL-terminated within their size, so every size fits its field.
    stDevParam.ubMf_string_size = static_cast<U8>(sizeWithNul(aub_mf_string));
    stDevParam.ubPd_string_size = static_cast<U8>(sizeWithNul(aub_pd_string));
    stDevParam.ubSerial_string_size = static_cast<U8>(sizeWithNul(aub_serial_str));
    stDevParam.uwDev_id_1284_size = static_cast<U16>(sizeWithNul(aub_dev1284_str));
    stDevParam.stDevStrID.pub_mf_string = aub_mf_string;
    stDevParam.stDevStrID.pub_pd_string = aub_pd_string;
    stDevParam.stDevStrID.pub_serial_string = aub_serial_str;
    stDevParam.stDevStrID.pub_dev_id_1284 = aub_dev1284_str;
    USBADP_LOG(INFO, "[USBAdp] aub_mf_string: [%s]\n", text(aub_mf_string));
    USBADP_LOG(INFO, "[USBAdp] aub_pd_string: [%s]\n", text(aub_pd_string));
    USBADP_LOG(INFO, "[USBAdp] aub_serial_str: [%s]\n", text(aub_serial_str));
    USBADP_LOG(INFO, "[USBAdp] aub_dev1284_str: [%s]\n", text(aub_dev1284_str));
    return ::ioctl(fdPrn.load(), IOCNR_SET_DESC_REQ, &stDevParam) >= 0;
}

}  // namespace

void SetDeviceIDString(void) { buildDeviceId(true); }

void SetDeviceIDString_reOpen(void) { buildDeviceId(false); }

S32 MfpDevSetDesc(void) {
    USBADP_LOG(INFO, "[USBAdp]Inside MfpDevSetDesc().\n");
    const U16 pid = ProductConfig_ProductId(aub_pd_string);
    USBADP_LOG(INFO, "[USBAdp] stDevParam.uwPid: %#x\n", pid);
    if (!sendDescriptors(pid)) {
        USBADP_LOG(ERROR, "[USBAdp][print thread] ioctl[IOCNR_SET_DESC_REQ] failed, errno: %d\n", errno);
        return -1;
    }
    U8 connect = 1;
    if (::ioctl(fdPrn.load(), IOCNR_SET_DEV_CONNECT, &connect) < 0) {
        USBADP_LOG(ERROR, "[USBAdp][print thread] ioctl[IOCNR_SET_DEV_CONNECT] failed, errno: %d\n", errno);
        return -1;
    }
    USBADP_LOG(INFO, "Initialization of the device completed and now waiting for the acknowledgement from the driver.\n");
    return 0;
}

S32 MAAMfpDevSetDesc(void) {
    USBADP_LOG(INFO, "[USBAdp]Inside MAAMfpDevSetDesc().\n");
    if (!sendDescriptors(DEV_PRODUCT_ID)) {
        USBADP_LOG(ERROR, "Setting Descriptors Request to driver Unsuccessful.\n");
        return -1;
    }
    USBADP_LOG(INFO, "Setting Descriptors Request made successfully to driver.\n");
    return 0;
}

S32 USBADP_SetSerialNumber(void) {
    USBADP_LOG(INFO, "[USBAdp] Start USBADP_SetSerialNumber()\n");
    if (fdPrn.load() <= 0) {
        USBADP_LOG(ERROR, "[USBAdp] fdPrn <= 0\n");
        return -1;
    }
    const S32 slSerialNumber_Length = static_cast<S32>(strnlen(text(aub_serial_str), sizeof aub_serial_str - 1));
    if (slSerialNumber_Length <= 0) {
        USBADP_LOG(ERROR, "[USBAdp] slSerialNumber_Length: %d < 0\n", slSerialNumber_Length);
        return -1;
    }
    stVendor_cmd.bRequest = MFP_SET_SERIALNO;
    stVendor_cmd.wValue = 0;
    stVendor_cmd.wIndex = 1;
    std::memset(stVendor_cmd.data, 0, sizeof stVendor_cmd.data);
    std::memcpy(stVendor_cmd.data, aub_serial_str, static_cast<size_t>(slSerialNumber_Length));
    USBADP_LOG(INFO, "[USBAdp] Machine Serial number: %s\n", text(aub_serial_str));
    if (::ioctl(fdPrn.load(), IOCNR_SET_DEV_VENDOR, &stVendor_cmd) < 0) {
        USBADP_LOG(ERROR, "[USBAdp] ioctl for Machine Serial number failed, errno: %d\n", errno);
        return -1;
    }
    USBADP_LOG(INFO, "[USBAdp] Exit USBADP_SetSerialNumber()\n");
    return 0;
}

void WriteSerialString(U8 *buf) {
    USBADP_LOG(INFO, "[USBAdp]Entered inside WriteSerialString()\n");
    char *report = static_cast<char *>(std::malloc(kReportTextSize));
    if (!report) {
        USBADP_LOG(ERROR, "[USBAdp]malloc failed.\n");
        std::free(buf);
        return;
    }
    // Four characters of the caller's text, fewer when it is shorter: nothing
    // past its terminator is read.
    const int n = std::snprintf(report, kReportTextSize, "%.*s\t%s", 4, buf ? text(buf) : "", kProductSeriesName);
    const std::string path = FixedPath(REPORT_FILE);
    UniqueFd fd(::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644));
    if (!fd) {
        USBADP_LOG(ERROR, "[USBAdp]Error in opening file.\n");
    } else if (n < 0 || ::write(fd.get(), report, static_cast<size_t>(n)) != n) {
        USBADP_LOG(ERROR, "[USBAdp]Error in writing to usb_version.txt file.\n");
    }
    std::free(report);
    std::free(buf);
    USBADP_LOG(INFO, "[USBAdp]Exited WriteSerialString()\n");
}
