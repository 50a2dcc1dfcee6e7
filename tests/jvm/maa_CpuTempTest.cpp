// CheckCPUTemperature of the loaded library against the recording daemons:
// the Java method it calls, the records the host gets, and that no Java
// failure or local reference is left behind (-Xcheck:jni fails the test on a
// pending exception or a local-reference overflow).
#include <string>
#include <utility>
#include <vector>

#include "print_Hidden.h"
#include "print_Support.h"

namespace {

using Rec = std::pair<U32, std::string>;
constexpr U32 C = 0, E = 1;  // CONTINUE, END

struct Result {  // TMAAResult
    U32 enContinue, ulResult, ulDataSize;
    U8 *pubData;
};

std::vector<Rec> written;
void capture(const Result *r) {
    written.emplace_back(r->enContinue, std::string(reinterpret_cast<const char *>(r->pubData), r->ulDataSize));
}

class CpuTemperatureJvm : public PrintJvmTest {
protected:
    // The reader waits on its queue with the daemon as globalPrintObj; the
    // test thread calls the function as the shell would.
    void Start(const char *daemonClass = fixtures::kRecordingDaemon) {
        StartReader(daemonClass, false);
        if (HasFatalFailure()) return;
        check = hidden::Function<Result *(U32)>("CheckCPUTemperature(unsigned int)");
        auto setWriter = hidden::Function<void(void (*)(const Result *))>(
            "MAA_SetResultWriter(void (*)(TMAAResult const*))");
        setMachine = hidden::Function<void(const char *)>("MAA_SetMachineName(char const*)");
        ASSERT_TRUE(check && setWriter && setMachine);
        setWriter(&capture);
        setMachine("x86_64");
        written.clear();
    }
    std::vector<Rec> Run(U32 mode) {
        written.clear();
        const Result *r = check(mode);
        std::vector<Rec> all = written;
        all.emplace_back(r->enContinue, std::string(reinterpret_cast<const char *>(r->pubData), r->ulDataSize));
        return all;
    }
    static bool ExceptionPending() { return jvm::Env()->ExceptionCheck() == JNI_TRUE; }

    Result *(*check)(U32) = nullptr;
    void (*setMachine)(const char *) = nullptr;
};

TEST_F(CpuTemperatureJvm, StartAndEndCallTheirJavaMethodsAndReportTheReply) {
    Start();
    if (HasFatalFailure()) return;
    EXPECT_EQ(Run(0), (std::vector<Rec>{{C, "[ CPU_TEMP_START ]"}, {C, "CPU_TEMP_START = OK"},
                                        {E, "CPU temperature recording started"}}));
    fixtures::SetReply("maaCheckCPUTemperatureEnd", "max 61.5 C\nmin 40.0 C");
    EXPECT_EQ(Run(1), (std::vector<Rec>{{C, "[ CPU_TEMP_END ]"}, {C, "CPU_TEMP_END = OK"},
                                        {E, "max 61.5 C\nmin 40.0 C"}}));
    EXPECT_EQ(fixtures::EventLines(),
              (std::vector<std::string>{"maaCheckCPUTemperatureStart", "maaCheckCPUTemperatureEnd"}));
}

TEST_F(CpuTemperatureJvm, ALongReplyIsCutToItsBuffer) {
    Start();
    if (HasFatalFailure()) return;
    const std::string reply(6000, 'r');
    fixtures::SetReply("maaCheckCPUTemperatureStart", reply);
    EXPECT_EQ(Run(0).back(), Rec(E, reply.substr(0, 4999)));
}

TEST_F(CpuTemperatureJvm, RefusedCasesNeverReachJava) {
    Start();
    if (HasFatalFailure()) return;
    EXPECT_EQ(Run(5), (std::vector<Rec>{{E, "Failed"}}));
    setMachine("armv5tel");
    EXPECT_EQ(Run(0), (std::vector<Rec>{{E, "Do not support Mono Model"}}));
    EXPECT_EQ(fixtures::Events(), "");
}

TEST_F(CpuTemperatureJvm, JavaFailuresEndTheTestAndAreCleared) {
    Start();
    if (HasFatalFailure()) return;
    const std::vector<Rec> noReply{
        {C, "[ CPU_TEMP_END ]"}, {C, "CPU_TEMP_END = OK"}, {E, "Failed jcheckCPUTemperature NULL"}};
    fixtures::ReturnNull("maaCheckCPUTemperatureEnd");
    EXPECT_EQ(Run(1), noReply);
    fixtures::ReturnNull("maaCheckCPUTemperatureEnd", false);
    fixtures::ThrowOn("maaCheckCPUTemperatureEnd", 1);
    EXPECT_EQ(Run(1), noReply);
    EXPECT_FALSE(ExceptionPending());
    EXPECT_EQ(fixtures::EventLines(),
              (std::vector<std::string>{"maaCheckCPUTemperatureEnd!null", "maaCheckCPUTemperatureEnd!throw"}));
}

TEST_F(CpuTemperatureJvm, ADaemonWithoutTheMethodsFailsCleanly) {
    Start(fixtures::kDaemonWithoutUpcalls);
    if (HasFatalFailure()) return;
    EXPECT_EQ(Run(0), (std::vector<Rec>{{C, "[ CPU_TEMP_START ]"}, {E, "Failed midCheckCPUTemperature NULL"}}));
    EXPECT_FALSE(ExceptionPending());
}

TEST_F(CpuTemperatureJvm, RepeatedCallsLeaveNoLocalReferences) {
    Start();
    if (HasFatalFailure()) return;
    // The test thread's one local frame lives as long as the thread: a leaked
    // reference per call would exceed its capacity and -Xcheck:jni would say so.
    for (int i = 0; i < 100; ++i) ASSERT_EQ(Run(i % 2).back().first, E);
    EXPECT_EQ(fixtures::Calls("maaCheckCPUTemperatureStart"), 50);
}

}  // namespace
