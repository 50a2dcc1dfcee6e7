// The reporting routine and the command runner, as the host sees them: which
// records reach the wire, with what status, result and bytes; and the CPU
// temperature and fan tests that use them: the records sent and returned, the
// shell commands they run (recorded, never run) and the status files they read
// under a private root.
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <filesystem>

#include "maa_functions/FnFixture.h"
#include "print/USBPrint.h"

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

// ---- CPU temperature and fan -------------------------------------------------------

using CpuTemp = FnTest;

TEST_F(CpuTemp, FanTestsRunTheirCommandsAndReadTheStatusFiles) {
    const std::string fanTest = root / "/proc/cpufantest", fanStatus = root / "/proc/fanstatus";
    const std::string data = root / "/halvard/sys/statusinfo/cpu_temp_data.txt", longLine(2000, 'x'),
                      longFile = longLine + "\n";
    const std::string start = "echo start > " + fanTest, stop = "echo stop > " + fanTest;
    const std::string script = root / "/etc/halvard/config/system/cpu_temp.sh &", kill = "killall cpu_temp.sh";
    const Rec head = Cont("[CPU FAN Temp Test]");
    const std::vector<std::string> ended = {kill, "rm -rf " + data};
    struct Case {
        U32 mode;
        std::string file;
        const char *content;  // nullptr: no file
        Recs records;
        std::vector<std::string> commands;
    } cases[] = {
        {3, fanTest, "Stop\n", {head, End("CPU Fan  = Stop")}, {stop}},
        {2, fanTest, "running\n", {head, End("CPU Fan  = Running")}, {start}},
        {2, fanTest, "stop", {head, End("CPU Fan  = UNKOWN")}, {start}},
        {3, fanTest, "", {head, End("CPU Fan  = UNKOWN")}, {stop}},
        {3, fanTest, nullptr, {head, Cont("fail to open /proc/cpufantest"), End("CPU Fan  = UNKOWN")}, {stop}},
        // Recording starts only with a fan.
        {0, fanStatus, "TRUE\n", {head, Cont("CPU Fan  = TRUE"), End("CPU_TEMP_START = OK")}, {script}},
        {0, fanStatus, "FALSE\n", {head, End("CPU Fan  = FALSE")}, {}},
        {0, fanStatus, nullptr, {head, Cont("fail to open /proc/fanstatus"), End("CPU Fan  = FALSE")}, {}},
        // Its end sends the data line by line.
        {1, data, "45.0\n46.5\n47.0\n", {head, Cont("45.0"), Cont("46.5"), Cont("47.0"), End("CPU_TEMP_END = OK")},
         ended},
        {1, data, "45.0\n46.5\n47.0", {head, Cont("45.0"), Cont("46.5"), End("CPU_TEMP_END = OK")}, ended},
        {1, data, "1\n\n2\n", {head, Cont("1"), Cont(""), Cont("2"), End("CPU_TEMP_END = OK")}, ended},
        {1, data, "", {head, End("CPU_TEMP_END = OK")}, ended},
        {1, data, longFile.c_str(), {head, Cont(longLine.substr(0, 1023)), End("CPU_TEMP_END = OK")}, ended},
        {1, data, nullptr, {head, End("Error Opening cpu_temp_data.txt File")}, {kill}},
        {4, data, nullptr, {head, End("Argument 1 is wrong option.")}, {}},
        {0xFFFFFFFF, data, nullptr, {head, End("Argument 1 is wrong option.")}, {}},
    };
    std::filesystem::create_directories(root / "/proc");
    for (const Case &c : cases) {
        SCOPED_TRACE(testing::Message() << "mode " << c.mode << " " << (c.content ? c.content : "<no file>"));
        Restart();
        std::filesystem::remove(c.file);
        if (c.content) std::ofstream(c.file, std::ios::binary) << c.content;
        EXPECT_EQ(Seen(CPU_FAN_TEMP_CHK(c.mode)), c.records);
        EXPECT_EQ(commands, c.commands);
    }
}

// The machine name gives the controller class; the mono class refuses the
// temperature test before the mode check, the others fail without the print
// service (with it, whether a case reaches Java is the JVM tests' part).
TEST_F(CpuTemp, MachineNamesGiveTheControllerClassAndMonoRefusesTheTemperatureTest) {
    ASSERT_EQ(globalPrintObj.load(), nullptr);
    const std::pair<const char *, S32> cases[] = {{"i686", 0},    {"x86_64", 0},  {"ppc", 1}, {"powerpc64", 1},
                                                  {"armv5tel", 2}, {"armv7l", -1}, {"aarch64", -1}, {"", -1}};
    for (const auto &[machine, model] : cases) {
        SCOPED_TRACE(machine);
        MAA_SetMachineName(machine);
        EXPECT_EQ(currentmcmodel(), model);
        const std::string refusal = model == 2 ? "Do not support Mono Model" : "Failed";
        for (U32 mode : {0u, 7u}) EXPECT_EQ(Seen(CheckCPUTemperature(mode)), Recs{End(refusal)}) << mode;
    }
    EXPECT_TRUE(commands.empty());
}

}  // namespace
}  // namespace fntest
