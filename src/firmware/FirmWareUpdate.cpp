#include "firmware/FirmWareUpdate.h"

#include <unistd.h>

#include <cstring>

#include "common/Log.h"

// Interim: firmware images are not recognised yet. Reads the would-be 80-byte
// header the way the real reception does and hands back every byte it holds,
// including the ones already read, so the stream is delivered as print data.
S32 FirmWareDownload(S32 fd, U8 *command, U32 commandlen, U8 *firmware_command, S32 *firmware) {
    USBADP_LOG(INFO, "=====> f/w download not available yet\r\n");
    *firmware = 0;
    if (commandlen > FW_PJL_HEADER_SIZE - 1) {
        USBADP_LOG(ERROR, "Command Length seems greater than header size (80)\r\n");
        return FW_FAIL;
    }
    std::memcpy(firmware_command, command, commandlen);
    ssize_t n = ::read(fd, firmware_command + commandlen, FW_PJL_HEADER_SIZE - commandlen);
    if (n <= 0) {
        USBADP_LOG(INFO, "Read Failed\r\n");
        USBADP_LOG(INFO, "\r\nread 0 bytes so returning [%d]\n", static_cast<int>(commandlen));
        return static_cast<S32>(commandlen);
    }
    return static_cast<S32>(commandlen) + static_cast<S32>(n);
}
