// USB serial-number services: the machine serial number from the Java print
// daemon and its validity as a USB serial string.
#pragma once

#include "usbadapter/types.h"

// "0000-00000000000", 16 characters, no terminator stored.
extern const U8 aubCONDefaultUSBSerialNumber[16];

S32 checkMachineSerialinConf(void);
U8 *getSerialString(void);
bool IsValidUSBSerialString(U8 *serial);
