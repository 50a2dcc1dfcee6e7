// The supplies information report.
#pragma once

#include "maa/MAA_Types.h"

TMAAResult *Get_SuppliesInfo_Report();
