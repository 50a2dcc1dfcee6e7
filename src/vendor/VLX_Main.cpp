#include "vendor/VLX_Main.h"

#include <unistd.h>

#include <cstring>

#include "common/Log.h"

std::atomic<U32> ulDrvHandle{0};

namespace {
constexpr S32 kRequestSize = 16;
}

// Interim: no request is recognised yet. Reads the rest of a would-be 16-byte
// request as the real reception does and hands every byte back, so the caller
// goes on classifying and nothing the host sent is lost.
S32 Vlx_Cap_Xml(S32 fd, U8 *command, S32 commandlen, U8 *vlx_command) {
    USBADP_LOG(INFO, "\r\nVlx_Cap_Xml() not available yet\n");
    if (commandlen <= 0) return -1;
    std::memcpy(vlx_command, command, static_cast<size_t>(commandlen));
    if (commandlen >= kRequestSize) return commandlen;
    ssize_t n = ::read(fd, vlx_command + commandlen, static_cast<size_t>(kRequestSize - commandlen));
    if (n <= 0) {
        USBADP_LOG(INFO, "Read Failed\r\n");
        USBADP_LOG(INFO, "\r\nread 0 bytes so returning [%d]\n", commandlen);
        return commandlen;
    }
    return commandlen + static_cast<S32>(n);
}
