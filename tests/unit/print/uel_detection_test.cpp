// The UEL detector the reader cuts jobs with: where a whole UEL lies, and how
// much of a UEL cut by the end of a buffer is present.
#include <string>

#include "print/PrintRecorder.h"

namespace {

class UelDetection : public ::testing::Test {
protected:
    void SetUp() override {
        LoggerHost_StartCapture();
        Clear();
    }
    static void Clear() {
        jobCounter = 0;
        splitPatternFlag = 0;
        splitPatternMarker = 0;
        UelPosition = -1;
    }

    static S32 Check(std::string bytes) {
        return CheckUELCommand(reinterpret_cast<U8 *>(bytes.data()), static_cast<S32>(bytes.size()));
    }
};

// Where the first whole UEL lies; a mismatch is scanned again from the
// mismatching byte, and a lone escape at the end is one byte of a cut UEL.
TEST_F(UelDetection, FirstWholeUelIsFoundWhereverItLiesAndCounted) {
    const struct {
        const char *bytes;
        S32 found, position, marker;  // answer, UelPosition, splitPatternMarker
    } rows[] = {
        {"\x1b%-12345X", 1, 0, 0},
        {"@PJL data \x1b%-12345Xtail", 1, 10, 0},
        {"ab\x1b%-12345Xcd\x1b%-12345X", 1, 2, 0},
        {"\x1b%-12345Y\x1b%-12345X", 1, 9, 0},
        {"\x1b%-12345\x1b%-12345X", 1, 8, 0},
        {"\x1b%-12345Y tail", 0, 0, 0},
        {"\x1b", 0, 0, 1},
    };
    for (const auto &r : rows) {
        SCOPED_TRACE(testing::PrintToString(r.bytes));
        Clear();
        EXPECT_EQ(Check(r.bytes), r.found);
        EXPECT_EQ(UelPosition, r.position);
        EXPECT_EQ(jobCounter, r.found);
        EXPECT_EQ(splitPatternMarker, r.marker);
        EXPECT_EQ(splitPatternFlag, r.marker > 0 ? 1 : 0);
    }
    EXPECT_EQ(LoggerHost_Count("[USBAdp]return TRUE HITT UelPosition[10]\n"), 1);
}

TEST_F(UelDetection, UelCutByTheBufferEndGivesTheNumberOfBytesPresent) {
    for (int present = 1; present <= 8; ++present) {
        SCOPED_TRACE(present);
        Clear();
        EXPECT_EQ(Check("job data" + kUel.substr(0, present)), 0);
        EXPECT_EQ(splitPatternFlag, 1);
        EXPECT_EQ(splitPatternMarker, present);
        EXPECT_EQ(UelPosition, 8);
        EXPECT_EQ(jobCounter, 0);
    }
    EXPECT_EQ(LoggerHost_Count("[USBAdp]splitPatternMarker : [7]\n"), 1);
}

TEST_F(UelDetection, SplitFlagIsLeftForTheReaderToClear) {
    EXPECT_EQ(Check("abc\x1b%-"), 0);
    EXPECT_EQ(splitPatternFlag, 1);
    EXPECT_EQ(Check("no escape here"), 0);
    EXPECT_EQ(splitPatternFlag, 1);
    EXPECT_EQ(splitPatternMarker, 3);
    EXPECT_EQ(Check(""), 0);
}

}  // namespace
