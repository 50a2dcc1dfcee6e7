// The UEL detector the reader cuts jobs with: where a whole UEL lies, and how
// much of a UEL cut by the end of a buffer is present.
#include <string>

#include "print/PrintRecorder.h"

namespace {

class UelDetection : public ::testing::Test {
protected:
    void SetUp() override {
        LoggerHost_StartCapture();
        jobCounter = 0;
        splitPatternFlag = 0;
        splitPatternMarker = 0;
        UelPosition = -1;
    }

    static S32 Check(std::string bytes) {
        return CheckUELCommand(reinterpret_cast<U8 *>(bytes.data()), static_cast<S32>(bytes.size()));
    }
};

TEST_F(UelDetection, WholeUelIsFoundWhereverItLiesAndCounted) {
    EXPECT_EQ(Check(kUel), 1);
    EXPECT_EQ(UelPosition, 0);
    EXPECT_EQ(jobCounter, 1);

    EXPECT_EQ(Check("@PJL data " + kUel + "tail"), 1);
    EXPECT_EQ(UelPosition, 10);
    EXPECT_EQ(jobCounter, 2);
    EXPECT_EQ(splitPatternFlag, 0);
    EXPECT_EQ(LoggerHost_Count("[USBAdp]return TRUE HITT UelPosition[10]\n"), 1);
}

TEST_F(UelDetection, OnlyTheFirstOfTwoUelsIsReported) {
    EXPECT_EQ(Check("ab" + kUel + "cd" + kUel), 1);
    EXPECT_EQ(UelPosition, 2);
    EXPECT_EQ(jobCounter, 1);
}

TEST_F(UelDetection, UelCutByTheBufferEndGivesTheNumberOfBytesPresent) {
    for (int present = 1; present <= 8; ++present) {
        SCOPED_TRACE(present);
        splitPatternFlag = 0;
        splitPatternMarker = 0;
        EXPECT_EQ(Check("job data" + kUel.substr(0, present)), 0);
        EXPECT_EQ(splitPatternFlag, 1);
        EXPECT_EQ(splitPatternMarker, present);
        EXPECT_EQ(UelPosition, 8);
    }
    EXPECT_EQ(jobCounter, 0);
    EXPECT_EQ(LoggerHost_Count("[USBAdp]splitPatternMarker : [7]\n"), 1);
}

TEST_F(UelDetection, LoneEscapeAtTheEndIsOneBytePresent) {
    EXPECT_EQ(Check("\x1b"), 0);
    EXPECT_EQ(splitPatternMarker, 1);
    EXPECT_EQ(UelPosition, 0);
}

TEST_F(UelDetection, MismatchIsScannedAgainFromTheMismatchingByte) {
    // Y in place of X: not a UEL, and the scan goes on at the Y.
    EXPECT_EQ(Check("\x1b%-12345Y" + kUel), 1);
    EXPECT_EQ(UelPosition, 9);
    // The mismatching byte is itself the start of a UEL.
    EXPECT_EQ(Check("\x1b%-12345" + kUel), 1);
    EXPECT_EQ(UelPosition, 8);
    EXPECT_EQ(Check("\x1b%-12345Y tail"), 0);
    EXPECT_EQ(splitPatternFlag, 0);
    EXPECT_EQ(jobCounter, 2);
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
