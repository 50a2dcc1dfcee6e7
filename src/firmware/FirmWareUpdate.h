// Firmware images received on the print channel and handed to the update
// manager.
#pragma once

#include "usbadapter/types.h"

#define FW_PJL_HEADER_SIZE 80
#define FW_PASS 0
#define FW_FAIL (-1)

// 0: every image delivered; -1: firmware recognised but the download failed;
// otherwise the number of bytes in firmware_command (at most 80) that are not
// firmware and must be processed as ordinary data.
S32 FirmWareDownload(S32 fdPrn, U8 *command, U32 commandlen, U8 *firmware_command, S32 *firmware);
