// What the general function and the engine string interface do without Java:
// argument texts, reply forms and line splitting as the host sees them, and a
// clean end when there is no JVM behind them.
#include <gtest/gtest.h>

#include <cstring>
#include <list>
#include <string>
#include <vector>

#include "LoggerHost.h"
#include "maa/MAA_Address.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_Result.h"
#include "maa/functions/MAA_EngineIF.h"
#include "maa/functions/MAA_General.h"
#include "maa/functions/MAA_SysResult.h"

namespace {

struct Record {
    U32 enContinue;
    std::string data;
    bool operator==(const Record &) const = default;
};
std::ostream &operator<<(std::ostream &os, const Record &r) {
    return os << (r.enContinue == MAA_RESULT_END ? "END " : "CONTINUE ") << '"' << r.data << '"';
}
std::vector<Record> written;
void capture(const TMAAResult *r) {
    written.push_back({r->enContinue, std::string(reinterpret_cast<const char *>(r->pubData), r->ulDataSize)});
}

// What reached the host: the records written at once, then the returned one.
std::vector<Record> Seen(const TMAAResult *returned) {
    std::vector<Record> all = written;
    if (returned != nullptr)
        all.push_back({returned->enContinue,
                       std::string(reinterpret_cast<const char *>(returned->pubData), returned->ulDataSize)});
    return all;
}
constexpr U32 C = MAA_RESULT_CONTINUE, E = MAA_RESULT_END;

class JavaCalls : public ::testing::Test {
protected:
    void SetUp() override {
        written.clear();
        enSpecialMode = MAA_NORMAL_CMD;
        MAA_SetResultWriter(&capture);
        LoggerHost_StartCapture();
    }
    void TearDown() override {
        MAA_SetResultWriter(nullptr);
        MAA_SetCmdString(nullptr);
        MAA_AddrReset();
    }
    // The address of a copy of `text` in the shell's map, NUL included.
    U32 Map(const std::string &text) {
        texts_.push_back(text);
        std::string &kept = texts_.back();
        return MAA_AddrMap(kept.data(), static_cast<U32>(kept.size() + 1));
    }
    std::list<std::string> texts_;  // stable addresses for the map
};

TEST_F(JavaCalls, ReportLinesDropsEachLinesLastCharacterAndBoundsLinesBy64) {
    const std::string longLine(100, 'x');
    struct Case {
        std::string text;
        std::vector<Record> seen;
    } cases[] = {
        {"OK", {{E, "OK"}}},  // no line feed: the whole text, as the final record
        {"", {{E, ""}}},
        {std::string(200, 'w'), {{E, std::string(200, 'w')}}},  // unbounded by the line buffer
        {"one\r\ntwo\r\n", {{C, "one"}, {E, "two"}}},              // exactly the carriage returns go
        {"one\ntwo\n", {{C, "on"}, {E, "tw"}}},
        {"one\r\ntail", {{C, "one"}, {E, "tail"}}},  // a last line without line feed stays whole
        {"a\n\nb", {{C, ""}, {C, ""}, {E, "b"}}},
        {"\n", {{E, ""}}},
        {longLine + "\r\n" + longLine, {{C, std::string(63, 'x')}, {E, std::string(63, 'x')}}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.text);
        written.clear();
        EXPECT_EQ(Seen(MAA_ReportLines(c.text.c_str())), c.seen);
    }
}

TEST_F(JavaCalls, ReplyPrefixSelectsHowTheReplyIsSent) {
    struct Case {
        std::string reply;
        std::vector<Record> seen;
    } cases[] = {
        {"spider:ABC", {{E, "ABC"}}},
        {"spiderXABC", {{E, "ABC"}}},  // known by its first six characters
        {"spider", {{E, ""}}},
        {"idpt:first\r\nsecond\r\n", {{C, "first"}, {E, "second"}}},
        {"idpt:single", {{E, "single"}}},
        {"idp:x\r\ny", {{E, "idp:x\r\ny"}}},  // any other reply: whole
        {"Result= OK", {{E, "Result= OK"}}},
        {"", {{E, ""}}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.reply);
        written.clear();
        EXPECT_EQ(Seen(MAA_ReportUsbFunctionReply(c.reply)), c.seen);
    }
}

TEST_F(JavaCalls, ArgumentWordsBecomeNumbersOrTheTextsTheyAddress) {
    const std::string hundred(100, 'h');
    struct Case {
        U32 word;
        bool ok;
        std::string text;
    } cases[] = {
        {0, true, "0"},
        {1000000, true, "1000000"},
        {1000001, false, ""},  // a text address, and no region holds it
        {0xFFFFFFFF, false, ""},
        {Map("hello"), true, "hello"},
        {Map(""), true, ""},
        {Map(hundred), true, hundred.substr(0, 99)},  // the buffer keeps 99 and the NUL
        {Map(hundred + "!"), false, ""},
        // The text was its own format: "%%" is the only directive with a meaning
        // and every other stays as typed (nothing is read that was not passed).
        {Map("50%% off %s%n%d %"), true, "50% off %s%n%d %"},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.word);
        char text[MAA_GENERAL_ARG_SIZE];
        std::memset(text, 0x55, sizeof text);
        ASSERT_EQ(MAA_UsbFunctionArgText(c.word, text), c.ok);
        if (c.ok) {
            EXPECT_EQ(std::string(text), c.text);
        }
    }
    EXPECT_TRUE(LoggerHost_Contains("invalid address 0xf4241"));
}

TEST_F(JavaCalls, TextRunningOutOfItsRegionIsRefused) {
    char unterminated[4] = {'a', 'b', 'c', 'd'};
    char text[MAA_GENERAL_ARG_SIZE];
    EXPECT_FALSE(MAA_UsbFunctionArgText(MAA_AddrMap(unterminated, sizeof unterminated), text));
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

TEST_F(JavaCalls, WithoutAJvmEveryEngineFunctionSendsItsHeaderThenFailed) {
    using Fn = TMAAResult *(*)();
    struct Case {
        Fn call;
        const char *logged;
    } cases[] = {
        {[] { return Eng_MaaStrIFOpt0(); }, "Error in Eng_MaaStrNormalTest()::can't find class PrintDaemon\n"},
        {[] { return Eng_MaaStrIFOpt5(1, 2, 3, 4, 5); }, "Error in Eng_MaaStrNormalTest()::can't find class PrintDaemon\n"},
        {[] { return Eng_MaaStrIFOpt1_Str(0); }, "Error in Eng_MaaStrNormalTest()::can't find class PrintDaemon\n"},
        {[] { return Eng_MaaPBAStrIFOpt7(1, 2, 3, 4, 5, 6, 7); },
         "Error in Eng_MaaStrNormalTest()::can't find class PrintDaemon\n"},
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
        EXPECT_EQ(Seen(c.call()), (std::vector<Record>{{C, "[ GetData ]"}, {E, "Failed"}}));
        EXPECT_EQ(LoggerHost_Count(c.logged), 1);
    }
    EXPECT_TRUE(LoggerHost_Contains("[Eng_MaaStrFTCATest] Start===>(GetData(1,2))(GetData)\n"));
}

TEST_F(JavaCalls, EngineHeaderIsBoundedByTheLineBuffer) {
    const std::string name(200, 'n');
    MAA_SetCmdName(reinterpret_cast<const U8 *>(name.c_str()));
    Eng_MaaStrIFOpt0();
    ASSERT_FALSE(written.empty());
    EXPECT_EQ(written[0].data, "[ " + std::string(61, 'n'));
}

}  // namespace
