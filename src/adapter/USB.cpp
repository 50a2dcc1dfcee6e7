#include "adapter/USB.h"

#include <fcntl.h>
#include <sys/ioctl.h>
#include <sys/msg.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <string>

#include <jni.h>

#include "common/FixedPath.h"
#include "common/JniUtil.h"
#include "common/Log.h"
#include "common/UniqueFd.h"

std::atomic<S32> fdPrn{0};
std::atomic<U8> IsConfigured{0};
std::atomic<U8> IsDisconnected{0};
std::atomic<U8> bootUpFlag{0};
std::atomic<U8> hibernation_flag{0};
std::atomic<U8> IsCanClose{0};
std::atomic<U8> startreading_enter{0};

std::atomic<S32> globalPrnMsgQ{-1};
std::atomic<S32> globalScanMsgQ{-1};
TMessageBuf globalSendingBuf;
TMessageBuf globalReceivingBuf;
mfp_to_t stMFP_To;
vendor_cmd_t stVendor_cmd;

namespace {

constexpr char kPlaceholderSerialLine[] = "0000-00000000000\t";

// Writes the placeholder report line only when the file does not exist yet; the
// serial-number writer replaces it later.
bool writeReportFileIfAbsent(const char *modelName) {
    char *buf = static_cast<char *>(std::malloc(USB_SERIAL_SIZE));
    if (!buf) {
        USBADP_LOG(ERROR, "[USBAdp][USB]Error malloc failed.\n");
        return false;
    }
    std::memset(buf, 0, USB_SERIAL_SIZE);
    std::memcpy(buf, kPlaceholderSerialLine, sizeof kPlaceholderSerialLine - 1);
    // Callers pass model names of at most 42 characters; bound the copy by what
    // is left so a longer one is cut, not written past the buffer.
    std::strncat(buf, modelName, USB_SERIAL_SIZE - 1 - std::strlen(buf));

    const std::string path = FixedPath(REPORT_FILE);
    bool ok = true;
    UniqueFd fd(::open(path.c_str(), O_RDWR));
    if (!fd) {
        fd.reset(::open(path.c_str(), O_RDWR | O_CREAT | O_TRUNC, 0644));
        if (!fd) {
            USBADP_LOG(ERROR, "[USBAdp][USB]Error in opening file/File doesn't exist.\n");
            ok = false;
        } else {
            size_t len = std::strlen(buf);
            if (::write(fd.get(), buf, len) != static_cast<ssize_t>(len)) {
                USBADP_LOG(ERROR, "[USBAdp][USB]Error in writing to usb_version.txt file.\n");
                ok = false;
            }
        }
    }
    std::free(buf);
    return ok;
}

// Routing of a forwarded notification: both queues, the print queue only, or
// the scan queue only. Returns false when a send failed.
bool sendRouted(S32 status, long printFlag, long scanFlag, long commonFlag) {
    (void)scanFlag;
    TMessageBuf msg{};
    msg.mtype = 1;
    msg.status = status;
    if (commonFlag || printFlag) {
        if (msgsnd(globalPrnMsgQ.load(), &msg, MSGBUF_TEXT_SIZE, IPC_NOWAIT) < 0) {
            USBADP_LOG_ASYNC(ERROR, "[USBAdp] [print thread] Can't send message through Prn_MsgQ message queue.\n");
            return false;
        }
        if (!commonFlag) return true;
    }
    if (msgsnd(globalScanMsgQ.load(), &msg, MSGBUF_TEXT_SIZE, IPC_NOWAIT) < 0) {
        USBADP_LOG_ASYNC(ERROR, "[USBAdp] [print thread] Can't send message through Scan_MsgQ message queue.\n");
        return false;
    }
    return true;
}

}  // namespace

S32 USBAdapter_IF_CreatePrnScanMsgQs(const char *modelName) {
    if (!writeReportFileIfAbsent(modelName)) return 0;

    USBADP_LOG(INFO, "[USBAdp][USB]Creating message queues. \n");
    const std::string keyFile = FixedPath(FTOK_FILE);
    {
        UniqueFd fd(::open(keyFile.c_str(), O_RDWR | O_CREAT, 0644));
        if (!fd) {
            int err = errno;
            USBADP_LOG(ERROR, "[USBAdp][USB]Error Cannot open file for ftok key: %s, errno: %d\n", keyFile.c_str(),
                       err);
            if (::access(FixedPath(FTOK_DIR).c_str(), F_OK) != 0)
                USBADP_LOG(ERROR, "No tmp file /halvard/spool, errno: %d\n", errno);
            return 0;
        }
    }

    key_t key1 = ftok(keyFile.c_str(), KEY1);
    if (key1 == -1) {
        USBADP_LOG(ERROR, "[USBAdp][USB]Error KEY1 for Prn_MsgQ cannot be generated. ftok() failed.\n");
        return 0;
    }
    key_t key2 = ftok(keyFile.c_str(), KEY2);
    if (key2 == -1) {
        USBADP_LOG(ERROR, "[USBAdp][USB]Error KEY2 for Scan_MsgQ cannot be generated. ftok() failed.\n");
        return 0;
    }

    // No IPC_EXCL: queues of an earlier run are reused with what they still hold.
    globalPrnMsgQ = msgget(key1, IPC_CREAT | 0666);
    if (globalPrnMsgQ < 0) {
        USBADP_LOG(ERROR, "[USBAdp][USB]Error Prn_msgQ message queue can't be created. \n");
        return 0;
    }
    USBADP_LOG(INFO, "[USBAdp][USB]Prn_MsgQ created with message queue id : %ld\n", long{globalPrnMsgQ.load()});
    globalScanMsgQ = msgget(key2, IPC_CREAT | 0666);
    if (globalScanMsgQ < 0) {
        USBADP_LOG(ERROR, "[USBAdp][USB]Error Scan_msgQ message queue can't be created. \n");
        return 0;
    }
    USBADP_LOG(INFO, "[USBAdp][USB]Scan_MsgQ created with message queue id : %ld\n", long{globalScanMsgQ.load()});
    return 1;
}

S32 USBAdapter_IF_InitDevice(void) {
    globalSendingBuf.mtype = 1;
    globalSendingBuf.status = MFP_DEV_INIT;
    if (msgsnd(globalPrnMsgQ.load(), &globalSendingBuf, MSGBUF_TEXT_SIZE, IPC_NOWAIT) < 0) {
        USBADP_LOG(ERROR, "[USBAdp][USB]%ld, %ld, %ld\n", long{globalPrnMsgQ.load()}, globalSendingBuf.mtype,
                   long{globalSendingBuf.status});
        USBADP_LOG(ERROR, "[USBAdp][USB]Prn_msgQ message can't be send. \n");
        return 0;
    }
    USBADP_LOG(INFO, "[USBAdp][USB]Message sent for initialization.. \n");
    return 1;
}

// Runs on whatever thread the kernel interrupts: ioctl, msgsnd, atomic stores
// and the deferred log queue only. It builds its message on its own stack so an
// interrupted InitDevice never sees a half-written shared buffer.
extern "C" void PrnScanSighandler(int) {
    static std::atomic<long> slprintFlag{0}, slscanFlag{0}, slcommonFlag{0};
    int savedErrno = errno;

    mfp_notif_t notif;
    std::memset(&notif, 0, sizeof notif);
    if (ioctl(fdPrn.load(), MFP_IOC_GET_NOTIF, &notif) < 0) {
        USBADP_LOG_ASYNC(ERROR, "ioctl[MFP_IOC_GET_NOTIF] failed.\n");
        errno = savedErrno;
        return;
    }
    long status = notif.ub_notif;
    long forWhom = notif.ub_intf;
    USBADP_LOG_ASYNC(INFO, "[USBAdp] [print thread] Value of status: %ld\n", status);
    USBADP_LOG_ASYNC(INFO, "[USBAdp] [print thread] Value of forWhom: %ld\n", forWhom);

    switch (forWhom) {
    case eMfp_Notif_Prn: slprintFlag = 1; break;
    case eMfp_Notif_Scan: slscanFlag = 1; break;
    case eMfp_Notif_Both: slcommonFlag = 1; break;
    default: USBADP_LOG_ASYNC(INFO, "[USBAdp] [print thread] Request not supported!/Unwanted signal\n"); break;
    }

    bool sent = true;
    switch (status) {
    case MFP_DEV_RESET:
        USBADP_LOG_ASYNC(INFO, "[USBAdp] [print thread]Requested MFP_DEV_RESET message received!\n");
        IsConfigured = 1;
        sent = sendRouted(MFP_DEV_RESET, slprintFlag, slscanFlag, slcommonFlag);
        break;
    case SCAN_COMMAND:
        USBADP_LOG_ASYNC(INFO, "[USBAdp] [print thread] Requested MFP_SCAN_CMD message received!\n");
        if (slscanFlag) {
            sent = sendRouted(SCAN_COMMAND, 0, 1, 0);
        } else {
            USBADP_LOG_ASYNC(INFO,
                             "[USBAdp][print thread] This signal is meant for scan but is received in wrong mode.\n.");
        }
        break;
    case MFP_DEV_CONFIGURED:
        USBADP_LOG_ASYNC(INFO, "[USBAdp] [print thread] Requested MFP_DEV_CONFIGURED message received!\n");
        IsConfigured = 1;
        IsDisconnected = 0;
        if (bootUpFlag != 1) {
            sent = sendRouted(MFP_DEV_CONFIGURED, slprintFlag, slscanFlag, slcommonFlag);
            // Only a configuration that reached the reader counts: the next one
            // is forwarded again, or the reader would never start.
            if (sent) bootUpFlag = 1;
        } else {
            USBADP_LOG_ASYNC(INFO, "[USBAdp] [print thread] bootUpFlag == 1\n");
        }
        break;
    case MFP_DEV_DISCONNECT:
        USBADP_LOG_ASYNC(INFO, "[USBAdp] [print thread] Requested MFP_DEV_DISCONNECT message received!\n");
        IsConfigured = 0;
        IsDisconnected = 1;
        break;
    default:
        USBADP_LOG_ASYNC(INFO, "[USBAdp] [print thread] Request not supported %ld\n", status);
        break;
    }

    // A failed send leaves the request flags set, as the driver path expects.
    if (sent) {
        slprintFlag = 0;
        slscanFlag = 0;
        slcommonFlag = 0;
    }
    errno = savedErrno;
}

S32 MAA_IsUSBDisconnected(void) { return IsDisconnected.load(); }

extern "C" JNIEXPORT void JNICALL
Java_com_tarnwel_vbk_common_qz_services_usbadapter_USBAdapterPrintAndScanJNIService_creatPrnScanMsgQs(
    JNIEnv *env, jobject, jstring modelName) {
    if (!env) {
        USBADP_LOG(ERROR, "[USBAdp] JNI environment received is NULL\n");
        return;
    }
    UtfChars name(env, modelName);
    if (!name) {
        JNI_ExceptionSweep(env);
        USBADP_LOG(ERROR, "[USBAdp] pubmodelName returns NULL\n");
        return;
    }
    if (USBAdapter_IF_CreatePrnScanMsgQs(name.get()))
        USBADP_LOG(INFO, "[USBAdp] Exit JNI_creatPrnScanMsgQs()\n");
    else
        USBADP_LOG(ERROR, "[USBAdp] Error in creating PrnScanMsgQs\n");
}

extern "C" JNIEXPORT void JNICALL
Java_com_tarnwel_vbk_common_qz_services_usbadapter_USBAdapterPrintAndScanJNIService_initDevice(JNIEnv *, jobject) {
    if (USBAdapter_IF_InitDevice())
        USBADP_LOG(INFO, "[USBAdp]Exit JNI_initDevice()\n");
    else
        USBADP_LOG(ERROR, "[USBAdp] Error in JNI_initDevice\n");
}
