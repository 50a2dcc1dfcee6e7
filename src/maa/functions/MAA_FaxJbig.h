// Test functions on the fax driver (fax line, fax-side I/O, speaker; they write
// their own results, target ftarget_scn) and the JBIG codec test.
#pragma once

#include "maa/MAA_Types.h"

TMAAResult *SetSpeakerTest(U32);
TMAAResult *SysPBA_IO_Fax_GPITest(U32, U32, U32);
TMAAResult *SysPBA_IO_Fax_GPOTest(U32, U32, U32, U32);
TMAAResult *PhoneTest_OHD(U32, U32, U32);
TMAAResult *PhoneTest_Dial(U32, U32, U32);
TMAAResult *PhoneTest_Ring(U32, U32);
TMAAResult *UART_Test_FAX(U32, U32, U32, U32);
TMAAResult *FaxModuleDetect_To_SCB();

TMAAResult *HWJBIGTest(U32);
