#include "adapter/Lifecycle.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include <jni.h>

#include "adapter/Descriptors.h"
#include "adapter/SerialNumber.h"
#include "adapter/USB.h"
#include "adapter/prn_thread.h"
#include "common/Log.h"

S32 USBAdapter_IF_PrintInit(void) {
    USBADP_LOG(INFO, "[USBAdp]Inside USBAdapter_IF_PrintInit(), fdPrn:%d\n", fdPrn.load());
    // The print daemon may not answer from this thread: the status is not asked.
    SetDeviceIDString_reOpen();
    if (fdPrn == 0) {
        USBADP_LOG(INFO, "[USBAdp] PrintInit fdPrn Open\n");
        fdPrn = ::open(MS_PRN_FILE_NAME, O_RDWR);
        if (fdPrn < 0) USBADP_LOG(ERROR, "[USBAdp]Cannot open the device file of print, errno:%d\n", errno);
    }
    USBADP_LOG(INFO, "[USBAdp] PrintInit =====> USB DEVICE OPEN - Print : [%d]\n", fdPrn.load());
    if (!USBAdapter_PreparePrnNode()) return 0;

    // The serial number of the first set-up stands; only a damaged one is replaced.
    if (!IsValidUSBSerialString(aub_serial_str)) {
        USBAdapter_SetDefaultSerial();
        USBADP_LOG(INFO, "[USBAdp]USB Serial ID found Invalid and Default is Set [%s]\n",
                   reinterpret_cast<const char *>(aub_serial_str));
    }
    if (!USBAdapter_SendIdentity(true)) return 0;

    hibernation_flag = 0;
    if (IsDisconnected.load()) {
        USBADP_LOG(INFO, "[USBAdp] IsDisconnected signal is set\n");
        IsConfigured = 0;
    } else {
        IsConfigured = 1;
    }
    USBADP_LOG(INFO, "[USBAdp]Exit USBAdapter_IF_PrintInit(), fdPrn:%d\n", fdPrn.load());
    return 1;
}

S32 USBAdapter_IF_PrintClose(void) {
    USBADP_LOG(INFO, "[USBAdp] USBAdapter_IF_PrintClose start, fdPrn: %d\n", fdPrn.load());
    // A report left from an earlier park must not let this close through
    // before the reader has parked again.
    if (startreading_enter.load() == 1) IsCanClose = 0;
    hibernation_flag = 1;
    USBAdapter_WakeReader();
    while (startreading_enter.load() == 1 && IsCanClose.load() != 1) ::usleep(1);
    // 0 is "not open": closing it would close standard input.
    const int fd = fdPrn.exchange(0);
    const int r = fd > 0 ? ::close(fd) : -1;
    if (r < 0) {
        USBADP_LOG(ERROR, "[USBAdp] close on print channel failed, errno: %d\n", fd > 0 ? errno : EBADF);
        return 0;
    }
    USBADP_LOG(INFO, "[USBAdp] USBAdapter_IF_PrintClose end\n");
    return 1;
}

U8 USBAdapter_IF_PrintDrvOpenCheck(void) { return IsConfigured.load(); }

extern "C" JNIEXPORT jint JNICALL
Java_com_tarnwel_vbk_common_qz_services_usbadapter_USBAdapterPrintAndScanJNIService_USBPrintDrvOpen(JNIEnv *,
                                                                                                    jobject) {
    USBADP_LOG(INFO, "[USBAdp][Hibernation] Start Print USB Driver Opened\n");
    if (USBAdapter_IF_PrintInit() != 1) {
        USBADP_LOG(ERROR, "[USBAdp]USBAdapter_IF_PrintInit fails\n");
        return 0;
    }
    USBADP_LOG(INFO, "[USBAdp][Hibernation] Complete Print USB Driver Opened\n");
    return 1;
}

extern "C" JNIEXPORT jint JNICALL
Java_com_tarnwel_vbk_common_qz_services_usbadapter_USBAdapterPrintAndScanJNIService_USBPrintDrvClose(JNIEnv *,
                                                                                                     jobject) {
    USBADP_LOG(INFO, "[USBAdp][Hibernation] Start Print USB Driver Closed\n");
    const S32 r = USBAdapter_IF_PrintClose();
    USBADP_LOG(INFO, "[USBAdp][Hibernation] Complete Print USB Driver Closed\n");
    return r;
}

extern "C" JNIEXPORT jint JNICALL
Java_com_tarnwel_vbk_common_qz_services_usbadapter_USBAdapterPrintAndScanJNIService_USBPrintDrvOpenChk(JNIEnv *,
                                                                                                      jobject) {
    return USBAdapter_IF_PrintDrvOpenCheck();
}
