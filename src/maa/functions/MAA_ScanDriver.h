// The scanner-side test functions: each formats its name and arguments into a
// command line and passes it to the scanner driver, which answers with ready
// result frames. They write their own results (target ftarget_scn).
#pragma once

#include "maa/MAA_Types.h"

TMAAResult *MAA_ScanFunction(const char *format, ...) __attribute__((format(printf, 1, 2)));

TMAAResult *ADFMotorTest(U32, U32, U32, U32);
TMAAResult *CompensateScanPositionValue(U32, U32);
TMAAResult *DADFFeedTest(U32, U32);
TMAAResult *DADFPaperPathTimeTest(U32);
TMAAResult *DADFSensorTest();
TMAAResult *GetScanFanTest(U32);
TMAAResult *GetScanSensorTest(U32);
TMAAResult *ManualCompensateScanDeSkew(U32, U32, U32);
TMAAResult *ManualCompensateScanPosition(U32, U32, U32, U32, U32, U32);
TMAAResult *ManualWidthAdjust(U32, U32, U32);
TMAAResult *PBA_IP_IfPathTest(U32, U32, U32, U32);
TMAAResult *PlatenMotorNoiseTest(U32);
TMAAResult *PWM_Scan_Test(U32, U32, U32, U32, U32, U32, U32);
TMAAResult *ScanMotorTest(U32);
TMAAResult *ScanPatchDetect_Test();
TMAAResult *ScanToInspectionDust();
TMAAResult *SFRReadWrite(U32, U32, U32);  // the second argument is a text
TMAAResult *Step_Mot_Test_Scan(U32, U32, U32, U32);
TMAAResult *SysPBA_IO_Scn_GPITest(U32, U32, U32);
TMAAResult *SysPBA_IO_Scn_GPOTest(U32, U32, U32, U32);
TMAAResult *UART_Test_SCN(U32, U32, U32, U32);
TMAAResult *GetShadingData(U32);
TMAAResult *ScanJobTest1(U32);
TMAAResult *ScanJobTest2(U32, U32);
TMAAResult *ScanJobTest3(U32, U32, U32);
TMAAResult *ScanJobTest4(U32, U32, U32, U32);
TMAAResult *ScanBalanceCorrection(U32);

// ADF type, multi-type and version read through the scanner driver (main
// controller side: the shell writes its result).
TMAAResult *GetADFInfo();
