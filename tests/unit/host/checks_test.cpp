// What the host client checks before anything goes to the device.
#include <gtest/gtest.h>

#include <cstdint>
#include <string>
#include <vector>

#include "MaaClient.h"

namespace maahost {
namespace {

TEST(CheckDownloadSize, RefusesWhatTheSizeFieldCannotHold) {
    struct Row { uint64_t size; bool refused; } rows[] = {
        {0, false}, {1, false}, {0xFFFFFFFFull, false},
        {0x100000000ull, true},  // 4 GiB would go out as 0
        {0x100000005ull, true},  // ... and this as 5
        {5ull << 30, true}, {UINT64_MAX, true},
    };
    for (const Row &r : rows) {
        SCOPED_TRACE(r.size);
        const std::string why = CheckDownloadSize(r.size);
        EXPECT_EQ(!why.empty(), r.refused) << why;
        if (r.refused) {
            EXPECT_EQ(why.rfind(std::to_string(r.size) + " bytes cannot be downloaded", 0), 0u) << why;
            EXPECT_NE(why.find("4 GiB"), std::string::npos) << why;
        }
    }
}

TEST(DropBlankLines, KeepsEveryLineTheAutoRunShouldReach) {
    using Lines = std::vector<std::string>;
    struct Row { const char *name; Lines script; Lines kept; } rows[] = {
        {"none blank", {"a=1", "probe(7)"}, {"a=1", "probe(7)"}},
        {"empty lines anywhere", {"", "a=1", "", "", "probe(7)", ""}, {"a=1", "probe(7)"}},
        {"spaces and tabs only", {" ", "\t \t", "a=1"}, {"a=1"}},
        {"blanks around a statement stay", {" a=1\t", "!put x.bin", "f($addr)"}, {" a=1\t", "!put x.bin", "f($addr)"}},
        {"all blank", {"", " "}, {}},
        {"empty script", {}, {}},
    };
    for (const Row &r : rows) {
        SCOPED_TRACE(r.name);
        Lines lines = r.script;
        EXPECT_EQ(DropBlankLines(&lines), r.script.size() - r.kept.size());
        EXPECT_EQ(lines, r.kept);
    }
}

TEST(CallsFunction, OnlyANameFollowedByAParenthesisOutsideTextsGetsTheLongWait) {
    struct Row { const char *line; bool calls; } rows[] = {
        {"MAA_SymbolDump()", true},
        {"x = Delay_ms (5)", true},
        {"*(char*)(0x01000000 + 36) = 0x74", false},  // casts and grouping
        {"a = (b + 1) * 2", false},
        {"x = 0x12(3)", false},                        // a number is no name
        {"s = \"f(1)\"", false},                      // inside a text
        {"s = \"a\\\"b(\" ; g(1)", true},            // an escaped quote does not end the text
        {"#$%\x01", false},
        {"", false},
    };
    for (const Row &r : rows) EXPECT_EQ(CallsFunction(r.line), r.calls) << r.line;
}

}  // namespace
}  // namespace maahost
