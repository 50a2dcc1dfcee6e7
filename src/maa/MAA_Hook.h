// MAA session on the print channel: start handshake, command lines, the stop
// command, the special binary commands (download, saved-command modes) and the
// driver access layer the whole shell writes and reads through.
#pragma once

#include "maa/MAA_Driver.h"
#include "maa/MAA_Types.h"
#include "maa/MAA_Wire.h"

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
// the shell's address map (0 when it could not be made). It stays
// addressable until the session ends.
U32 Request_MAA_CommandH2T(U32 size);
void MAA_CommandH2T(U32 ulFileSize);
void MAA_CommandAutoStart(void);
void MAA_CommandAutoEnd(void);
void MAA_CommandJIGStart(void);
void MAA_CommandJIGEnd(void);

// Opens the shell's queue and starts the print-channel reader on a thread of
// its own (the stand-alone start; the service starts the reader itself).
void MAA_Initialize(void);
extern "C" __attribute__((visibility("default"))) S32 MAA_CompEntry(U32 entry);

// Records the USB speed for the status service; called when reading starts.
void MAA_DummyUsbSpeed(void);
// Registration of the shell's test functions (maa/functions).
void MAA_SymbolReg(void);
