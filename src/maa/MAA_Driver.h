// The test shell's access to its channel (the print node of the session):
// every byte the shell reads or writes goes through these two calls.
#pragma once

#include "maa/MAA_Types.h"

constexpr U32 DM_RET_CANCELED = 0;
constexpr U32 DM_RET_TIMEOUT = 0;  // a time-out and a cancel are the same result
constexpr U32 DM_RET_OK = 1;
constexpr U32 DM_RET_USB_DISCONNECTED = 2;

typedef void (*TDMCallback)(void);  // completion callbacks: never used

// Largest piece one DM_ReadDriver call delivers. Line readers ask for one
// byte, so only file downloads read ahead.
constexpr U32 DM_READ_PIECE_MAX = 4096;

// Delivers up to min(ulReadSize, DM_READ_PIECE_MAX) bytes (at least one):
// *pubbufPtr points at them and *pulReturnSize is their count.
// DM_RET_TIMEOUT when nothing came within the poll time-out (the first wait of
// the process is five minutes, later ones five seconds) or an empty transfer
// came; a channel that is hung up, closed or failing takes the whole period. DM_RET_USB_DISCONNECTED once
// the cable is gone. A signal is not a time-out: the wait goes on.
U32 DM_ReadDriver(U32 ulHandle, U8 **pubbufPtr, U32 ulReadSize, U32 *pulReturnSize, TDMCallback ptfDRP);
// The same into the caller's buffer (room for min(ulReadSize, DM_READ_PIECE_MAX)
// bytes), without the copy: for downloads.
U32 DM_ReadDriverInto(U32 ulHandle, U8 *pubDest, U32 ulReadSize, U32 *pulReturnSize);
// Writes the whole buffer. DM_RET_OK even after a write error (logged), so
// callers only ever see a disconnect.
U32 DM_WriteDriver(U32 ulHandle, const U8 *pubBufPtr, U32 ulWriteSize, U32 *pulReturnSize, TDMCallback pnfDRP);

// The shell's own poll time-out (the print reader has one of the same name).
namespace maa_session {
extern S32 slPollTimeout;
}
constexpr S32 MAA_POLL_TIMEOUT_FIRST = 300000;
constexpr S32 MAA_POLL_TIMEOUT = 5000;
