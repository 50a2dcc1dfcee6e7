// MAA session on the print channel: start handshake, command lines, the stop
// command, the special binary commands (download, saved-command modes) and the
// driver access layer the whole shell writes and reads through.
#pragma once

#include "maa/MAA_Types.h"

// ---- wire constants

constexpr U32 HDR_CMD_LEN = 10;       // ESC "w" "MAASTART"
constexpr U32 HDR_RESP_CMD_LEN = 8;   // ESC "w" "MAA-OK"
constexpr U32 TAIL_CMD_LEN = 8;       // "MAA-STOP"
constexpr U32 SPCL_CMD_LEN = 3;       // "#$%"
extern const U8 HeaderCmd[HDR_CMD_LEN];
extern const U8 HeaderResCmd[HDR_RESP_CMD_LEN];
extern const U8 TailCmd[TAIL_CMD_LEN];
extern const U8 SpecialCmdPrefix[SPCL_CMD_LEN];

// Special command, host to device: "#$%", code, big-endian size, then CR or LF.
#pragma pack(push, 1)
struct TMAAFileCommand {
    U8 ubPreFix[SPCL_CMD_LEN];
    U8 ubCommandCode;
    U8 ulFileSize[4];  // big-endian
};
#pragma pack(pop)
static_assert(sizeof(TMAAFileCommand) == 8);

enum MAASpcialOperation : U32 {
    MAA_FILE_TRANS_H2T = 0,
    MAA_FILE_TRANS_T2H = 1,  // device to host only
    MAA_JIG_MODE_START = 2,
    MAA_JIG_MODE_END = 3,
    MAA_AUTO_MODE_START = 4,
    MAA_AUTO_MODE_END = 5,
    MAA_FILE_END = 160,      // device to host only
};

enum TMAADeviceType : U32 { MAA_SERIAL_DEVICE = 240, MAA_USB_DEVICE = 250 };
enum maa_comm : U32 { MAA_START = 0, MAA_STOP = 1, MAA_SPECIAL_COMMNAD = 2 };

// ---- driver access

constexpr U32 DM_RET_CANCELED = 0;
constexpr U32 DM_RET_TIMEOUT = 0;  // a time-out and a cancel are the same result
constexpr U32 DM_RET_OK = 1;
constexpr U32 DM_RET_USB_DISCONNECTED = 2;

typedef void (*TDMCallback)(void);  // completion callbacks: never used

// Delivers one byte per call (whatever ulReadSize asks): *pubbufPtr points at
// it and *pulReturnSize is 1. DM_RET_TIMEOUT when nothing came within the poll
// time-out (the first wait of the process is five minutes, later ones five
// seconds); DM_RET_USB_DISCONNECTED once the cable is gone.
U32 DM_ReadDriver(U32 ulHandle, U8 **pubbufPtr, U32 ulReadSize, U32 *pulReturnSize, TDMCallback ptfDRP);
// Writes the whole buffer. DM_RET_OK even after a write error (logged), so
// callers only ever see a disconnect.
U32 DM_WriteDriver(U32 ulHandle, const U8 *pubBufPtr, U32 ulWriteSize, U32 *pulReturnSize, TDMCallback pnfDRP);

// ---- session state

constexpr U32 MAA_LINE_SIZE = 1024;  // a longer line is cut
// A line may run a little past MAA_LINE_SIZE (the byte that crosses it, the
// raw bytes behind a "#") before it is cut; the buffer has room for that.
constexpr U32 MAA_LINE_BUFFER_SIZE = MAA_LINE_SIZE + 16;
// Largest download or saved-command buffer a host may ask for; larger sizes
// take the allocation-failure path.
constexpr U32 MAA_HEAP_REQUEST_MAX = 64u << 20;

struct MAAHeapHandle {
    U8 *ulHeapPtr;
    U32 ulHeapSize;
    U32 ulHeapIndex;  // bytes used so far
};

extern U8 aubBuf[MAA_LINE_BUFFER_SIZE];  // current line, shared with the test functions
extern U32 dataReadCount;
extern U32 fSellStop;
extern U32 ulReadCount;
extern MAAHeapHandle stDataHeap;
extern MAAHeapHandle stCmdHeap;
// The shell's own poll time-out (the print reader has one of the same name).
namespace maa_session {
extern S32 slPollTimeout;
}
constexpr S32 MAA_POLL_TIMEOUT_FIRST = 300000;
constexpr S32 MAA_POLL_TIMEOUT = 5000;

// ---- the session

// 0 after a session; -1 when nothing followed the two bytes in `command`;
// n > 0 when it was not an MAA start command: n further bytes (at most 8) have
// been read into `command` behind the first two and belong to the caller.
S32 MAA_Hook(U32 ulDrvHandleGot, U8 *command);
// Reads the 8 bytes of the start command behind ESC "w". 0 on a time-out,
// 1 otherwise (also after a disconnect); dataReadCount holds the count.
S32 MAA_GetStartCommand(U32 ulDMHandle, U8 *pubDataBuffer, TMAADeviceType enDeviceType);
S32 MAA_CheckStartCmd(const U8 *buffer);
// One command line into pubBuf (NUL-terminated, CR/LF not stored).
U8 *MAA_ReadLine(U32 ulDrvHandle, U8 *pubBuf);
S32 MAA_CheckStopShell(const U8 *line);
// Balance check before parsing: 1 acceptable, 0 not.
U32 MAA_CheckCommand(const U8 *pubCommand);
S32 MAA_CheckSpecialCommand(const U8 *ubBuf);
S32 MAA_ReadSavedCommand(U8 *out);
void MAA_AutoTestMain(void);
// Download buffer for the file that follows; returns its 32-bit address in
// the shell's address map (0 when it could not be made).
U32 Request_MAA_CommandH2T(U32 size);
void MAA_CommandH2T(U32 ulFileSize);
void MAA_CommandAutoStart(void);
void MAA_CommandAutoEnd(void);
void MAA_CommandJIGStart(void);
void MAA_CommandJIGEnd(void);
// The most recent download buffer (host pointer) and its size.
U8 *MAA_DownloadBuffer(U32 *pulSize);

// Opens the shell's queue and starts the print-channel reader on a thread of
// its own (the stand-alone start; the service starts the reader itself).
void MAA_Initialize(void);
extern "C" __attribute__((visibility("default"))) S32 MAA_CompEntry(U32 entry);

// Records the USB speed for the status service; called when reading starts.
void MAA_DummyUsbSpeed(void);
// Registration of the shell's test functions (maa/functions).
void MAA_SymbolReg(void);
