#include "maa/MAA_Hook.h"

#include "common/Log.h"

// Interim: the test-function registry is not built yet; nothing is registered.
void MAA_SymbolReg(void) { USBADP_LOG(INFO, "\r\n[MAA] MAA_SymbolReg() not available yet: no functions registered"); }
