// Compiled, never run: the public declarations of the exported entries must
// agree with the library's own (a conflicting C declaration does not compile).
#include "usbadapter/usbadapter.h"

#include "adapter/Descriptors.h"
#include "maa/MAA_Hook.h"
#include "maa/functions/MAA_SerialNo.h"
