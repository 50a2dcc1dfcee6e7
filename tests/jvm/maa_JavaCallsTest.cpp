// The test functions that go to Java, in the library the JVM loaded: the engine
// string interface on the print daemon and the general function on the MAA
// object. What Java receives (the fixtures' journal), what the host receives
// (the records), and that no Java failure leaves an exception pending.
#include <jni.h>

#include <atomic>
#include <list>

#include "maa/MAA_Types.h"
#include "print_Hidden.h"
#include "print_Support.h"
#include "support/MaaRecords.h"

namespace {

using namespace maarec;

// The library's shell functions, found once Java has loaded it.
struct Shell {
    using Writer = void (*)(const TMAAResult *);
    void (*SetResultWriter)(Writer) = nullptr;
    void (*SetCmdString)(const U8 *) = nullptr;
    void (*SetCmdName)(const U8 *) = nullptr;
    U32 (*AddrMap)(void *, U32) = nullptr;
    TMAAResult *(*General)(U32, U32 *) = nullptr;
    TMAAResult *(*StrIFOpt2)(U32, U32) = nullptr;
    TMAAResult *(*PBAStrIFOpt1)(U32) = nullptr;
    TMAAResult *(*ImgStbStart)(U32) = nullptr;
    TMAAResult *(*FTCATest)(U32) = nullptr;

    bool Load() {
        SetResultWriter = hidden::Function<void(Writer)>("MAA_SetResultWriter(void (*)(TMAAResult const*))");
        SetCmdString = hidden::Function<void(const U8 *)>("MAA_SetCmdString(unsigned char const*)");
        SetCmdName = hidden::Function<void(const U8 *)>("MAA_SetCmdName(unsigned char const*)");
        AddrMap = hidden::Function<U32(void *, U32)>("MAA_AddrMap(void*, unsigned int)");
        General = hidden::Function<TMAAResult *(U32, U32 *)>("MAA_GENERAL_FUNCTION(unsigned int, unsigned int*)");
        StrIFOpt2 = hidden::Function<TMAAResult *(U32, U32)>("Eng_MaaStrIFOpt2(unsigned int, unsigned int)");
        PBAStrIFOpt1 = hidden::Function<TMAAResult *(U32)>("Eng_MaaPBAStrIFOpt1(unsigned int)");
        ImgStbStart = hidden::Function<TMAAResult *(U32)>("Eng_MaaImgStbStart(unsigned int)");
        FTCATest = hidden::Function<TMAAResult *(U32)>("Eng_MaaStrFTCATest(unsigned int)");
        return SetResultWriter && SetCmdString && SetCmdName && AddrMap && General && StrIFOpt2 && PBAStrIFOpt1 &&
               ImgStbStart && FTCATest;
    }
};

class MaaJavaCalls : public PrintJvmTest {
protected:
    // The reader waits on its queue and leaves the library to the test thread.
    void Start(const char *daemonClass = fixtures::kRecordingDaemon) {
        StartReader(daemonClass, false);
        if (HasFatalFailure()) return;
        ASSERT_TRUE(sh.Load());
        sh.SetResultWriter(&Capture);
    }
    void TearDown() override {
        if (sh.SetResultWriter) sh.SetResultWriter(nullptr);
        PrintJvmTest::TearDown();
    }
    // The shell's state before a call: the command line and the called name.
    void Command(const std::string &line, const std::string &name) {
        command_ = line;
        name_ = name;
        sh.SetCmdString(reinterpret_cast<const U8 *>(command_.c_str()));
        sh.SetCmdName(reinterpret_cast<const U8 *>(name_.c_str()));
        written.clear();
        fixtures::Reset();
        LoggerHost_StartCapture();
    }
    U32 Map(const std::string &text) {
        std::string &kept = texts_.emplace_back(text);
        return sh.AddrMap(kept.data(), static_cast<U32>(kept.size() + 1));
    }
    // Recs written at once, then the returned one; and no exception left.
    Recs Seen(const TMAAResult *returned) {
        EXPECT_FALSE(jvm::Env()->ExceptionCheck()) << "a Java exception was left pending";
        return maarec::Seen(returned);
    }

    Shell sh;
    std::string command_, name_;
    std::list<std::string> texts_;
};

TEST_F(MaaJavaCalls, EngineCommandReachesItsJavaMethodAndTheReplyComesBackAsOneFinalRecord) {
    Start();
    if (HasFatalFailure()) return;
    const std::string longReply(6000, 'r');
    struct Case {
        TMAAResult *(*call)(const Shell &);
        const char *method, *logName;
        std::string reply, sent;
    } cases[] = {
        {[](const Shell &s) { return s.StrIFOpt2(7, 8); }, "maaEngMaaStrNormalTest", "Eng_MaaStrNormalTest",
         "T=25\r\nH=40\r\n", "T=25\r\nH=40\r\n"},
        {[](const Shell &s) { return s.StrIFOpt2(0, 0); }, "maaEngMaaStrNormalTest", "Eng_MaaStrNormalTest", longReply,
         longReply.substr(0, 4607)},  // the reply buffer's bound
        {[](const Shell &s) { return s.ImgStbStart(1); }, "maaEngMaaImageStabilization", "Eng_MaaImgStbStart", "IS OK",
         "IS OK"},
        {[](const Shell &s) { return s.FTCATest(1); }, "maaEngMaaOpcodeFTCATest", "Eng_MaaStrFTCATest", "FTCA 12",
         "FTCA 12"},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.method);
        Command("GetData(7,\"x y\")", "GetData");
        fixtures::SetReply(c.method, c.reply);
        EXPECT_EQ(Seen(c.call(sh)), (Recs{Cont("[ GetData ]"), End(c.sent)}));
        EXPECT_EQ(fixtures::EventLines(), std::vector<std::string>{std::string(c.method) + ":GetData(7,\"x y\")"});
        EXPECT_EQ(LoggerHost_Count("[" + std::string(c.logName) + "] Start===>(GetData(7,\"x y\"))(GetData)\n"), 1);
    }
}

TEST_F(MaaJavaCalls, PbaReplyIsSentLineByLineAndEachLineLosesItsCarriageReturn) {
    Start();
    if (HasFatalFailure()) return;
    Command("FRA_Feed(1,2,3,4)", "FRA_Feed");
    fixtures::SetReply("maaEngMaaStrNormalTest", "Tray1=OK\r\nTray2=NG\r\n" + std::string(80, 'z') + "\r\nEND\r\n");
    EXPECT_EQ(Seen(sh.PBAStrIFOpt1(0)), (Recs{Cont("[ FRA_Feed ]"), Cont("Tray1=OK"), Cont("Tray2=NG"),
                                              Cont(std::string(63, 'z')), End("END")}));
}

TEST_F(MaaJavaCalls, HostBytesThatAreNoModifiedUtf8ReachJavaAsQuestionMarks) {
    Start();
    if (HasFatalFailure()) return;
    Command("GetData(\"\xff\xc3\xa9\xc0\x80\")", "GetData");
    EXPECT_EQ(Seen(sh.StrIFOpt2(0, 0)).back().data, "NG: no engine");
    EXPECT_EQ(fixtures::EventLines(), std::vector<std::string>{"maaEngMaaStrNormalTest:GetData(\"?\xc3\xa9??\")"});
}

TEST_F(MaaJavaCalls, EngineFailuresEndWithTheirTextsAndLeaveNoException) {
    Start();
    if (HasFatalFailure()) return;
    Command("GetData(1,2)", "GetData");
    fixtures::ReturnNull("maaEngMaaStrNormalTest");
    EXPECT_EQ(Seen(sh.StrIFOpt2(1, 2)), (Recs{Cont("[ GetData ]"), End("GetData=NG")}));
    EXPECT_EQ(LoggerHost_Count("Error in Eng_MaaStrNormalTest()::Return Data(GetData)\n"), 1);

    Command("GetData(1,2)", "GetData");
    fixtures::ThrowOn("maaEngMaaStrNormalTest");
    EXPECT_EQ(Seen(sh.StrIFOpt2(1, 2)), (Recs{Cont("[ GetData ]"), End("GetData=NG")}));
    EXPECT_EQ(fixtures::Calls("maaEngMaaStrNormalTest"), 1);

    Command("", "GetData");
    sh.SetCmdString(nullptr);
    EXPECT_EQ(Seen(sh.StrIFOpt2(1, 2)), (Recs{Cont("[ GetData ]"), End("Failed")}));
    EXPECT_EQ(LoggerHost_Count("Error in Eng_MaaStrNormalTest()::can't get MAA Command String\n"), 1);
    EXPECT_EQ(fixtures::Calls("maaEngMaaStrNormalTest"), 0);
}

TEST_F(MaaJavaCalls, DaemonWithoutTheEngineMethodsGetsFailed) {
    Start(fixtures::kDaemonWithoutUpcalls);
    if (HasFatalFailure()) return;
    struct Case {
        TMAAResult *(*call)(const Shell &);
        const char *logged;
    } cases[] = {
        {[](const Shell &s) { return s.StrIFOpt2(1, 2); },
         "Error in Eng_MaaStrNormalTest()::can't find Eng_MaaStrNormalTest()\n"},
        {[](const Shell &s) { return s.PBAStrIFOpt1(1); },
         "Error in Eng_MaaStrNormalTest()::can't find Eng_MaaStrNormalTest()\n"},
        {[](const Shell &s) { return s.ImgStbStart(1); },
         "Error in Eng_MaaImgStbStart()::can't find maaEngMaaImageStabilization().\n"},
        {[](const Shell &s) { return s.FTCATest(1); },
         "Error in Eng_MaaStrFTCATest()::can't find maaEngMaaOpcodeFTCATest().\n"},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.logged);
        Command("ImageStablization(1)", "ImageStablization");
        EXPECT_EQ(Seen(c.call(sh)), (Recs{Cont("[ ImageStablization ]"), End("Failed")}));
        EXPECT_EQ(LoggerHost_Count(c.logged), 1);
    }
}

TEST_F(MaaJavaCalls, GeneralFunctionPassesIdAndArgumentTextsAndSendsTheReplyByItsPrefix) {
    Start();
    if (HasFatalFailure()) return;
    const std::string hundred(100, 'h');
    struct Case {
        std::vector<U32> args;
        std::string reply, journaled;
        Recs seen;
    } cases[] = {
        {{1000000, Map("text")}, "spider:ABC", "1000000,text", {End("ABC")}},
        {{0, 0xFFFF}, "idpt:L1\r\nL2\r\nL3", "0,65535", {Cont("L1"), Cont("L2"), End("L3")}},
        {{Map(hundred)}, "Volt=3.3\r\n", hundred.substr(0, 99), {End("Volt=3.3\r\n")}},  // no known prefix: whole
        {{Map("100%% %s")}, "x", "100% %s", {End("x")}},
        {{}, "", "", {End("")}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.journaled);
        Command("MyFunc(...)", "MyFunc");
        fixtures::SetReply("runUsbFunctionCall", c.reply);
        std::vector<U32> args = c.args;
        EXPECT_EQ(Seen(sh.General(static_cast<U32>(args.size()), args.data())), c.seen);
        EXPECT_EQ(fixtures::EventLines(), std::vector<std::string>{"runUsbFunctionCall:MyFunc:" + c.journaled});
    }
}

TEST_F(MaaJavaCalls, GeneralFunctionRefusesBadArgumentsWithoutCallingJava) {
    Start();
    if (HasFatalFailure()) return;
    const U32 tooLong = Map(std::string(101, 'h'));
    struct Case {
        const char *what;
        std::vector<U32> args;
    } cases[] = {
        {"1000001 is a text address, and none is mapped there", {1000001}},
        {"a text of 101 characters", {7, tooLong}},
        {"eleven arguments", std::vector<U32>(11, 1)},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.what);
        Command("MyFunc(...)", "MyFunc");
        std::vector<U32> args = c.args;
        EXPECT_EQ(sh.General(static_cast<U32>(args.size()), args.data()), nullptr);
        EXPECT_EQ(Seen(nullptr), Recs{});
        EXPECT_EQ(fixtures::Calls("runUsbFunctionCall"), 0);
    }
}

TEST_F(MaaJavaCalls, GeneralFunctionWithoutAReplyLogsItAndEndsWithFailed) {
    Start();
    if (HasFatalFailure()) return;
    U32 args[] = {5};
    Command("Unknown(5)", "Unknown");  // the service serves no such function: null
    EXPECT_EQ(Seen(sh.General(1, args)), (Recs{End("Failed")}));
    EXPECT_EQ(LoggerHost_Count("Result string is NULL!\n"), 1);
    EXPECT_EQ(fixtures::EventLines(), std::vector<std::string>{"runUsbFunctionCall:Unknown:5"});

    Command("Unknown(5)", "Unknown");
    fixtures::ThrowOn("runUsbFunctionCall");
    EXPECT_EQ(Seen(sh.General(1, args)), (Recs{End("Failed")}));
    EXPECT_EQ(LoggerHost_Count("Result string is NULL!\n"), 1);

    Command("SetUIEnable()", "SetUIEnable");  // the service's own answer
    EXPECT_EQ(Seen(sh.General(0, args)), (Recs{End("SetUIEnable = OK")}));

    // An MAA object without the method.
    auto *maaSlot = hidden::Variable<std::atomic<jobject>>("globalMAAObj");
    ASSERT_NE(maaSlot, nullptr);
    maaSlot->store(jvm::New(fixtures::kDaemonWithoutUpcalls));
    Command("Unknown(5)", "Unknown");
    EXPECT_EQ(Seen(sh.General(1, args)), (Recs{End("Failed")}));
    EXPECT_EQ(LoggerHost_Count("[MAA] can't find runUsbFunctionCall()\n"), 1);
}

}  // namespace
