// Serial-number setters for factory tooling: a new USB serial number through
// the Java print daemon, written to the report file and reported like a test
// function. Not in the shell's registry: outside components call them.
#pragma once

#include "maa/MAA_Types.h"

// The last serial number set through a setter, NUL-terminated.
extern U8 serial_number_str[17];
// Set by a setter: the print side must re-send its descriptors after the
// shell's session.
extern S32 init_required_after_maa;

extern "C" {
// An invalid serial (null included) is replaced by the default
// "0000-00000000000"; a caller's buffer that holds at least 16 characters is
// overwritten with the default too. Both return &stMAASysResult.
__attribute__((visibility("default"))) TMAAResult *USB_SetSerialNumber(U8 *serial);
__attribute__((visibility("default"))) TMAAResult *USB_SetSnNoPowerOff(U8 *serial);
}
