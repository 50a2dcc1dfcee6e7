// The CPU temperature and fan tests as the host sees them: the records sent and
// returned, the shell commands they run (recorded, never run) and the status
// files they read under a private root.
#include <filesystem>

#include "maa_functions/FnFixture.h"
#include "print/USBPrint.h"

namespace fntest {
namespace {

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

TEST_F(CpuTemp, MachineNamesGiveTheControllerClass) {
    const std::pair<const char *, S32> cases[] = {{"i686", 0},    {"x86_64", 0},  {"ppc", 1}, {"powerpc64", 1},
                                                  {"armv5tel", 2}, {"armv7l", -1}, {"aarch64", -1}, {"", -1}};
    for (const auto &[machine, model] : cases) {
        MAA_SetMachineName(machine);
        EXPECT_EQ(currentmcmodel(), model) << machine;
    }
}

// The mono refusal comes before the mode check; with the print service,
// whether a case reaches Java is the JVM tests' part.
TEST_F(CpuTemp, TemperatureRefusalsEndAtOnce) {
    ASSERT_EQ(globalPrintObj.load(), nullptr);
    for (U32 mode : {0u, 7u}) {
        MAA_SetMachineName("armv5tel");
        EXPECT_EQ(Seen(CheckCPUTemperature(mode)), Recs{End("Do not support Mono Model")});
        MAA_SetMachineName("x86_64");
        EXPECT_EQ(Seen(CheckCPUTemperature(mode)), Recs{End("Failed")});  // no print-service object
    }
    EXPECT_TRUE(commands.empty());
}

}  // namespace
}  // namespace fntest
