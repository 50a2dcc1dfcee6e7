// The reporting routine and the command runner, as the host sees them: which
// records reach the wire, with what status, result and bytes.
#include <gtest/gtest.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <string>
#include <vector>

#include "support/TempRoot.h"
#include "common/ByteOrder.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_Result.h"
#include "maa/functions/MAA_SysResult.h"

namespace {

struct Written {
    U32 enContinue, ulResult;
    std::string data;
};
std::vector<Written> written;
void capture(const TMAAResult *r) {
    written.push_back({r->enContinue, r->ulResult,
                       std::string(reinterpret_cast<const char *>(r->pubData), r->pubData ? r->ulDataSize : 0)});
}

class SysResultTest : public ::testing::Test {
protected:
    void SetUp() override {
        written.clear();
        enSpecialMode = MAA_NORMAL_CMD;
        MAA_SetResultWriter(&capture);
    }
    void TearDown() override { MAA_SetResultWriter(nullptr); }
};

TEST_F(SysResultTest, ModeAndScannerSelectWhatIsWrittenAndReturned) {
    struct Case {
        U32 mode, scanner;
        bool writtenAtOnce;
        U32 enContinue, ulResult;
        std::string data;
    } cases[] = {
        {0, 0, true, MAA_RESULT_CONTINUE, 1, "line"},
        {1, 0, false, MAA_RESULT_END, 1, "line"},
        {7, 0, false, MAA_RESULT_END, 0, ""},
        {0, 2, true, MAA_RESULT_END, 0, "line"},
        {5, 2, true, MAA_RESULT_END, 0, "line"},
        {0, 0x302, true, MAA_RESULT_END, 0, "line"},   // only the low byte counts
        {1, 0x300, false, MAA_RESULT_END, 1, "line"},
        {0, 9, true, MAA_RESULT_CONTINUE, 1, "line"},  // any other value is 0
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(testing::Message() << "mode " << c.mode << " scanner " << c.scanner);
        written.clear();
        SysPBA_IF_PrintResult(reinterpret_cast<const U8 *>("line"), c.mode, c.scanner);
        EXPECT_EQ(stMAASysResult.enContinue, c.enContinue);
        EXPECT_EQ(stMAASysResult.ulResult, c.ulResult);
        EXPECT_EQ(std::string(reinterpret_cast<char *>(stMAASysResult.pubData), stMAASysResult.ulDataSize), c.data);
        EXPECT_EQ(stMAASysResult.pubData, aubSysData);
        ASSERT_EQ(written.size(), c.writtenAtOnce ? 1u : 0u);
        if (c.writtenAtOnce) {
            EXPECT_EQ(written[0].data, c.data);
        }
    }
}

TEST_F(SysResultTest, EachReportClearsWhatAnEarlierOneLeft) {
    SysPBA_IF_PrintResult(reinterpret_cast<const U8 *>("a much longer first line"), 1, 0);
    SysPBA_IF_PrintResult(reinterpret_cast<const U8 *>("short"), 1, 0);
    EXPECT_EQ(std::string(reinterpret_cast<char *>(aubSysData)), "short");
    EXPECT_EQ(aubSysData[6], 0);
}

TEST_F(SysResultTest, ThreeLinesAreTwoContinueRecordsAndAFinalOne) {
    MAA_ReportF(0, "[ %s ]", "Three");
    MAA_ReportF(0, "middle %d", 2);
    TMAAResult *last = MAA_ReportF(1, "%s", "Result= OK");
    ASSERT_EQ(written.size(), 2u);
    EXPECT_EQ(written[0].data, "[ Three ]");
    EXPECT_EQ(written[1].data, "middle 2");
    EXPECT_EQ(last->enContinue, MAA_RESULT_END);
    EXPECT_EQ(std::string(reinterpret_cast<char *>(last->pubData), last->ulDataSize), "Result= OK");
}

TEST_F(SysResultTest, TextsAreBoundedByTheirBuffers) {
    const std::string big(6000, 'x');
    SysPBA_IF_PrintResult(reinterpret_cast<const U8 *>(big.c_str()), 1, 0);
    EXPECT_EQ(stMAASysResult.ulDataSize, MAA_SYS_DATA_SIZE - 1);
    MAA_ReportF(1, "%s", big.c_str());
    EXPECT_EQ(stMAASysResult.ulDataSize, MAA_TEMP_DATA_SIZE - 1);
}

TEST_F(SysResultTest, ABinaryBlockIsForwardedAsReadyFrames) {
    // Two ready result frames in one block; the routine passes them on as they are.
    std::string block;
    for (const char *text : {"one", "two!"}) {
        U8 h[12];
        WriteBE32(h, MAA_RESULT_CONTINUE);
        WriteBE32(h + 4, 1);
        WriteBE32(h + 8, static_cast<U32>(std::strlen(text)));
        block += std::string(reinterpret_cast<char *>(h), 12) + text;
    }
    ulCIP6MaaResultSize = static_cast<U32>(block.size());
    SysPBA_IF_PrintResult(reinterpret_cast<const U8 *>(block.data()), 0, 1);
    EXPECT_EQ(stMAASysResult.ulDataSize, block.size());
    EXPECT_EQ(std::string(reinterpret_cast<char *>(aubSysData), block.size()), block);
    ulCIP6MaaResultSize = 0;
}

std::vector<std::pair<std::string, TMAARunVia>> commands;
int recordCommand(const char *command, TMAARunVia via) {
    commands.emplace_back(command, via);
    return 3;
}

TEST(CommandRunner, AReplacedRunnerSeesEveryCommandAndRunsNothing) {
    commands.clear();
    MAA_SetCommandRunner(&recordCommand);
    EXPECT_EQ(MAA_System("killall cpu_temp.sh"), 3);
    EXPECT_EQ(execbin("rm -rf /halvard/x"), 3);
    MAA_SetCommandRunner(nullptr);
    ASSERT_EQ(commands.size(), 2u);
    EXPECT_EQ(commands[0], std::make_pair(std::string("killall cpu_temp.sh"), TMAARunVia::System));
    EXPECT_EQ(commands[1], std::make_pair(std::string("rm -rf /halvard/x"), TMAARunVia::Execbin));
}

TEST(CommandRunner, TheDefaultRunnerRecordsIntoTheCommandLogInsteadOfRunning) {
    TempRoot root;
    const std::string log = root / "/commands.log", marker = root / "/ran";
    ::setenv("USBADAPTER_COMMAND_LOG", log.c_str(), 1);
    const std::string touch = "touch " + marker;
    EXPECT_EQ(MAA_System(touch.c_str()), 0);
    EXPECT_EQ(execbin(touch.c_str()), 0);
    ::unsetenv("USBADAPTER_COMMAND_LOG");
    std::ifstream in(log);
    std::string a, b;
    std::getline(in, a);
    std::getline(in, b);
    EXPECT_EQ(a, touch);
    EXPECT_EQ(b, touch);
    EXPECT_FALSE(std::ifstream(marker).good());
}

TEST(CommandRunner, ExecbinRunsThroughTheShellAndGivesTheExitStatus) {
    TempRoot root;  // the commands stay inside the temporary root
    const std::string marker = root / "/ran";
    EXPECT_EQ(execbin(("echo hi > " + marker + "; exit 4").c_str()), 4);
    EXPECT_TRUE(std::ifstream(marker).good());
}

}  // namespace

namespace {
std::vector<U32> pauses;
void recordPause(U32 ms) { pauses.push_back(ms); }
}  // namespace

TEST(Pauses, AReplacedSleeperTakesEveryPauseAndTheDefaultReallyWaits) {
    MAA_SetSleeper(&recordPause);
    MAA_SleepMs(1000);
    MAA_SetSleeper(nullptr);
    EXPECT_EQ(pauses, std::vector<U32>{1000});
    auto start = std::chrono::steady_clock::now();
    MAA_SleepMs(120);
    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(100));
}
