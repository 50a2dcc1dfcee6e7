#include "adapter/SerialNumber.h"

#include "common/Log.h"

const U8 aubCONDefaultUSBSerialNumber[16] = {'0', '0', '0', '0', '-', '0', '0', '0',
                                             '0', '0', '0', '0', '0', '0', '0', '0'};

// Interim: the Java serial check is not built yet; answers "not in step", so
// the caller takes the default serial.
S32 checkMachineSerialinConf(void) {
    USBADP_LOG(INFO, "checkMachineSerialinConf() not available yet\n");
    return -1;
}

// Interim: no machine serial number yet; answers as a failed fetch.
U8 *getSerialString(void) {
    USBADP_LOG(INFO, "getSerialString() not available yet\n");
    return nullptr;
}

// Interim: the validity check is not built yet; every text is refused, so the
// caller falls back to the default serial.
bool IsValidUSBSerialString(U8 *) {
    USBADP_LOG(INFO, "\r\nIsValidUSBSerialString() not available yet");
    return false;
}
