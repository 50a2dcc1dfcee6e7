// The scanner-side test functions: each formats its name and arguments into a
// command line and passes it to the scanner driver, which answers with ready
// result frames. They write their own results (target ftarget_scn).
#pragma once

#include <cstddef>

#include "maa/MAA_Types.h"

// Descriptors of the scanner and fax drivers while a test holds them, else -1.
extern S32 fdScnDrv;
extern S32 fdFaxDrv;

// Runs one command line on the scanner driver (format and values give the
// line, cut to SCAN_MAA_COMMAND_LENGTH - 1) and sends the driver's response
// frames to the host, or one final failure record. Returns &stMAASysResult;
// after a forwarded response its state is MAA_RESULT_NONE (all was sent).
TMAAResult *MAA_ScanFunction(const char *format, ...) __attribute__((format(printf, 1, 2)));

// "Name(n1,n2,...)" with every word as "%lu", "Name()" for none; cut to `size`.
void MAA_FormatCommand(char *line, size_t size, const char *name, const U32 *words, size_t count);

// The scanner's application lock, shared by every test that needs the scanner
// side to itself: up to 1 + SCAN_MAA_RETRY_COUNT attempts one second apart
// (MAA_SleepMs); true once the driver answered SCAN_APP_LOCK_TAKEN.
bool MAA_ScanAppLock(S32 fd);
void MAA_ScanAppRelease(S32 fd);

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
// The second argument is the address of a text; one the address map refuses
// ends the command with "critical error! invalid text argument" (driver untouched).
TMAAResult *SFRReadWrite(U32, U32, U32);
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
// controller side: the shell writes its result). After the header
// "[ GetADFInfo ]" the final record is "ADFType=%lu MultiType=%lu Version=%lu",
// or a text naming the step that failed.
TMAAResult *GetADFInfo();
