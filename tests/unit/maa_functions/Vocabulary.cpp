// Calling the registered vocabulary through the shell the way a host script
// does: names that reach a family's shared function, and every name called
// with hostile arguments.
#include "maa_functions/FnFixture.h"

namespace fntest {
namespace {

using Vocabulary = FnTest;

TEST_F(Vocabulary, NamesReachTheirFunctionsWithTheirHeaders) {
    struct Case { const char *line; Recs records; const char *logged; std::vector<U32> pauses; } cases[] = {
        // A forwarded family, without the Java service.
        {"SysPBA_DramTest(1)", {Cont("[ GetRamSize ]"), End("Failed")}, "", {}},
        // The engine interface, not the toner sensor's first registration ("[ GetTonerSensorStatus ]").
        {"Get_TonerSensorStatus(1)", {Cont("[ Get_TonerSensorStatus ]"), End("Failed")},
         "[Eng_MaaStrNormalTest] Start===>", {}},
        // Delay pauses for its argument up to a minute.
        {"Delay_ms(250)", {End("Delay 250 ms DONE")}, "", {250}},
        {"Delay_ms(0xFFFFFFFF)", {End("Delay 60000 ms DONE")}, "", {60000}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.line);
        Restart();
        LoggerHost_StartCapture();
        EXPECT_EQ(HostSees(c.line), c.records);
        EXPECT_TRUE(LoggerHost_Contains(c.logged));
        EXPECT_EQ(sleeps, c.pauses);
    }
}

// Every registered name with its own count of arguments of every kind a host
// may send: numbers at the edges, a text where a number is expected, a number
// where a text is expected, long texts. Nothing may crash (the sanitizer builds
// run this too), nothing may run a command outside the recorder, and the shell
// still works afterwards.
TEST_F(Vocabulary, EveryNameSurvivesHostileArguments) {
    const std::string text100(100, 'a'), text101(101, 'b');
    const std::vector<std::string> kinds = {"0", "0xFFFFFFFF", "1000000", "1000001", "\"" + text100 + "\"",
                                            "\"" + text101 + "\"", "\"%s%n%x\"", "\"\""};
    Run("");
    std::vector<std::pair<std::string, U8>> names;
    for (TSymbolNode *n = pstRoot; n != nullptr; n = n->pstNext) {
        if (std::string(reinterpret_cast<const char *>(n->pstSymbol->pubName)) == "MAA_SymbolDump") continue;
        names.emplace_back(reinterpret_cast<const char *>(n->pstSymbol->pubName), n->pstSymbol->ubPramCount);
    }
    for (const auto &[name, count] : names) {
        for (const std::string &kind : kinds) {
            std::string line = name + "(";
            for (U8 i = 0; i < count; ++i) line += (i ? "," : "") + kind;
            SCOPED_TRACE(line + ")");
            Run(line + ")");
        }
    }
    EXPECT_EQ(HostSees("Delay_ms(1)"), Recs{End("Delay 1 ms DONE")});
}

}  // namespace
}  // namespace fntest
