// Plays the bridge start-up on the virtual devices and shows what reaches the
// worker queues: queue creation, the initialisation message, and the driver's
// notifications turned into messages by the SIGIO handler.
#include <fcntl.h>
#include <signal.h>
#include <sys/msg.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <thread>

#include "adapter/USB.h"
#include "common/FixedPath.h"
#include "common/Log.h"
#include "vdev.h"

namespace {

const char *CodeName(int code) {
    switch (code) {
    case MFP_DEV_INIT: return "MFP_DEV_INIT";
    case MFP_DEV_RESET: return "MFP_DEV_RESET";
    case SCAN_COMMAND: return "SCAN_COMMAND";
    case MFP_DEV_CONFIGURED: return "MFP_DEV_CONFIGURED";
    case MFP_DEV_DISCONNECT: return "MFP_DEV_DISCONNECT";
    default: return "?";
    }
}

void ShowQueues(const char *after) {
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
    std::printf("  after %-34s print queue:", after);
    TMessageBuf m{};
    while (msgrcv(globalPrnMsgQ, &m, MSGBUF_TEXT_SIZE, 0, IPC_NOWAIT) == MSGBUF_TEXT_SIZE)
        std::printf(" %s", CodeName(m.status));
    std::printf(" | scan queue:");
    while (msgrcv(globalScanMsgQ, &m, MSGBUF_TEXT_SIZE, 0, IPC_NOWAIT) == MSGBUF_TEXT_SIZE)
        std::printf(" %s", CodeName(m.status));
    std::printf(" | IsConfigured=%d IsDisconnected=%d\n", IsConfigured.load(), IsDisconnected.load());
}

void Notify(U8 code, S32 forWhom) {
    mfp_notif_t n{};
    n.ub_notif = code;
    n.ub_intf = forWhom;
    vdev::QueueNotification(vdev::kPrn, n);
}

}  // namespace

int main() {
    char tmpl[] = "/tmp/usbadapter-demo-XXXXXX";
    const char *root = mkdtemp(tmpl);
    if (!root) return 1;
    setenv("USBADAPTER_ROOT", root, 1);
    std::filesystem::create_directories(std::string(root) + "/halvard/sys/statusinfo");
    std::filesystem::create_directories(std::string(root) + "/halvard/spool/tmp");
    Log_StartDeferredWorker();

    std::printf("controller root: %s\n", root);
    if (!USBAdapter_IF_CreatePrnScanMsgQs("DEMO-MFP")) return 1;
    std::ifstream report(FixedPath(REPORT_FILE));
    std::string line((std::istreambuf_iterator<char>(report)), {});
    std::printf("report file: \"%s\"\n", line.c_str());
    std::printf("queues: print %d, scan %d\n", globalPrnMsgQ.load(), globalScanMsgQ.load());

    USBAdapter_IF_InitDevice();
    ShowQueues("initDevice");

    // What the print reader does when it opens the node.
    int fd = open(MS_PRN_FILE_NAME, O_RDWR);
    if (fd <= 0) return 1;
    fdPrn = fd;
    struct sigaction sa{};
    sa.sa_handler = PrnScanSighandler;
    sigemptyset(&sa.sa_mask);
    sigaction(SIGIO, &sa, nullptr);
    fcntl(fd, F_SETOWN, getpid());
    fcntl(fd, F_SETFL, fcntl(0, F_GETFL) | FASYNC);

    Notify(MFP_DEV_CONFIGURED, eMfp_Notif_Both);
    ShowQueues("host configures the device");
    Notify(SCAN_COMMAND, eMfp_Notif_Scan);
    ShowQueues("scan command");
    Notify(SCAN_COMMAND, eMfp_Notif_Prn);
    ShowQueues("scan command for the print side");
    Notify(MFP_DEV_DISCONNECT, eMfp_Notif_Both);
    ShowQueues("cable pulled");
    Notify(MFP_DEV_CONFIGURED, eMfp_Notif_Both);
    ShowQueues("cable plugged in again");
    Notify(MFP_DEV_RESET, eMfp_Notif_Prn);
    ShowQueues("bus reset");

    Log_FlushDeferred();
    msgctl(globalPrnMsgQ, IPC_RMID, nullptr);
    msgctl(globalScanMsgQ, IPC_RMID, nullptr);
    std::filesystem::remove_all(root);
    return 0;
}
