// USB serial-number services: the machine serial number from the Java print
// daemon and its validity as a USB serial string. They run on the print
// thread and report failures like the test functions.
#pragma once

#include "usbadapter/types.h"

#define USB_SERIAL_TEXT_SIZE 17

// "0000-00000000000", 16 characters, no terminator stored.
extern const U8 aubCONDefaultUSBSerialNumber[16];

// -1 when the daemon reports the serial number out of step with the
// configuration, 0 otherwise (also when it cannot be asked).
S32 checkMachineSerialinConf(void);
// The machine serial number (at most 39 characters, NUL-terminated, valid
// until the next call), or null when the daemon gives none.
U8 *getSerialString(void);
// 7 to 16 printable characters before any blank, comma or backslash.
bool IsValidUSBSerialString(U8 *serial);
