// Test functions on the fax driver (fax line, fax-side I/O, speaker; they write
// their own results, target ftarget_scn) and the JBIG codec test.
//
// A fax-side function reports the header "[ Name ]" at once, passes its call
// on as the command line "Name(n1,...)" (IOCNR_FAX_MAA_TEST), and writes one
// final record: the driver's response text (or "Name DONE" / "Name FAIL" when
// it sent none), result 1 when the driver reports success, else result 0; or a
// text naming the failed step (result 0). The fax-line, fax I/O and fax UART
// tests hold the scanner lock around the driver call.
//
// HWJBIGTest runs the self test of the encoder, then of the decoder, with its
// argument as the pattern number; the shell writes its verdict
// ("HWJBIG TEST DONE", "JBIG Encoder = NG", ...).
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
