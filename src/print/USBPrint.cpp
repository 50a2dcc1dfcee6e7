#include "print/USBPrint.h"

#include <algorithm>
#include <cstring>

#include "adapter/Descriptors.h"
#include "adapter/prn_thread.h"
#include "common/JniUtil.h"
#include "common/Log.h"

std::atomic<JNIEnv *> globalPrintEnv{nullptr};
std::atomic<jobject> globalPrintObj{nullptr};
std::atomic<jobject> globalMAAObj{nullptr};
std::atomic<jobject> globalUSBPrintFileStreamObj{nullptr};
thread_local std::atomic<jobject> globalUSBAppStreamobj{nullptr};
std::atomic<S32> faxAvailability{0};

namespace {

constexpr const char kProcessPrintCommandSig[] = "(Ljava/lang/String;)L" PKG_NAME "USBPrintFileStreamHandler;";
constexpr int kInterpreterCount = 15;

std::atomic<JavaVM *> printVM{nullptr};

// Held by the readPrintMsg call that owns the print globals, for as long as it
// runs: another call would delete references the reader still uses.
std::atomic<bool> printEntryBusy{false};

struct PrintEntryClaim {
    ~PrintEntryClaim() { printEntryBusy.store(false); }
};

// PassData's method and the handler class it belongs to (a global reference,
// so the class and the id stay valid), per thread: no lock on the data path.
thread_local jobject passDataClass = nullptr;
thread_local jmethodID passDataMethod = nullptr;

const TPrintDelivery kUpcalls = {RegisterJob, PassData, NotifyEndOfData, SendAppType, SendAppBuf, NotifyAppEnd};
std::atomic<const TPrintDelivery *> delivery{&kUpcalls};

// Copies a Java string into a fixed buffer, always terminated. False when the
// characters cannot be had.
bool copyJavaString(JNIEnv *env, jstring s, U8 *dst, size_t size) {
    UtfChars chars(env, s);
    if (!chars) {
        JNI_ExceptionSweep(env);
        return false;
    }
    size_t len = std::min(std::strlen(chars.get()), size - 1);
    std::memcpy(dst, chars.get(), len);
    dst[len] = 0;
    return true;
}

}  // namespace

JNIEnv *USBPrint_ThreadEnv(void) {
    JavaVM *vm = printVM.load();
    if (!vm) return nullptr;
    JNIEnv *env = nullptr;
    jint r = vm->GetEnv(reinterpret_cast<void **>(&env), JNI_VERSION_1_6);
    if (r == JNI_EDETACHED) {
        // A native thread of our own (the stand-alone reader): attach it for good.
        if (vm->AttachCurrentThreadAsDaemon(reinterpret_cast<void **>(&env), nullptr) != JNI_OK) return nullptr;
    } else if (r != JNI_OK) {
        return nullptr;
    }
    return env;
}

const TPrintDelivery &USBPrint_Delivery(void) { return *delivery.load(); }

void USBPrint_SetDelivery(const TPrintDelivery *d) { delivery.store(d ? d : &kUpcalls); }

S8 RegisterJob(const char *p_filename) {
    USBADP_LOG(INFO, "[USBAdp] Inside RegisterJob().\n");
    JNIEnv *env = USBPrint_ThreadEnv();
    jobject daemon = globalPrintObj.load();
    if (!env || !daemon) {
        USBADP_LOG(ERROR, "[USBAdp] Error in RegisterJob()::can't find class PrintDaemon.\n");
        return 1;
    }
    LocalRef<jclass> cls(env, env->GetObjectClass(daemon));
    if (!cls) {
        USBADP_LOG(ERROR, "[USBAdp] Error in RegisterJob()::can't find class PrintDaemon.\n");
        JNI_ExceptionSweep(env);
        return 1;
    }
    jmethodID mid = env->GetMethodID(cls.get(), "processPrintCommand", kProcessPrintCommandSig);
    if (!mid) {
        USBADP_LOG(ERROR, "[USBAdp] Error in RegisterJob()::can't find processPrintCommand().\n");
        JNI_ExceptionSweep(env);
        return 1;
    }
    LocalRef<jstring> name(env, env->NewStringUTF(p_filename));
    if (!name) {
        USBADP_LOG(ERROR, "[USBAdp] Error in RegisterJob()::NewStringUTF failed.\n");
        JNI_ExceptionSweep(env);
        return -1;
    }
    LocalRef<jobject> handler(env, env->CallObjectMethod(daemon, mid, name.get()));
    JNI_ExceptionSweep(env);
    // A handler still set from an unfinished job is dropped here.
    JNI_ReplaceGlobalRef(env, globalUSBPrintFileStreamObj, handler.get());
    if (!handler) {
        USBADP_LOG(ERROR, "[USBAdp] Error in RegisterJob()::globalUSBPrintFileStreamObj object is null.\n");
        return -1;
    }
    USBADP_LOG(INFO, "[USBAdp]Exited RegisterJob().\n");
    return 1;
}

void PassData(U8 *received_data, S32 prn_read_ret) {
    USBADP_LOG(DEBUG, "[USBAdp] Inside PassData(), prn_read_ret: %d\n", prn_read_ret);
    jobject handler = globalUSBPrintFileStreamObj.load();
    JNIEnv *env = handler ? USBPrint_ThreadEnv() : nullptr;
    if (!env) {
        USBADP_LOG(ERROR, "[USBAdp] globalUSBPrintFileStreamObj == NULL\n");
        return;
    }
    LocalRef<jclass> cls(env, env->GetObjectClass(handler));
    if (!cls) {
        USBADP_LOG(ERROR, "[USBAdp] Error in PassData()::can't find class clsUSBPrintFileStream\n");
        JNI_ExceptionSweep(env);
        return;
    }
    // The method is looked up once per handler class, not once per chunk; a
    // class without it is looked up (and logged) on every call, as before.
    jmethodID mid = nullptr;
    if (passDataClass && env->IsSameObject(cls.get(), passDataClass)) {
        mid = passDataMethod;
    } else {
        mid = env->GetMethodID(cls.get(), "addBufferToList", "(Ljava/nio/ByteBuffer;)V");
        if (!mid) {
            USBADP_LOG(ERROR, "[USBAdp] Error in PassData()::can't find addBufferToList().\n");
            JNI_ExceptionSweep(env);
            return;
        }
        JNI_ReplaceGlobalRef(env, passDataClass, cls.get());
        passDataMethod = passDataClass ? mid : nullptr;
    }
    // No copy: Java must take the bytes before the call returns, the reader
    // reuses its buffer at once.
    LocalRef<jobject> jbuf(env, env->NewDirectByteBuffer(received_data, static_cast<jlong>(prn_read_ret)));
    if (!jbuf) {
        USBADP_LOG(ERROR, "[USBAdp] Error in PassData()::jbuf is null!!.\n");
        JNI_ExceptionSweep(env);
        return;
    }
    env->CallVoidMethod(handler, mid, jbuf.get());
    JNI_ExceptionSweep(env);
    USBADP_LOG(DEBUG, "[USBAdp] Exited PassData().\n");
}

void NotifyEndOfData(void) {
    USBADP_LOG(INFO, "[USBAdp] Inside NotifyEndOfData().\n");
    jobject handler = globalUSBPrintFileStreamObj.load();
    JNIEnv *env = handler ? USBPrint_ThreadEnv() : nullptr;
    if (!env) {
        USBADP_LOG(ERROR, "[USBAdp] globalUSBPrintFileStreamObj == NULL\n");
        return;
    }
    {
        LocalRef<jclass> cls(env, env->GetObjectClass(handler));
        if (!cls) {
            USBADP_LOG(ERROR, "[USBAdp] Error in NotifyEndOfData()::can't find class clsUSBPrintFileStream\n");
            JNI_ExceptionSweep(env);
            return;
        }
        jfieldID fid = env->GetFieldID(cls.get(), "fileParsingStatus", "I");
        if (fid) {
            env->SetIntField(handler, fid, 1);
        } else {
            // The job is over for the reader either way; the handler goes.
            USBADP_LOG(ERROR, "[USBAdp] Error in NotifyEndOfData()::can't find fileParsingStatus.\n");
            JNI_ExceptionSweep(env);
        }
    }
    JNI_ReplaceGlobalRef(env, globalUSBPrintFileStreamObj, nullptr);
    JNI_ExceptionSweep(env);
    USBADP_LOG(INFO, "[USBAdp] Exited NotifyEndOfData().\n");
}

S32 SendAppType(const char *pubAppType) {
    USBADP_LOG(INFO, "[USBAdp] Start SendAppType(%s)\n", pubAppType);
    JNIEnv *env = USBPrint_ThreadEnv();
    jobject daemon = globalPrintObj.load();
    if (!env || !daemon) {
        USBADP_LOG(ERROR, "[USBAdp] can't find Print class\n");
        return -1;
    }
    LocalRef<jclass> cls(env, env->GetObjectClass(daemon));
    if (!cls) {
        USBADP_LOG(ERROR, "[USBAdp] can't find Print class\n");
        JNI_ExceptionSweep(env);
        return -1;
    }
    jmethodID mid = env->GetMethodID(cls.get(), "processData", "(Ljava/lang/String;)Ljava/io/OutputStream;");
    if (!mid) {
        USBADP_LOG(ERROR, "[USBAdp] can't find processData method\n");
        JNI_ExceptionSweep(env);
        return -1;
    }
    LocalRef<jstring> jstrAppType(env, env->NewStringUTF(pubAppType));
    if (!jstrAppType) {
        USBADP_LOG(ERROR, "[USBAdp] Error in NewStringUTF::jstrAppType\n");
        JNI_ExceptionSweep(env);
        return -1;
    }
    LocalRef<jobject> stream(env, env->CallObjectMethod(daemon, mid, jstrAppType.get()));
    JNI_ExceptionSweep(env);
    JNI_ReplaceGlobalRef(env, globalUSBAppStreamobj, stream.get());
    if (!stream) {
        USBADP_LOG(ERROR, "[USBAdp] globalUSBAppStreamobj is NULL\n");
        return -1;
    }
    USBADP_LOG(INFO, "[USBAdp] Exit SendAppType(%s)\n", pubAppType);
    return 0;
}

S32 SendAppBuf(const char *pubAppType, U8 *pubBuffer, S32 slBufLen) {
    USBADP_LOG(INFO, "[USBAdp] Start SendAppBuf(%s), slBufLen:%d\n", pubAppType, slBufLen);
    jobject stream = globalUSBAppStreamobj.load();
    JNIEnv *env = stream ? USBPrint_ThreadEnv() : nullptr;
    if (!env) {
        USBADP_LOG(ERROR, "[USBAdp] can't find clsUSBAppStream\n");
        return -1;
    }
    LocalRef<jclass> cls(env, env->GetObjectClass(stream));
    if (!cls) {
        USBADP_LOG(ERROR, "[USBAdp] can't find clsUSBAppStream\n");
        JNI_ExceptionSweep(env);
        return -1;
    }
    jmethodID mid = env->GetMethodID(cls.get(), "write", "([B)V");
    if (!mid) {
        USBADP_LOG(ERROR, "[USBAdp] can't find write methodID\n");
        JNI_ExceptionSweep(env);
        return -1;
    }
    LocalRef<jbyteArray> bytes(env, slBufLen >= 0 ? env->NewByteArray(slBufLen) : nullptr);
    if (!bytes) {
        USBADP_LOG(ERROR, "[USBAdp] Error in NewByteArray, len: %d\n", slBufLen);
        JNI_ExceptionSweep(env);
        return -1;
    }
    if (slBufLen > 0) env->SetByteArrayRegion(bytes.get(), 0, slBufLen, reinterpret_cast<const jbyte *>(pubBuffer));
    env->CallVoidMethod(stream, mid, bytes.get());
    JNI_ExceptionSweep(env);
    USBADP_LOG(INFO, "[USBAdp] Exit SendAppBuf(%s)\n", pubAppType);
    return 0;
}

S32 NotifyAppEnd(const char *pubAppType) {
    USBADP_LOG(INFO, "[USBadp] Start NotifyAppEnd(%s)\n", pubAppType);
    jobject stream = globalUSBAppStreamobj.load();
    JNIEnv *env = stream ? USBPrint_ThreadEnv() : nullptr;
    if (!env) {
        USBADP_LOG(ERROR, "[USBAdp] can't find clsUSBAppStream\n");
        return -1;
    }
    {
        LocalRef<jclass> cls(env, env->GetObjectClass(stream));
        if (!cls) {
            USBADP_LOG(ERROR, "[USBAdp] can't find clsUSBAppStream\n");
            JNI_ExceptionSweep(env);
            return -1;
        }
        jmethodID mid = env->GetMethodID(cls.get(), "close", "()V");
        if (!mid) {
            USBADP_LOG(ERROR, "[USBAdp] can't find close methodID\n");
            JNI_ExceptionSweep(env);
            return -1;
        }
        env->CallVoidMethod(stream, mid);
        JNI_ExceptionSweep(env);
    }
    JNI_ReplaceGlobalRef(env, globalUSBAppStreamobj, nullptr);
    USBADP_LOG(INFO, "[USBadp] Exit NotifyAppEnd(%s)\n", pubAppType);
    return 0;
}

void ClearAppStream(void) {
    if (!globalUSBAppStreamobj.load()) return;
    if (JNIEnv *env = USBPrint_ThreadEnv()) JNI_ReplaceGlobalRef(env, globalUSBAppStreamobj, nullptr);
}

U32 fetchPrinterStatus(void) {
    USBADP_LOG(INFO, "[USBAdp][USBPrint]Entered fetchPrinterStatus\n");
    if (!globalPrintEnv.load()) {
        USBADP_LOG(ERROR, "[USBAdp][USBPrint]Error: globalPrintEnv is null.\n");
        return 0;
    }
    jobject daemon = globalPrintObj.load();
    JNIEnv *env = daemon ? USBPrint_ThreadEnv() : nullptr;
    if (!env) {
        USBADP_LOG(ERROR, "[USBAdp][USBPrint]Error: globalPrintObj is null.\n");
        return 0;
    }
    LocalRef<jclass> cls(env, env->GetObjectClass(daemon));
    if (!cls) {
        USBADP_LOG(ERROR, "[USBAdp][USBPrint] GetObjectClass returned NULL in fetchPrinterStatus()\n");
        JNI_ExceptionSweep(env);
        return 0;
    }
    jmethodID mid = env->GetMethodID(cls.get(), "getPrinterStatus", "()I");
    if (!mid) {
        USBADP_LOG(ERROR, "[USBAdp][USBPrint] GetMethodID returned NULL in fetchPrinterStatus()\n");
        // Leaving the lookup's error pending would poison the reader's next call.
        JNI_ExceptionSweep(env);
        return 0;
    }
    U32 printerStatus = static_cast<U32>(env->CallIntMethod(daemon, mid));
    JNI_ExceptionSweep(env);
    USBADP_LOG(INFO, "[USBAdp][USBPrint]Exit fetchPrinterStatus, printerStatus[%d]\n", static_cast<int>(printerStatus));
    return printerStatus;
}

void getInterpreters(U32 *interpreters) {
    USBADP_LOG(INFO, "[USBAdp][USBPrint]Entered getInterpreters.\n");
    if (!globalPrintEnv.load()) {
        USBADP_LOG(ERROR, "[USBAdp][USBPrint]Error: globalPrintEnv is null.\n");
        return;
    }
    jobject daemon = globalPrintObj.load();
    JNIEnv *env = daemon ? USBPrint_ThreadEnv() : nullptr;
    if (!env) {
        USBADP_LOG(ERROR, "[USBAdp][USBPrint]Error: globalPrintObj is null.\n");
        return;
    }
    LocalRef<jclass> cls(env, env->GetObjectClass(daemon));
    if (!cls) {
        USBADP_LOG(ERROR, "[USBAdp][USBPrint] GetObjectClass returned NULL in getInterpreters()\n");
        JNI_ExceptionSweep(env);
        return;
    }
    jmethodID mid = env->GetMethodID(cls.get(), "getInstalledInterpreter", "()[I");
    if (!mid) {
        USBADP_LOG(ERROR, "[USBAdp][USBPrint] GetMethodID returned NULL in getInterpreters()\n");
        JNI_ExceptionSweep(env);
        return;
    }
    LocalRef<jintArray> ids(env, static_cast<jintArray>(env->CallObjectMethod(daemon, mid)));
    JNI_ExceptionSweep(env);
    if (!ids) {
        USBADP_LOG(ERROR, "[USBAdp][USBPrint] getInstalledInterpreter returned NULL\n");
        return;
    }
    // Always 15 entries; a shorter Java array leaves the missing ones 0.
    jint values[kInterpreterCount] = {};
    jsize len = env->GetArrayLength(ids.get());
    if (len < kInterpreterCount)
        USBADP_LOG(ERROR, "[USBAdp][USBPrint] getInstalledInterpreter returned %d entries\n", static_cast<int>(len));
    env->GetIntArrayRegion(ids.get(), 0, std::min<jsize>(len, kInterpreterCount), values);
    for (U8 i = 0; i < kInterpreterCount; ++i) interpreters[i] = static_cast<U32>(values[i]);
    USBADP_LOG(INFO, "[USBAdp][USBPrint]Exited getInterpreters\n");
}

extern "C" JNIEXPORT void JNICALL
Java_com_tarnwel_vbk_common_qz_services_usbadapter_USBAdapterPrintAndScanJNIService_readPrintMsg(
    JNIEnv *env, jobject thiz, jobject maaObj, jstring p_manufacturingString, jstring p_modelName,
    jstring p_deviceClassName, jint p_faxAvailability) {
    if (!env) {
        USBADP_LOG(ERROR, "[USBAdp] JNI environment received is NULL\n");
        return;
    }
    bool idle = false;
    if (!printEntryBusy.compare_exchange_strong(idle, true)) {
        USBADP_LOG(ERROR, "[USBAdp] readPrintMsg: the print reader is already running\n");
        return;
    }
    PrintEntryClaim claim;
    globalPrintEnv = env;
    JavaVM *vm = nullptr;
    if (env->GetJavaVM(&vm) == JNI_OK) printVM = vm;

    bool hadPrint = globalPrintObj.load() != nullptr;
    if (hadPrint) USBADP_LOG(INFO, "[USBAdp] Deleting Global reference of print\n");
    JNI_ReplaceGlobalRef(env, globalPrintObj, thiz);
    if (hadPrint) USBADP_LOG(INFO, "[USBAdp] Global reference of print deleted successfully\n");
    if (globalMAAObj.load()) USBADP_LOG(INFO, "[USBAdp-MAA] Deleting Global reference of print\n");
    JNI_ReplaceGlobalRef(env, globalMAAObj, maaObj);

    const char *failed = nullptr;
    if (!copyJavaString(env, p_manufacturingString, manufacturingString, sizeof manufacturingString))
        failed = "[USBAdp] GetStringUTFChars[p_manufacturingString] returns NULL\n";
    else if (!copyJavaString(env, p_modelName, aub_pd_string, sizeof aub_pd_string))
        failed = "[USBAdp] GetStringUTFChars[p_modelName] returns NULL\n";
    else if (!copyJavaString(env, p_deviceClassName, deviceClassName, sizeof deviceClassName))
        failed = "[USBAdp] GetStringUTFChars[p_deviceClassName] returns NULL\n";
    if (failed) {
        USBADP_LOG(ERROR, "%s", failed);
        JNI_ReplaceGlobalRef(env, globalPrintObj, nullptr);
        return;
    }
    faxAvailability = p_faxAvailability;

    USBAdapter_IF_PrintFunction();
}
