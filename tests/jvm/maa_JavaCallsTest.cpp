// The test functions that go to Java, in the library the JVM loaded: the CPU
// temperature recording and the panel switch on the print daemon, the engine
// string interface on the print daemon and the general function on the MAA
// object. What Java receives (the fixtures' journal), what the host receives
// (the records), and that no Java failure or local reference is left behind
// (-Xcheck:jni fails the test on a pending exception or a local-reference
// overflow).
#include <jni.h>

#include <atomic>
#include <list>
#include <optional>

#include "maa/MAA_Types.h"
#include "print_Hidden.h"
#include "print_Support.h"
#include "support/MaaRecords.h"

namespace {

using namespace maarec;

// The library's shell functions, looked up on construction once Java has
// loaded the library (a missing one fails the test).
struct Shell {
    using Fn1 = TMAAResult *(U32);
    using Writer = void (*)(const TMAAResult *);
    void (*SetResultWriter)(Writer) =
        hidden::Function<void(Writer)>("MAA_SetResultWriter(void (*)(TMAAResult const*))");
    void (*SetCmdString)(const U8 *) = hidden::Function<void(const U8 *)>("MAA_SetCmdString(unsigned char const*)");
    void (*SetCmdName)(const U8 *) = hidden::Function<void(const U8 *)>("MAA_SetCmdName(unsigned char const*)");
    void (*SetMachineName)(const char *) = hidden::Function<void(const char *)>("MAA_SetMachineName(char const*)");
    U32 (*AddrMap)(void *, U32) = hidden::Function<U32(void *, U32)>("MAA_AddrMap(void*, unsigned int)");
    TMAAResult *(*General)(U32, U32 *) =
        hidden::Function<TMAAResult *(U32, U32 *)>("MAA_GENERAL_FUNCTION(unsigned int, unsigned int*)");
    TMAAResult *(*StrIFOpt2)(U32, U32) =
        hidden::Function<TMAAResult *(U32, U32)>("Eng_MaaStrIFOpt2(unsigned int, unsigned int)");
    TMAAResult *(*SetUIEnable)() = hidden::Function<TMAAResult *()>("SetUIEnable()");
    Fn1 *PBAStrIFOpt1 = hidden::Function<Fn1>("Eng_MaaPBAStrIFOpt1(unsigned int)");
    Fn1 *ImgStbStart = hidden::Function<Fn1>("Eng_MaaImgStbStart(unsigned int)");
    Fn1 *FTCATest = hidden::Function<Fn1>("Eng_MaaStrFTCATest(unsigned int)");
    Fn1 *CheckCPUTemperature = hidden::Function<Fn1>("CheckCPUTemperature(unsigned int)");
};

// The reader waits on its queue with the daemon as globalPrintObj and leaves
// the library to the test thread, which calls the functions as the shell would.
class MaaJvm : public PrintJvmTest {
protected:
    void SetUp() override {
        PrintJvmTest::SetUp();
        StartReader(Daemon(), false);
        if (HasFatalFailure()) return;
        sh.emplace();
        ASSERT_FALSE(HasFailure());
        sh->SetResultWriter(&Capture);
        sh->SetMachineName("x86_64");
    }
    void TearDown() override {
        if (sh && sh->SetResultWriter) sh->SetResultWriter(nullptr);
        PrintJvmTest::TearDown();
    }
    virtual const char *Daemon() const { return fixtures::kRecordingDaemon; }

    // The shell's state before a call: the command line and the called name.
    void Command(const std::string &line, const std::string &name) {
        command_ = line;
        name_ = name;
        sh->SetCmdString(reinterpret_cast<const U8 *>(command_.c_str()));
        sh->SetCmdName(reinterpret_cast<const U8 *>(name_.c_str()));
        written.clear();
        fixtures::Reset();
        LoggerHost_StartCapture();
    }
    U32 Map(const std::string &text) {
        std::string &kept = texts_.emplace_back(text);
        return sh->AddrMap(kept.data(), static_cast<U32>(kept.size() + 1));
    }
    // Records written at once, then the returned one; and no exception left.
    static Recs Seen(const TMAAResult *returned) {
        EXPECT_FALSE(jvm::Env()->ExceptionCheck()) << "a Java exception was left pending";
        return maarec::Seen(returned);
    }
    // What the host receives from one call on its own.
    template <typename Call>
    static Recs HostSees(Call call) {
        written.clear();
        return Seen(call());
    }
    Recs Temperature(U32 mode) {
        return HostSees([&] { return sh->CheckCPUTemperature(mode); });
    }

    std::optional<Shell> sh;
    std::string command_, name_;
    std::list<std::string> texts_;
};

class MaaJvmWithoutUpcalls : public MaaJvm {
protected:
    const char *Daemon() const override { return jvm::kPrintAndScanService; }
};

TEST_F(MaaJvm, CpuTemperatureStartAndEndCallTheirJavaMethodsAndReportTheReply) {
    EXPECT_EQ(Temperature(0), (Recs{Cont("[ CPU_TEMP_START ]"), Cont("CPU_TEMP_START = OK"),
                                    End("CPU temperature recording started")}));
    fixtures::SetReply("maaCheckCPUTemperatureEnd", "max 61.5 C\nmin 40.0 C");
    EXPECT_EQ(Temperature(1),
              (Recs{Cont("[ CPU_TEMP_END ]"), Cont("CPU_TEMP_END = OK"), End("max 61.5 C\nmin 40.0 C")}));
    const std::string reply(6000, 'r');
    fixtures::SetReply("maaCheckCPUTemperatureStart", reply);
    EXPECT_EQ(Temperature(0).back(), End(reply.substr(0, 4999)));  // cut to its buffer
    EXPECT_EQ(Temperature(5), Recs{End("Failed")});  // refused: never reaches Java
    EXPECT_EQ(fixtures::EventLines(), (std::vector<std::string>{"maaCheckCPUTemperatureStart",
                                                                "maaCheckCPUTemperatureEnd",
                                                                "maaCheckCPUTemperatureStart"}));
}

TEST_F(MaaJvm, CpuTemperatureJavaFailuresEndTheTestAndAreCleared) {
    const Recs noReply{Cont("[ CPU_TEMP_END ]"), Cont("CPU_TEMP_END = OK"), End("Failed jcheckCPUTemperature NULL")};
    fixtures::ReturnNull("maaCheckCPUTemperatureEnd");
    EXPECT_EQ(Temperature(1), noReply);
    fixtures::ReturnNull("maaCheckCPUTemperatureEnd", false);
    fixtures::ThrowOn("maaCheckCPUTemperatureEnd", 1);
    EXPECT_EQ(Temperature(1), noReply);
    EXPECT_EQ(fixtures::EventLines(),
              (std::vector<std::string>{"maaCheckCPUTemperatureEnd!null", "maaCheckCPUTemperatureEnd!throw"}));
    // The test thread's one local frame lives as long as the thread: a leaked
    // reference per call would exceed its capacity and -Xcheck:jni would say so.
    for (int i = 0; i < 100; ++i) ASSERT_EQ(Temperature(i % 2).back().st, MAA_RESULT_END);
    EXPECT_EQ(fixtures::Calls("maaCheckCPUTemperatureStart"), 50);
}

TEST_F(MaaJvm, PanelSetUIEnableTakesTheServiceReplyAsTheVerdictAndJavaFailuresEndInFailed) {
    const auto call = [this] { return sh->SetUIEnable(); };
    const Rec header = Cont("[ SetUIEnable ]");
    EXPECT_EQ(HostSees(call), (Recs{header, End("SetUIEnable = OK")}));
    fixtures::SetReply("maaSetUIEnable", "panel on");
    EXPECT_EQ(HostSees(call), (Recs{header, End("panel on")}));
    fixtures::ReturnNull("maaSetUIEnable");
    EXPECT_EQ(HostSees(call), (Recs{header, End("Failed")}));
    fixtures::ReturnNull("maaSetUIEnable", false);
    fixtures::ThrowOn("maaSetUIEnable");
    EXPECT_EQ(HostSees(call), (Recs{header, End("Failed")}));
    EXPECT_EQ(fixtures::Calls("maaSetUIEnable"), 4);
}

// The reply comes back as one final record, or line by line in the PBA form
// (how lines are cut is the unit tests' part).
TEST_F(MaaJvm, EngineCommandReachesItsJavaMethodAndTheReplyComesBack) {
    const std::string longReply(6000, 'r');
    struct Case {
        TMAAResult *(*call)(const Shell &);
        const char *method, *logName;
        std::string reply;
        Recs seen;  // behind the header
    } cases[] = {
        {[](const Shell &s) { return s.StrIFOpt2(7, 8); }, "maaEngMaaStrNormalTest", "Eng_MaaStrNormalTest",
         "T=25\r\nH=40\r\n", {End("T=25\r\nH=40\r\n")}},
        {[](const Shell &s) { return s.StrIFOpt2(0, 0); }, "maaEngMaaStrNormalTest", "Eng_MaaStrNormalTest", longReply,
         {End(longReply.substr(0, 4607))}},  // the reply buffer's bound
        {[](const Shell &s) { return s.PBAStrIFOpt1(0); }, "maaEngMaaStrNormalTest", "Eng_MaaStrNormalTest",
         "Tray1=OK\r\nTray2=NG\r\n", {Cont("Tray1=OK"), End("Tray2=NG")}},
        {[](const Shell &s) { return s.ImgStbStart(1); }, "maaEngMaaImageStabilization", "Eng_MaaImgStbStart", "IS OK",
         {End("IS OK")}},
        {[](const Shell &s) { return s.FTCATest(1); }, "maaEngMaaOpcodeFTCATest", "Eng_MaaStrFTCATest", "FTCA 12",
         {End("FTCA 12")}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.method);
        Command("GetData(7,\"x y\")", "GetData");
        fixtures::SetReply(c.method, c.reply);
        Recs want{Cont("[ GetData ]")};
        want.insert(want.end(), c.seen.begin(), c.seen.end());
        EXPECT_EQ(Seen(c.call(*sh)), want);
        EXPECT_EQ(fixtures::EventLines(), std::vector<std::string>{std::string(c.method) + ":GetData(7,\"x y\")"});
        EXPECT_EQ(LoggerHost_Count("[" + std::string(c.logName) + "] Start===>(GetData(7,\"x y\"))(GetData)\n"), 1);
    }
}

TEST_F(MaaJvm, HostBytesThatAreNoModifiedUtf8ReachJavaAsQuestionMarks) {
    Command("GetData(\"\xff\xc3\xa9\xc0\x80\")", "GetData");
    EXPECT_EQ(Seen(sh->StrIFOpt2(0, 0)).back().data, "NG: no engine");
    EXPECT_EQ(fixtures::EventLines(), std::vector<std::string>{"maaEngMaaStrNormalTest:GetData(\"?\xc3\xa9??\")"});
}

TEST_F(MaaJvm, EngineFailuresEndWithTheirTextsAndLeaveNoException) {
    struct Case {
        void (*fail)();
        bool command;  // a command string is set
        const char *verdict, *logged;
        int calls;
    } cases[] = {
        {[] { fixtures::ReturnNull("maaEngMaaStrNormalTest"); }, true, "GetData=NG",
         "Error in Eng_MaaStrNormalTest()::Return Data(GetData)\n", 1},
        {[] { fixtures::ThrowOn("maaEngMaaStrNormalTest"); }, true, "GetData=NG", nullptr, 1},
        {[] {}, false, "Failed", "Error in Eng_MaaStrNormalTest()::can't get MAA Command String\n", 0},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.verdict);
        Command("GetData(1,2)", "GetData");
        if (!c.command) sh->SetCmdString(nullptr);
        c.fail();
        EXPECT_EQ(Seen(sh->StrIFOpt2(1, 2)), (Recs{Cont("[ GetData ]"), End(c.verdict)}));
        if (c.logged) { EXPECT_EQ(LoggerHost_Count(c.logged), 1); }
        EXPECT_EQ(fixtures::Calls("maaEngMaaStrNormalTest"), c.calls);
    }
}

TEST_F(MaaJvmWithoutUpcalls, EveryCallFailsCleanly) {
    const Recs failed{Cont("[ ImageStablization ]"), End("Failed")};
    struct Case { TMAAResult *(*call)(const Shell &); Recs seen; std::string logged; } cases[] = {
        {[](const Shell &s) { return s.StrIFOpt2(1, 2); }, failed,
         "Error in Eng_MaaStrNormalTest()::can't find Eng_MaaStrNormalTest()\n"},
        {[](const Shell &s) { return s.ImgStbStart(1); }, failed,
         "Error in Eng_MaaImgStbStart()::can't find maaEngMaaImageStabilization().\n"},
        {[](const Shell &s) { return s.FTCATest(1); }, failed,
         "Error in Eng_MaaStrFTCATest()::can't find maaEngMaaOpcodeFTCATest().\n"},
        {[](const Shell &s) { return s.SetUIEnable(); }, {Cont("[ SetUIEnable ]"), End("Failed")},
         "can't find maaSetUIEnable()"},
        {[](const Shell &s) { return s.CheckCPUTemperature(0); },
         {Cont("[ CPU_TEMP_START ]"), End("Failed midCheckCPUTemperature NULL")}, ""},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.logged);
        Command("ImageStablization(1)", "ImageStablization");
        EXPECT_EQ(Seen(c.call(*sh)), c.seen);
        EXPECT_TRUE(LoggerHost_Contains(c.logged));
    }
}

// Argument texts and reply prefixes are the unit tests' part; here they
// cross to Java and back, no arguments as an empty array.
TEST_F(MaaJvm, GeneralFunctionPassesIdAndArgumentTextsAndSendsTheReplyByItsPrefix) {
    struct Case { std::vector<U32> args; std::string reply, journaled; Recs seen; } cases[] = {
        {{1000000, Map("text")}, "spider:ABC", "1000000,text", {End("ABC")}},
        {{}, "idpt:L1\r\nL2", "", {Cont("L1"), End("L2")}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.journaled);
        Command("MyFunc(...)", "MyFunc");
        fixtures::SetReply("runUsbFunctionCall", c.reply);
        std::vector<U32> args = c.args;
        EXPECT_EQ(Seen(sh->General(static_cast<U32>(args.size()), args.data())), c.seen);
        EXPECT_EQ(fixtures::EventLines(), std::vector<std::string>{"runUsbFunctionCall:MyFunc:" + c.journaled});
    }
}

TEST_F(MaaJvm, GeneralFunctionRefusesBadArgumentsWithoutCallingJava) {
    const U32 tooLong = Map(std::string(101, 'h'));
    struct Case { const char *what; std::vector<U32> args; } cases[] = {
        {"1000001 is a text address, and none is mapped there", {1000001}},
        {"a text of 101 characters", {7, tooLong}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.what);
        Command("MyFunc(...)", "MyFunc");
        std::vector<U32> args = c.args;
        EXPECT_EQ(sh->General(static_cast<U32>(args.size()), args.data()), nullptr);
        EXPECT_EQ(Seen(nullptr), Recs{});
        EXPECT_EQ(fixtures::Calls("runUsbFunctionCall"), 0);
    }
}

TEST_F(MaaJvm, GeneralFunctionWithoutAReplyLogsItAndEndsWithFailed) {
    U32 args[] = {5};
    Command("Unknown(5)", "Unknown");  // the service serves no such function: null
    EXPECT_EQ(Seen(sh->General(1, args)), (Recs{End("Failed")}));
    EXPECT_EQ(LoggerHost_Count("Result string is NULL!\n"), 1);
    EXPECT_EQ(fixtures::EventLines(), std::vector<std::string>{"runUsbFunctionCall:Unknown:5"});

    Command("Unknown(5)", "Unknown");
    fixtures::ThrowOn("runUsbFunctionCall");
    EXPECT_EQ(Seen(sh->General(1, args)), (Recs{End("Failed")}));
    EXPECT_EQ(LoggerHost_Count("Result string is NULL!\n"), 1);

    Command("SetUIEnable()", "SetUIEnable");  // the service's own answer
    EXPECT_EQ(Seen(sh->General(0, args)), (Recs{End("SetUIEnable = OK")}));

    // An MAA object without the method.
    auto *maaSlot = hidden::Variable<std::atomic<jobject>>("globalMAAObj");
    ASSERT_NE(maaSlot, nullptr);
    maaSlot->store(jvm::New(jvm::kPrintAndScanService));
    Command("Unknown(5)", "Unknown");
    EXPECT_EQ(Seen(sh->General(1, args)), (Recs{End("Failed")}));
    EXPECT_EQ(LoggerHost_Count("[MAA] can't find runUsbFunctionCall()\n"), 1);
}

}  // namespace
