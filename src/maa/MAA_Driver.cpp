#include "maa/MAA_Driver.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "adapter/USB.h"
#include "common/Log.h"
#include "common/Wait.h"

namespace maa_session {
S32 slPollTimeout = MAA_POLL_TIMEOUT_FIRST;
}

namespace {

U8 aubDMBuf[DM_READ_PIECE_MAX];

bool cableGone() { return MAA_IsUSBDisconnected() != 0; }

// One read of the node takes what the host's transfer holds (up to this
// much); what the caller did not ask for is put back in front of the node, so
// the line readers' one-byte reads and the download's pieces cost no system
// call until it is used up, and whoever reads the node after the session
// (the print reader) still finds the bytes behind the session's last line.
constexpr size_t kReadAhead = 64 << 10;
U8 aubAhead[kReadAhead];

ssize_t readAhead(int fd, U8 *dest, size_t size) {
    if (Wait_PutBackLeft(fd) > 0) return Wait_Read(fd, dest, size, cableGone);
    ssize_t n = Wait_Read(fd, aubAhead, kReadAhead, cableGone);
    if (n <= 0) return n;
    const size_t give = std::min(size, static_cast<size_t>(n));
    std::memcpy(dest, aubAhead, give);
    Wait_PutBack(fd, aubAhead + give, static_cast<size_t>(n) - give, static_cast<size_t>(n) == kReadAhead);
    return static_cast<ssize_t>(give);
}

}  // namespace

U32 DM_ReadDriverInto(U32 ulHandle, U8 *pubDest, U32 ulReadSize, U32 *pulReturnSize) {
    *pulReturnSize = 0;
    if (MAA_IsUSBDisconnected()) {
        USBADP_LOG(ERROR, "\r\n[MAA] ReadDriver: USB Disconnected");
        return DM_RET_USB_DISCONNECTED;
    }
    const int fd = static_cast<int>(ulHandle);
    const S32 period = maa_session::slPollTimeout;
    const int64_t start = Wait_NowMs();
    short revents = 0;
    int r = Wait_PollIn(fd, period, &revents, cableGone);
    bool stopped = r < 0 && errno == EINTR;  // the cable went while waiting
    ssize_t count = 0;
    if (r < 1) {
        USBADP_LOG(DEBUG, "\r\n[MAA] No Data to read\n");
    } else {
        count = readAhead(fd, pubDest, std::clamp<U32>(ulReadSize, 1, DM_READ_PIECE_MAX));
        stopped = count < 0 && errno == EINTR;
    }
    if (count < 1) {
        USBADP_LOG(DEBUG, "\r\n Serial Read Error\\No data");
        // A channel that is hung up, closed or failing is ready again at once
        // and gives nothing: the period is over only when its time is, or the
        // line readers that retry on a time-out would spin. (An empty transfer
        // is a time-out of its own and is gone once read.)
        const bool broken = !stopped && (r < 0 || count < 0 || (r > 0 && Wait_HungUp(revents)));
        if (broken) Wait_IdleRest(start, period, cableGone);
        if (!stopped && period == MAA_POLL_TIMEOUT_FIRST) maa_session::slPollTimeout = MAA_POLL_TIMEOUT;
        if (MAA_IsUSBDisconnected()) {
            USBADP_LOG(ERROR, "\r\n[MAA] ReadDriver: USB Disconnected");
            return DM_RET_USB_DISCONNECTED;
        }
        return DM_RET_TIMEOUT;
    }
    *pulReturnSize = static_cast<U32>(count);
    return DM_RET_OK;
}

U32 DM_ReadDriver(U32 ulHandle, U8 **pubbufPtr, U32 ulReadSize, U32 *pulReturnSize, TDMCallback) {
    U32 r = DM_ReadDriverInto(ulHandle, aubDMBuf, ulReadSize, pulReturnSize);
    if (r == DM_RET_OK) *pubbufPtr = aubDMBuf;
    return r;
}

U32 DM_WriteDriver(U32 ulHandle, const U8 *pubBufPtr, U32 ulWriteSize, U32 *pulReturnSize, TDMCallback) {
    USBADP_LOG(DEBUG, "[MAA] WriteDriver START (%d bytes)\n", static_cast<int>(ulWriteSize));
    U32 total = 0;
    for (;;) {
        if (MAA_IsUSBDisconnected()) {
            USBADP_LOG(ERROR, "[MAA] WriteDriver: USB Disconnected (%d/%d)\n", static_cast<int>(total),
                       static_cast<int>(ulWriteSize));
            *pulReturnSize = ulWriteSize;
            return DM_RET_USB_DISCONNECTED;
        }
        // A retry starts again at the buffer's beginning, as the driver layer
        // always has; the bridge writes whole buffers.
        ssize_t w = ::write(static_cast<int>(ulHandle), pubBufPtr, ulWriteSize);
        if (w < 0 && errno == EINTR) continue;  // nothing was written yet
        if (w < 1) {
            int err = errno;
            USBADP_LOG(ERROR, "[MAA] WriteDriver: write (ret=%d,errno=%d,%s)(%d/%d)\n", static_cast<int>(w), err,
                       std::strerror(err), static_cast<int>(total), static_cast<int>(ulWriteSize));
            break;
        }
        total += static_cast<U32>(w);
        if (total == ulWriteSize) break;
        if (total > ulWriteSize) {
            USBADP_LOG(ERROR, "[MAA] WriteDriver: write overflow (%d/%d)\n", static_cast<int>(total),
                       static_cast<int>(ulWriteSize));
            break;
        }
    }
    // Only a disconnect is reported: callers cannot act on a failed write.
    *pulReturnSize = ulWriteSize;
    USBADP_LOG(DEBUG, "[MAA] WriteDriver DONE (%d bytes)\n", static_cast<int>(ulWriteSize));
    return DM_RET_OK;
}
