#include "vendor/VLX_Main.h"

#include <jni.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>

#include "adapter/USB.h"
#include "common/ByteOrder.h"
#include "common/JniUtil.h"
#include "common/Log.h"
#include "common/Wait.h"
#include "maa/MAA_Driver.h"
#include "print/USBPrint.h"

const U8 vlxHeader[VLX_HEADER_SIZE] = {0x1B, 0x24, 0xF4, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00};
const U8 imageHeader[IMAGE_HEADER_SIZE] = {0x1B, 0x91, 0x00, 0x00, 0x00, 0x00, 0x00, 0x03,
                                           0x00, 0x00, 0x00, 0x01, 0x00, 0x00, 0x00, 0x00};

std::atomic<U32> ulDrvHandle{0};

namespace {

constexpr S32 kRequestSize = 16;
constexpr S32 kRecognisedSize = 3;
constexpr S32 kImageRecognisedSize = 12;
constexpr S32 kSizeOffset = 6;
constexpr S32 kImageSizeOffset = 12;

// The print and scan readers serve requests at the same time, each on its own
// channel: the channel is the thread's, not a shared handle.
thread_local S32 replyChannel = -1;

struct ReplyChannel {
    explicit ReplyChannel(S32 fd) : saved(replyChannel) { replyChannel = fd; }
    ~ReplyChannel() { replyChannel = saved; }
    S32 saved;
};

void writeReply(const U8 *bytes, U32 size) {
    const U32 channel = replyChannel >= 0 ? static_cast<U32>(replyChannel) : ulDrvHandle.load();
    U32 written = 0;
    DM_WriteDriver(channel, bytes, size, &written, nullptr);
}

bool cableGone() { return IsDisconnected.load() != 0; }

// A method of the print daemon, looked up on every call. `marks` are logged
// after the class and after the method were found (either may be null).
struct DaemonMethod {
    JNIEnv *env = nullptr;
    jobject daemon = nullptr;
    jmethodID mid = nullptr;
    explicit operator bool() const { return mid != nullptr; }
};

DaemonMethod findDaemonMethod(const char *name, const char *sig, const char *classMark, const char *methodMark) {
    DaemonMethod m;
    m.daemon = globalPrintObj.load();
    m.env = m.daemon ? USBPrint_ThreadEnv() : nullptr;
    if (!m.env) {
        USBADP_LOG(ERROR, "[VLX_Main] no print daemon for %s\n", name);
        return m;
    }
    LocalRef<jclass> cls(m.env, m.env->GetObjectClass(m.daemon));
    if (!cls) {
        JNI_ExceptionSweep(m.env);
        return m;
    }
    USBADP_LOG(INFO, "%s", classMark);
    m.mid = m.env->GetMethodID(cls.get(), name, sig);
    if (!m.mid) {
        USBADP_LOG(ERROR, "[VLX_Main] can't find %s\n", name);
        JNI_ExceptionSweep(m.env);
        return m;
    }
    USBADP_LOG(INFO, "%s", methodMark);
    return m;
}

}  // namespace

void CapXmlSizeWrite(U32 xmlsize) {
    U8 reply[VLX_HEADER_SIZE];
    std::memcpy(reply, vlxHeader, sizeof reply);
    WriteBE32(reply + kSizeOffset, xmlsize);
    writeReply(reply, sizeof reply);
}

void GetCapXmlSize(void) {
    USBADP_LOG(INFO, "\r\n[GetCapXmlSize Start1]");
    DaemonMethod m = findDaemonMethod("getCapXmlSize", "()I", "\r\n[GetCapXmlSize Start2]", "\r\n[GetCapXmlSize Start3]");
    if (!m) return;
    jint size = m.env->CallIntMethod(m.daemon, m.mid);
    // A method that threw answered nothing: the host gets no reply.
    if (JNI_ExceptionSweep(m.env) || size < 0) return;
    USBADP_LOG(INFO, "\r\n[GetCapXmlSize Start4]");
    CapXmlSizeWrite(static_cast<U32>(size));
}

void GetCapXmlData(void) {
    USBADP_LOG(INFO, "\r\n[GetCapXmlData Start1]");
    DaemonMethod m = findDaemonMethod("getCapXmlData", "()Ljava/lang/String;", "\r\n[GetCapXmlData Start2]",
                                      "\r\n[GetCapXmlData Start3]");
    if (!m) return;
    LocalRef<jstring> xml(m.env, static_cast<jstring>(m.env->CallObjectMethod(m.daemon, m.mid)));
    if (JNI_ExceptionSweep(m.env) || !xml) return;
    UtfChars chars(m.env, xml.get());
    if (!chars) {
        JNI_ExceptionSweep(m.env);
        return;
    }
    USBADP_LOG(INFO, "\r\n[GetCapXmlData Start4]");
    writeReply(reinterpret_cast<const U8 *>(chars.get()), static_cast<U32>(std::strlen(chars.get())));
}

void SetImageWrite(void) {
    DaemonMethod m = findDaemonMethod("getPrintImage", "()[B", "\r\n[SetImageWrite Start2]", "\r\n[SetImageWrite Start3]");
    if (!m) return;
    LocalRef<jbyteArray> image(m.env, static_cast<jbyteArray>(m.env->CallObjectMethod(m.daemon, m.mid)));
    const bool threw = JNI_ExceptionSweep(m.env);
    const jsize size = (!threw && image) ? m.env->GetArrayLength(image.get()) : 0;
    if (size <= 0) {
        std::fputs("\r\n[VLX_Main] SetImageWrite() jGetPrintImage NULL or ImageSize = 0 return", stdout);
        std::fflush(stdout);
        return;
    }
    std::unique_ptr<U8, decltype(&std::free)> bytes(static_cast<U8 *>(std::malloc(static_cast<size_t>(size) + 1)),
                                                   &std::free);
    if (!bytes) {
        USBADP_LOG(ERROR, "[VLX_Main] SetImageWrite() no memory for %d bytes\n", static_cast<int>(size));
        return;
    }
    m.env->GetByteArrayRegion(image.get(), 0, size, reinterpret_cast<jbyte *>(bytes.get()));
    std::printf("\r\n[VLX_Main] SetImageWrite() jGetPrintImage size = %d", static_cast<int>(size));
    std::fflush(stdout);
    U8 header[IMAGE_HEADER_SIZE];
    std::memcpy(header, imageHeader, sizeof header);
    WriteBE32(header + kImageSizeOffset, static_cast<U32>(size));
    writeReply(header, sizeof header);
    writeReply(bytes.get(), static_cast<U32>(size));
}

S32 Vlx_Cap_Xml(S32 fd, U8 *command, S32 commandlen, U8 *vlx_command) {
    if (commandlen <= 0) return -1;
    const S32 held = std::min(commandlen, kRequestSize);
    std::memcpy(vlx_command, command, static_cast<size_t>(held));
    ReplyChannel channel(fd);

    if (held > kRecognisedSize && std::memcmp(vlx_command, vlxHeader, kRecognisedSize) == 0) {
        switch (vlx_command[3]) {
        case 0:
            USBADP_LOG(INFO, "\r\n[GetCapXmlSize Start]");
            GetCapXmlSize();
            break;
        case 1:
            USBADP_LOG(INFO, "\r\n[GetCapXmlData Start]");
            GetCapXmlData();
            break;
        default: break;  // swallowed without a reply
        }
        return 0;
    }

    ssize_t n = held < kRequestSize
                    ? Wait_Read(fd, vlx_command + held, static_cast<size_t>(kRequestSize - held), cableGone)
                    : 0;
    if (n <= 0) {
        USBADP_LOG(INFO, "Read Failed\r\n");
        USBADP_LOG(INFO, "\r\nread 0 bytes so returning [%d]\n", held);
        return held;
    }
    if (std::memcmp(vlx_command, imageHeader, kImageRecognisedSize) == 0) {
        SetImageWrite();
        USBADP_LOG(INFO, "Setter Image Query Success\r\n");
        return 0;
    }
    return held + static_cast<S32>(n);
}
