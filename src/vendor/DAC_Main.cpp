#include "vendor/DAC_Main.h"

#include <sys/ioctl.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include <jni.h>

#include "adapter/USB.h"
#include "common/Log.h"

namespace {

// Module buffers, by their sizes in the record they fill.
U8 aubSizeInfo[8];
U8 aubSMPrinterInfo[16];
U8 aubSMJobInfo[75];
U8 aubCMDInfo[255];
U8 aubTrayInfo[8];
U8 aubUsageCountInfo[255];
U8 aubMultiBinInfo[255];
U8 aubCapabilityInfo[255];
U8 aubTrayInfo3[255];
U8 aubPullprintingInfo[255];
U8 aubEcoInfo[USB_VEN_ECOBUFSIZE];
U8 aubFWVersionInfo[511];
U8 aubMPSInfo[8];
U8 aubMPSWakeupInfo[8];
// Rows without a module buffer pass the array's own bytes, up to a record.
U8 aubArrayBytes[VENDOR_CMD_DATA_SIZE];

// Status-panel records and the others; both overwritten by every call.
vendor_cmd_t stKivoro_cmd;
vendor_cmd_t vendor_cmd;

struct TVendorRow {
    const char *method;
    U8 bRequest;
    U16 wValue;
    U16 wIndex;
    U8 *buffer;
    size_t size;
    bool statusPanel;        // which record
    bool arrayBytes;         // the array's bytes, not a fixed buffer's
    const char *closedLine;  // standard error when the print node is closed
};

constexpr const char kDacClosed[] = "fdPrn = 0\n";

const TVendorRow kKivoroSize = {"KivoroSize", MFP_DEV_KIVORO_DATA, KIVORO_SIZE_VAL_INFO, 0, aubSizeInfo,
                                sizeof aubSizeInfo, true, false, "fdPrnKivoroSize = 0\n"};
const TVendorRow kKivoroPrinterStatus = {"KivoroPrinterStatus", MFP_DEV_KIVORO_PRINTSTATUS, 0, 0, aubSMPrinterInfo,
                                         sizeof aubSMPrinterInfo, true, false, "fdPrnKivoroPrinterStatus = 0\n"};
const TVendorRow kKivoroJobStatus = {"KivoroJobStatus", MFP_DEV_KIVORO_JOBSTATUS, 0, 0, aubSMJobInfo,
                                     sizeof aubSMJobInfo, true, false, "fdPrnKivoroJobStatus = 0\n"};
const TVendorRow kExtCMDInfo = {"extCMDInfo", SET_EXT_COMMAND, 1, 0, aubCMDInfo, sizeof aubCMDInfo, false, false,
                                "USBAdapter_extCMDInfo fdPrn = 0\n"};
const TVendorRow kTrayInfo1 = {"trayInfo1", 0x0A, 0x0000, 0, aubTrayInfo, sizeof aubTrayInfo, false, false, kDacClosed};
const TVendorRow kTrayInfo2 = {"trayInfo2", 0x0A, 0x0100, 2, aubTrayInfo, sizeof aubTrayInfo, false, false, kDacClosed};
const TVendorRow kUsageCountInfo = {"usageCountInfo", 0x0A, 0x0200, 3, aubUsageCountInfo, sizeof aubUsageCountInfo,
                                    false, false, kDacClosed};
const TVendorRow kMultiBinInfo1 = {"multiBinInfo1", 0x0A, 0x0300, 4, aubMultiBinInfo, sizeof aubMultiBinInfo,
                                   false, false, kDacClosed};
const TVendorRow kMultiBinInfo2 = {"multiBinInfo2", 0x0A, 0x0400, 5, aubMultiBinInfo, sizeof aubMultiBinInfo,
                                   false, false, kDacClosed};
const TVendorRow kCapabilityInfo = {"capabilityInfo", 0x0A, 0x0500, 6, aubCapabilityInfo, sizeof aubCapabilityInfo,
                                    false, false, kDacClosed};
const TVendorRow kTrayInfo3 = {"trayInfo3", 0x0A, 0x0600, 7, aubTrayInfo3, sizeof aubTrayInfo3, false, false,
                               kDacClosed};
const TVendorRow kPullPrintingInfo = {"pullPrintingInfo", 0x0A, 0x0700, 8, aubPullprintingInfo,
                                      sizeof aubPullprintingInfo, false, false, kDacClosed};
const TVendorRow kBlackOnlyKeyInfo = {"blackOnlyKeyInfo", 0x0E, 0x0000, 9, aubArrayBytes, sizeof aubArrayBytes,
                                      false, true, kDacClosed};
const TVendorRow kEcoInfo = {"ecoInfo", 0x23, 0x0002, 10, aubEcoInfo, sizeof aubEcoInfo, false, false, kDacClosed};
const TVendorRow kExtInfo = {"extInfo", 0xAC, 0x0000, 11, aubArrayBytes, sizeof aubArrayBytes, false, true,
                             kDacClosed};
const TVendorRow kFwversion = {"fwversion", MFP_FW_VERSION, 0, 0, aubFWVersionInfo, sizeof aubFWVersionInfo, false,
                               false, kDacClosed};
const TVendorRow kMpsMode = {"mpsMode", 0x23, 0x0001, 0, aubMPSInfo, sizeof aubMPSInfo, false, false, kDacClosed};
const TVendorRow kMpsWakeup = {"mpsWakeup", MFP_MPS_WAKEUP, 0, 0, aubMPSWakeupInfo, sizeof aubMPSWakeupInfo, false,
                               false, kDacClosed};

void stage(vendor_cmd_t &rec, U8 bRequest, U16 wValue, U16 wIndex, const U8 *bytes, size_t n) {
    rec.bRequest = bRequest;
    rec.wValue = wValue;
    rec.wIndex = wIndex;
    std::memset(rec.data, 0, sizeof rec.data);
    std::memcpy(rec.data, bytes, n);
    // The driver keeps the record for the host's request; its answer is not ours to act on.
    (void)::ioctl(fdPrn.load(), IOCNR_SET_DEV_VENDOR, &rec);
}

void stageRow(JNIEnv *env, jbyteArray array, const TVendorRow &row) {
    if (!env) {
        USBADP_LOG(ERROR, "[USBAdp] %s: Java env is null\n", row.method);
        return;
    }
    if (!array) {
        USBADP_LOG(ERROR, "[USBAdp] %s: byte array is null\n", row.method);
        return;
    }
    const jsize len = env->GetArrayLength(array);
    size_t n = static_cast<size_t>(len);
    if (n > row.size) {
        USBADP_LOG(ERROR, "[USBAdp] %s: %d bytes cut to %d\n", row.method, static_cast<int>(len),
                   static_cast<int>(row.size));
        n = row.size;
    }
    std::memset(row.buffer, 0, row.size);
    env->GetByteArrayRegion(array, 0, static_cast<jsize>(n), reinterpret_cast<jbyte *>(row.buffer));
    if (fdPrn.load() <= 0) {
        std::fputs(row.closedLine, stderr);
        return;
    }
    // A fixed buffer goes whole, zeros included; the array rows send what came.
    stage(row.statusPanel ? stKivoro_cmd : vendor_cmd, row.bRequest, row.wValue, row.wIndex, row.buffer,
          row.arrayBytes ? n : row.size);
}

void stageKivoroData(JNIEnv *env, jbyteArray array) {
    if (!env || !array) {
        USBADP_LOG(ERROR, "[USBAdp] KivoroData: %s is null\n", env ? "byte array" : "Java env");
        return;
    }
    const jsize len = env->GetArrayLength(array);
    if (len <= 0) return;
    // Bytes past the longest answer are never sent: they are not copied either.
    const size_t length = std::min<size_t>(static_cast<size_t>(len), KIVORO_DATA_MAX_SIZE);
    if (static_cast<size_t>(len) > length)
        USBADP_LOG(ERROR, "[USBAdp] KivoroData: %d bytes cut to %d\n", static_cast<int>(len),
                   static_cast<int>(length));
    U8 *buf = static_cast<U8 *>(std::calloc(length + 1, 1));
    if (!buf) {
        USBADP_LOG(ERROR, "[USBAdp] KivoroData: allocation of %d bytes failed\n", static_cast<int>(length + 1));
        return;
    }
    env->GetByteArrayRegion(array, 0, static_cast<jsize>(length), reinterpret_cast<jbyte *>(buf));
    // Copied as a string: everything from the first zero byte on is zero.
    const size_t text = strnlen(reinterpret_cast<const char *>(buf), length);
    std::memset(buf + text, 0, length - text);
    if (fdPrn.load() <= 0) {
        std::free(buf);
        std::fputs("fdPrnKivoroData = 0\n", stderr);
        return;
    }
    // Answers of one block or less go through KivoroSize alone.
    size_t blocks = 0, rest = 0;
    if (length > KIVORO_BLOCK_SIZE) {
        blocks = length / KIVORO_BLOCK_SIZE;
        rest = length % KIVORO_BLOCK_SIZE;
    }
    for (size_t b = 0; b < blocks; ++b)
        stage(stKivoro_cmd, MFP_DEV_KIVORO_DATA, KIVORO_DATA_VAL_INFO, static_cast<U16>(b),
              buf + b * KIVORO_BLOCK_SIZE, KIVORO_BLOCK_SIZE);
    if (rest > 0)
        stage(stKivoro_cmd, MFP_DEV_KIVORO_DATA, KIVORO_DATA_VAL_INFO, static_cast<U16>(blocks),
              buf + blocks * KIVORO_BLOCK_SIZE, rest);
    std::free(buf);
}

}  // namespace

#define KIVORO_DAC_ENTRY(method, row)                                                                         \
    extern "C" JNIEXPORT void JNICALL                                                                         \
        Java_com_tarnwel_vbk_common_qz_services_usbadapter_USBAdapterKivoropnlAndDACJNIService_##method(      \
            JNIEnv *env, jobject, jbyteArray data) {                                                          \
        stageRow(env, data, row);                                                                             \
    }

KIVORO_DAC_ENTRY(KivoroSize, kKivoroSize)
KIVORO_DAC_ENTRY(KivoroPrinterStatus, kKivoroPrinterStatus)
KIVORO_DAC_ENTRY(KivoroJobStatus, kKivoroJobStatus)
KIVORO_DAC_ENTRY(extCMDInfo, kExtCMDInfo)
KIVORO_DAC_ENTRY(trayInfo1, kTrayInfo1)
KIVORO_DAC_ENTRY(trayInfo2, kTrayInfo2)
KIVORO_DAC_ENTRY(usageCountInfo, kUsageCountInfo)
KIVORO_DAC_ENTRY(multiBinInfo1, kMultiBinInfo1)
KIVORO_DAC_ENTRY(multiBinInfo2, kMultiBinInfo2)
KIVORO_DAC_ENTRY(capabilityInfo, kCapabilityInfo)
KIVORO_DAC_ENTRY(trayInfo3, kTrayInfo3)
KIVORO_DAC_ENTRY(pullPrintingInfo, kPullPrintingInfo)
KIVORO_DAC_ENTRY(blackOnlyKeyInfo, kBlackOnlyKeyInfo)
KIVORO_DAC_ENTRY(ecoInfo, kEcoInfo)
KIVORO_DAC_ENTRY(fwversion, kFwversion)
KIVORO_DAC_ENTRY(mpsMode, kMpsMode)
KIVORO_DAC_ENTRY(mpsWakeup, kMpsWakeup)

extern "C" JNIEXPORT void JNICALL Java_com_tarnwel_vbk_common_qz_services_usbadapter_USBAdapterKivoropnlAndDACJNIService_KivoroData(
    JNIEnv *env, jobject, jbyteArray data) {
    stageKivoroData(env, data);
}

extern "C" JNIEXPORT void JNICALL Java_com_tarnwel_vbk_ca_plugin_usbadapter_USBAdapter_extInfo(JNIEnv *env, jobject,
                                                                                                jbyteArray data) {
    stageRow(env, data, kExtInfo);
}
