/*
 * Entries of libusbadapter that other platform components call. The Java
 * service reaches everything else through JNI (JNI_OnLoad and the Java_*
 * natives of usbadapter.jar's classes).
 */
#ifndef USBADAPTER_USBADAPTER_H
#define USBADAPTER_USBADAPTER_H

#include "usbadapter/types.h"

#ifdef __cplusplus
extern "C" {
#endif

/* The test shell's result record; the setters below return the shell's own. */
struct TMAAResult;

/* Stand-alone start of the test shell: its queue and the print-channel reader
 * on a thread of its own. Returns 1. */
S32 MAA_CompEntry(U32 entry);

/* New USB serial number through the Java print daemon (maaUSBSetSerialNumber,
 * maaUSBSetSnNoPowerOff), written to the report file. An invalid serial, null
 * included, is replaced by "0000-00000000000", in the caller's buffer too. */
struct TMAAResult *USB_SetSerialNumber(U8 *serial);
struct TMAAResult *USB_SetSnNoPowerOff(U8 *serial);

/* Descriptor request to the bridge with the default product id, no connect:
 * 0, or -1 on failure. */
S32 MAAMfpDevSetDesc(void);

/* Rewrites the report file with the first 4 characters of buf, a tab and the
 * product series name; frees buf, which must come from malloc. */
void WriteSerialString(U8 *buf);

#ifdef __cplusplus
}
#endif

#endif
