#include "firmware/UpdateManager.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>

#include "common/ByteOrder.h"
#include "common/Log.h"
#include "common/Wait.h"
#include "firmware/FirmWareUpdate.h"
#include "platform/Platform.h"

namespace {

std::atomic<int> g_waitOverrideMs{-1};
std::atomic<int> g_progressLimitMs{-1};

int waitMs(U32 seconds) {
    if (seconds == 0) return -1;
    const int forced = g_waitOverrideMs.load();
    return forced >= 0 ? forced : static_cast<int>(seconds) * 1000 + 500;
}

U16 updatePort() {
    if (const char *env = std::getenv(UPDATE_PORT_ENV)) {
        char *end = nullptr;
        long p = std::strtol(env, &end, 10);
        if (end != env && *end == '\0' && p > 0 && p < 65536) return static_cast<U16>(p);
    }
    return UPDATE_PORT;
}

constexpr int kFileBlocksPerLine = 64;
constexpr U32 kFwWriteBlock = 0x10000;

}  // namespace

void UpdateManager_SetWaitMs(int ms) { g_waitOverrideMs = ms; }

void UpdateManager_SetProgressLimitMs(int ms) { g_progressLimitMs = ms; }

int UpdateManager_ProgressLimitMs() {
    const int forced = g_progressLimitMs.load();
    return forced >= 0 ? forced : PROGRESS_LIMIT_MS;
}

S32 connect_server(const char *pub_server_ip) {
    char server[SERVER_IP_BITS] = {};
    std::snprintf(server, sizeof server, "%s", pub_server_ip ? pub_server_ip : "");
    int sock = ::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (sock < 0) {
        USBADP_LOG(ERROR, "can't open socket!!!\n");
        return INVALID_SOCKET;
    }
    sockaddr_in addr{};
    addr.sin_family = AF_INET;
    addr.sin_port = htons(updatePort());
    addr.sin_addr.s_addr = inet_addr(server);
    int r;
    do {
        r = ::connect(sock, reinterpret_cast<sockaddr *>(&addr), sizeof addr);
    } while (r < 0 && errno == EINTR);
    if (r < 0) {
        USBADP_LOG(ERROR, "can't connect to a server!!!\n");
        // Closed here although nothing else could use it: every failed attempt
        // would otherwise cost the process a descriptor for good.
        ::close(sock);
        return SOCKET_ERROR;
    }
    // A manager that stops reading must not hold the print reader for ever:
    // a send waits as long as a receive does.
    const int limit = waitMs(RECEIVE_TIMEOUT) > 0 ? waitMs(RECEIVE_TIMEOUT) : 1;
    timeval tv{limit / 1000, (limit % 1000) * 1000};
    ::setsockopt(sock, SOL_SOCKET, SO_SNDTIMEO, &tv, sizeof tv);
    // Every request is small and answered: none may wait for an earlier
    // segment's acknowledgement (the checksum before the verdict would).
    const int one = 1;
    ::setsockopt(sock, IPPROTO_TCP, TCP_NODELAY, &one, sizeof one);
    return sock;
}

S32 send_data(S32 sock, const U8 *pub_data, U32 ul_size) {
    U32 sent = 0;
    while (sent < ul_size) {
        // After a partial send the start of the buffer goes again with the
        // count still missing; on loopback with 1 KiB blocks it never happens.
        ssize_t n = ::send(sock, pub_data, ul_size - sent, MSG_NOSIGNAL);
        if (n < 0 && errno == EINTR) continue;
        if (n < 0) {
            USBADP_LOG(ERROR, "send_data : Sending Error!!!\n");
            return SOCKET_ERROR;
        }
        sent += static_cast<U32>(n);
    }
    return static_cast<S32>(ul_size);
}

S32 send_to_update_manager(S32 sock, U32 ul_type, U32 ul_option) {
    U8 buf[SIGNATURE_SIZE + 1] = {};
    U32 size = 4;
    switch (ul_type) {
    case IMG_SIGNATURE: std::memcpy(buf, HEADER_SIGNATURE, SIGNATURE_SIZE); break;
    case IMG_TYPE:
    case IMG_SIZE: WriteBE32(buf, ul_option); break;
    case IMG_CHECKSUM:
        WriteBE16(buf, static_cast<U16>(ul_option));
        size = 2;
        break;
    case IMG_END: std::memcpy(buf, END_SIGNATURE, SIGNATURE_SIZE); break;
    default:
        USBADP_LOG(ERROR, "send_to_update_manager : invalid request(%d)!!!", static_cast<int>(ul_type));
        return -1;
    }
    USBADP_LOG(DEBUG, "send_to_update_manager : %s\n", reinterpret_cast<const char *>(buf));
    if (send_data(sock, buf, size) != static_cast<S32>(size)) {
        USBADP_LOG(ERROR, "send_to_update_manager : sending error(%d)!!!\n", static_cast<int>(ul_type));
        return -1;
    }
    return 0;
}

bool BodySender::Send(const U8 *data, size_t size) {
    size_t at = 0;
    while (!failed_ && at < size) {
        ssize_t n = ::send(sock_, data + at, size - at, MSG_NOSIGNAL);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) {
            USBADP_LOG(ERROR, "send_data : Sending Error!!!\n");
            USBADP_LOG(ERROR, "send_file : sending error!!!\n");
            failed_ = true;
            break;
        }
        at += static_cast<size_t>(n);
        sent_ += static_cast<unsigned long long>(n);
    }
    mark();
    return !failed_;
}

void BodySender::mark() {
    // At most a line's worth per call keeps the buffer small; the rest follows.
    char line[2 * kFileBlocksPerLine];
    while (marked_ < sent_ / MAX_FILE_BUFFER) {
        size_t len = 0;
        while (len + 1 < sizeof line && marked_ < sent_ / MAX_FILE_BUFFER) {
            line[len++] = '#';
            if (++marked_ % kFileBlocksPerLine == 0) line[len++] = '\n';
        }
        std::fwrite(line, 1, len, stdout);
    }
}

S32 BodySender::Finish() {
    if (failed_) return -1;
    // A last short block, or the one empty block of an empty body.
    if (sent_ % MAX_FILE_BUFFER != 0 || sent_ == 0) std::fputc('#', stdout);
    std::fputc('\n', stdout);
    std::fflush(stdout);
    USBADP_LOG(INFO, "Sending Complete...\n");
    return 0;
}

S32 send_file(S32 sock, const char *pub_filename) {
    std::unique_ptr<FILE, int (*)(FILE *)> file(std::fopen(pub_filename, "rb"), std::fclose);
    if (!file) {
        USBADP_LOG(ERROR, "send_file : file open error\n");
        return -1;
    }
    long size = -1;
    if (std::fseek(file.get(), 0, SEEK_END) == 0) size = std::ftell(file.get());
    if (size < 0) {
        USBADP_LOG(ERROR, "send_file : file size get error\n");
        return -1;
    }
    std::rewind(file.get());
    // Read in large blocks: the byte stream and the marks are those of 1 KiB
    // blocks, without a system call per kibibyte.
    std::unique_ptr<U8[]> block(new U8[kFwWriteBlock]);
    BodySender out(sock);
    for (long left = size; left > 0;) {
        const size_t want = static_cast<size_t>(left < static_cast<long>(kFwWriteBlock) ? left : kFwWriteBlock);
        const size_t got = std::fread(block.get(), 1, want, file.get());
        if (got != want) {
            USBADP_LOG(ERROR, "send_file : sending error!!!\n");
            return -1;
        }
        if (!out.Send(block.get(), got)) return -1;
        left -= static_cast<long>(got);
    }
    return out.Finish();
}

S32 recv_data(S32 sock, U8 *pub_data, U32 ul_size, U32 ul_wait_time) {
    const int limit = waitMs(ul_wait_time);
    U32 got = 0;
    while (got < ul_size) {
        // poll rather than select: any descriptor number, and a signal resumes
        // the wait towards the same end instead of failing it.
        const int64_t start = Wait_NowMs();
        short revents = 0;
        int r = Wait_PollIn(sock, limit, &revents);
        if (r < 0) {
            USBADP_LOG(ERROR, "error!!!\n");
            return -1;
        }
        if (r == 0) {
            USBADP_LOG(ERROR, "timeout!!!\n");
            return -1;
        }
        ssize_t n;
        do {
            n = ::recv(sock, pub_data + got, ul_size - got, 0);
        } while (n < 0 && errno == EINTR);
        if (n < 0) {
            USBADP_LOG(ERROR, "Receiving Error!!!\n");
            return -1;
        }
        if (n == 0) {
            // The manager has closed: nothing more can come. The wait still
            // ends by its time-out, but idly, not spinning on the closed socket.
            Wait_IdleRest(start, limit);
            USBADP_LOG(ERROR, "timeout!!!\n");
            return -1;
        }
        got += static_cast<U32>(n);
    }
    return static_cast<S32>(ul_size);
}

UpdMgrResponse recv_data_on_socket(S32 sock, U32 ul_size) {
    UpdMgrResponse resp;
    std::memset(&resp, 0, sizeof resp);
    if (ul_size > sizeof resp.data) ul_size = sizeof resp.data;
    recv_data(sock, resp.data, ul_size, RECEIVE_TIMEOUT);
    return resp;
}

S32 write_to_update_manager(U32 ul_size) {
    std::unique_ptr<FILE, int (*)(FILE *)> file(std::fopen(TEMP_FW_IMAGE, "rb"), std::fclose);
    if (!file) {
        USBADP_LOG(ERROR, "write_to_update_manager : Temp datafile open error\n");
        return -1;
    }
    std::unique_ptr<U8[]> block(new U8[kFwWriteBlock]);
    U32 left = ul_size;
    while (left > 0) {
        const U32 want = left < kFwWriteBlock ? left : kFwWriteBlock;
        const size_t got = std::fread(block.get(), 1, want, file.get());
        if (got == 0) return -1;
        USBADP_LOG(INFO, "Writing Firmware data to socket\n");
        if (FW_Write(block.get(), static_cast<unsigned>(got)) < 0) return -1;
        left -= static_cast<U32>(got);
    }
    return 0;
}
