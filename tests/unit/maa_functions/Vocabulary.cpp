// Calling the registered vocabulary through the shell the way a host script
// does: the call contract, the dump, the forwarded families, and every name
// called with hostile arguments.
#include <fcntl.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <vector>

#include "adapter/USB.h"
#include "common/ByteOrder.h"
#include "maa/MAA_Hook.h"
#include "maa/ShellFixture.h"
#include "maa/functions/MAA_Forwarded.h"
#include "maa/functions/MAA_Panel.h"
#include "maa/functions/MAA_SysResult.h"
#include "support/TempRoot.h"
#include "vdev.h"
#include "vendor/VLX_Main.h"

namespace maatest {
namespace {

std::vector<std::string> commandsRun;
int recordCommand(const char *command, TMAARunVia) {
    commandsRun.emplace_back(command);
    return 0;
}
std::vector<U32> pauses;
void recordPause(U32 ms) { pauses.push_back(ms); }

class Vocabulary : public ShellTest {
protected:
    void SetUp() override {
        ShellTest::SetUp();
        vdev::Reset();
        commandsRun.clear();
        pauses.clear();
        MAA_SetCommandRunner(&recordCommand);
        MAA_SetSleeper(&recordPause);
        MAA_PanelSetWaits(50, 50, 50);  // no UI server answers here
        MAA_SymbolReg();
    }
    void TearDown() override {
        MAA_SetCommandRunner(nullptr);
        MAA_SetSleeper(nullptr);
        MAA_PanelSetWaits(0, 0, 0);
        ShellTest::TearDown();
    }
    static std::vector<std::string> texts() {
        std::vector<std::string> out;
        for (const Record &r : records) out.push_back(r.data);
        return out;
    }
    TempRoot root;
};

TEST_F(Vocabulary, TheDumpListsTheThirtyEightListedNamesAndCountsThem) {
    ASSERT_EQ(run("MAA_SymbolDump()"), 0u);
    ASSERT_EQ(records.size(), 3u + 38u + 3u);
    EXPECT_EQ(records[38 + 4].data, "The Number Of Symbol : 38 ");
    EXPECT_EQ(records[38 + 4].ulResult, 1u);
    EXPECT_EQ(records.back().enContinue, MAA_RESULT_END);
    std::vector<std::string> names;
    for (size_t i = 3; i < 3 + 38; ++i) names.push_back(records[i].data);
    for (const char *listed : {"   Pattern_Print  ", "   GetFTCAData  ", "   ScanBalanceCorrection  ", "   SetUIEnable  "})
        EXPECT_NE(std::find(names.begin(), names.end(), listed), names.end()) << listed;
    for (const char *hidden : {"   Delay_ms  ", "   MAA_SymbolDump  ", "   ScanMotorTest  "})
        EXPECT_EQ(std::find(names.begin(), names.end(), hidden), names.end()) << hidden;
}

TEST_F(Vocabulary, ANameAloneIsPrintedByItsKind) {
    run("Pattern_Print");
    EXPECT_TRUE(LoggerHost_Contains("\r\nFUNC "));
    LoggerHost_StartCapture();
    run("Delay_ms");
    EXPECT_TRUE(LoggerHost_Contains("\r\nunknown(4) "));
}

TEST_F(Vocabulary, AWrongArgumentCountCallsNothing) {
    for (const char *line : {"Pattern_Print(1)", "Pattern_Print(1,2,3)", "Delay_ms()", "ScanMotorTest(1,2)"}) {
        records.clear();
        EXPECT_EQ(run(line), 0u) << line;
        EXPECT_TRUE(records.empty()) << line;
    }
    EXPECT_TRUE(pauses.empty());
    EXPECT_EQ(vdev::OpenCount("/dev/scanner"), 0);
}

TEST_F(Vocabulary, ElevenArgumentsAreWorthZeroAndCallNothing) {
    run("x = Pattern_Print(1,2,3,4,5,6,7,8,9,10,11)");
    EXPECT_TRUE(LoggerHost_Contains("too many args\n"));
    EXPECT_TRUE(records.empty());
}

TEST_F(Vocabulary, AForwardedFamilyReportsItsHeaderAndFailsWithoutTheJavaService) {
    ASSERT_EQ(run("SysPBA_DramTest(1)"), 0u);
    ASSERT_EQ(records.size(), 2u);
    EXPECT_EQ(records[0].data, "[ GetRamSize ]");
    EXPECT_EQ(records[0].enContinue, MAA_RESULT_CONTINUE);
    EXPECT_EQ(records[1].data, "Failed");
    EXPECT_EQ(records[1].enContinue, MAA_RESULT_END);
}

TEST_F(Vocabulary, TheTonerSensorNameReachesTheEngineInterfaceNotItsFirstRegistration) {
    ASSERT_EQ(run("Get_TonerSensorStatus(1)"), 0u);
    ASSERT_FALSE(records.empty());
    EXPECT_EQ(records[0].data, "[ Get_TonerSensorStatus ]");  // "[ GetTonerSensorStatus ]" is the superseded one
    EXPECT_TRUE(LoggerHost_Contains("[Eng_MaaStrNormalTest] Start===>"));
}

TEST_F(Vocabulary, AScannerSideNameWritesItsOneResultItselfAndTheShellAddsNone) {
    const int channel = ::open(vdev::kPrn, O_RDWR);
    ASSERT_GT(channel, 0);
    ulDrvHandle = static_cast<U32>(channel);
    std::string frame(12, '\0');
    WriteBE32(reinterpret_cast<U8 *>(frame.data()), MAA_RESULT_END);
    WriteBE32(reinterpret_cast<U8 *>(frame.data()) + 4, 1);
    WriteBE32(reinterpret_cast<U8 *>(frame.data()) + 8, 7);
    frame += "Motor=1";
    vdev::SetScanTestAnswer({std::vector<uint8_t>(frame.begin(), frame.end()), std::nullopt, 1, 0});
    EXPECT_EQ(run("ScanMotorTest(1)"), 0u);
    const std::vector<uint8_t> wire = vdev::HostRead(vdev::kPrn);
    EXPECT_EQ(std::string(wire.begin(), wire.end()), frame);
    EXPECT_TRUE(records.empty());
    EXPECT_EQ(vdev::ScanCommands(), std::vector<std::string>{"ScanMotorTest(1)"});
    ::close(channel);
}

TEST_F(Vocabulary, DelayPausesForItsArgumentUpToAMinute) {
    run("Delay_ms(250)");
    run("Delay_ms(0xFFFFFFFF)");
    EXPECT_EQ(pauses, (std::vector<U32>{250, MAA_DELAY_MAX_MS}));
    EXPECT_EQ(texts(), (std::vector<std::string>{"Delay 250 ms DONE", "Delay 60000 ms DONE"}));
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
    std::vector<std::pair<std::string, U8>> names;
    for (TSymbolNode *n = pstRoot; n != nullptr; n = n->pstNext) {
        if (std::string(reinterpret_cast<const char *>(n->pstSymbol->pubName)) == "MAA_SymbolDump") continue;
        names.emplace_back(reinterpret_cast<const char *>(n->pstSymbol->pubName), n->pstSymbol->ubPramCount);
    }
    for (const auto &[name, count] : names) {
        for (const std::string &kind : kinds) {
            std::string line = name + "(";
            for (U8 i = 0; i < count; ++i) line += (i ? "," : "") + kind;
            line += ")";
            SCOPED_TRACE(line);
            run(line);
        }
    }
    records.clear();
    ASSERT_EQ(run("Delay_ms(1)"), 0u);
    EXPECT_EQ(texts(), std::vector<std::string>{"Delay 1 ms DONE"});
}

}  // namespace
}  // namespace maatest
