#include "maa/MAA_Hook.h"

#include <fcntl.h>
#include <pthread.h>
#include <sys/msg.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "adapter/USB.h"
#include "adapter/prn_thread.h"
#include "common/ByteOrder.h"
#include "common/FixedPath.h"
#include "common/Log.h"
#include "common/UniqueFd.h"
#include "maa/MAA_Address.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_MM.h"
#include "maa/MAA_Parser.h"
#include "maa/MAA_Result.h"
#include "vendor/VLX_Main.h"

U8 aubBuf[MAA_LINE_BUFFER_SIZE];
U32 dataReadCount = 0;
U32 fSellStop = 0;
U32 ulReadCount = 0;
MAAHeapHandle stDataHeap = {};
MAAHeapHandle stCmdHeap = {};

namespace {

constexpr key_t kMAAQueueKey = 1234;
constexpr char kUsbSpeedFile[] = "/halvard/sys/statusinfo/usb_speed.txt";
constexpr U32 kRawBytesAfterHash = 8;

// Most recent download buffer (owned by the session's download store).
U8 *addr = nullptr;
pthread_t thrThread;
sched_param thrParam;

U32 session() { return ulDrvHandle.load(); }

// Gives the bytes taken so far back to the classifier: the two it had, then
// the ones read behind them.
S32 handBack(U8 *command, const U8 *start, U32 count, const char *tag) {
    std::memcpy(command, start, count + 2);
    char text[HDR_CMD_LEN + 1] = {};
    std::memcpy(text, start, count + 2);
    USBADP_LOG(INFO, "\r\n[MAA:MAA_Hook] (%s)Value of dataReadCount: [%d]\n", tag, static_cast<int>(count));
    USBADP_LOG(INFO, "\r\n[MAA:MAA_Hook] (%s)Value of command: [%s]\n", tag, text);
    dataReadCount = 0;
    return static_cast<S32>(count);
}

// Replaces the buffer of a heap handle with one of ulSize bytes, zeroed when
// its contents will be read (the saved commands rely on zero bytes).
bool reallocHeap(MAAHeapHandle &heap, U32 ulSize, bool zeroed) {
    if (heap.ulHeapPtr != nullptr || heap.ulHeapSize != 0) {
        MAA_HeapFree(heap.ulHeapPtr, 0);
        heap = {};
    }
    void *block = nullptr;
    if (ulSize <= MAA_HEAP_REQUEST_MAX) block = zeroed ? MAA_HeapAllocZeroed(ulSize, 0) : MAA_HeapAlloc(ulSize, 0);
    U8 *p = static_cast<U8 *>(block);
    if (p == nullptr) {
        USBADP_LOG(ERROR, "\r\n[MAA] Data Allocation in Heap Failed");
        return false;
    }
    heap = {p, ulSize, 0};
    return true;
}

// Appends a line to the saved commands as its characters, 0x00, LF, with a
// NUL behind (not counted). A line that does not fit is dropped: the host's
// size is all the room there is.
void saveLine(const U8 *line) {
    U32 len = static_cast<U32>(std::strlen(reinterpret_cast<const char *>(line)));
    MAAHeapHandle &h = stCmdHeap;
    if (h.ulHeapPtr == nullptr || h.ulHeapIndex > h.ulHeapSize || h.ulHeapSize - h.ulHeapIndex < len + 3) {
        USBADP_LOG(ERROR, "\r\n[MAA] Command buffer full, not saved : %s", line);
        return;
    }
    std::memcpy(h.ulHeapPtr + h.ulHeapIndex, line, len);
    h.ulHeapIndex += len + 1;
    h.ulHeapPtr[h.ulHeapIndex++] = '\n';
    h.ulHeapPtr[h.ulHeapIndex] = 0;
    USBADP_LOG(INFO, "\r\n[MAA]Save Command : %s , %d, %d", line, static_cast<int>(len),
               static_cast<int>(h.ulHeapIndex));
}

void runLine(U8 *line) {
    MAA_InputSet(line);
    MAA_SetCmdString(line);
}

void *readerThread(void *) {
    StartReading();
    return nullptr;
}

}  // namespace

// ---- start and stop ------------------------------------------------------------

S32 MAA_GetStartCommand(U32 ulDMHandle, U8 *pubDataBuffer, TMAADeviceType) {
    U32 count = 0;
    while (count < HDR_CMD_LEN - 2) {
        U8 *p = nullptr;
        U32 n = 0;
        U32 r = DM_ReadDriver(ulDMHandle, &p, 1, &n, nullptr);
        if (r == DM_RET_TIMEOUT) {
            USBADP_LOG(INFO, "\r\n[MAA:MAA_GetStartCommand] Invalid DM Read Return(%d)\n", static_cast<int>(r));
            dataReadCount = count;
            return 0;
        }
        if (r == DM_RET_USB_DISCONNECTED) {
            USBADP_LOG(ERROR, "\r\n[MAA:MAA_GetStartCommand] Cable Disconnected during MAA_GetStartCommand\n");
            dataReadCount = count;
            return 1;
        }
        if (n == 0) {
            // Nothing delivered although the read succeeded: no start command.
            USBADP_LOG(ERROR, "\r\n DM_Read Error\n");
            dataReadCount = count;
            return 0;
        }
        pubDataBuffer[count++] = *p;
    }
    dataReadCount = count;
    return 1;
}

S32 MAA_CheckStartCmd(const U8 *buffer) { return std::memcmp(buffer, HeaderCmd, HDR_CMD_LEN) == 0 ? 1 : 0; }

S32 MAA_CheckStopShell(const U8 *line) {
    if (std::strncmp(reinterpret_cast<const char *>(line), reinterpret_cast<const char *>(TailCmd), TAIL_CMD_LEN) != 0)
        return 0;
    U32 n = 0;
    if (DM_WriteDriver(session(), HeaderResCmd, HDR_RESP_CMD_LEN, &n, nullptr) == DM_RET_USB_DISCONNECTED) {
        USBADP_LOG(ERROR, "\r\n[MAA] Cable Disconnected during MAA_CheckStopShell");
        return 0;
    }
    USBADP_LOG(INFO, "\r\n[MAA] Stop working..");
    return 1;
}

// ---- lines ---------------------------------------------------------------------

U8 *MAA_ReadLine(U32 ulHandle, U8 *pubBuf) {
    const bool fromSaved = enSpecialMode == MAA_JIG_RUN_CMD || (enSpecialMode == MAA_AUTO_RUN_CMD && fSellStop);
    U32 index = 0;
    U32 raw = 0;  // per line: after a second "#" it never reaches 8 again
    auto store = [&](U8 c) {
        if (index < MAA_LINE_BUFFER_SIZE - 1) pubBuf[index++] = c;
    };
    for (;;) {
        U8 c = 0;
        if (fromSaved) {
            if (!MAA_ReadSavedCommand(&c)) break;
        } else {
            U8 *p = nullptr;
            U32 n = 0;
            U32 r = DM_ReadDriver(ulHandle, &p, 1, &n, nullptr);
            if (r == DM_RET_TIMEOUT) {
                USBADP_LOG(DEBUG, "\r\n[MAA:MAA_ReadLine1] Invalid DM Read Return(%d)", static_cast<int>(r));
                continue;
            }
            if (r == DM_RET_USB_DISCONNECTED) {
                USBADP_LOG(ERROR, "\r\n[MAA:MAA_ReadLine1] Cable Disconnected during MAA_ReadLine");
                break;
            }
            c = *p;
            if (c == '#') {
                // The special command's binary fields follow: taken raw.
                store(c);
                bool cut = false;
                for (;;) {
                    r = DM_ReadDriver(ulHandle, &p, 1, &n, nullptr);
                    if (r == DM_RET_TIMEOUT) {
                        USBADP_LOG(DEBUG, "\r\n[MAA:MAA_ReadLine2] Invalid DM Read Return(%d)", static_cast<int>(r));
                        continue;
                    }
                    if (r == DM_RET_USB_DISCONNECTED) {
                        USBADP_LOG(ERROR, "\r\n[MAA:MAA_ReadLine2] Cable Disconnected during MAA_ReadLine");
                        cut = true;
                        break;
                    }
                    c = *p;
                    store(c);
                    if (++raw == kRawBytesAfterHash) break;
                }
                if (cut) break;
            }
        }
        if (c == '\r' || c == '\n') break;
        store(c);
        USBADP_LOG(DEBUG, "\r\n[MAA:MAA_ReadLine1] written to buffer : [%c]", c);
        if (index > MAA_LINE_SIZE) break;
    }
    pubBuf[index] = 0;
    if (index != 0 && pubBuf[0] != '#') USBADP_LOG(INFO, "\r\nCommand : %s ", pubBuf);
    return pubBuf;
}

U32 MAA_CheckCommand(const U8 *pubCommand) {
    const U8 *p = pubCommand;
    while (*p == ' ' || *p == '\t') ++p;
    if (*p >= '0' && *p <= '9') return 0;
    U8 balance = 0;  // 8 bits: it wraps, as hosts have always seen
    for (; *p != 0; ++p) {
        switch (*p) {
        case '"': balance = balance <= 80 ? static_cast<U8>(balance + 100) : static_cast<U8>(balance - 100); break;
        case '(': ++balance; break;
        case ')': --balance; break;
        case '[': balance = static_cast<U8>(balance + 10); break;
        case ']': balance = static_cast<U8>(balance - 10); break;
        case ';':
            if (balance != 0) return 0;
            break;
        default: break;
        }
    }
    return balance == 0 ? 1 : 0;
}

// ---- special commands and saved commands -----------------------------------------

S32 MAA_CheckSpecialCommand(const U8 *ubBuf) {
    if (std::memcmp(ubBuf, SpecialCmdPrefix, SPCL_CMD_LEN) != 0) return 0;
    const auto *cmd = reinterpret_cast<const TMAAFileCommand *>(ubBuf);
    const U32 code = cmd->ubCommandCode;
    const U32 ulFileSize = ReadBE32(cmd->ulFileSize);
    switch (code) {
    case MAA_FILE_TRANS_H2T:
        // The file goes to its own download buffer; this one only has to be
        // had (a size that cannot be makes the line an ordinary command), and
        // nothing ever reads it, so it is not zeroed.
        if (!reallocHeap(stDataHeap, ulFileSize, false)) return 0;
        USBADP_LOG(INFO, "\r\n[MAA] H2T Command");
        MAA_CommandH2T(ulFileSize);
        USBADP_LOG(INFO, "\r\n[MAA]FileCommand Type    : %d", static_cast<int>(code));
        USBADP_LOG(INFO, "\r\n[MAA]FileCommand FileSize: %d", static_cast<int>(ulFileSize));
        return 1;
    case MAA_JIG_MODE_START:
        if (!reallocHeap(stCmdHeap, ulFileSize, true)) return 0;
        MAA_CommandJIGStart();
        USBADP_LOG(INFO, "\r\n[MAA]JIG Buffer Size    : %d", static_cast<int>(ulFileSize));
        return 1;
    case MAA_JIG_MODE_END: MAA_CommandJIGEnd(); return 1;
    case MAA_AUTO_MODE_START:
        if (!reallocHeap(stCmdHeap, ulFileSize, true)) return 0;
        USBADP_LOG(INFO, "\r\n[MAA]AUTO Buffer Size    : %d", static_cast<int>(ulFileSize));
        MAA_CommandAutoStart();
        return 1;
    case MAA_AUTO_MODE_END: MAA_CommandAutoEnd(); return 1;
    default: return 1;
    }
}

U32 Request_MAA_CommandH2T(U32 size) {
    U32 address = 0;
    addr = MAA_DownloadAlloc(size, &address);
    if (addr == nullptr) USBADP_LOG(ERROR, "\r\n[MAA] Data Allocation in Heap Failed");
    return address;
}

void MAA_CommandH2T(U32 ulFileSize) {
    U32 address = Request_MAA_CommandH2T(ulFileSize);
    USBADP_LOG(INFO, "\r\n[MAA] Return Address : %x", address);
    U8 wire[4];
    WriteBE32(wire, address);
    U32 n = 0;
    U32 r = DM_WriteDriver(session(), wire, sizeof wire, &n, nullptr);
    if (r == DM_RET_TIMEOUT)
        USBADP_LOG(ERROR, "\r\n[MAA:MAA_CommandH2T] Invalide DM Write Return(%d)", static_cast<int>(r));
    else if (r == DM_RET_USB_DISCONNECTED)
        USBADP_LOG(ERROR, "\r\n[MAA:MAA_CommandH2T] Cable Disconnected during MAA_CommandH2T");
    MAA_ReadFile(ulFileSize);
}

void MAA_CommandAutoStart(void) {
    enSpecialMode = MAA_AUTO_SAVE_CMD;
    USBADP_LOG(INFO, "\r\n[MAA] CommandAutoStart");
}

void MAA_CommandAutoEnd(void) {
    enSpecialMode = MAA_AUTO_RUN_CMD;
    USBADP_LOG(INFO, "\r\n[MAA] CommandAutoEnd");
}

void MAA_CommandJIGStart(void) {
    enSpecialMode = MAA_JIG_SAVE_CMD;
    USBADP_LOG(INFO, "\r\n[MAA] CommandJIGStart");
}

void MAA_CommandJIGEnd(void) {
    enSpecialMode = MAA_NORMAL_CMD;
    USBADP_LOG(INFO, "\r\n[MAA]CommandJIGEnd");
}

S32 MAA_ReadSavedCommand(U8 *out) {
    if (stCmdHeap.ulHeapIndex <= ulReadCount || stCmdHeap.ulHeapPtr == nullptr) return 0;
    *out = stCmdHeap.ulHeapPtr[ulReadCount++];
    return 1;
}

void MAA_AutoTestMain(void) {
    ulReadCount = 0;
    for (;;) {
        MAA_ReadLine(session(), aubBuf);
        if (aubBuf[0] == 0) break;
        if (!MAA_CheckCommand(aubBuf)) {
            USBADP_LOG(ERROR, "\r\nInvalid Command");
            break;
        }
        runLine(aubBuf);
        U32 e = MAA_Parser();
        if (e != 0) {
            USBADP_LOG(ERROR, "\r\nparser error %d", static_cast<int>(e));
            break;
        }
    }
    enSpecialMode = MAA_NORMAL_CMD;
}

// ---- the session -----------------------------------------------------------------

S32 MAA_Hook(U32 ulDrvHandleGot, U8 *command) {
    ulDrvHandle = ulDrvHandleGot;
    enSpecialMode = MAA_NORMAL_CMD;
    U8 start[HDR_CMD_LEN] = {command[0], command[1]};
    if (MAA_GetStartCommand(ulDrvHandleGot, start + 2, MAA_USB_DEVICE) == 0) {
        USBADP_LOG(INFO, "\r\nelse part added for data less than 10 bytes received from buffer.\n");
        if (dataReadCount == 0) return -1;
        return handBack(command, start, dataReadCount, "2");
    }
    if (!MAA_CheckStartCmd(start)) return handBack(command, start, dataReadCount, "1");

    MAA_SetResultWriter(&MAA_WriteResultFrame);
    U32 n = 0;
    U32 r = DM_WriteDriver(session(), HeaderResCmd, HDR_RESP_CMD_LEN, &n, nullptr);
    if (r == DM_RET_TIMEOUT) {
        USBADP_LOG(ERROR, "\r\n[MAA:MAA_Hook] Invalid DM Write Return(%d)", static_cast<int>(r));
        return 0;
    }
    if (r == DM_RET_USB_DISCONNECTED) {
        USBADP_LOG(ERROR, "\r\n[MAA:MAA_Hook] Cable Disconnected during write (%d)", static_cast<int>(r));
        return 0;
    }

    // Downloads are the session's: every address the host got stays valid
    // until the session ends (stop, cable, or the auto run after the stop).
    struct SessionEnd {
        ~SessionEnd() { MAA_DownloadFreeAll(); }
    } sessionEnd;
    fSellStop = 0;
    for (;;) {
        MAA_ReadLine(session(), aubBuf);
        if (MAA_IsUSBDisconnected()) {
            USBADP_LOG(ERROR, "\r\n[MAA:MAA_Hook] Cable Disconnected during MAA_ReadLine");
            return 0;
        }
        if (MAA_CheckStopShell(aubBuf)) {
            if (enSpecialMode == MAA_AUTO_RUN_CMD) {
                // Acknowledged: the host may leave while the saved lines run.
                fSellStop = 1;
                MAA_AutoTestMain();
            }
            return 0;
        }
        if (!MAA_CheckCommand(aubBuf)) {
            USBADP_LOG(ERROR, "\r\n[MAA] Invalid Command");
            continue;
        }
        if (MAA_CheckSpecialCommand(aubBuf)) continue;
        if (enSpecialMode != MAA_NORMAL_CMD) {
            saveLine(aubBuf);
            continue;
        }
        USBADP_LOG(INFO, "\r\nMAA NORMAL COMMAND");
        runLine(aubBuf);
        U32 e = MAA_Parser();
        if (e != 0) USBADP_LOG(ERROR, "\r\n[MAA] parser error %d", static_cast<int>(e));
    }
}

// ---- start-up --------------------------------------------------------------------

void MAA_Initialize(void) {
    // A second start (in-process restart) must not strand what a session held.
    for (MAAHeapHandle *h : {&stDataHeap, &stCmdHeap}) {
        MAA_HeapFree(h->ulHeapPtr, 0);
        *h = {};
    }
    ulReadCount = 0;
    int q = ::msgget(kMAAQueueKey, IPC_CREAT | 0666);
    if (q < 0) {
        USBADP_LOG(ERROR, "\r\nMessage Q Creation fail");
        std::exit(1);
    }
    ulMAAMsgQueueID = q;
    USBADP_LOG(INFO, "\r\n MAA Queue Create Sucess");
    pthread_attr_t attr;
    if (pthread_attr_init(&attr) != 0) {
        USBADP_LOG(ERROR, "\r\nAttribute creation failed");
        std::exit(1);
    }
    int rc = pthread_create(&thrThread, &attr, readerThread, nullptr);
    pthread_attr_destroy(&attr);
    if (rc != 0) {
        USBADP_LOG(ERROR, "\r\nThread Creation failed");
        std::exit(1);
    }
    USBADP_LOG(INFO, "\r\n MAA Thread Create Sucess");
    // Recorded only; the reader keeps the default scheduling.
    thrParam.sched_priority = 99;
    USBADP_LOG(INFO, "\r\n apply Attribute Sucess");
}

extern "C" S32 MAA_CompEntry(U32 /*entry*/) {
    MAA_Initialize();
    return 1;
}

void MAA_DummyUsbSpeed(void) {
    const std::string path = FixedPath(kUsbSpeedFile);
    UniqueFd fd(::open(path.c_str(), O_RDWR | O_CREAT, 0644));
    if (!fd) {
        USBADP_LOG(ERROR, "\r\n[MAA] usb_speed.txt open failed");
        return;
    }
    if (::write(fd.get(), "HIGH", 4) != 4) USBADP_LOG(ERROR, "\r\n[MAA] usb_speed.txt write failed");
}
