// The shell's whole vocabulary: every name a host script may call, with its
// kind, entry, parameter count and target. The count comes from the function's
// C++ signature, so a row cannot disagree with the function it names.
#include "maa/MAA_Address.h"
#include "maa/MAA_Hook.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_Result.h"
#include "maa/MAA_Symbol.h"
#include "maa/functions/MAA_CpuTemp.h"
#include "maa/functions/MAA_EngineIF.h"
#include "maa/functions/MAA_FaxJbig.h"
#include "maa/functions/MAA_Forwarded.h"
#include "maa/functions/MAA_General.h"
#include "maa/functions/MAA_Panel.h"
#include "maa/functions/MAA_ScanDriver.h"
#include "maa/functions/MAA_Supplies.h"

namespace {

struct Registration {
    const char *name;
    U32 (*entry)();  // makes (or finds) the function's handle
    U8 count;
    U32 kind;
    TMAATarget target;
};

constexpr U32 K1 = MAA_SYM_FUNC;       // listed by MAA_SymbolDump
constexpr U32 K4 = MAA_SYM_FUNC_HIDE;  // callable, not listed
constexpr TMAATarget PPC = ftarget_ppc;
constexpr TMAATarget SCN = ftarget_scn;

template <auto Fn>
constexpr Registration Reg(const char *name, U32 kind = K4, TMAATarget target = PPC) {
    return {name, &MAA_FuncEntry<Fn>, static_cast<U8>(maa_detail::arity(Fn)), kind, target};
}

template <MAA_FunctionName Name, std::size_t N>
constexpr auto Fwd = MAA_Forwarded<Name, N>;

// Table order is registration order. It matters for one name only:
// Get_TonerSensorStatus is registered twice and the later row (the engine
// interface) is the one a script reaches.
const Registration kRegistry[] = {
    // shell utilities
    Reg<MAA_SymbolDump>("MAA_SymbolDump", K4, ftarget_all),
    Reg<Dump_File>("Dump_File"),
    Reg<SysPBA_Delay_ms>("Delay_ms"),
    Reg<Fwd<"CopyToPC", 9>>("CopyToPC"),
    // board and system
    Reg<Fwd<"SysPBA_PbaModeIn", 0>>("SysPBA_PbaModeIn"),
    Reg<Fwd<"SysPBA_PbaModeEnd", 0>>("SysPBA_PbaModeEnd"),
    Reg<Fwd<"USBHostTestresult", 0>>("USBHostTestresult"),
    Reg<Fwd<"FW_Download", 0>>("FW_Download"),
    Reg<Fwd<"SysPBA_MemoryClear", 1>>("SysPBA_MemoryClear"),
    Reg<Fwd<"PBA_SelfVdoTest", 3>>("PBA_SelfVdoTest"),
    Reg<Fwd<"Engine_Print", 1>>("Engine_Print"),
    Reg<Fwd<"CryptoVersionCheck", 0>>("MSOK_CryptoVerCheck"),
    Reg<Fwd<"Cyprto_Check_Init", 0>>("Crypto_MSOK_PreProgram"),
    Reg<Fwd<"Flash_size_Detect", 0>>("MSOK_Flash_Size"),
    Reg<Fwd<"PBA_MsokAccess", 3>>("PBA_MsokAccess"),
    Reg<Fwd<"USB_DeviceID", 0>>("USB_DeviceID"),
    Reg<Fwd<"GetTonerSensorStatus", 1>>("Get_TonerSensorStatus"),
    Reg<Fwd<"PatternPrint", 2>>("Pattern_Print", K1),
    Reg<Fwd<"GetRamSize", 1>>("SysPBA_DramTest"),
    Reg<Fwd<"MSOK_EEPROM_Test", 0>>("MSOK_EEPROM_Test"),
    Reg<Fwd<"USBHost_Detect", 0>>("USBHost_Detect"),
    Reg<Fwd<"Crum_Model_Id", 1>>("Crum_Model_Id", K1),
    Reg<Fwd<"PBA_SelfBusIfTest", 3>>("PBA_SelfBusIfTest", K1),
    Reg<Fwd<"ExitInitalSetup", 0>>("Exit_InitalSetup", K1),
    Reg<Fwd<"CheckEngineMSOKTest", 1>>("CheckEngineMSOK"),
    Reg<Fwd<"GetScanAutoAdjustment", 2>>("ScanAutoAdjustment"),
    Reg<Fwd<"SetPrintMarginValue", 5>>("SetPrintMarginValue"),
    Reg<Fwd<"SetEachMarginValue", 6>>("SetEachMarginValue"),
    Reg<Fwd<"GetPrintMarginValue", 0>>("GetPrintMarginValue"),
    Reg<Fwd<"PrintAutoAdjustmentPattern", 2>>("PrintAutoAdjustmentPattern"),
    Reg<Fwd<"PrintAutoAdjustmentStart", 3>>("PrintAutoAdjustment"),
    Reg<Fwd<"SetPowerSaveMode", 1>>("SPI_Set_Power_Save"),
    Reg<CheckCPUTemperature>("CPU_TEMP_START"),
    Reg<CheckCPUTemperature>("CPU_TEMP_END"),
    Reg<SetSpeakerTest>("SPI_Set_Speaker_Test", K4, SCN),
    Reg<Fwd<"SetDADFCommErrIgnoreOption", 1>>("Ignore_DADF_Comm_ERR"),
    Reg<Fwd<"SetTargetModelIndex", 1>>("Set_Target_Model_Index"),
    Reg<Fwd<"Set_ModelName", 1>>("Set_ModelName"),
    Reg<Fwd<"HDDTestStart", 0>>("HDDTestStart"),
    Reg<Fwd<"HDDTestGetResult", 0>>("HDDTestGetResult"),
    Reg<Fwd<"SPI_Get_Log", 0>>("SPI_Get_Log", K1),
    Reg<Fwd<"SPI_Get_LogOPT", 1>>("SPI_Get_LogOPT", K1),
    Reg<Fwd<"PBA_NEW_DRAM_TEST_MAIN", 0>>("PBA_NEW_DRAM_TEST_MAIN"),
    Reg<HWJBIGTest>("HWJBIGTest"),
    Reg<Fwd<"Engine_Test", 1>>("Engine_Test"),
    Reg<Fwd<"PBA_Mode_Print", 1>>("PBA_Mode_Print"),
    Reg<Fwd<"Get_Dot", 0>>("GET_DOT"),
    Reg<Fwd<"PrintTest_USB", 2>>("PrintTest_USB"),
    Reg<Fwd<"PrintTest_USB_HDD", 1>>("PrintTest_USB_HDD"),
    Reg<Fwd<"GetFooterString", 1>>("SPI_Get_Footer"),
    Reg<Fwd<"SetEngFooterOption", 1>>("SPI_Eng_Footer_Option"),
    Reg<Fwd<"PBA_FONT_TEST", 2>>("PBA_FONT_TEST"),
    Reg<Fwd<"Get_SW_Power", 0>>("Get_SW_Power"),
    Reg<Fwd<"SPI_FW_UPDate", 2>>("SPI_FW_UPDate"),
    Reg<Fwd<"PBA_NPC_TEST", 2>>("PBA_NPC_TEST"),
    Reg<CPU_FAN_TEMP_CHK>("CPU_FAN_TEMP_CHK_START"),
    Reg<CPU_FAN_TEMP_CHK>("CPU_FAN_TEMP_CHK_END"),
    Reg<CPU_FAN_TEMP_CHK>("Main_CPU_Fan_Test"),
    Reg<Fwd<"PBA_Power_Control_Test_EV", 2>>("PBA_Power_Control_Test_EV"),
    // board I/O, serial lines, fax line
    Reg<Fwd<"SysPBA_IO_GPOTest", 4>>("SysPBA_IO_GPOTest", K1),
    Reg<Fwd<"SysPBA_IO_GPITest", 3>>("SysPBA_IO_GPITest", K1),
    Reg<Fwd<"SysPBA_IO_EndGPOTest", 0>>("SysPBA_IO_EndGPOTest", K1),
    Reg<SysPBA_IO_Fax_GPITest>("SysPBA_IO_Fax_GPITest", K1, SCN),
    Reg<SysPBA_IO_Fax_GPOTest>("SysPBA_IO_Fax_GPOTest", K1, SCN),
    Reg<PhoneTest_OHD>("PhoneTest_OHD", K4, SCN),
    Reg<PhoneTest_Dial>("PhoneTest_Dial", K4, SCN),
    Reg<PhoneTest_Ring>("PhoneTest_Ring", K4, SCN),
    Reg<Fwd<"UartTest", 4>>("UART_Test", K1),
    Reg<UART_Test_FAX>("UART_Test_FAX", K1, SCN),
    Reg<FaxModuleDetect_To_SCB>("Fax_Modul_Detect", K1, SCN),
    Reg<Fwd<"SysPBA_IO_Main_GPITest", 3>>("SysPBA_IO_Main_GPITest", K1),
    Reg<Fwd<"SysPBA_IO_Main_GPOTest", 4>>("SysPBA_IO_Main_GPOTest", K1),
    Reg<Fwd<"SysPBA_IO_Main_EndGPOTest", 0>>("SysPBA_IO_Main_EndGPOTest", K1),
    // operator panel
    Reg<UISSM_IF_LED_Test>("UISSM_MAA_LED_Test_pelmar", K1),
    Reg<UISSM_IF_KeyInTest>("UISSM_MAA_KeyInTest_pelmar", K1),
    Reg<UISSM_IF_KeyInTest_And_Cli>("UISSM_MAA_KeyInTest"),
    Reg<UISSM_IF_LED_Test_And_Cli>("UISSM_MAA_LED_Test"),
    Reg<UISSM_IF_Key_WaitTest_And_Cli>("UISSM_MAA_Key_WaitTest", K1),
    Reg<UISSM_IF_Key_LCD_Test_And_Cli>("UISSM_MAA_Key_LCD_Test", K1),
    Reg<UISSM_MAA_CountrySkip_And_Cli>("UISSM_MAA_CountrySkip", K1),
    Reg<UISSM_MAA_TrayConfirmSkip_And_Cli>("UISSM_MAA_TrayConfirmSkip", K1),
    Reg<SPI_Set_UI_Power_Save_And_Cli>("SPI_Set_UI_Power_Save"),
    Reg<UISSM_MAA_TSPCalibration_Result_And_Cli>("UISSM_MAA_TSPCalibration_Result"),
    Reg<PbaMode_UI_Data_clear>("PbaMode_UI_Data_clear", K1),
    Reg<SPI_Get_UI>("SPI_Get_UI", K1),
    Reg<SPI_Set_UI_Reboot>("SPI_Set_UI_Reboot", K1),
    Reg<UISSM_MAA_Set_KeySound_And_Cli>("UISSM_MAA_Set_KeySound"),
    Reg<UISSM_MAA_MIC_Test_And_Cli>("UISSM_MAA_MIC_Test"),
    Reg<UISSM_MAA_HAPTIC_And_Cli>("UISSM_MAA_HAPTIC"),
    Reg<UISSM_MAA_SpeakerTest_And_Cli>("UISSM_MAA_Speaker"),
    // engine string interface
    Reg<Eng_MaaStrIFOpt3>("Crypto_Write"),
    Reg<Eng_MaaStrIFOpt1>("GetSensorTest"),
    Reg<Eng_MaaStrIFOpt1>("SPI_GET_TEMP_HUMI"),
    Reg<Eng_MaaStrFTCATest>("GetFTCAData", K1),
    Reg<Eng_MaaImgStbStart>("ImageStablization"),
    Reg<Eng_MaaStrIFOpt2>("FUSER_PreConfig"),
    Reg<Eng_MaaStrIFOpt3>("FUSER_PreProgram"),
    Reg<Eng_MaaStrIFOpt1>("Get_TonerSensorStatus"),
    Reg<Eng_MaaStrIFOpt0>("GetSensorTimeClear"),
    Reg<Eng_MaaStrIFOpt1_Str>("WriteFooter"),
    Reg<Eng_MaaPBAStrIFOpt4>("FRA_Feed"),
    Reg<Eng_MaaStrIFOpt2>("zCrum_ISSUE_1"),
    Reg<Eng_MaaStrIFOpt1>("zCrum_ISSUE_2"),
    Reg<Eng_MaaStrIFOpt2>("zCrum_WRITE_IBL"),
    Reg<Eng_MaaStrIFOpt4>("JIG_CRUM_WRITE"),
    Reg<Eng_MaaStrIFOpt3>("JIG_CRUM_READ"),
    Reg<Eng_MaaStrIFOpt2>("ResetATR"),
    Reg<Eng_MaaStrIFOpt1>("TCSensorReset"),
    Reg<Eng_MaaStrIFOpt5>("Crum_ISSUE_HF_1"),
    Reg<Eng_MaaStrIFOpt4>("Crum_ISSUE_HF_2"),
    Reg<Eng_MaaStrIFOpt4>("Crum_ISSUE_SF"),
    Reg<Eng_MaaStrIFOpt5>("zCrum_CMD"),
    Reg<Eng_MaaStrIFOpt5>("zCRUM_CMD"),
    Reg<Eng_MaaStrIFOpt2>("GetData"),
    Reg<Eng_MaaStrIFOpt2>("GetUserData"),
    Reg<Eng_MaaStrIFOpt3>("SetSysConfig"),
    // scanner side: each passes its command line to the scanner driver
    Reg<ADFMotorTest>("ADFMotorTest", K4, SCN),
    Reg<CompensateScanPositionValue>("CompensateScanPositionValue", K4, SCN),
    Reg<DADFFeedTest>("DADFFeedTest", K4, SCN),
    Reg<DADFPaperPathTimeTest>("DADFPaperPathTimeTest", K4, SCN),
    Reg<DADFSensorTest>("DADFSensorTest", K4, SCN),
    Reg<GetScanFanTest>("GetScanFanTest", K4, SCN),
    Reg<GetScanSensorTest>("GetScanSensorTest", K4, SCN),
    Reg<ManualCompensateScanDeSkew>("ManualCompensateScanDeSkew", K4, SCN),
    Reg<ManualCompensateScanPosition>("ManualCompensateScanPosition", K4, SCN),
    Reg<ManualWidthAdjust>("ManualWidthAdjust", K4, SCN),
    Reg<PBA_IP_IfPathTest>("PBA_IP_IfPathTest", K4, SCN),
    Reg<PlatenMotorNoiseTest>("PlatenMotorNoiseTest", K4, SCN),
    Reg<PWM_Scan_Test>("PWM_Scan_Test", K1, SCN),
    Reg<ScanMotorTest>("ScanMotorTest", K4, SCN),
    Reg<ScanPatchDetect_Test>("ScanPatchDetect_Test", K4, SCN),
    Reg<ScanToInspectionDust>("ScanToInspectionDust", K4, SCN),
    Reg<SFRReadWrite>("SFRReadWrite", K4, SCN),
    Reg<Step_Mot_Test_Scan>("Step_Mot_Test_Scan", K4, SCN),
    Reg<SysPBA_IO_Scn_GPITest>("SysPBA_IO_Scn_GPITest", K1, SCN),
    Reg<SysPBA_IO_Scn_GPOTest>("SysPBA_IO_Scn_GPOTest", K1, SCN),
    Reg<UART_Test_SCN>("UART_Test_SCN", K1, SCN),
    Reg<GetShadingData>("GetShadingData", K4, SCN),
    Reg<ScanJobTest1>("ScanJobTest1", K1, SCN),
    Reg<ScanJobTest2>("ScanJobTest2", K1, SCN),
    Reg<ScanJobTest3>("ScanJobTest3", K1, SCN),
    Reg<ScanJobTest4>("ScanJobTest4", K1, SCN),
    Reg<ScanBalanceCorrection>("ScanBalanceCorrection", K1, SCN),
    // added last
    Reg<Get_SuppliesInfo_Report>("GetSuppliesInfoReport", K1),
    Reg<SetUIEnable>("SetUIEnable", K1),
    Reg<UISSM_MAA_USB_Test_And_Cli>("UISSM_MAA_USB_Test"),
    Reg<GetADFInfo>("GetADFInfo"),
};
static_assert(sizeof kRegistry / sizeof kRegistry[0] == 147, "147 named registrations and the general symbol");

}  // namespace

void MAA_SymbolReg(void) {
    for (const Registration &r : kRegistry) MAA_IF_SymbolAdd(r.target, r.name, r.kind, r.entry(), r.count);
    MAA_SymbolAddGeneral(ftarget_ppc, "MAA_GENERAL_FUNCTION", MAA_SYM_FUNC_HIDE,
                         MAA_AddrGeneralHandle(&MAA_GENERAL_FUNCTION), 2);
}
