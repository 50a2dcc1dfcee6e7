#include "maa/MAA_Result.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "adapter/ProductConfig.h"
#include "adapter/USB.h"
#include "common/ByteOrder.h"
#include "common/FixedPath.h"
#include "common/Log.h"
#include "common/UniqueFd.h"
#include "maa/MAA_Address.h"
#include "maa/MAA_Driver.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_MM.h"
#include "maa/MAA_Wire.h"
#include "vendor/VLX_Main.h"

TMAAResult stMAASysResult;

namespace {

constexpr size_t kSerialStringSize = 40;

// Lines of Dump_File. Not the session's line buffer: the parser may still be
// reading the rest of the command line from there after the call.
U8 aubDumpLine[MAA_LINE_SIZE + 1];

bool runMode() { return enSpecialMode == MAA_JIG_RUN_CMD || enSpecialMode == MAA_AUTO_RUN_CMD; }

// Zero bytes are not written at all: an empty write is an error to the driver.
U32 writeBytes(const U8 *p, U32 n) {
    if (n == 0) return DM_RET_OK;
    U32 done = 0;
    return DM_WriteDriver(ulDrvHandle.load(), p, n, &done, nullptr);
}

// In pieces of at most FILE_BUFFERSIZE; stops at the first failed piece.
void writePieces(const U8 *p, U32 n, bool scanner) {
    for (U32 off = 0; off < n;) {
        U32 piece = std::min(FILE_BUFFERSIZE, n - off);
        U32 r = writeBytes(p + off, piece);
        if (scanner) USBADP_LOG(DEBUG, "\r\n[MAA] ScannerWriteFile : %d", static_cast<int>(piece));
        else USBADP_LOG(DEBUG, "\r\n[MAA] WriteFile : %d", static_cast<int>(piece));
        if (r != DM_RET_OK) return;
        off += piece;
    }
}

// One line of a text file, one byte per read: LF ends it (not stored), so do
// the end of the file and a full buffer. Returns its length; 0 is an empty
// line or the end.
U32 ReadFileByLine(int fd, U8 *line, U32 capacity) {
    U32 len = 0;
    U8 c;
    while (len + 1 < capacity && ::read(fd, &c, 1) == 1 && c != '\n') line[len++] = c;
    line[len] = 0;
    return len;
}

TMAAResult *dumpResult(TMAAResultStatus status, U32 result, const char *format, const char *value) {
    int n = std::snprintf(reinterpret_cast<char *>(aubDumpLine), sizeof aubDumpLine, format, value);
    U32 len = n < 0 ? 0 : std::min(static_cast<U32>(n), static_cast<U32>(sizeof aubDumpLine - 1));
    stMAASysResult = {status, result, len, aubDumpLine};
    return &stMAASysResult;
}

}  // namespace

void MAA_WriteResultFrame(const TMAAResult *pstMAAResult) {
    const U32 size = pstMAAResult->pubData != nullptr ? pstMAAResult->ulDataSize : 0;
    USBADP_LOG(INFO, "\n[MAA_WriteResult]AFTER CALL : Continue: %d Result:%d, DataSize:%d, Data:%.*s",
               static_cast<int>(pstMAAResult->enContinue), static_cast<int>(pstMAAResult->ulResult),
               static_cast<int>(size), static_cast<int>(size),
               size != 0 ? reinterpret_cast<const char *>(pstMAAResult->pubData) : "");
    U8 header[MAA_RESULT_HEADER_SIZE];
    WriteBE32(header, pstMAAResult->enContinue);
    WriteBE32(header + 4, pstMAAResult->ulResult);
    WriteBE32(header + 8, size);
    U32 r = writeBytes(header, sizeof header);
    if (r == DM_RET_TIMEOUT)
        USBADP_LOG(ERROR, "\r\n[MAA:MAA_WriteResult1] Invalide DM Write Return(%d)", static_cast<int>(r));
    else if (r == DM_RET_USB_DISCONNECTED)
        USBADP_LOG(ERROR, "\r\n[MAA:MAA_WriteResult1] Cable Disconnected during MAA_WriteResult");
    if (size != 0) {
        r = writeBytes(pstMAAResult->pubData, size);
        if (r == DM_RET_TIMEOUT)
            USBADP_LOG(ERROR, "\r\n[MAA:MAA_WriteResult2] Invalide DM Write Return(%d)", static_cast<int>(r));
        else if (r == DM_RET_USB_DISCONNECTED)
            USBADP_LOG(ERROR, "\r\n[MAA:MAA_WriteResult2] Cable Disconnected during MAA_WriteResult");
    }
    USBADP_LOG(DEBUG, "\nWriteBytes : %d(%d)", static_cast<int>(MAA_RESULT_HEADER_SIZE + size), static_cast<int>(size));
}

U32 MAA_SendCmdToHost(U32 ulFileSize, U32 enMAAop) {
    U8 frame[MAA_TRANSFER_FRAME_SIZE] = {'#', '$', '%', static_cast<U8>(enMAAop & 0xFF)};
    WriteBE32(frame + 4, ulFileSize);
    WriteBE32(frame + 8, ulFileSize);
    USBADP_LOG(DEBUG, "\r\n[MAA] T2H");
    for (U8 b : frame) USBADP_LOG(DEBUG, "%02x ", b);
    return writeBytes(frame, sizeof frame) == DM_RET_USB_DISCONNECTED ? 0 : 1;
}

void MAA_WriteFile(const U8 *pubFileBuffer, U32 ulFileSize) {
    USBADP_LOG(INFO, "\r\n[MAA] MAA_WriteFile");
    MAA_SendCmdToHost(ulFileSize, MAA_FILE_TRANS_T2H);
    writePieces(pubFileBuffer, ulFileSize, false);
}

void MAA_Scanner_WriteFile(const U8 *pubFileBuffer, U32 ulFileSize) { writePieces(pubFileBuffer, ulFileSize, true); }

void MAA_FileEnd(void) { MAA_SendCmdToHost(0, MAA_FILE_END); }

void MAA_WriteResultForward(const TMAAResult *pstMAAResult) {
    if (runMode() || pstMAAResult == nullptr) return;
    const U8 *data = pstMAAResult->pubData;
    const U32 size = data != nullptr ? pstMAAResult->ulDataSize : 0;
    U32 consumed = 0;
    bool fileEnded = false;  // after the end marker, transfer frames carry no data
    while (consumed < size) {
        if (size - consumed < MAA_RESULT_HEADER_SIZE) {
            USBADP_LOG(ERROR, "\r\n[MAA] Forward: %d bytes left, no whole frame", static_cast<int>(size - consumed));
            break;
        }
        const U8 *frame = data + consumed;
        const bool transfer = std::memcmp(frame, SpecialCmdPrefix, SPCL_CMD_LEN) == 0;
        if (transfer && frame[3] == MAA_FILE_END) fileEnded = true;
        U32 r = writeBytes(frame, MAA_RESULT_HEADER_SIZE);
        if (r == DM_RET_TIMEOUT) USBADP_LOG(ERROR, "\r\n[MAA] Invalide DM Write Return(%d)", static_cast<int>(r));
        consumed += MAA_RESULT_HEADER_SIZE;
        if (transfer && fileEnded) continue;
        // A length past the buffer's end is cut to what is there.
        const U32 len = std::min(ReadBE32(frame + 8), size - consumed);
        if (transfer) {
            writePieces(data + consumed, len, false);
        } else {
            r = writeBytes(data + consumed, len);
            if (r == DM_RET_TIMEOUT) USBADP_LOG(ERROR, "\r\n[MAA] Invalide DM Write Return(%d)", static_cast<int>(r));
        }
        consumed += len;
    }
    USBADP_LOG(DEBUG, "\r\n[CHD] FINISH(%d)", static_cast<int>(consumed));
    USBADP_LOG(DEBUG, "\nWriteBytes : %d(%d)", static_cast<int>(consumed), static_cast<int>(size));
}

void MAA_WriteFileForward(U8 *pubFileBuffer, U32 ulFileSize) {
    stMAASysResult = {MAA_RESULT_CONTINUE, 1, ulFileSize, pubFileBuffer};
    MAA_WriteResultForward(&stMAASysResult);
}

U32 MAA_ReadFile(U32 ulFileSize) {
    U32 capacity = 0;
    U8 *buffer = MAA_DownloadBuffer(&capacity);
    U32 total = 0;
    while (total < ulFileSize) {
        const U32 piece = std::min(FILE_BUFFERSIZE, ulFileSize - total);
        USBADP_LOG(DEBUG, "\r\n[MAA:MAA_ReadFile] USB Read File %d", static_cast<int>(piece));
        for (U32 got = 0; got < piece;) {
            // Straight into the download; without one (it could not be
            // allocated) the bytes are still taken.
            const bool fits = buffer != nullptr && total + piece <= capacity;
            U8 *discarded = nullptr;
            U32 n = 0;
            U32 r = fits ? DM_ReadDriverInto(ulDrvHandle.load(), buffer + total + got, piece - got, &n)
                         : DM_ReadDriver(ulDrvHandle.load(), &discarded, piece - got, &n, nullptr);
            if (r != DM_RET_OK) {
                USBADP_LOG(ERROR, "\r\n[MAA:MAA_ReadFile] Invalid DM Read Return(%d)", static_cast<int>(r));
                MAA_DownloadZeroFrom(total + got);
                return 0;
            }
            if (n == 0) {
                USBADP_LOG(ERROR, "\r\n[MAA] Read Fail ");
                MAA_DownloadZeroFrom(total + got);
                return 0;
            }
            got += std::min(n, piece - got);
        }
        total += piece;
        USBADP_LOG(DEBUG, "\r\n[MAA] ReadFile ( %05d )", static_cast<int>(total));
    }
    USBADP_LOG(INFO, "\r\n[MAA] ReadFile TotalSize : %d", static_cast<int>(total));
    return 1;
}

void MAA_ResponseOK(void) {
    USBADP_LOG(INFO, "\r\n Write MAA OK Command");
    U32 r = writeBytes(HeaderResCmd, HDR_RESP_CMD_LEN);
    if (r == DM_RET_TIMEOUT)
        USBADP_LOG(ERROR, "\r\n[MAA:MAA_ResponseOK] Invalid DM Write Return(%d)", static_cast<int>(r));
    else if (r == DM_RET_USB_DISCONNECTED)
        USBADP_LOG(ERROR, "\r\n[MAA:MAA_ResponseOK] Cable Disconnected during MAA_ResponseOK");
}

void MAA_WriteSerialString(const char *serial) {
    USBADP_LOG(INFO, "\r\nEntered inside WriteSerialString()");
    char *text = static_cast<char *>(std::malloc(kSerialStringSize));
    if (text == nullptr) {
        USBADP_LOG(ERROR, "\r\nWriting Serial String Failed : malloc failed.");
        return;
    }
    // The serial is cut, never the suffix.
    constexpr int kSerialRoom = static_cast<int>(kSerialStringSize - sizeof kProductSeriesName - 1);
    int n = std::snprintf(text, kSerialStringSize, "%.*s\t%s", kSerialRoom, serial ? serial : "", kProductSeriesName);
    const std::string path = FixedPath(REPORT_FILE);
    UniqueFd fd(::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644));
    if (!fd || n < 0 || ::write(fd.get(), text, static_cast<size_t>(n)) != n)
        USBADP_LOG(ERROR, "\r\n[MAA] usb_version.txt not written");
    std::free(text);
    USBADP_LOG(INFO, "\r\nExited WriteSerialString()");
}

TMAAResult *Dump_File(U32 ulPath) {
    // The host names a file of the controller: under USBADAPTER_ROOT on a PC.
    const char *name = MAA_AddrString(ulPath);
    const std::string path = name != nullptr ? FixedPath(name) : std::string();
    // Text files only: a device such as /dev/zero never ends, and a pipe or
    // /proc/kmsg would keep the shell waiting (hence no blocking, either).
    UniqueFd fd(name != nullptr ? ::open(path.c_str(), O_RDONLY | O_NONBLOCK) : -1);
    struct stat st;
    if (fd && (::fstat(fd.get(), &st) != 0 || !S_ISREG(st.st_mode))) fd.reset();
    if (!fd) return dumpResult(MAA_RESULT_END, 0, "File Open Error %s", name ? name : "");
    USBADP_LOG(INFO, "\r\nFile Dump Start");
    for (;;) {
        if (MAA_IsUSBDisconnected()) {
            USBADP_LOG(ERROR, "\r\n[MAA] Dump_File: cable disconnected, dump stopped");
            break;
        }
        U32 len = ReadFileByLine(fd.get(), aubDumpLine, sizeof aubDumpLine);
        if (len == 0) break;
        USBADP_LOG(DEBUG, "%s\n", aubDumpLine);
        stMAASysResult = {MAA_RESULT_CONTINUE, 0, len, aubDumpLine};
        MAA_IF_WriteResult(&stMAASysResult);
    }
    USBADP_LOG(INFO, "\nReturning from dump_file");
    return dumpResult(MAA_RESULT_END, 1, "File Read Complete : %s", name);
}
