// The reporting routine and the command runner, as the host sees them: which
// records reach the wire, with what status, result and bytes.
#include <chrono>
#include <cstdlib>
#include <cstring>

#include "maa_functions/FnFixture.h"

namespace fntest {
namespace {

using SysResult = FnTest;

TEST_F(SysResult, ModeAndScannerSelectWhatIsWrittenAndReturned) {
    struct Case { U32 mode, scanner; bool writtenAtOnce; Rec returned; } cases[] = {
        {0, 0, true, Cont("line", 1)},  {1, 0, false, End("line", 1)},     {7, 0, false, End("", 0)},
        {0, 2, true, End("line", 0)},   {5, 2, true, End("line", 0)},      {1, 0x300, false, End("line", 1)},
        {0, 0x302, true, End("line", 0)},  // only the low byte counts
        {0, 9, true, Cont("line", 1)},     // any other value is 0
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(testing::Message() << "mode " << c.mode << " scanner " << c.scanner);
        // A longer earlier report must leave nothing behind.
        SysPBA_IF_PrintResult(reinterpret_cast<const U8 *>("a much longer first line"), 1, 0);
        written.clear();
        SysPBA_IF_PrintResult(reinterpret_cast<const U8 *>("line"), c.mode, c.scanner);
        EXPECT_EQ(Of(&stMAASysResult), c.returned);
        if (!c.returned.data.empty()) { EXPECT_EQ(std::string(reinterpret_cast<char *>(aubSysData)), c.returned.data); }
        EXPECT_EQ(written, (c.writtenAtOnce ? Recs{{c.returned.st, c.returned.data, {}}} : Recs{}));
    }
}

TEST_F(SysResult, LinesAreContinueRecordsUntilTheFinalOneAndBoundedByTheirBuffers) {
    MAA_ReportF(0, "[ %s ]", "Three");
    MAA_ReportF(0, "middle %d", 2);
    EXPECT_EQ(Seen(MAA_ReportF(1, "%s", "Result= OK")), (Recs{Cont("[ Three ]"), Cont("middle 2"), End("Result= OK")}));
    const std::string big(6000, 'x');
    SysPBA_IF_PrintResult(reinterpret_cast<const U8 *>(big.c_str()), 1, 0);
    EXPECT_EQ(stMAASysResult.ulDataSize, MAA_SYS_DATA_SIZE - 1);
    MAA_ReportF(1, "%s", big.c_str());
    EXPECT_EQ(stMAASysResult.ulDataSize, MAA_TEMP_DATA_SIZE - 1);
}

TEST_F(SysResult, ABinaryBlockIsForwardedAsReadyFrames) {
    const std::string block = Frame(MAA_RESULT_CONTINUE, 1, "one") + Frame(MAA_RESULT_CONTINUE, 1, "two!");
    ulCIP6MaaResultSize = static_cast<U32>(block.size());
    SysPBA_IF_PrintResult(reinterpret_cast<const U8 *>(block.data()), 0, 1);
    ulCIP6MaaResultSize = 0;
    EXPECT_EQ(stMAASysResult.ulDataSize, block.size());
    EXPECT_EQ(std::string(reinterpret_cast<char *>(aubSysData), block.size()), block);
}

std::vector<TMAARunVia> vias;
int recordVia(const char *command, TMAARunVia via) {
    vias.push_back(via);
    return RecordCommand(command, via) + 3;
}

TEST_F(SysResult, AReplacedRunnerSeesEveryCommandTheDefaultLogsOrRunsThroughTheShell) {
    MAA_SetCommandRunner(&recordVia);
    EXPECT_EQ(MAA_System("killall cpu_temp.sh"), 3);
    EXPECT_EQ(execbin("rm -rf /halvard/x"), 3);
    EXPECT_EQ(commands, (std::vector<std::string>{"killall cpu_temp.sh", "rm -rf /halvard/x"}));
    EXPECT_EQ(vias, (std::vector<TMAARunVia>{TMAARunVia::System, TMAARunVia::Execbin}));

    // The default runner with a command log records instead of running.
    MAA_SetCommandRunner(nullptr);
    const std::string log = root / "/commands.log", marker = root / "/ran", touch = "touch " + marker;
    ::setenv("USBADAPTER_COMMAND_LOG", log.c_str(), 1);
    EXPECT_EQ(MAA_System(touch.c_str()), 0);
    EXPECT_EQ(execbin(touch.c_str()), 0);
    ::unsetenv("USBADAPTER_COMMAND_LOG");
    EXPECT_EQ(ReadFile(log), touch + "\n" + touch + "\n");
    EXPECT_FALSE(std::ifstream(marker).good());
    // Without one, execbin runs through the shell (inside the private root) and gives the exit status.
    EXPECT_EQ(execbin(("echo hi > " + marker + "; exit 4").c_str()), 4);
    EXPECT_TRUE(std::ifstream(marker).good());
}

TEST_F(SysResult, TheDefaultSleeperReallyWaits) {
    MAA_SetSleeper(nullptr);
    auto start = std::chrono::steady_clock::now();
    MAA_SleepMs(120);
    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(100));
}

}  // namespace
}  // namespace fntest
