// CPU temperature and fan tests; each serves several registered names and
// tells them apart by its argument or the called name.
#pragma once

#include "maa/MAA_Types.h"

TMAAResult *CheckCPUTemperature(U32);
TMAAResult *CPU_FAN_TEMP_CHK(U32);
