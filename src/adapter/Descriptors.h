// USB descriptors, serial number and IEEE 1284 Device ID handed to the bridge.
#pragma once

#include "usbadapter/types.h"

#define MAX_STR_DESC_SIZE 256
#define USB_SERIAL_NUMBER_LENGTH 16
#define USB_STRING_SIZE 40
#define DEV_ID_STRING_SIZE 200
#define JAVA_NAME_SIZE 20

// Strings of the descriptor request and the Device ID, NUL-terminated.
extern U8 aub_mf_string[USB_STRING_SIZE];       // set by the reader on MFP_DEV_INIT
extern U8 aub_pd_string[USB_STRING_SIZE];       // model, from readPrintMsg
extern U8 aub_serial_str[USB_STRING_SIZE];      // set by the reader's Initialization
extern U8 aub_dev1284_str[DEV_ID_STRING_SIZE];  // built by SetDeviceIDString
extern U8 manufacturingString[JAVA_NAME_SIZE];  // from readPrintMsg
extern U8 deviceClassName[JAVA_NAME_SIZE];      // from readPrintMsg

void SetDeviceIDString(void);
S32 MfpDevSetDesc(void);
S32 USBADP_SetSerialNumber(void);
