// Client side of the link to the update manager, the local process that writes
// firmware images to flash: framed requests out, 4- and 1-byte answers in.
#pragma once

#include <cstddef>

#include "usbadapter/types.h"

#define LOCALHOST "127.0.0.1"
#define UPDATE_PORT 30243
#define MAX_FILE_BUFFER 1024
#define RECEIVE_TIMEOUT 5
#define SOCKET_ERROR (-1)
#define INVALID_SOCKET (-1)
#define SERVER_IP_BITS 256

// Overrides UPDATE_PORT when set (1..65535), read at each connect: lets tests
// and the simulator run an update manager of their own on loopback.
#define UPDATE_PORT_ENV "USBADAPTER_UPDATE_PORT"

// Request codes of send_to_update_manager.
enum TUpdMgrRequest : U32 {
    IMG_SIGNATURE = 0,  // "$IMG"
    IMG_TYPE = 1,       // type, 4 bytes big-endian
    IMG_SIZE = 2,       // size, 4 bytes big-endian
    IMG_CHECKSUM = 3,   // low 16 bits, big-endian
    IMG_END = 4,        // "$END"
};

// Every answer is read through this; zeroed before each receive, so bytes that
// never came read as 0.
union UpdMgrResponse {
    S8 progress;
    S32 value;
    U8 data[5];
};

// Connected socket or -1.
S32 connect_server(const char *pub_server_ip);
// ul_size or -1.
S32 send_data(S32 sock, const U8 *pub_data, U32 ul_size);
// 0 or -1.
S32 send_to_update_manager(S32 sock, U32 ul_type, U32 ul_option);
// 0 or -1. Prints one '#' per 1 KiB block on standard output.
S32 send_file(S32 sock, const char *pub_filename);

// An image body sent in pieces of any size. Standard output gets the marks
// send_file prints for 1 KiB blocks (one '#' each, a line break after every 64
// and at the end), whatever the pieces. A partial send goes on after the bytes
// the kernel took, so the stream stays exact. After a failed send nothing more
// is sent.
class BodySender {
public:
    explicit BodySender(S32 sock) : sock_(sock) {}
    bool Send(const U8 *data, size_t size);
    // 0, or -1 when a send failed; logs like send_file.
    S32 Finish();

private:
    void mark();
    S32 sock_;
    bool failed_ = false;
    unsigned long long sent_ = 0;
    unsigned long long marked_ = 0;  // whole blocks marked
};
// ul_size or -1; each wait lasts ul_wait_time seconds and a half (0: no limit).
S32 recv_data(S32 sock, U8 *pub_data, U32 ul_size, U32 ul_wait_time);
// At most 5 bytes; whatever the outcome.
UpdMgrResponse recv_data_on_socket(S32 sock, U32 ul_size);
// Hands the temporary image to the platform's FW_Write in blocks; 0 or -1.
S32 write_to_update_manager(U32 ul_size);

// All progress reports after "$END" must have come within this time: a
// manager still below 100 then fails the download. A slow flash of a large
// image that reports (or is just alive) stays well inside it; a manager stuck
// below 100 no longer holds the print reader for ever.
#define PROGRESS_LIMIT_MS (30 * 60 * 1000)

// Tests: the progress limit is `ms` instead (< 0: PROGRESS_LIMIT_MS).
void UpdateManager_SetProgressLimitMs(int ms);
int UpdateManager_ProgressLimitMs();

// Tests: every wait of recv_data lasts `ms` instead (< 0: the real length), so
// a silent manager need not cost seconds per case.
void UpdateManager_SetWaitMs(int ms);
