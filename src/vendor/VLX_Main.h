// Capability XML and print-image requests on the print channel.
#pragma once

#include <atomic>

#include "usbadapter/types.h"

// Channel the replies go out on; set by the caller before each request.
extern std::atomic<U32> ulDrvHandle;

// 0 when a request was recognised and served; otherwise the number of bytes
// now in vlx_command (commandlen plus what was read), to be classified further.
S32 Vlx_Cap_Xml(S32 fd, U8 *command, S32 commandlen, U8 *vlx_command);
