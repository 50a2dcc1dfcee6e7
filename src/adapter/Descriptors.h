// USB descriptors, serial number and IEEE 1284 Device ID handed to the bridge.
#pragma once

#include "usbadapter/types.h"

#define MAX_STR_DESC_SIZE 256
#define USB_SERIAL_NUMBER_LENGTH 16
#define USB_STRING_SIZE 40
#define DEV_ID_STRING_SIZE 200
#define JAVA_NAME_SIZE 20
#define USB_LANGUAGE_ID 0x0409
#define MFP_SET_SERIALNO 0x49

// Strings of the descriptor request and the Device ID, NUL-terminated.
extern U8 aub_mf_string[USB_STRING_SIZE];       // set by the reader on MFP_DEV_INIT
extern U8 aub_pd_string[USB_STRING_SIZE];       // model, from readPrintMsg
extern U8 aub_serial_str[USB_STRING_SIZE];      // set by the reader's Initialization
extern U8 aub_dev1284_str[DEV_ID_STRING_SIZE];  // built by SetDeviceIDString
extern U8 manufacturingString[JAVA_NAME_SIZE];  // from readPrintMsg
extern U8 deviceClassName[JAVA_NAME_SIZE];      // from readPrintMsg

// Builds aub_dev1284_str; the status part asks the print daemon.
void SetDeviceIDString(void);
// The same with the status part always "IDLE" (re-open after hibernation).
void SetDeviceIDString_reOpen(void);
// Descriptor request, then connect to the bus: 0, or -1 on failure.
S32 MfpDevSetDesc(void);
// Serial number as a vendor record: 0, or -1 on failure.
S32 USBADP_SetSerialNumber(void);

extern "C" {
// For outside callers: the descriptor request with the default product id and
// no connect; 0 or -1.
__attribute__((visibility("default"))) S32 MAAMfpDevSetDesc(void);
// Rewrites the report file with the first 4 characters of buf, a tab and the
// product series name; frees buf (which must come from malloc).
__attribute__((visibility("default"))) void WriteSerialString(U8 *buf);
}
