#include "adapter/BackChannel.h"

#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>

#include <jni.h>

#include "adapter/USB.h"
#include "common/Log.h"
#include "scan/USBScan.h"

namespace {

U8 aubScanEventData[SCAN_EVENT_DATA_SIZE];
U8 aubBuf[CHECKIN_TIME_SIZE];

}  // namespace

extern "C" JNIEXPORT void JNICALL
Java_com_tarnwel_vbk_common_qz_services_usbadapter_USBAdapterPrintAndScanJNIService_sendBackChannelData(
    JNIEnv *env, jobject, jbyteArray p_response, jint buffLen) {
    USBADP_LOG(INFO, "[UsbAdp] [write] Start JNI_sendBackChannelData(), slDeviceHndl: %ld\n",
               static_cast<long>(slDeviceHndl.load()));
    if (!env) {
        USBADP_LOG(ERROR, "[UsbAdp] [write] env is NULL\n");
        return;
    }
    const jsize n = p_response ? env->GetArrayLength(p_response) : 0;
    S32 slDataLen = buffLen;
    if (slDataLen <= 0) {
        USBADP_LOG(ERROR, "[UsbAdp] [write] data received slDataLen: %d <= 0\n", slDataLen);
        return;
    }
    USBADP_LOG(INFO, "[UsbAdp] [write] size of response data n: %d, slDataLen: %d\n", static_cast<int>(n), slDataLen);
    // The length comes from Java as well as the array: only bytes the array
    // holds are sent.
    if (slDataLen > n) {
        USBADP_LOG(ERROR, "[UsbAdp] [write] buffLen %d is more than the %d bytes of the array: cut\n", slDataLen,
                   static_cast<int>(n));
        slDataLen = n;
        if (slDataLen <= 0) return;
    }
    U8 *data = static_cast<U8 *>(std::calloc(static_cast<size_t>(slDataLen) + 1, 1));
    if (!data) {
        USBADP_LOG(ERROR, "[UsbAdp] [write] Error in allocating memory for %d bytes, errno:%d\n", slDataLen, errno);
        return;
    }
    env->GetByteArrayRegion(p_response, 0, slDataLen, reinterpret_cast<jbyte *>(data));
    USBADP_LOG(DEBUG, "[UsbAdp] [write] read the command response\n");
    if (fdPrn.load() <= 0) {
        USBADP_LOG(ERROR, "[UsbAdp] [write] fdPrn <= 0\n");
        std::free(data);
        return;
    }
    // The handle of the host application in progress; none yet (0) must not
    // send the response to standard input.
    if (slDeviceHndl.load() <= 0) {
        USBADP_LOG(ERROR, "[UsbAdp] [write] no host application handle, slDeviceHndl: %ld\n",
                   static_cast<long>(slDeviceHndl.load()));
        std::free(data);
        return;
    }
    S32 done = 0;
    while (done < slDataLen) {
        ssize_t slRet = ::write(slDeviceHndl.load(), data + done, static_cast<size_t>(slDataLen - done));
        USBADP_LOG(DEBUG, "[UsbAdp] [write] Response data written to driver slRet: %d\n", static_cast<int>(slRet));
        if (slRet < 0) {
            if (errno == EINTR) continue;
            USBADP_LOG(ERROR, "[UsbAdp] [write] Error in writing to fdPrn, slDataLen:%d, errno: %d\n", slDataLen,
                       errno);
            std::free(data);
            return;
        }
        done += static_cast<S32>(slRet);
    }
    std::free(data);
    USBADP_LOG(INFO, "[UsbAdp] [write] Exit JNI_sendBackChannelData(), slDeviceHndl: %ld\n",
               static_cast<long>(slDeviceHndl.load()));
}

extern "C" JNIEXPORT jint JNICALL
Java_com_tarnwel_vbk_common_qz_services_usbadapter_USBAdapterPrintAndScanJNIService_sendScanToPCEventData(
    JNIEnv *env, jobject, jbyteArray p_response, jint buffLen) {
    USBADP_LOG(INFO, "[USBAdp] sendScanToPCEventData() native method start\n");
    if (!env) {
        USBADP_LOG(ERROR, "[USBAdp] Java env is null in sendScanToPCEventData native method\n");
        return 0;
    }
    const jsize jArrayLen = p_response ? env->GetArrayLength(p_response) : 0;
    if (jArrayLen <= 0) {
        USBADP_LOG(ERROR, "[USBAdp] ByteArray length is 0 in sendScanToPCEventData native method\n");
        return 0;
    }
    if (buffLen < 1 || buffLen > SCAN_EVENT_DATA_SIZE) {
        USBADP_LOG(ERROR, "[USBAdp] input buffLen(%d) is wrong in sendScanToPCEventData native method\n",
                   static_cast<int>(buffLen));
        return 0;
    }
    if (buffLen != jArrayLen)
        USBADP_LOG(INFO, "[USBAdp] Mismatch in size b/n byte array(%d) and buf len(%d)\n", static_cast<int>(jArrayLen),
                   static_cast<int>(buffLen));
    std::memset(aubScanEventData, 0, sizeof aubScanEventData);
    // Bytes past the array's end are not there to copy: they stay 0.
    env->GetByteArrayRegion(p_response, 0, std::min<jsize>(buffLen, jArrayLen),
                            reinterpret_cast<jbyte *>(aubScanEventData));
    for (int i = 0; i < SCAN_EVENT_DATA_SIZE; ++i)
        USBADP_LOG(DEBUG, "[USBAdp] aubScanEventData[%d]: %#x\n", i, aubScanEventData[i]);
    stVendor_cmd.bRequest = MFP_SET_SCAN2PCEVENT;
    stVendor_cmd.wValue = 1;
    stVendor_cmd.wIndex = 0;
    std::memset(stVendor_cmd.data, 0, sizeof stVendor_cmd.data);
    std::memcpy(stVendor_cmd.data, aubScanEventData, static_cast<size_t>(buffLen));
    if (::ioctl(fdPrn.load(), IOCNR_SET_DEV_VENDOR, &stVendor_cmd) < 0) {
        USBADP_LOG(ERROR, "[USBAdp] ioctl for sendScanToPCEventData failed, errno: %d\n", errno);
        return 0;
    }
    USBADP_LOG(INFO, "[USBAdp] sendScanToPCEventData() native method end\n");
    return 1;
}

extern "C" JNIEXPORT void JNICALL
Java_com_tarnwel_vbk_common_qz_services_usbadapter_USBAdapterKivoropnlAndDACJNIService_configInfoCheckInTime(
    JNIEnv *env, jobject, jbyteArray jBuf) {
    if (!env) {
        USBADP_LOG(ERROR, "[USBAdp] Java env is null in configInfoCheckInTime native method\n");
        return;
    }
    const jsize ArrayLen = jBuf ? env->GetArrayLength(jBuf) : 0;
    if (ArrayLen <= 0) {
        USBADP_LOG(ERROR, "[USBAdp] ByteArray length is 0 in configInfoCheckInTime native method\n");
        return;
    }
    jsize n = ArrayLen;
    if (n > CHECKIN_TIME_SIZE) {
        USBADP_LOG(ERROR, "[USBAdp] configInfoCheckInTime: %d bytes cut to %d\n", static_cast<int>(n),
                   CHECKIN_TIME_SIZE);
        n = CHECKIN_TIME_SIZE;
    }
    std::memset(aubBuf, 0, sizeof aubBuf);
    env->GetByteArrayRegion(jBuf, 0, n, reinterpret_cast<jbyte *>(aubBuf));
    stVendor_cmd.bRequest = MFP_DEV_KIVORO_CHECKINTIME;
    // The host is told the length Java gave.
    stVendor_cmd.wValue = static_cast<U16>(ArrayLen);
    stVendor_cmd.wIndex = 0;
    std::memset(stVendor_cmd.data, 0, sizeof stVendor_cmd.data);
    std::memcpy(stVendor_cmd.data, aubBuf, static_cast<size_t>(n));
    if (::ioctl(fdPrn.load(), IOCNR_SET_DEV_VENDOR, &stVendor_cmd) < 0)
        USBADP_LOG(ERROR, "[USBAdp] ioctl for configInfoCheckInTime failed, errno: %d\n", errno);
}
