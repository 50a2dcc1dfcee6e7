// The CPU temperature and fan tests as the host sees them: the records sent and
// returned, the shell commands they run (recorded, never run) and the status
// files they read under a private root.
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <string>
#include <utility>
#include <vector>

#include "support/TempRoot.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_Result.h"
#include "maa/functions/MAA_CpuTemp.h"
#include "maa/functions/MAA_SysResult.h"
#include "print/USBPrint.h"

namespace {

using Rec = std::pair<U32, std::string>;  // enContinue, text
constexpr U32 C = MAA_RESULT_CONTINUE, E = MAA_RESULT_END;

std::vector<Rec> written;
std::vector<std::string> commands;

void capture(const TMAAResult *r) {
    written.emplace_back(r->enContinue, std::string(reinterpret_cast<const char *>(r->pubData), r->ulDataSize));
}
int recordCommand(const char *command, TMAARunVia) {
    commands.emplace_back(command);
    return 0;
}

class CpuTempTest : public ::testing::Test {
protected:
    void SetUp() override {
        written.clear();
        commands.clear();
        enSpecialMode = MAA_NORMAL_CMD;
        MAA_SetResultWriter(&capture);
        MAA_SetCommandRunner(&recordCommand);
        std::filesystem::create_directories(root / "/proc");
    }
    void TearDown() override {
        MAA_SetResultWriter(nullptr);
        MAA_SetCommandRunner(nullptr);
        MAA_SetMachineName(nullptr);
    }

    // Everything the host gets: the records written at once, then the returned one.
    static std::vector<Rec> seen(const TMAAResult *r) {
        std::vector<Rec> all = written;
        all.emplace_back(r->enContinue, std::string(reinterpret_cast<const char *>(r->pubData), r->ulDataSize));
        return all;
    }
    void put(const char *fixed, const char *content) {
        if (content) std::ofstream(root / fixed, std::ios::binary) << content;
    }

    TempRoot root;
};

TEST_F(CpuTempTest, FanTestWritesItsCommandAndReadsTheStateBack) {
    struct Case {
        U32 mode;
        const char *state;  // nullptr: no /proc/cpufantest
        std::vector<Rec> records;
    } cases[] = {
        {3, "Stop\n", {{C, "[CPU FAN Temp Test]"}, {E, "CPU Fan  = Stop"}}},
        {2, "running\n", {{C, "[CPU FAN Temp Test]"}, {E, "CPU Fan  = Running"}}},
        {2, "stop", {{C, "[CPU FAN Temp Test]"}, {E, "CPU Fan  = UNKOWN"}}},
        {3, "", {{C, "[CPU FAN Temp Test]"}, {E, "CPU Fan  = UNKOWN"}}},
        {3, nullptr, {{C, "[CPU FAN Temp Test]"}, {C, "fail to open /proc/cpufantest"}, {E, "CPU Fan  = UNKOWN"}}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(testing::Message() << "mode " << c.mode << " state " << (c.state ? c.state : "<none>"));
        written.clear();
        commands.clear();
        std::filesystem::remove(root / "/proc/cpufantest");
        put("/proc/cpufantest", c.state);
        EXPECT_EQ(seen(CPU_FAN_TEMP_CHK(c.mode)), c.records);
        const std::string word = c.mode == 2 ? "start" : "stop";
        EXPECT_EQ(commands, std::vector<std::string>{"echo " + word + " > " + root.path() + "/proc/cpufantest"});
    }
}

TEST_F(CpuTempTest, RecordingStartsOnlyWithAFan) {
    const std::string script = root.path() + "/etc/halvard/config/system/cpu_temp.sh &";
    struct Case {
        const char *fanStatus;
        std::vector<Rec> records;
        std::vector<std::string> commands;
    } cases[] = {
        {"TRUE\n", {{C, "[CPU FAN Temp Test]"}, {C, "CPU Fan  = TRUE"}, {E, "CPU_TEMP_START = OK"}}, {script}},
        {"FALSE\n", {{C, "[CPU FAN Temp Test]"}, {E, "CPU Fan  = FALSE"}}, {}},
        {nullptr, {{C, "[CPU FAN Temp Test]"}, {C, "fail to open /proc/fanstatus"}, {E, "CPU Fan  = FALSE"}}, {}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.fanStatus ? c.fanStatus : "<no file>");
        written.clear();
        commands.clear();
        std::filesystem::remove(root / "/proc/fanstatus");
        put("/proc/fanstatus", c.fanStatus);
        EXPECT_EQ(seen(CPU_FAN_TEMP_CHK(0)), c.records);
        EXPECT_EQ(commands, c.commands);
    }
}

TEST_F(CpuTempTest, RecordingEndSendsTheDataLineByLine) {
    const std::string data = root.path() + "/halvard/sys/statusinfo/cpu_temp_data.txt";
    const std::string longLine(2000, 'x');
    struct Case {
        const char *name;
        std::string content;
        std::vector<std::string> lines;
    } cases[] = {
        {"three lines", "45.0\n46.5\n47.0\n", {"45.0", "46.5", "47.0"}},
        {"last line without line feed", "45.0\n46.5\n47.0", {"45.0", "46.5"}},
        {"empty line inside", "1\n\n2\n", {"1", "", "2"}},
        {"empty file", "", {}},
        {"line longer than the line buffer", longLine + "\n", {longLine.substr(0, 1023)}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        written.clear();
        commands.clear();
        std::ofstream(data, std::ios::binary) << c.content;
        std::vector<Rec> expected{{C, "[CPU FAN Temp Test]"}};
        for (const std::string &l : c.lines) expected.emplace_back(C, l);
        expected.emplace_back(E, "CPU_TEMP_END = OK");
        EXPECT_EQ(seen(CPU_FAN_TEMP_CHK(1)), expected);
        EXPECT_EQ(commands, (std::vector<std::string>{"killall cpu_temp.sh", "rm -rf " + data}));
    }
}

TEST_F(CpuTempTest, RecordingEndWithoutDataSaysSo) {
    EXPECT_EQ(seen(CPU_FAN_TEMP_CHK(1)),
              (std::vector<Rec>{{C, "[CPU FAN Temp Test]"}, {E, "Error Opening cpu_temp_data.txt File"}}));
    EXPECT_EQ(commands, std::vector<std::string>{"killall cpu_temp.sh"});
}

TEST_F(CpuTempTest, UnknownFanModesAreRefusedAfterTheHeader) {
    for (U32 mode : {4u, 0xFFFFFFFFu}) {
        written.clear();
        EXPECT_EQ(seen(CPU_FAN_TEMP_CHK(mode)),
                  (std::vector<Rec>{{C, "[CPU FAN Temp Test]"}, {E, "Argument 1 is wrong option."}}));
    }
    EXPECT_TRUE(commands.empty());
}

TEST_F(CpuTempTest, MachineNamesGiveTheControllerClass) {
    const std::pair<const char *, S32> cases[] = {
        {"i686", 0},     {"x86_64", 0}, {"ppc", 1},      {"powerpc64", 1}, {"armv5tel", 2},
        {"armv7l", -1},  {"aarch64", -1}, {"", -1},
    };
    for (const auto &[machine, model] : cases) {
        MAA_SetMachineName(machine);
        EXPECT_EQ(currentmcmodel(), model) << machine;
    }
}

TEST_F(CpuTempTest, TemperatureRefusalsComeBeforeAnyJavaCall) {
    // No print service here: a case that got as far as Java would end in "Failed"
    // after a header; these end at once, with nothing written before.
    struct Case {
        const char *machine;
        U32 mode;
        const char *verdict;
    } cases[] = {
        {"armv5tel", 0, "Do not support Mono Model"},
        {"armv5tel", 7, "Do not support Mono Model"},
        {"x86_64", 5, "Failed"},
        {"x86_64", 0xFFFFFFFF, "Failed"},
        {"x86_64", 0, "Failed"},  // no print-service object
        {"x86_64", 1, "Failed"},
    };
    ASSERT_EQ(globalPrintObj.load(), nullptr);
    for (const Case &c : cases) {
        SCOPED_TRACE(testing::Message() << c.machine << " mode " << c.mode);
        written.clear();
        MAA_SetMachineName(c.machine);
        EXPECT_EQ(seen(CheckCPUTemperature(c.mode)), (std::vector<Rec>{{E, c.verdict}}));
    }
    EXPECT_TRUE(commands.empty());
}

}  // namespace
