#include "scan/USBScan.h"

#include "common/Log.h"

std::atomic<S32> slDeviceHndl{0};

// Interim: the status-utility request is not served yet; answers as failed.
S32 USBAdpScan_VLX(U8 *) {
    USBADP_LOG(INFO, "[USBAdp Scan] USBAdpScan_VLX() not available yet\n");
    return -1;
}

// Interim: PC-scan packets are not forwarded yet; answers as failed (PCSCAN_FAIL).
S32 USBAdpScan_PCScan(U8 *) {
    USBADP_LOG(INFO, "[USBAdp Scan] USBAdpScan_PCScan() not available yet\n");
    return -2;
}

// Interim: scan-to-application packets are not forwarded yet.
void USBAdpScan_Scan2App(U8 *) { USBADP_LOG(INFO, "[USBAdp Scan] USBAdpScan_Scan2App() not available yet\n"); }

// Interim: light-protocol packets are not forwarded yet.
void USBAdpScan_TAVIK_Light(U8 *) {
    USBADP_LOG(INFO, "[USBAdp Scan] USBAdpScan_TAVIK_Light() not available yet\n");
}
