#include "maa/functions/MAA_SerialNo.h"

#include <cstdlib>
#include <cstring>

#include "adapter/SerialNumber.h"
#include "common/JniUtil.h"
#include "common/Log.h"
#include "maa/MAA_Result.h"
#include "maa/functions/MAA_SysResult.h"
#include "print/USBPrint.h"

U8 serial_number_str[17];
S32 init_required_after_maa = 0;

namespace {

// What tells the two setters apart.
struct TSetter {
    const char *header;
    const char *noClass;
    bool logsJniCall;
    const char *method;
    const char *noMethod;
    const char *nullAnswer;
};

constexpr TSetter kSetSerialNumber = {
    "[USB_SetSerialNumber]",
    "Error in USB_SetSerialNumber()::can't find class PrintDaemon.\n",
    true,
    "maaUSBSetSerialNumber",
    "Error in USB_SetSerialNumber()::can't find USB_SetSerialNumber().\n",
    "USB SerialNumber=NG",
};
constexpr TSetter kSetSnNoPowerOff = {
    "[USB_SetSnNoPowerOff]",
    "Error in USB_SetSnNoPowerOff()::can't find class PrintDaemon.\n",
    false,
    "maaUSBSetSnNoPowerOff",
    "Error in USB_SetSnNoPowerOff()::can't find USB_SetSnNoPowerOff().\n",
    "USB Serial = Write Fail",
};

constexpr size_t kDefaultLength = sizeof aubCONDefaultUSBSerialNumber;

void report(const char *text, U32 mode) { SysPBA_IF_PrintResult(reinterpret_cast<const U8 *>(text), mode, 0); }

void putDefault(U8 *buf) {
    std::memcpy(buf, aubCONDefaultUSBSerialNumber, kDefaultLength);
    buf[kDefaultLength] = 0;
}

void callDaemon(const TSetter &s, JNIEnv *env, jobject daemon, const U8 *serial) {
    LocalRef<jclass> cls(env, env->GetObjectClass(daemon));
    if (!cls) {
        USBADP_LOG(ERROR, "%s", s.noClass);
        report("Failed", 1);
        return;
    }
    const char *text = reinterpret_cast<const char *>(serial);
    MAA_WriteSerialString(text);
    std::memset(serial_number_str, 0, sizeof serial_number_str);
    std::memcpy(serial_number_str, serial, strnlen(text, sizeof serial_number_str - 1));
    init_required_after_maa = 1;
    if (s.logsJniCall) USBADP_LOG(INFO, "\r\nMaking a JNI call to maaUSBSetSerialNumber.\n");
    jmethodID mid = env->GetMethodID(cls.get(), s.method, "(Ljava/lang/String;)Ljava/lang/String;");
    if (!mid) {
        USBADP_LOG(ERROR, "%s", s.noMethod);
        report("Failed", 1);
        return;
    }
    LocalRef<jstring> arg(env, JNI_NewHostString(env, text));
    if (!arg) {
        report("Failed", 1);
        return;
    }
    LocalRef<jstring> answer(env, static_cast<jstring>(env->CallObjectMethod(daemon, mid, arg.get())));
    if (env->ExceptionCheck() || !answer) {
        JNI_ExceptionSweep(env);
        report(s.nullAnswer, 1);
        return;
    }
    UtfChars chars(env, answer.get());
    if (!chars) {
        report(s.nullAnswer, 1);
        return;
    }
    MAA_ReportF(1, "USB SerialNumber=%s", chars.get());
}

TMAAResult *setSerial(const TSetter &s, U8 *serial) {
    U8 *allocated = nullptr;
    U8 *use = serial;
    U8 fallback[kDefaultLength + 1];
    if (!IsValidUSBSerialString(serial)) {
        if (!serial) {
            allocated = static_cast<U8 *>(std::malloc(kDefaultLength + 1));
            if (!allocated) {
                report("Allocation failed (String)", 1);
                return &stMAASysResult;
            }
            USBADP_LOG(DEBUG, "\r\n Address of serialnumber is [0x%lx]", reinterpret_cast<unsigned long>(allocated));
            putDefault(allocated);
            use = allocated;
        } else if (std::strlen(reinterpret_cast<const char *>(serial)) >= kDefaultLength) {
            // The caller's buffer holds at least 17 bytes: the default goes there.
            putDefault(serial);
        } else {
            // A shorter buffer may be just its text: overwriting it with 17
            // bytes could write past it, so the default is used from here.
            USBADP_LOG(ERROR, "\r\n Invalid serial number [%s] left as it is; default used",
                       reinterpret_cast<const char *>(serial));
            putDefault(fallback);
            use = fallback;
        }
    }
    report(s.header, 0);
    JNIEnv *env = USBPrint_ThreadEnv();
    jobject daemon = globalPrintObj.load();
    if (!env || !daemon) {
        USBADP_LOG(ERROR, "%s", s.noClass);
        report("Failed", 1);
    } else {
        callDaemon(s, env, daemon, use);
        JNI_ExceptionSweep(env);
    }
    std::free(allocated);
    return &stMAASysResult;
}

}  // namespace

TMAAResult *USB_SetSerialNumber(U8 *serial) { return setSerial(kSetSerialNumber, serial); }

TMAAResult *USB_SetSnNoPowerOff(U8 *serial) { return setSerial(kSetSnNoPowerOff, serial); }
