#include "maa/MAA_Hook.h"

#include <poll.h>
#include <unistd.h>

#include <cerrno>

#include "common/Log.h"

namespace {
constexpr S32 kStartCommandRest = 8;  // start command is 10 bytes, 2 already read
constexpr int kByteTimeoutMs = 5000;
}  // namespace

// Interim: the MAA shell is not built yet. Reads what would be the rest of the
// start command and hands it back as "not MAA", so the caller delivers every
// byte as print data; -1 when nothing followed.
S32 MAA_Hook(U32 ulDrvHandleGot, U8 *command) {
    USBADP_LOG(INFO, "\r\n[MAA:MAA_Hook] MAA shell not available yet\n");
    const int fd = static_cast<int>(ulDrvHandleGot);
    S32 got = 0;
    while (got < kStartCommandRest) {
        pollfd pfd{fd, POLLIN, 0};
        int r = ::poll(&pfd, 1, kByteTimeoutMs);
        if (r < 0 && errno == EINTR) continue;
        if (r <= 0) break;
        ssize_t n = ::read(fd, command + 2 + got, static_cast<size_t>(kStartCommandRest - got));
        if (n <= 0) break;
        got += static_cast<S32>(n);
    }
    return got > 0 ? got : -1;
}

// Interim: the USB speed status file is not written yet.
void MAA_DummyUsbSpeed(void) { USBADP_LOG(INFO, "\r\n[MAA] MAA_DummyUsbSpeed() not available yet"); }
