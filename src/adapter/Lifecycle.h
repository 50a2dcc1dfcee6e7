// Print channel close and re-open around hibernation, and the host's
// configuration state, for the Java service. The reader keeps running: a close
// parks it, a re-open lets it resume.
#pragma once

#include "usbadapter/types.h"

// Re-opens and re-prepares the print node, re-sends the descriptors and the
// serial number and lets the reader resume: 1, or 0 at the first failure.
S32 USBAdapter_IF_PrintInit(void);
// Parks the reader (waiting for it when it has started) and closes the node;
// fdPrn is 0 afterwards in any case. 1, or 0 when close failed.
S32 USBAdapter_IF_PrintClose(void);
// IsConfigured.
U8 USBAdapter_IF_PrintDrvOpenCheck(void);
