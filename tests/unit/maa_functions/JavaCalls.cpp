// What the general function and the engine string interface do without Java:
// argument texts, reply forms and line splitting as the host sees them, and a
// clean end when there is no JVM behind them.
#include <cstring>

#include "maa/functions/MAA_EngineIF.h"
#include "maa/functions/MAA_General.h"
#include "maa_functions/FnFixture.h"

namespace fntest {
namespace {

using JavaCalls = FnTest;

TEST_F(JavaCalls, RepliesAreSplitIntoLinesOrSentWholeByTheirPrefix) {
    const std::string x100(100, 'x'), w200(200, 'w');
    struct Case {
        bool lines;  // through the line splitter, else as a general function's reply
        std::string text;
        Recs seen;
    } cases[] = {
        // Each line loses its last character and is bounded by 64.
        {true, "OK", {End("OK")}},  // no line feed: the whole text, as the final record
        {true, "", {End("")}},
        {true, w200, {End(w200)}},  // unbounded by the line buffer
        {true, "one\r\ntwo\r\n", {Cont("one"), End("two")}},
        {true, "one\ntwo\n", {Cont("on"), End("tw")}},
        {true, "one\r\ntail", {Cont("one"), End("tail")}},
        {true, "a\n\nb", {Cont(""), Cont(""), End("b")}},
        {true, "\n", {End("")}},
        {true, x100 + "\r\n" + x100, {Cont(x100.substr(0, 63)), End(x100.substr(0, 63))}},
        {false, "spider:ABC", {End("ABC")}},
        {false, "spiderXABC", {End("ABC")}},  // known by its first six characters
        {false, "spider", {End("")}},
        {false, "idpt:first\r\nsecond\r\n", {Cont("first"), End("second")}},
        {false, "idpt:single", {End("single")}},
        {false, "idp:x\r\ny", {End("idp:x\r\ny")}},  // any other reply: whole
        {false, "", {End("")}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.text);
        written.clear();
        EXPECT_EQ(Seen(c.lines ? MAA_ReportLines(c.text.c_str()) : MAA_ReportUsbFunctionReply(c.text)), c.seen);
    }
}

TEST_F(JavaCalls, ArgumentWordsBecomeNumbersOrTheTextsTheyAddress) {
    const std::string hundred(100, 'h');
    char unterminated[4] = {'a', 'b', 'c', 'd'};
    struct Case { U32 word; bool ok; std::string text; } cases[] = {
        {0, true, "0"},
        {1000000, true, "1000000"},
        {1000001, false, ""},  // a text address, and no region holds it
        {0xFFFFFFFF, false, ""},
        {Map("hello"), true, "hello"},
        {Map(""), true, ""},
        {Map(hundred), true, hundred.substr(0, 99)},  // the buffer keeps 99 and the NUL
        {Map(hundred + "!"), false, ""},
        {MAA_AddrMap(unterminated, sizeof unterminated), false, ""},
        // The text was its own format: "%%" is the only directive with a meaning
        // and every other stays as typed (nothing is read that was not passed).
        {Map("50%% off %s%n%d %"), true, "50% off %s%n%d %"},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.word);
        char text[MAA_GENERAL_ARG_SIZE];
        std::memset(text, 0x55, sizeof text);
        ASSERT_EQ(MAA_UsbFunctionArgText(c.word, text), c.ok);
        if (c.ok) { EXPECT_EQ(std::string(text), c.text); }
    }
    EXPECT_TRUE(LoggerHost_Contains("invalid address 0xf4241"));
}

TEST_F(JavaCalls, WithoutAJvmTheGeneralFunctionSendsNothingAndForwardedCallsGetNoReply) {
    const std::string command = "NotRegistered(1,2)";
    MAA_SetCmdString(reinterpret_cast<const U8 *>(command.c_str()));
    U32 args[11] = {1, 2};
    EXPECT_EQ(MAA_GENERAL_FUNCTION(2, args), nullptr);
    EXPECT_EQ(MAA_GENERAL_FUNCTION(11, args), nullptr);
    std::string reply = "untouched";
    EXPECT_EQ(MAA_CallUsbFunction("SetUIEnable", 0, nullptr, &reply), TMAAJavaCall::NoReply);
    EXPECT_EQ(MAA_CallUsbFunction("SetUIEnable", 11, args, &reply), TMAAJavaCall::BadArgs);
    EXPECT_EQ(MAA_CallUsbFunction("SetUIEnable", 1, nullptr, &reply), TMAAJavaCall::BadArgs);
    EXPECT_EQ(reply, "untouched");
    EXPECT_TRUE(written.empty());
}

TEST_F(JavaCalls, WithoutAJvmEveryEngineFunctionSendsItsBoundedHeaderThenFailed) {
    using Fn = TMAAResult *(*)();
    const std::string normal = "Error in Eng_MaaStrNormalTest()::can't find class PrintDaemon\n";
    struct Case { Fn call; std::string logged; } cases[] = {
        {[] { return Eng_MaaStrIFOpt0(); }, normal},
        {[] { return Eng_MaaStrIFOpt5(1, 2, 3, 4, 5); }, normal},
        {[] { return Eng_MaaStrIFOpt1_Str(0); }, normal},
        {[] { return Eng_MaaPBAStrIFOpt7(1, 2, 3, 4, 5, 6, 7); }, normal},
        {[] { return Eng_MaaImgStbStart(1); }, "Error in Eng_MaaImgStbStart()::can't find class PrintDaemon\n"},
        {[] { return Eng_MaaStrFTCATest(1); }, "Error in Eng_MaaStrFTCATest()::can't find class PrintDaemon\n"},
    };
    const std::string command = "GetData(1,2)";
    MAA_SetCmdString(reinterpret_cast<const U8 *>(command.c_str()));
    MAA_SetCmdName(reinterpret_cast<const U8 *>("GetData"));
    for (const Case &c : cases) {
        SCOPED_TRACE(c.logged);
        written.clear();
        LoggerHost_StartCapture();
        EXPECT_EQ(Seen(c.call()), (Recs{Cont("[ GetData ]"), End("Failed")}));
        EXPECT_EQ(LoggerHost_Count(c.logged), 1);
    }
    EXPECT_TRUE(LoggerHost_Contains("[Eng_MaaStrFTCATest] Start===>(GetData(1,2))(GetData)\n"));

    const std::string name(200, 'n');
    MAA_SetCmdName(reinterpret_cast<const U8 *>(name.c_str()));
    written.clear();
    Eng_MaaStrIFOpt0();
    ASSERT_FALSE(written.empty());
    EXPECT_EQ(written[0].data, "[ " + std::string(61, 'n'));  // bounded by the line buffer
}

}  // namespace
}  // namespace fntest
