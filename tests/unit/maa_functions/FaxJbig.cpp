// The fax-side test functions and the JBIG codec test as the host and the
// drivers see them: the command line on the fax driver, the scanner lock held
// around it where the test needs the scanner side, and the records written.
#include <cstring>
#include <functional>

#include "maa/functions/MAA_FaxJbig.h"
#include "maa/functions/MAA_ScanDriver.h"
#include "maa_functions/FnFixture.h"
#include "usbadapter/maadrivers.h"

namespace fntest {
namespace {

using FaxJbig = FnTest;

TEST_F(FaxJbig, EachFaxNameSendsItsLineAndWritesHeaderAndResponse) {
    struct Case { const char *shell, *name, *line; bool scannerLock; } cases[] = {
        {"SPI_Set_Speaker_Test(2)", "SetSpeakerTest", "SetSpeakerTest(2)", false},
        {"SysPBA_IO_Fax_GPITest(1,2,3)", "SysPBA_IO_Fax_GPITest", "SysPBA_IO_Fax_GPITest(1,2,3)", true},
        {"SysPBA_IO_Fax_GPOTest(1,0,0xFFFFFFFF,4)", "SysPBA_IO_Fax_GPOTest", "SysPBA_IO_Fax_GPOTest(1,0,4294967295,4)",
         true},
        {"PhoneTest_OHD(1,2,3)", "PhoneTest_OHD", "PhoneTest_OHD(1,2,3)", true},
        {"PhoneTest_Dial(5,5,5)", "PhoneTest_Dial", "PhoneTest_Dial(5,5,5)", true},
        {"PhoneTest_Ring(0,1)", "PhoneTest_Ring", "PhoneTest_Ring(0,1)", true},
        {"UART_Test_FAX(9600,8,0,1)", "UART_Test_FAX", "UART_Test_FAX(9600,8,0,1)", true},
        {"Fax_Modul_Detect()", "FaxModuleDetect_To_SCB", "FaxModuleDetect_To_SCB()", false},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.shell);
        Restart();
        vdev::SetFaxTestAnswer({"LINE OK", std::nullopt, 1, 0});
        EXPECT_EQ(HostSees(c.shell), (Recs{Cont("[ " + std::string(c.name) + " ]", 1), End("LINE OK", 1)}));
        EXPECT_EQ(vdev::FaxCommands(), std::vector<std::string>{c.line});
        const std::vector<unsigned long> locked{IOCNR_SCAN_APP_LOCK, IOCNR_SCAN_APP_LOCK_RELEASE};
        EXPECT_EQ(Requests(vdev::kScanner), c.scannerLock ? locked : std::vector<unsigned long>{});
        EXPECT_EQ(vdev::Opens(vdev::kScanner), c.scannerLock ? 1u : 0u);
        EXPECT_EQ(vdev::OpenCount(vdev::kScanner) + vdev::OpenCount(vdev::kFax), 0);
        EXPECT_EQ(fdFaxDrv, -1);
        EXPECT_EQ(fdScnDrv, -1);
    }
}

TEST_F(FaxJbig, WithoutAResponseTextTheVerdictFollowsTheDriversSuccess) {
    struct Case { std::string response; std::optional<uint32_t> result; uint32_t success; Rec last; } cases[] = {
        {"", std::nullopt, 1, End("PhoneTest_Ring DONE", 1)},
        {"", std::nullopt, 0, End("PhoneTest_Ring FAIL", 0)},
        {"NO DIAL TONE", std::nullopt, 0, End("NO DIAL TONE", 0)},
        // The count bounds the text; a count past the record is cut to it.
        {"RING 3 TIMES", 6u, 1, End("RING 3", 1)},
        {std::string(1500, 'r'), 0xFFFFFFFFu, 1, End(std::string(FAX_MAA_RESPONSE_LENGTH, 'r'), 1)},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.last.data);
        Restart();
        vdev::SetFaxTestAnswer({c.response, c.result, c.success, 0});
        PhoneTest_Ring(1, 1);
        ASSERT_EQ(written.size(), 2u);
        EXPECT_EQ(written[1], c.last);
    }
}

TEST_F(FaxJbig, FailedStepsAreNamedAndTheLockIsNeverLeftHeld) {
    struct Case { std::function<void()> script; std::string text; size_t lockAttempts, releases, faxCalls; } cases[] = {
        {[] { vdev::SetPresent(vdev::kScanner, false); }, "critical error! failed to open scan device", 0, 0, 0},
        {[] { vdev::SetScanLockDefault(0); }, "scanner is busy or in sleep", 31, 0, 0},
        {[] { vdev::SetPresent(vdev::kFax, false); }, "critical error! failed to open fax device", 1, 1, 0},
        {[] { vdev::SetFaxTestAnswer({"x", std::nullopt, 1, 4}); }, "critical error! failed to control fax device",
         1, 1, 1},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.text);
        Restart();
        c.script();
        PhoneTest_OHD(1, 2, 3);
        EXPECT_EQ(written, (Recs{Cont("[ PhoneTest_OHD ]", 1), End(c.text, 0)}));
        const std::vector<unsigned long> req = Requests(vdev::kScanner);
        EXPECT_EQ(CountOf(req, IOCNR_SCAN_APP_LOCK), c.lockAttempts);
        EXPECT_EQ(CountOf(req, IOCNR_SCAN_APP_LOCK_RELEASE), c.releases);
        EXPECT_EQ(vdev::FaxCommands().size(), c.faxCalls);
        EXPECT_FALSE(vdev::ScanLocked());
        EXPECT_EQ(sleeps.size(), c.lockAttempts ? c.lockAttempts - 1 : 0);
    }
}

TEST_F(FaxJbig, HWJBIGTestChecksEncoderThenDecoder) {
    struct Case { std::function<void()> script; std::string verdict; int decoderResets; } cases[] = {
        {[] {}, "HWJBIG TEST DONE", 1},
        {[] { vdev::SetJbigSelfTestStatus(vdev::kJbigDec, 9); }, "JBIG Decoder = NG", 1},
        {[] { vdev::SetJbigSelfTestStatus(vdev::kJbigEnc, 1); }, "JBIG Encoder = NG", 0},
        {[] { vdev::SetPresent(vdev::kJbigEnc, false); }, "Open /dev/jbigenc Fails", 0},
        {[] { vdev::SetPresent(vdev::kJbigDec, false); }, "Open /dev/jbigdec Fails", 0},
        {[] { vdev::FailIoctl(vdev::kJbigEnc, JBIG_IOC_RESET, EIO); }, "JBIG Encoder Reset Fails", 0},
        {[] { vdev::FailIoctl(vdev::kJbigDec, JBIG_IOC_SELFTEST, EIO); }, "JBIG Decoder Self Test Fails", 1},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.verdict);
        Restart();
        c.script();
        // The shell writes the returned verdict.
        EXPECT_EQ(Seen(HWJBIGTest(5)), (Recs{Cont("[ HWJBIGTest : Argument=5 ]", 1), End(c.verdict, 1)}));
        EXPECT_EQ(vdev::JbigResets(vdev::kJbigDec), c.decoderResets);
        EXPECT_EQ(vdev::OpenCount(vdev::kJbigEnc) + vdev::OpenCount(vdev::kJbigDec), 0);
    }
    Restart();
    HWJBIGTest(7);
    std::vector<vdev::IoctlCall> calls = vdev::Ioctls(vdev::kJbigDec);
    ASSERT_EQ(calls.size(), 2u);
    TJBIGSelfTest sent;
    ASSERT_EQ(calls[1].payload.size(), sizeof sent);
    std::memcpy(&sent, calls[1].payload.data(), sizeof sent);
    EXPECT_EQ(sent.ulPattern, 7u);
}

}  // namespace
}  // namespace fntest
