#include "scan/scan_thread.h"

#include <fcntl.h>
#include <sys/msg.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "adapter/USB.h"
#include "common/JniUtil.h"
#include "common/Log.h"
#include "common/Wait.h"
#include "scan/USBScan.h"
#include "usbadapter/mfpbridge.h"
#include "vendor/VLX_Main.h"

std::atomic<S32> fdScan{-1};
std::atomic<JNIEnv *> g_ScanEnv{nullptr};
std::atomic<jobject> g_ScanObj{nullptr};
std::atomic<U8> g_IsScanCanClose{0};

namespace {

constexpr U8 ESC = 0x1B;
constexpr int kIdleMs = 1000;
// How long the reader waits for host data before it looks at the close flag
// again: the Java side's close must not wait for the host.
constexpr int kPollSliceMs = 100;
// The close entry waits this long for a packet in progress to be read whole.
constexpr int kCloseWaitMs = 10000;
constexpr size_t kIdsHeader = IMAGE_HEADER_SIZE;

// 1 from the moment the reader takes a packet's first byte until the packet is
// handled. The close entry closes the node only while it is 0, so no packet
// is taken half (its rest would be read as new packets after the re-open).
std::atomic<U8> inPacket{0};
// Held by the readScanMsg call that runs the reader.
std::atomic<bool> scanEntryBusy{false};

bool mayRead() { return g_IsScanCanClose.load() == 0 && IsConfigured.load() == 1; }
bool mayNotRead() { return !mayRead(); }

// The rest of a 16-byte ID-scan header is read here, in one read.
S32 idsFromSelector(U8 *pubCommand) {
    U8 header[kIdsHeader] = {};
    std::memcpy(header, pubCommand, 2);
    ssize_t n = Wait_Read(slDeviceHndl.load(), header + 2, kIdsHeader - 2, USBAdpScan_PacketGone);
    if (n < 0) {
        USBADP_LOG(ERROR, "[USBAdp Scan] Error in reading IDS header, errno: %d\n", errno);
        return 0;
    }
    USBADP_LOG(INFO, "[USBAdp Scan] IDS packet length: %ld\n", static_cast<long>(n + 2));
    return USBAdpScan_IDS(header);
}

struct Selector {
    U8 code;
    S32 (*handler)(U8 *pubCommand);
    S32 failure;             // the handler's result that is logged as failed
    const char *failedLine;  // null: the result is ignored
};

const Selector kSelectors[] = {
    {0xA8, USBAdpScan_PCScan, -2, "[USBAdp Scan] USBAdpScan_PCScan() failed\n"},
    {0x24, USBAdpScan_VLX, -1, "[USBAdp Scan] USBAdpScan_VLX() failed\n"},
    {0x91, idsFromSelector, -1, "[USBAdp Scan] Not IDS header\n"},
    {0x9A, [](U8 *c) -> S32 { USBAdpScan_Scan2App(c); return 0; }, 0, nullptr},
    {0xAA, [](U8 *c) -> S32 { USBAdpScan_TAVIK_Light(c); return 0; }, 0, nullptr},
};

// Reads the two leading bytes and runs the packet's handler; the read's count.
ssize_t readPacket(S32 fd) {
    U8 header[2] = {};
    USBADP_LOG(DEBUG, "[USBAdp Scan] reading scan data\n");
    ssize_t n = Wait_Read(fd, header, sizeof header, mayNotRead);
    if (n < 0) {
        USBADP_LOG(ERROR, "[USBAdp Scan] read fails, errno: %d\n", errno);
        return n;
    }
    USBADP_LOG(INFO, "[USBAdp Scan] read scan data: %ld, [%#x %#x]\n", static_cast<long>(n), header[0], header[1]);
    if (header[0] != ESC) {
        USBADP_LOG(ERROR, "[USBAdp Scan] HOSTApp not supported [%#x %#x]\n", header[0], header[1]);
        return n;
    }
    for (const Selector &s : kSelectors) {
        if (s.code != header[1]) continue;
        slDeviceHndl = fd;
        S32 r = s.handler(header);
        if (s.failedLine && r == s.failure) USBADP_LOG(ERROR, "%s", s.failedLine);
        return n;
    }
    USBADP_LOG(ERROR, "[USBAdp Scan] HostApp not supported [%#x %#x]\n", header[0], header[1]);
    return n;
}

}  // namespace

S32 USBAdpScan_Openfd(void) {
    if (fdScan.load() >= 0) return 1;
    int fd = ::open(MS_SCAN_FILE_NAME, O_RDWR);
    if (fd < 0) {
        USBADP_LOG(ERROR, "[USBAdp Scan] Scan channel not present(/dev/usb/mfp_scan), errno:%d\n", errno);
        return 0;
    }
    // Two Java threads opening at once keep one descriptor.
    S32 closed = -1;
    if (!fdScan.compare_exchange_strong(closed, fd)) ::close(fd);
    return 1;
}

S32 USBAdpScan_Closefd(void) {
    S32 fd = fdScan.load();
    if (fd < 1) {
        USBADP_LOG(ERROR, "[USBAdp Scan] fdScan[%d] < 0\n", fd);
        return 1;
    }
    if (!fdScan.compare_exchange_strong(fd, -1)) return 1;  // closed by another thread meanwhile
    if (::close(fd) < 0) {
        USBADP_LOG(ERROR, "[USBAdp Scan] Error in closing fdScan, errno:%d\n", errno);
        return 0;
    }
    return 1;
}

S32 USBAdpScan_Close(void) { return USBAdpScan_Closefd(); }

bool USBAdpScan_AwaitPacketEnd(int timeoutMs) {
    Wait_IdleRest(Wait_NowMs(), timeoutMs, [] { return inPacket.load() == 0; });
    return inPacket.load() == 0;
}

bool USBAdpScan_TakeEvent(void) {
    USBADP_LOG(INFO, "[USBAdp Scan] Waiting for the scan events\n");
    TMessageBuf msg{};
    if (::msgrcv(globalScanMsgQ.load(), &msg, MSGBUF_TEXT_SIZE, 1, 0) < 0) {
        int err = errno;
        USBADP_LOG(ERROR, "[USBAdp Scan] Scan_msgQ msgrcv fails, errno:%d\n", err);
        // A queue that is gone fails at once every time: do not spin.
        if (err != EINTR) Wait_IdleRest(Wait_NowMs(), kIdleMs);
        return false;
    }
    if (msg.status != MFP_DEV_CONFIGURED) {
        USBADP_LOG(INFO, "[USBAdp Scan] Unknown event:%d\n", static_cast<int>(msg.status));
        return false;
    }
    USBADP_LOG(INFO, "[USBAdp Scan] Received MFP_DEV_CONFIGURED event\n");
    return true;
}

void USBAdpScan_ReadEvents(void) {
    USBADP_LOG(INFO, "[USBAdp Scan] USBAdpScan_ReadEvents() Begin\n");
    while (!USBAdpScan_TakeEvent()) {
    }
    USBAdpScan_StartReading();
}

void USBAdpScan_ReadTurn(void) {
    if (!mayRead()) {
        USBADP_LOG(INFO, "[USBAdp Scan] g_IsScanCanClose: %d, IsConfigured: %d\n", g_IsScanCanClose.load(),
                   IsConfigured.load());
        Wait_IdleRest(Wait_NowMs(), kIdleMs, mayRead);
        return;
    }
    const S32 fd = fdScan.load();
    const int64_t start = Wait_NowMs();
    short revents = 0;
    if (Wait_PollIn(fd, kPollSliceMs, &revents, mayNotRead) <= 0) return;  // nothing yet, or closing

    inPacket = 1;
    // A close requested since the check above finds inPacket set, or is seen
    // here; a descriptor closed and re-opened meanwhile is polled again first.
    if (mayRead() && fd == fdScan.load()) {
        // A node that is ready but gives nothing (failed, hung up) must not be
        // read in a tight loop.
        if (readPacket(fd) <= 0) Wait_IdleRest(start, kPollSliceMs, mayNotRead);
    }
    inPacket = 0;
}

void USBAdpScan_StartReading(void) {
    for (;;) USBAdpScan_ReadTurn();
}

S32 USBAdpScan_Init(void) {
    if (!USBAdpScan_Openfd()) {
        USBADP_LOG(ERROR, "[USBAdp Scan] USBAdpScan_Openfd() failed\n");
        return 0;
    }
    USBAdpScan_ReadEvents();
    return 0;
}

extern "C" JNIEXPORT void JNICALL
Java_com_tarnwel_vbk_common_qz_services_usbadapter_USBAdapterPrintAndScanJNIService_readScanMsg(JNIEnv *env, jobject,
                                                                                                 jobject p_scan_obj) {
    USBADP_LOG(INFO, "[USBAdp Scan] readScanMsg native method Begin\n");
    if (!env || !p_scan_obj) {
        USBADP_LOG(ERROR, "[USBAdp Scan] (env(%d) == NULL) || (p_scan_obj(%d) == NULL)\n", env ? 1 : 0,
                   p_scan_obj ? 1 : 0);
        return;
    }
    bool idle = false;
    if (!scanEntryBusy.compare_exchange_strong(idle, true)) {
        USBADP_LOG(ERROR, "[USBAdp Scan] readScanMsg: the scan reader is already running\n");
        return;
    }
    g_ScanEnv = env;
    JNI_ReplaceGlobalRef(env, g_ScanObj, p_scan_obj);
    g_IsScanCanClose = 0;
    if (USBAdpScan_Init() == 0) {
        USBADP_LOG(ERROR, "[USBAdp Scan] USBAdpScan_Init() fails\n");
    } else {
        USBADP_LOG(INFO, "[USBAdp Scan] readScanMsg native method End\n");
    }
    g_ScanEnv = nullptr;
    scanEntryBusy = false;
}

extern "C" JNIEXPORT jint JNICALL
Java_com_tarnwel_vbk_common_qz_services_usbadapter_USBAdapterPrintAndScanJNIService_USBScanDrvOpen(JNIEnv *, jobject) {
    USBADP_LOG(INFO, "[USBAdp Scan] Native method USBScanDrvOpen() Begin\n");
    jint result = 1;
    // Opened before the flag is cleared, so the reader resumes on the new node.
    if (!USBAdpScan_Openfd()) {
        USBADP_LOG(ERROR, "[USBAdp Scan] Native method USBAdpScan_Openfd() failed\n");
        result = -1;
    }
    g_IsScanCanClose = 0;
    USBADP_LOG(INFO, "[USBAdp Scan] USBScanDrvOpen() End\n");
    return result;
}

extern "C" JNIEXPORT jint JNICALL
Java_com_tarnwel_vbk_common_qz_services_usbadapter_USBAdapterPrintAndScanJNIService_USBScanDrvClose(JNIEnv *, jobject) {
    USBADP_LOG(INFO, "[USBAdp Scan] CloseUSBScan native method Begin\n");
    g_IsScanCanClose = 1;
    jint result = 1;
    if (!USBAdpScan_AwaitPacketEnd(kCloseWaitMs)) {
        // Closing under the reader would cut the packet and could hand its
        // descriptor number to another file; the channel stays open.
        USBADP_LOG(ERROR, "[USBAdp Scan] reader still inside a packet, scan channel not closed\n");
        USBADP_LOG(ERROR, "[USBAdp Scan] USBAdpScan_Close() failed\n");
        result = -1;
    } else if (!USBAdpScan_Close()) {
        USBADP_LOG(ERROR, "[USBAdp Scan] USBAdpScan_Close() failed\n");
        result = -1;
    }
    USBADP_LOG(INFO, "[USBAdp Scan] CloseUSBScan native method End\n");
    return result;
}
