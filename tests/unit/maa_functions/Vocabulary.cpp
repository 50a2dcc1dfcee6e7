// The registered vocabulary: the registration table against the names the
// host's scripts rely on, written out independently of the table; and calling
// it through the shell the way a host script does: names that reach a family's
// shared function, and every name called with hostile arguments.
#include <algorithm>
#include <map>
#include <set>
#include <sstream>
#include <tuple>

#include "maa_functions/FnFixture.h"

namespace fntest {
namespace {

// name, parameter count, kind, target (p = main controller, s = scanner side,
// a = all), implementing function ("=" when it has the name itself); "|"
// between entries.
const char kVocabulary[] = R"(
MAA_SymbolDump 0 4 a = | Dump_File 1 4 p = | Delay_ms 1 4 p SysPBA_Delay_ms | CopyToPC 9 4 p =
SysPBA_PbaModeIn 0 4 p = | SysPBA_PbaModeEnd 0 4 p = | USBHostTestresult 0 4 p = | FW_Download 0 4 p =
SysPBA_MemoryClear 1 4 p = | PBA_SelfVdoTest 3 4 p = | Engine_Print 1 4 p =
MSOK_CryptoVerCheck 0 4 p CryptoVersionCheck | Crypto_MSOK_PreProgram 0 4 p Cyprto_Check_Init
MSOK_Flash_Size 0 4 p Flash_size_Detect | PBA_MsokAccess 3 4 p = | USB_DeviceID 0 4 p =
Pattern_Print 2 1 p PatternPrint | SysPBA_DramTest 1 4 p GetRamSize | MSOK_EEPROM_Test 0 4 p =
USBHost_Detect 0 4 p = | Crum_Model_Id 1 1 p = | PBA_SelfBusIfTest 3 1 p =
Exit_InitalSetup 0 1 p ExitInitalSetup | CheckEngineMSOK 1 4 p CheckEngineMSOKTest
ScanAutoAdjustment 2 4 p GetScanAutoAdjustment | SetPrintMarginValue 5 4 p = | SetEachMarginValue 6 4 p =
GetPrintMarginValue 0 4 p = | PrintAutoAdjustmentPattern 2 4 p =
PrintAutoAdjustment 3 4 p PrintAutoAdjustmentStart | SPI_Set_Power_Save 1 4 p SetPowerSaveMode
CPU_TEMP_START 1 4 p CheckCPUTemperature | CPU_TEMP_END 1 4 p CheckCPUTemperature
SPI_Set_Speaker_Test 1 4 s SetSpeakerTest | Ignore_DADF_Comm_ERR 1 4 p SetDADFCommErrIgnoreOption
Set_Target_Model_Index 1 4 p SetTargetModelIndex | Set_ModelName 1 4 p = | HDDTestStart 0 4 p =
HDDTestGetResult 0 4 p = | SPI_Get_Log 0 1 p = | SPI_Get_LogOPT 1 1 p = | PBA_NEW_DRAM_TEST_MAIN 0 4 p =
HWJBIGTest 1 4 p = | Engine_Test 1 4 p = | PBA_Mode_Print 1 4 p = | GET_DOT 0 4 p Get_Dot | PrintTest_USB 2 4 p =
PrintTest_USB_HDD 1 4 p = | SPI_Get_Footer 1 4 p GetFooterString | SPI_Eng_Footer_Option 1 4 p SetEngFooterOption
PBA_FONT_TEST 2 4 p = | Get_SW_Power 0 4 p = | SPI_FW_UPDate 2 4 p = | PBA_NPC_TEST 2 4 p =
CPU_FAN_TEMP_CHK_START 1 4 p CPU_FAN_TEMP_CHK | CPU_FAN_TEMP_CHK_END 1 4 p CPU_FAN_TEMP_CHK
Main_CPU_Fan_Test 1 4 p CPU_FAN_TEMP_CHK | PBA_Power_Control_Test_EV 2 4 p =
GetSuppliesInfoReport 0 1 p Get_SuppliesInfo_Report | GetADFInfo 0 4 p = | SysPBA_IO_GPOTest 4 1 p =
SysPBA_IO_GPITest 3 1 p = | SysPBA_IO_EndGPOTest 0 1 p = | SysPBA_IO_Fax_GPITest 3 1 s =
SysPBA_IO_Fax_GPOTest 4 1 s = | PhoneTest_OHD 3 4 s = | PhoneTest_Dial 3 4 s = | PhoneTest_Ring 2 4 s =
UART_Test 4 1 p UartTest | UART_Test_FAX 4 1 s = | Fax_Modul_Detect 0 1 s FaxModuleDetect_To_SCB
SysPBA_IO_Main_GPITest 3 1 p = | SysPBA_IO_Main_GPOTest 4 1 p = | SysPBA_IO_Main_EndGPOTest 0 1 p =
UISSM_MAA_LED_Test_pelmar 0 1 p UISSM_IF_LED_Test | UISSM_MAA_KeyInTest_pelmar 0 1 p UISSM_IF_KeyInTest
UISSM_MAA_KeyInTest 1 4 p UISSM_IF_KeyInTest_And_Cli | UISSM_MAA_LED_Test 1 4 p UISSM_IF_LED_Test_And_Cli
UISSM_MAA_Key_WaitTest 0 1 p UISSM_IF_Key_WaitTest_And_Cli
UISSM_MAA_Key_LCD_Test 0 1 p UISSM_IF_Key_LCD_Test_And_Cli
UISSM_MAA_CountrySkip 0 1 p UISSM_MAA_CountrySkip_And_Cli
UISSM_MAA_TrayConfirmSkip 0 1 p UISSM_MAA_TrayConfirmSkip_And_Cli
SPI_Set_UI_Power_Save 1 4 p SPI_Set_UI_Power_Save_And_Cli
UISSM_MAA_TSPCalibration_Result 1 4 p UISSM_MAA_TSPCalibration_Result_And_Cli | PbaMode_UI_Data_clear 0 1 p =
SPI_Get_UI 0 1 p = | SPI_Set_UI_Reboot 0 1 p = | UISSM_MAA_Set_KeySound 1 4 p UISSM_MAA_Set_KeySound_And_Cli
UISSM_MAA_MIC_Test 0 4 p UISSM_MAA_MIC_Test_And_Cli | UISSM_MAA_HAPTIC 1 4 p UISSM_MAA_HAPTIC_And_Cli
UISSM_MAA_Speaker 1 4 p UISSM_MAA_SpeakerTest_And_Cli | SetUIEnable 0 1 p =
UISSM_MAA_USB_Test 0 4 p UISSM_MAA_USB_Test_And_Cli | Crypto_Write 3 4 p Eng_MaaStrIFOpt3
GetSensorTest 1 4 p Eng_MaaStrIFOpt1 | SPI_GET_TEMP_HUMI 1 4 p Eng_MaaStrIFOpt1
GetFTCAData 1 1 p Eng_MaaStrFTCATest | ImageStablization 1 4 p Eng_MaaImgStbStart
FUSER_PreConfig 2 4 p Eng_MaaStrIFOpt2 | FUSER_PreProgram 3 4 p Eng_MaaStrIFOpt3
Get_TonerSensorStatus 1 4 p GetTonerSensorStatus | Get_TonerSensorStatus 1 4 p Eng_MaaStrIFOpt1
GetSensorTimeClear 0 4 p Eng_MaaStrIFOpt0 | WriteFooter 1 4 p Eng_MaaStrIFOpt1_Str
FRA_Feed 4 4 p Eng_MaaPBAStrIFOpt4 | zCrum_ISSUE_1 2 4 p Eng_MaaStrIFOpt2 | zCrum_ISSUE_2 1 4 p Eng_MaaStrIFOpt1
zCrum_WRITE_IBL 2 4 p Eng_MaaStrIFOpt2 | JIG_CRUM_WRITE 4 4 p Eng_MaaStrIFOpt4
JIG_CRUM_READ 3 4 p Eng_MaaStrIFOpt3 | ResetATR 2 4 p Eng_MaaStrIFOpt2 | TCSensorReset 1 4 p Eng_MaaStrIFOpt1
Crum_ISSUE_HF_1 5 4 p Eng_MaaStrIFOpt5 | Crum_ISSUE_HF_2 4 4 p Eng_MaaStrIFOpt4
Crum_ISSUE_SF 4 4 p Eng_MaaStrIFOpt4 | zCrum_CMD 5 4 p Eng_MaaStrIFOpt5 | zCRUM_CMD 5 4 p Eng_MaaStrIFOpt5
GetData 2 4 p Eng_MaaStrIFOpt2 | GetUserData 2 4 p Eng_MaaStrIFOpt2 | SetSysConfig 3 4 p Eng_MaaStrIFOpt3
ADFMotorTest 4 4 s = | CompensateScanPositionValue 2 4 s = | DADFFeedTest 2 4 s = | DADFPaperPathTimeTest 1 4 s =
DADFSensorTest 0 4 s = | GetScanFanTest 1 4 s = | GetScanSensorTest 1 4 s = | ManualCompensateScanDeSkew 3 4 s =
ManualCompensateScanPosition 6 4 s = | ManualWidthAdjust 3 4 s = | PBA_IP_IfPathTest 4 4 s =
PlatenMotorNoiseTest 1 4 s = | PWM_Scan_Test 7 1 s = | ScanMotorTest 1 4 s = | ScanPatchDetect_Test 0 4 s =
ScanToInspectionDust 0 4 s = | SFRReadWrite 3 4 s = | Step_Mot_Test_Scan 4 4 s = | SysPBA_IO_Scn_GPITest 3 1 s =
SysPBA_IO_Scn_GPOTest 4 1 s = | UART_Test_SCN 4 1 s = | GetShadingData 1 4 s = | ScanJobTest1 1 1 s =
ScanJobTest2 2 1 s = | ScanJobTest3 3 1 s = | ScanJobTest4 4 1 s = | ScanBalanceCorrection 1 1 s =)";

struct Entry { std::string name, function; unsigned count, kind; char target; };

using Registry = FnTest;

TEST_F(Registry, EveryNameHasItsCountKindTargetAndSharesAnEntryOnlyWithItsFunction) {
    MAA_SymbolReg();
    // By name; a name registered twice in registration order (the list is newest first).
    std::map<std::string, std::vector<const TSymbol *>> byName;
    size_t registered = 0;
    for (TSymbolNode *n = pstRoot; n != nullptr; n = n->pstNext, ++registered) {
        auto &v = byName[reinterpret_cast<const char *>(n->pstSymbol->pubName)];
        v.insert(v.begin(), n->pstSymbol);
    }

    // Each listed name with its count, kind and target; names share an entry
    // exactly when they share an implementing function.
    std::string text = kVocabulary;
    std::replace(text.begin(), text.end(), '|', ' ');
    std::istringstream in(text);
    size_t listed = 0;
    std::map<std::string, U32> entryOfFunction;
    std::set<U32> entries;
    for (Entry e; in >> e.name >> e.count >> e.kind >> e.target >> e.function; ++listed) {
        if (e.function == "=") e.function = e.name;
        auto &same = byName[e.name];
        ASSERT_FALSE(same.empty()) << e.name;
        const TSymbol *s = same.front();
        same.erase(same.begin());
        const char target = s->fMaaTarget == ftarget_all ? 'a' : s->fMaaTarget == ftarget_scn ? 's' : 'p';
        EXPECT_EQ(std::make_tuple(unsigned{s->ubPramCount}, unsigned{s->ulType}, target),
                  std::make_tuple(e.count, e.kind, e.target)) << e.name;
        auto [it, fresh] = entryOfFunction.emplace(e.function, s->ulAddress);
        EXPECT_EQ(it->second, s->ulAddress) << e.name << " should share the entry of " << e.function;
        EXPECT_TRUE(!fresh || entries.insert(s->ulAddress).second) << e.name << " shares another function's entry";
    }
    EXPECT_EQ(listed, 147u);
    EXPECT_EQ(registered, listed);
    EXPECT_EQ(entries.size(), 128u);
    // The later of the two toner-sensor registrations is the one found by name.
    ASSERT_NE(MAA_SymbolFind("Get_TonerSensorStatus"), nullptr);
    EXPECT_EQ(MAA_SymbolFind("Get_TonerSensorStatus")->ulAddress, MAA_SymbolFind("GetSensorTest")->ulAddress);

    TSymbol *general = MAA_GetGeneralSymbolEntry();
    ASSERT_NE(general, nullptr);
    EXPECT_STREQ(reinterpret_cast<const char *>(general->pubName), "MAA_GENERAL_FUNCTION");
    EXPECT_EQ(std::make_tuple(general->ubPramCount, general->ulType, general->fMaaTarget),
              std::make_tuple(U8{2}, U32{4}, ftarget_ppc));
    EXPECT_EQ(MAA_SymbolFindAddress(general->ulAddress), nullptr);  // not in the named list
}

using Vocabulary = FnTest;

TEST_F(Vocabulary, NamesReachTheirFunctionsWithTheirHeaders) {
    struct Case { const char *line; Recs records; const char *logged; std::vector<U32> pauses; } cases[] = {
        // A forwarded family, without the Java service.
        {"SysPBA_DramTest(1)", {Cont("[ GetRamSize ]"), End("Failed")}, "", {}},
        // The engine interface, not the toner sensor's first registration ("[ GetTonerSensorStatus ]").
        {"Get_TonerSensorStatus(1)", {Cont("[ Get_TonerSensorStatus ]"), End("Failed")},
         "[Eng_MaaStrNormalTest] Start===>", {}},
        // Delay pauses for its argument up to a minute.
        {"Delay_ms(250)", {End("Delay 250 ms DONE")}, "", {250}},
        {"Delay_ms(0xFFFFFFFF)", {End("Delay 60000 ms DONE")}, "", {60000}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.line);
        Restart();
        LoggerHost_StartCapture();
        EXPECT_EQ(HostSees(c.line), c.records);
        EXPECT_TRUE(LoggerHost_Contains(c.logged));
        EXPECT_EQ(sleeps, c.pauses);
    }
}

// Every registered name with its own count of arguments of every kind a host
// may send: numbers at the edges, a text where a number is expected, a number
// where a text is expected, long texts. Nothing may crash (the sanitizer builds
// run this too), nothing may run a command outside the recorder, and the shell
// still works afterwards.
TEST_F(Vocabulary, EveryNameSurvivesHostileArguments) {
    const std::string text100(100, 'a'), text101(101, 'b');
    const std::vector<std::string> kinds = {"0", "0xFFFFFFFF", "1000000", "1000001", "\"" + text100 + "\"",
                                            "\"" + text101 + "\"", "\"%s%n%x\"", "\"\""};
    Run("");
    std::vector<std::pair<std::string, U8>> names;
    for (TSymbolNode *n = pstRoot; n != nullptr; n = n->pstNext) {
        if (std::string(reinterpret_cast<const char *>(n->pstSymbol->pubName)) == "MAA_SymbolDump") continue;
        names.emplace_back(reinterpret_cast<const char *>(n->pstSymbol->pubName), n->pstSymbol->ubPramCount);
    }
    for (const auto &[name, count] : names) {
        for (const std::string &kind : kinds) {
            std::string line = name + "(";
            for (U8 i = 0; i < count; ++i) line += (i ? "," : "") + kind;
            SCOPED_TRACE(line + ")");
            Run(line + ")");
        }
    }
    EXPECT_EQ(HostSees("Delay_ms(1)"), Recs{End("Delay 1 ms DONE")});
}

}  // namespace
}  // namespace fntest
