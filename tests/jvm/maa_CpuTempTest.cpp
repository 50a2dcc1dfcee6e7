// CheckCPUTemperature of the loaded library against the recording daemons:
// the Java method it calls, the records the host gets, and that no Java
// failure or local reference is left behind (-Xcheck:jni fails the test on a
// pending exception or a local-reference overflow).
#include "maa/MAA_Types.h"
#include "print_Hidden.h"
#include "print_Support.h"
#include "support/MaaRecords.h"

namespace {

using namespace maarec;

class CpuTemperatureJvm : public PrintJvmTest {
protected:
    // The reader waits on its queue with the daemon as globalPrintObj; the
    // test thread calls the function as the shell would.
    void Start(const char *daemonClass = fixtures::kRecordingDaemon) {
        StartReader(daemonClass, false);
        if (HasFatalFailure()) return;
        check = hidden::Function<TMAAResult *(U32)>("CheckCPUTemperature(unsigned int)");
        auto setWriter = hidden::Function<void(void (*)(const TMAAResult *))>(
            "MAA_SetResultWriter(void (*)(TMAAResult const*))");
        setMachine = hidden::Function<void(const char *)>("MAA_SetMachineName(char const*)");
        ASSERT_TRUE(check && setWriter && setMachine);
        setWriter(&Capture);
        setMachine("x86_64");
    }
    Recs Run(U32 mode) {
        written.clear();
        Recs all = Seen(check(mode));
        EXPECT_FALSE(jvm::Env()->ExceptionCheck()) << "a Java exception was left pending";
        return all;
    }

    TMAAResult *(*check)(U32) = nullptr;
    void (*setMachine)(const char *) = nullptr;
};

TEST_F(CpuTemperatureJvm, StartAndEndCallTheirJavaMethodsAndReportTheReply) {
    Start();
    if (HasFatalFailure()) return;
    EXPECT_EQ(Run(0), (Recs{Cont("[ CPU_TEMP_START ]"), Cont("CPU_TEMP_START = OK"),
                            End("CPU temperature recording started")}));
    fixtures::SetReply("maaCheckCPUTemperatureEnd", "max 61.5 C\nmin 40.0 C");
    EXPECT_EQ(Run(1), (Recs{Cont("[ CPU_TEMP_END ]"), Cont("CPU_TEMP_END = OK"), End("max 61.5 C\nmin 40.0 C")}));
    const std::string reply(6000, 'r');
    fixtures::SetReply("maaCheckCPUTemperatureStart", reply);
    EXPECT_EQ(Run(0).back(), End(reply.substr(0, 4999)));  // cut to its buffer
    // Refused cases never reach Java.
    EXPECT_EQ(Run(5), Recs{End("Failed")});
    setMachine("armv5tel");
    EXPECT_EQ(Run(0), Recs{End("Do not support Mono Model")});
    EXPECT_EQ(fixtures::EventLines(), (std::vector<std::string>{"maaCheckCPUTemperatureStart",
                                                                "maaCheckCPUTemperatureEnd",
                                                                "maaCheckCPUTemperatureStart"}));
}

TEST_F(CpuTemperatureJvm, JavaFailuresEndTheTestAndAreCleared) {
    Start();
    if (HasFatalFailure()) return;
    const Recs noReply{Cont("[ CPU_TEMP_END ]"), Cont("CPU_TEMP_END = OK"), End("Failed jcheckCPUTemperature NULL")};
    fixtures::ReturnNull("maaCheckCPUTemperatureEnd");
    EXPECT_EQ(Run(1), noReply);
    fixtures::ReturnNull("maaCheckCPUTemperatureEnd", false);
    fixtures::ThrowOn("maaCheckCPUTemperatureEnd", 1);
    EXPECT_EQ(Run(1), noReply);
    EXPECT_EQ(fixtures::EventLines(),
              (std::vector<std::string>{"maaCheckCPUTemperatureEnd!null", "maaCheckCPUTemperatureEnd!throw"}));
    // The test thread's one local frame lives as long as the thread: a leaked
    // reference per call would exceed its capacity and -Xcheck:jni would say so.
    for (int i = 0; i < 100; ++i) ASSERT_EQ(Run(i % 2).back().st, MAA_RESULT_END);
    EXPECT_EQ(fixtures::Calls("maaCheckCPUTemperatureStart"), 50);
}

TEST_F(CpuTemperatureJvm, ADaemonWithoutTheMethodsFailsCleanly) {
    Start(fixtures::kDaemonWithoutUpcalls);
    if (HasFatalFailure()) return;
    EXPECT_EQ(Run(0), (Recs{Cont("[ CPU_TEMP_START ]"), End("Failed midCheckCPUTemperature NULL")}));
}

}  // namespace
