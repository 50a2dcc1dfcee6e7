#include "adapter/SerialNumber.h"

#include <algorithm>
#include <cstring>

#include "adapter/Descriptors.h"
#include "common/JniUtil.h"
#include "common/Log.h"
#include "maa/functions/MAA_SysResult.h"
#include "print/USBPrint.h"

const U8 aubCONDefaultUSBSerialNumber[16] = {'0', '0', '0', '0', '-', '0', '0', '0',
                                             '0', '0', '0', '0', '0', '0', '0', '0'};

namespace {

U8 aubCONTempUSBSerialNumber[USB_SERIAL_TEXT_SIZE];
// The serial number as the daemon gave it, cut to what the USB string holds.
U8 aubMachineSerial[USB_STRING_SIZE];
// Where a serial number stops being usable, and the shortest usable one.
constexpr int kMinSerialLength = 7;

void reportFailed() { SysPBA_IF_PrintResult(reinterpret_cast<const U8 *>("Failed"), 1, 0); }

bool allowed(U8 c) { return c >= 33 && c <= 126 && c != ',' && c != '\\'; }

}  // namespace

S32 checkMachineSerialinConf(void) {
    JNIEnv *env = USBPrint_ThreadEnv();
    jobject daemon = globalPrintObj.load();
    if (!env || !daemon) {
        USBADP_LOG(ERROR, "Error in checkMachineSerialinConf()::can't find class PrintDaemon.\n");
        reportFailed();
        return 0;
    }
    LocalRef<jclass> cls(env, env->GetObjectClass(daemon));
    if (!cls) {
        USBADP_LOG(ERROR, "Error in checkMachineSerialinConf()::can't find class PrintDaemon.\n");
        reportFailed();
    } else if (jmethodID mid = env->GetMethodID(cls.get(), "checkMcSerialInConf", "()I"); !mid) {
        USBADP_LOG(ERROR, "Error in checkMachineSerialinConf()::can't find checkMcSerialInConf().\n");
        reportFailed();
    } else if (env->CallIntMethod(daemon, mid) != 0) {
        USBADP_LOG(ERROR, "Error in checkMachineSerialinConf()::machine number sync failed.\n");
        // A non-zero answer means the call returned normally: nothing to sweep.
        return -1;
    } else {
        USBADP_LOG(FINE, "checkMachineSerialinConf()::machine number synced properly.\n");
    }
    JNI_ExceptionSweep(env);
    return 0;
}

U8 *getSerialString(void) {
    JNIEnv *env = USBPrint_ThreadEnv();
    jobject daemon = globalPrintObj.load();
    if (!env || !daemon) {
        USBADP_LOG(ERROR, "Error in getSerialString()::can't find class PrintDaemon.\n");
        reportFailed();
        return nullptr;
    }
    U8 *result = nullptr;
    LocalRef<jclass> cls(env, env->GetObjectClass(daemon));
    jmethodID mid = cls ? env->GetMethodID(cls.get(), "getMcSerial", "()Ljava/lang/String;") : nullptr;
    if (!cls) {
        USBADP_LOG(ERROR, "Error in getSerialString()::can't find class PrintDaemon.\n");
    } else if (!mid) {
        USBADP_LOG(ERROR, "Error in getSerialString()::can't find getMcSerial().\n");
    } else {
        LocalRef<jstring> s(env, static_cast<jstring>(env->CallObjectMethod(daemon, mid)));
        if (env->ExceptionCheck()) {
            JNI_ExceptionSweep(env);
        } else if (UtfChars chars(env, s.get()); chars) {
            // Copied and released (the characters are not kept pinned for the
            // life of the process); longer texts are cut to the USB string.
            size_t len = std::strlen(chars.get());
            if (len >= sizeof aubMachineSerial)
                USBADP_LOG(ERROR, "getSerialString(): serial number of %d characters cut to %d\n",
                           static_cast<int>(len), static_cast<int>(sizeof aubMachineSerial - 1));
            std::memset(aubMachineSerial, 0, sizeof aubMachineSerial);
            std::memcpy(aubMachineSerial, chars.get(), std::min(len, sizeof aubMachineSerial - 1));
            USBADP_LOG(FINE, "USB Serial Number is [%s]. \n", reinterpret_cast<const char *>(aubMachineSerial));
            result = aubMachineSerial;
        }
    }
    if (!result) reportFailed();
    JNI_ExceptionSweep(env);
    return result;
}

bool IsValidUSBSerialString(U8 *serial) {
    if (!serial || serial[0] == 0) return false;
    std::memset(aubCONTempUSBSerialNumber, 0, sizeof aubCONTempUSBSerialNumber);
    const size_t full = std::strlen(reinterpret_cast<const char *>(serial));
    const U8 length = static_cast<U8>(full);
    // At most 16 characters are kept: a longer text is refused anyway.
    std::memcpy(aubCONTempUSBSerialNumber, serial, std::min<size_t>(full, USB_SERIAL_NUMBER_LENGTH));
    USBADP_LOG(DEBUG, "\r\nIsValidUSBSerialString usbserial string length is [%d]", length);
    const bool flag = !(length == 0 || length >= USB_SERIAL_TEXT_SIZE);
    int i = 0;
    for (; i < USB_SERIAL_NUMBER_LENGTH; ++i) {
        USBADP_LOG(DEBUG, "0x%x,", aubCONTempUSBSerialNumber[i]);
        if (!allowed(aubCONTempUSBSerialNumber[i])) break;
    }
    if (i == USB_SERIAL_NUMBER_LENGTH) return flag;
    if (i < kMinSerialLength) return false;
    aubCONTempUSBSerialNumber[i] = 0;
    return flag;
}
