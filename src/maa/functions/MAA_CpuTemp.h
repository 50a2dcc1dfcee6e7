// CPU temperature and fan tests; each serves several registered names and
// tells them apart by its argument or the called name.
#pragma once

#include "maa/MAA_Types.h"

TMAAResult *CheckCPUTemperature(U32);
TMAAResult *CPU_FAN_TEMP_CHK(U32);

// Controller class from the machine name of uname: 0 for x86 ("86"), 1 for
// PowerPC ("ppc", "powerpc"), 2 for the monochrome ARM9 models ("armv5tel"),
// -1 otherwise.
S32 currentmcmodel(void);
// Replaces the machine name currentmcmodel reads (a PC cannot be an armv5tel
// to a test); nullptr goes back to uname.
void MAA_SetMachineName(const char *machine);
