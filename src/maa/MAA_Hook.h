// MAA session on the print channel: start handshake, command lines, stop.
#pragma once

#include "usbadapter/types.h"

// 0 after a session; -1 when nothing followed the two bytes in `command`;
// n > 0 when it was not an MAA start command: n further bytes (at most 8) have
// been read into `command` behind the first two and belong to the caller.
S32 MAA_Hook(U32 ulDrvHandleGot, U8 *command);
// Records the USB speed for the status service; called when reading starts.
void MAA_DummyUsbSpeed(void);
// Registration of the shell's test functions (maa/functions).
void MAA_SymbolReg(void);
