#include "firmware/FirmWareUpdate.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <bit>
#include <cctype>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <memory>
#include <new>
#include <vector>

#include "adapter/USB.h"
#include "common/ByteOrder.h"
#include "common/Log.h"
#include "common/UniqueFd.h"
#include "common/Wait.h"
#include "firmware/UpdateManager.h"

const U8 kFirmwareHeaderText[PARTIAL_HEADER_SIZE] = {0x1B, '%', '-', '1', '2', '3', '4', '5', 'X', '@', 'P',
                                                     'J',  'L', 0x0D, 0x0A, '@', 'P', 'J', 'L', ' ', 'F', 'I',
                                                     'R',  'M', 'W', 'A', 'R', 'E', ' ', '=', ' '};

char pub_output[30];

namespace {

// One row per firmware type, plus the ids of other subsystems that map to
// UNAVAILABLE. `id` holds the characters that select the row (compared
// case-insensitively from the first); `word` is printed on standard output.
struct FirmwareTypeRow {
    TFirmwareType type;
    const char *logName;
    const char *id;
    const char *word;
};

const FirmwareTypeRow kFirmwareTypes[] = {
    {SCAN, "SCAN", "E7", "SCAN"},
    {DADF, "DADF", "E8", "DADF(Halvard)"},
    {VIDEO, "Video", "E5", "Video"},
    {VIDEOBOOT, "VideoBootRom", "E6", "Video Bootrom"},
    {ENGINE, "engine", "E1", "engine"},
    {SCF, "SCF", "E2", "SCF(Halvard)"},
    {HCF, "HCF", "E3", "HCF"},
    {FINISHER, "Finisher", "E4", "Finisher(Halvard)"},
    {UI, "UI", "EB", "UI"},
    {UNAVAILABLE, "Unavailable", "0", "MCB"},
    {UNAVAILABLE, "Unavailable", "3", "DADF"},
    {UNAVAILABLE, "Unavailable", "8", "SCF"},
    {UNAVAILABLE, "Unavailable", "9", "GUI"},
    {UNAVAILABLE, "Unavailable", "A", "Finisher"},
    {UBOOT, "uboot", "EC1", "UBoot"},
    {CONVERT, "Convert", "E9", "Convert"},
    {FAX, "Fax", "EA", "FAX"},
    {KERNEL, "kernel", "EC2", "Kernel"},
    {ROOTFS, "rootFS", "EC3", "RootFileSystem"},
    {EMULATOR, "emul", "ED", "Emulation"},
    // The drivers have no log names of their own.
    {SCANDRIVER, "Unknown", "EE1", "ScanDriver"},
    {VPUDRIVER, "Unknown", "EE2", "Vpu Driver"},
    {FAXDRIVER, "Unknown", "EE3", "Fax Driver"},
    {TARNWELMMDRIVER, "Unknown", "EE4", "Tarnwel_mm Driver"},
};

constexpr int kFlushFailureLimit = 5;
constexpr size_t kChecksumLoggedWords = 6;

// Nothing more can come once the cable is gone or the channel is closing.
bool channelGone() { return IsDisconnected.load() || hibernation_flag.load(); }

bool idMatches(const U8 *id, const char *rowId) {
    for (size_t i = 0; rowId[i]; ++i)
        if (std::toupper(id[i]) != rowId[i]) return false;
    return true;
}

// Sum of `words` big-endian 16-bit words, modulo 2^32 (so also modulo
// 65536): the high bytes and the low bytes summed apart, eight bytes at a time
// in four 16-bit lanes each, folded before a lane can overflow.
U32 sumWords(const U8 *p, size_t words) {
    constexpr uint64_t kLanes = 0x00FF00FF00FF00FFull;
    constexpr size_t kFoldEvery = 256;  // 256 * 255 fits a 16-bit lane
    auto fold = [](uint64_t v) { return static_cast<U32>((v & 0xFFFF) + ((v >> 16) & 0xFFFF) + ((v >> 32) & 0xFFFF) + (v >> 48)); };
    U32 high = 0, low = 0;
    size_t i = 0;
    while (words - i >= 4) {
        const size_t rounds = std::min((words - i) / 4, kFoldEvery);
        uint64_t first = 0, second = 0;  // little-endian: even, odd offsets
        for (size_t r = 0; r < rounds; ++r, i += 4) {
            uint64_t w;
            std::memcpy(&w, p + 2 * i, sizeof w);
            first += w & kLanes;
            second += (w >> 8) & kLanes;
        }
        if constexpr (std::endian::native == std::endian::little) {
            high += fold(first);
            low += fold(second);
        } else {
            high += fold(second);
            low += fold(first);
        }
    }
    for (; i < words; ++i) {
        high += p[2 * i];
        low += p[2 * i + 1];
    }
    return (high << 8) + low;
}

S32 fwFail(const char *line, S32 fdPrn, U32 discard) {
    USBADP_LOG(ERROR, "%s", line);
    flush_usb(fdPrn, static_cast<S32>(discard));
    return FW_FAIL;
}

// 16-bit big-endian words of a body that arrives in pieces of any length,
// summed as make_checksum sums the whole: an odd last byte counts as a high
// byte.
struct StreamSum {
    U32 sum;
    int pending = -1;  // a high byte whose low byte opens the next piece

    void add(const U8 *p, size_t n) {
        if (n == 0) return;
        if (pending >= 0) {
            sum += (static_cast<U32>(pending) << 8) | p[0];
            pending = -1;
            ++p;
            --n;
        }
        sum += sumWords(p, n / 2);
        if (n & 1) pending = p[n - 1];
    }
    U16 finish() {
        if (pending >= 0) sum += static_cast<U32>(pending) << 8;
        pending = -1;
        return static_cast<U16>(sum);
    }
};

// All of `data` into the file; the count it took.
size_t writeFile(int fd, const U8 *data, size_t size) {
    size_t done = 0;
    while (done < size) {
        ssize_t n = ::write(fd, data + done, size - done);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) break;
        done += static_cast<size_t>(n);
    }
    return done;
}

// The body of one image: off the print channel into the temporary file, and
// each piece on to the manager as soon as the file holds it, checksummed on
// the way. The manager gets the bytes the file got, as if the finished file
// had been sent, followed by the final checksum this returns (0xFFFF when
// the file did not get the whole body).
U16 relayImage(S32 fdPrn, S32 sock, U32 size, U16 seed) {
    std::snprintf(pub_output, sizeof pub_output, "%s", TEMP_FW_IMAGE);
    UniqueFd file(::open(pub_output, O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0666));
    if (!file) {
        USBADP_LOG(ERROR, "Error: Can't open file(%s).\n", pub_output);
        flush_usb(fdPrn, static_cast<S32>(size));
        USBADP_LOG(ERROR, "update_chksum : Temp datafile open error\n");
        USBADP_LOG(ERROR, "send_file : file open error\n");
        return 0xFFFF;
    }
    BodySender out(sock);
    StreamSum sum{seed};
    // A size of 2 GiB or more is negative as a count: no body is taken.
    S32 left = static_cast<S32>(size);
    bool whole = left >= 0;
    std::unique_ptr<U8[]> buf(new U8[BUFFER_SIZE]);
    while (left > 0) {
        const size_t want = left < BUFFER_SIZE ? static_cast<size_t>(left) : BUFFER_SIZE;
        const ssize_t n = Wait_Read(fdPrn, buf.get(), want, channelGone);
        USBADP_LOG(FINE, "Read bytes on USB [%d]\n", static_cast<int>(n));
        if (n < 0) {
            USBADP_LOG(ERROR, "firmWare data Read Error\n");
            flush_usb(fdPrn, left);
            whole = false;
            break;
        }
        const size_t kept = writeFile(file.get(), buf.get(), static_cast<size_t>(n));
        out.Send(buf.get(), kept);
        if (n == 0 || kept < static_cast<size_t>(n)) {
            USBADP_LOG(ERROR, "fimware to temp file Write Error\n ");
            flush_usb(fdPrn, left - static_cast<S32>(n));
            whole = false;
            break;
        }
        sum.add(buf.get(), kept);
        left -= static_cast<S32>(n);
    }
    file.reset();
    U16 final = 0xFFFF;
    if (whole) {
        final = static_cast<U16>(VERIFY_CHECK_SUM - sum.finish());
        USBADP_LOG(INFO, "Final Checksum is 0x%04x\n", final);
    } else {
        USBADP_LOG(ERROR, "update_chksum : Read Data from file error\n");
    }
    out.Finish();
    return final;
}

}  // namespace

U32 Convert_FW_SubSID(const U8 *id) {
    for (const FirmwareTypeRow &row : kFirmwareTypes) {
        if (idMatches(id, row.id)) {
            std::printf("%s\n", row.word);
            return row.type;
        }
    }
    std::printf("Unknown\n");
    return UNAVAILABLE;
}

const char *FirmwareType(U32 type) {
    for (const FirmwareTypeRow &row : kFirmwareTypes)
        if (row.type == type) return row.logName;
    return "Unknown";
}

U16 make_checksum(const U8 *pub_pool, U32 data_size, U32 chksum_seed) {
    U32 oddTerm = 0;
    if (data_size & 1) {
        oddTerm = static_cast<U32>(pub_pool[data_size - 1]) << 8;
        --data_size;
    }
    U16 sum = static_cast<U16>(chksum_seed + oddTerm);
    const size_t words = data_size / 2;
    const size_t logged = words < kChecksumLoggedWords ? words : kChecksumLoggedWords;
    for (size_t i = 0; i < logged; ++i) {
        const U16 word = ReadBE16(pub_pool + 2 * i);
        USBADP_LOG(FINE, "=====> uw_data=0x%x, uw_check_sum = 0x%x", word, sum);
        USBADP_LOG(FINE, " : uw_check_sum + uw_data = 0x%x\r\n", static_cast<U16>(sum + word));
        sum = static_cast<U16>(sum + word);
    }
    return static_cast<U16>(sum + sumWords(pub_pool + 2 * logged, words - logged));
}

S32 read_from_file(FILE *file, U8 *buffer, U32 size) {
    U32 done = 0;
    while (done < size) {
        size_t n = std::fread(buffer + done, 1, size - done, file);
        if (n == 0) return -1;
        done += static_cast<U32>(n);
    }
    return static_cast<S32>(size);
}

U16 update_chksum(U32 fw_checksum, U32 fil_size) {
    std::unique_ptr<FILE, int (*)(FILE *)> file(std::fopen(TEMP_FW_IMAGE, "rb"), std::fclose);
    if (!file) {
        USBADP_LOG(ERROR, "update_chksum : Temp datafile open error\n");
        return 0xFFFF;
    }
    // The size comes from the host: a file shorter than announced fails as a
    // short read would, before anything of that size is allocated.
    struct stat st{};
    if (::fstat(::fileno(file.get()), &st) != 0 || static_cast<unsigned long long>(st.st_size) < fil_size) {
        USBADP_LOG(ERROR, "update_chksum : Read Data from file error\n");
        return 0xFFFF;
    }
    std::unique_ptr<U8[]> data(new (std::nothrow) U8[fil_size ? fil_size : 1]);
    if (!data) {
        USBADP_LOG(ERROR, "update_chksum : Allocation for firmware data failed\n");
        return 0xFFFF;
    }
    if (read_from_file(file.get(), data.get(), fil_size) != static_cast<S32>(fil_size)) {
        USBADP_LOG(ERROR, "update_chksum : Read Data from file error\n");
        return 0xFFFF;
    }
    const U16 sum = make_checksum(data.get(), fil_size, fw_checksum % 65536);
    const U16 final = static_cast<U16>(VERIFY_CHECK_SUM - sum);
    USBADP_LOG(INFO, "Final Checksum is 0x%04x\n", final);
    return final;
}

void flush_usb(S32 fdPrn, S32 remain_size) {
    U8 buf[FLUSH_BUFFER_SIZE];
    int failures = 0;
    while (remain_size > 0) {
        const size_t want = remain_size < FLUSH_BUFFER_SIZE ? static_cast<size_t>(remain_size) : FLUSH_BUFFER_SIZE;
        ssize_t n = Wait_Read(fdPrn, buf, want, channelGone);
        // A read that brings nothing (the driver's read time-out: the host is
        // silent or gone) counts as a failure too, or a host that announced
        // more than it sent would hold the reader for ever.
        if (n <= 0) {
            USBADP_LOG(ERROR, "Data Read Error: can't Flush\n");
            if (++failures >= kFlushFailureLimit || channelGone()) return;
        }
        // A failed read's -1 counts like a byte count (one more to discard).
        remain_size -= static_cast<S32>(n);
    }
}

S32 read_fw_into_file(S32 fdPrn, S32 sl_remain_size) {
    std::snprintf(pub_output, sizeof pub_output, "%s", TEMP_FW_IMAGE);
    std::unique_ptr<FILE, int (*)(FILE *)> file(std::fopen(pub_output, "wb"), std::fclose);
    if (!file) {
        USBADP_LOG(ERROR, "Error: Can't open file(%s).\n", pub_output);
        flush_usb(fdPrn, sl_remain_size);
        return FW_FAIL;
    }
    std::vector<U8> buf(BUFFER_SIZE);
    while (sl_remain_size > 0) {
        const size_t want = sl_remain_size < BUFFER_SIZE ? static_cast<size_t>(sl_remain_size) : BUFFER_SIZE;
        ssize_t n = Wait_Read(fdPrn, buf.data(), want, channelGone);
        USBADP_LOG(FINE, "Read bytes on USB [%d]\n", static_cast<int>(n));
        if (n < 0) {
            USBADP_LOG(ERROR, "firmWare data Read Error\n");
            file.reset();
            flush_usb(fdPrn, sl_remain_size);
            return FW_FAIL;
        }
        if (n == 0 || std::fwrite(buf.data(), 1, static_cast<size_t>(n), file.get()) == 0) {
            USBADP_LOG(ERROR, "fimware to temp file Write Error\n ");
            file.reset();
            flush_usb(fdPrn, sl_remain_size - static_cast<S32>(n));
            return FW_FAIL;
        }
        sl_remain_size -= static_cast<S32>(n);
    }
    return std::fclose(file.release()) == 0 ? FW_PASS : FW_FAIL;
}

S32 FirmWareDownload(S32 fdPrn, U8 *command, U32 commandlen, U8 *firmware_command, S32 *firmware) {
    USBADP_LOG(INFO, "=====> start f/w download\r\n");
    *firmware = 0;
    U8 header[FW_PJL_HEADER_SIZE] = {};
    if (commandlen > FW_PJL_HEADER_SIZE - 1) {
        // Nothing of this stream is in the header buffer yet, so there is no
        // announced size to discard.
        USBADP_LOG(ERROR, "Command Length seems greater than header size (80)\r\n");
        return FW_FAIL;
    }
    std::memcpy(header, command, commandlen);
    ssize_t n = Wait_Read(fdPrn, header + commandlen, FW_PJL_HEADER_SIZE - commandlen, channelGone);
    if (n <= 0) {
        USBADP_LOG(ERROR, "Read Failed\r\n");
        USBADP_LOG(ERROR, "\r\nread 0 bytes so returning [%d]\n", static_cast<int>(commandlen));
        // The count returned is of bytes in firmware_command: the ones held.
        std::memcpy(firmware_command, command, commandlen);
        return static_cast<S32>(commandlen);
    }
    // Bytes of the current header; a later header (always 80) is all the
    // caller's buffer can take back.
    S32 held = static_cast<S32>(commandlen + static_cast<U32>(n));
    U32 running = 0;
    // An image's connection is closed once the next image's is up, the last
    // one when the call returns: the manager has answered by then, and a
    // process that outlives a failed download must not lose descriptors with
    // every firmware file.
    UniqueFd conn;
    for (;;) {
        if (std::memcmp(header, kFirmwareHeaderText, PARTIAL_HEADER_SIZE) != 0) {
            USBADP_LOG(INFO, "Not a FirmWare\r\n");
            std::memcpy(firmware_command, header, FW_PJL_HEADER_SIZE);
            return held;
        }
        *firmware = 1;
        USBADP_LOG(INFO, "Firmware Found\r\n");
        const U32 type = Convert_FW_SubSID(header + FW_SUBSYSTEM_ID_OFFSET);
        ImageHeader image{};
        std::memcpy(image.aubSig, HEADER_SIGNATURE, SIGNATURE_SIZE);
        std::memcpy(&image.ulSizeofBody, header + FW_SIZE_OFFSET, 4);
        WriteBE32(reinterpret_cast<U8 *>(&image.ulTypeofImage), type);
        const U32 size = ReadBE32(header + FW_SIZE_OFFSET);

        if (type == UNAVAILABLE) return fwFail("Firmware Type Unknown\r\n", fdPrn, size);
        USBADP_LOG(INFO, "Firmware Type [%d]\nFirmware size [%d]\r\n", static_cast<int>(type), static_cast<int>(size));
        running = make_checksum(reinterpret_cast<const U8 *>(&image), sizeof image, running);

        UniqueFd next(connect_server(LOCALHOST));
        if (!next) return fwFail("Socket Initialization failed\r\n", fdPrn, size);
        USBADP_LOG(INFO, "Socket Initialized\r\n");
        conn = std::move(next);
        const S32 sock = conn.get();

        USBADP_LOG(INFO, "Writing $IMG to socket\r\n");
        send_to_update_manager(sock, IMG_SIGNATURE, 0);
        USBADP_LOG(INFO, "Writing Firmware type to socket\r\n");
        send_to_update_manager(sock, IMG_TYPE, type);
        USBADP_LOG(INFO, "Writing Firmware size to socket\r\n");
        send_to_update_manager(sock, IMG_SIZE, size);

        // Failures here show at the manager's checksum verdict.
        const U16 final = relayImage(fdPrn, sock, size, static_cast<U16>(running));
        USBADP_LOG(INFO, "Writing the Checksum to socket [0x%02x]\r\n", final);
        send_to_update_manager(sock, IMG_CHECKSUM, final);

        USBADP_LOG(INFO, "Receiving checksum acknowledgement from socket\r\n");
        const UpdMgrResponse verdict = recv_data_on_socket(sock, 4);
        const U32 answer = ReadBE32(verdict.data);
        USBADP_LOG(INFO, "Response got is 0x%04x\r\n", answer);
        if (answer == 2) {
            USBADP_LOG(ERROR, "Invalid CheckSum Error\r\n");
            return FW_FAIL;
        }

        std::memset(header, 0, sizeof header);
        n = Wait_Read(fdPrn, header, FW_PJL_HEADER_SIZE, channelGone);
        if (n != FW_PJL_HEADER_SIZE) break;
        held = FW_PJL_HEADER_SIZE;
        running = final;
    }

    const S32 sock = conn.get();
    USBADP_LOG(INFO, "Writing $END Signature to socket\r\n");
    send_to_update_manager(sock, IMG_END, 0);
    UpdMgrResponse resp = recv_data_on_socket(sock, 4);
    if (std::memcmp(resp.data, "$PRO", 4) != 0) {
        USBADP_LOG(ERROR, "PROGRESS not received\r\n");
        return FW_FAIL;
    }
    USBADP_LOG(INFO, "PROGRESS receiving..\r\n");
    const int limitMs = UpdateManager_ProgressLimitMs();
    const int64_t progressEnd = Wait_NowMs() + limitMs;
    for (S8 progress = 0; progress < 100;) {
        if (Wait_NowMs() >= progressEnd) {
            USBADP_LOG(ERROR, "PROGRESS not done within %d s\r\n", limitMs / 1000);
            USBADP_LOG(ERROR, "Download of FirmWare Failed\r\n");
            return FW_FAIL;
        }
        // A manager that falls silent or closes here would otherwise be read
        // as progress 0 for ever: a pair that does not come ends the download.
        UpdMgrResponse kind, percent;
        std::memset(&kind, 0, sizeof kind);
        std::memset(&percent, 0, sizeof percent);
        if (recv_data(sock, kind.data, 4, RECEIVE_TIMEOUT) < 0 || recv_data(sock, percent.data, 1, RECEIVE_TIMEOUT) < 0) {
            USBADP_LOG(ERROR, "Download of FirmWare Failed\r\n");
            return FW_FAIL;
        }
        progress = percent.progress;
        if (progress == -1) {
            USBADP_LOG(ERROR, "Download of FirmWare Failed\r\n");
            return FW_FAIL;
        }
        U32 written;  // the manager's byte order, for the log only
        std::memcpy(&written, kind.data, sizeof written);
        USBADP_LOG(INFO, "fw type %s\tProgress %d%%\r\n", FirmwareType(written), progress);
    }
    resp = recv_data_on_socket(sock, SIGNATURE_SIZE);
    if (std::memcmp(resp.data, END_SIGNATURE, SIGNATURE_SIZE) != 0) return FW_FAIL;
    USBADP_LOG(INFO, "FirmWare Update Done....Rebooting\r\n");
    return FW_PASS;
}
