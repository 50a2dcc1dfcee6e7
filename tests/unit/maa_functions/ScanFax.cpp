// The scanner-side test functions as the host and the scanner driver see them:
// the command line each name sends, the driver's response frames on the wire,
// the lock's retries and the final failure records. The fax-side test
// functions and the JBIG codec test as the host and the drivers see them: the
// command line on the fax driver, the scanner lock held around it where the
// test needs the scanner side, and the records written.
#include <cstring>
#include <functional>

#include "maa/functions/MAA_FaxJbig.h"
#include "maa/functions/MAA_ScanDriver.h"
#include "maa_functions/FnFixture.h"
#include "platform/Platform.h"
#include "usbadapter/maadrivers.h"

namespace fntest {
namespace {

void Answer(const std::string &response, std::optional<uint32_t> result = std::nullopt, int status = 0) {
    vdev::SetScanTestAnswer({std::vector<uint8_t>(response.begin(), response.end()), result, 1, status});
}
const std::vector<unsigned long> kLockTestRelease{IOCNR_SCAN_APP_LOCK, IOC_MAA_TEST, IOCNR_SCAN_APP_LOCK_RELEASE};
constexpr U32 kMax = 0xFFFFFFFFu;

using ScanDriver = FnTest;

// Called through the shell, each name sends its own call as the command line,
// and the one result as the driver made it; the shell adds none.
TEST_F(ScanDriver, EveryNameSendsItsOwnCallAsTheCommandLineAndOneResult) {
    const char *lines[] = {
        "ADFMotorTest(1,2,3,4294967295)", "CompensateScanPositionValue(0,7)", "DADFFeedTest(10,20)",
        "DADFPaperPathTimeTest(5)", "DADFSensorTest()", "GetScanFanTest(1)", "GetScanSensorTest(4294967295)",
        "ManualCompensateScanDeSkew(1,0,2)", "ManualCompensateScanPosition(1,2,3,4,5,6)", "ManualWidthAdjust(9,8,7)",
        "PBA_IP_IfPathTest(0,0,0,0)", "PlatenMotorNoiseTest(3)", "PWM_Scan_Test(1,2,3,4,5,6,7)", "ScanMotorTest(1)",
        "ScanPatchDetect_Test()", "ScanToInspectionDust()", "Step_Mot_Test_Scan(4,3,2,1)",
        "SysPBA_IO_Scn_GPITest(1,2,3)", "SysPBA_IO_Scn_GPOTest(1,2,3,4)", "UART_Test_SCN(115200,8,0,1)",
        "GetShadingData(2)", "ScanJobTest1(1)", "ScanJobTest2(1,2)", "ScanJobTest3(1,2,3)", "ScanJobTest4(1,2,3,4)",
        "ScanBalanceCorrection(4294967295)", "SFRReadWrite(0,\"REG_A\",4294967295)",
    };
    const std::string response = Frame(MAA_RESULT_END, 1, "SCAN OK");
    for (const char *line : lines) {
        SCOPED_TRACE(line);
        Restart();
        Answer(response);
        EXPECT_EQ(HostSees(line), Recs{});
        EXPECT_EQ(vdev::ScanCommands(), std::vector<std::string>{line});
        EXPECT_EQ(Wire(), response);
        ASSERT_EQ(Requests(vdev::kScanner), kLockTestRelease);
        // The record carries the response buffer, its size and the job; the
        // buffer is gone afterwards: its address reaches nothing.
        const std::vector<vdev::IoctlCall> calls = vdev::Ioctls(vdev::kScanner);
        ASSERT_EQ(calls[1].payload.size(), sizeof(TMAAScanTest));
        TMAAScanTest rec;
        std::memcpy(&rec, calls[1].payload.data(), sizeof rec);
        EXPECT_NE(rec.bufphys, 0u);
        EXPECT_EQ(DataBlock_HostFromKerVirt(rec.bufphys, 1), nullptr);
        EXPECT_EQ(rec.bufsize, static_cast<U32>(SCAN_MAA_RESPONSE_LENGTH));
        EXPECT_EQ(rec.jobid, static_cast<U32>(SCAN_MAA_TEST_ID));
        EXPECT_EQ(vdev::OpenCount(vdev::kScanner), 0);
        EXPECT_EQ(fdScnDrv, -1);
    }
}

// A failure is one record, written and returned; a lock taken on the last
// attempt still runs the command. The lock is never left held.
TEST_F(ScanDriver, LockAndDriverOutcomes) {
    const std::vector<unsigned long> thirtyOneLocks(31, IOCNR_SCAN_APP_LOCK);  // never released, never tested
    std::vector<unsigned long> lateLock = thirtyOneLocks;
    lateLock.insert(lateLock.end(), {IOC_MAA_TEST, IOCNR_SCAN_APP_LOCK_RELEASE});
    const std::string failedControl = "critical error! failed to control device";
    const std::string late = Frame(MAA_RESULT_END, 1, "late");
    struct Case {
        std::function<void()> script;
        std::string failure;  // "": none
        std::vector<unsigned long> requests;
        size_t pauses;
    } cases[] = {
        {[] { vdev::SetScanLockDefault(0); }, "scanner is busy or in sleep", thirtyOneLocks, 30},
        {[&] {
             vdev::QueueScanLockAnswers(std::vector<int>(30, 2));
             Answer(late);
         },
         "", lateLock, 30},
        {[] { Answer("never sent", std::nullopt, 5); }, failedControl, kLockTestRelease, 0},
        {[] { Answer("never sent", std::nullopt, -EIO); }, failedControl, kLockTestRelease, 0},
        {[] { vdev::SetPresent(vdev::kScanner, false); }, "critical error! failed to open scan device", {}, 0},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.failure);
        Restart();
        c.script();
        const Recs failed{End(c.failure, 0), End(c.failure, 0)}, ran{{MAA_RESULT_NONE, "", 1}};
        EXPECT_EQ(Seen(ScanMotorTest(1)), c.failure.empty() ? ran : failed);
        EXPECT_EQ(Requests(vdev::kScanner), c.requests);
        EXPECT_EQ(sleeps, std::vector<U32>(c.pauses, 1000));
        EXPECT_FALSE(vdev::ScanLocked());
        EXPECT_EQ(Wire(), c.failure.empty() ? late : "");
        EXPECT_EQ(vdev::OpenCount(vdev::kScanner), 0);
    }
}

TEST_F(ScanDriver, OnlyTheReportedCountIsSentAndNeverMoreThanTheBuffer) {
    const std::string one = Frame(MAA_RESULT_CONTINUE, 1, "one");
    Answer(one + Frame(MAA_RESULT_END, 1, "two"), static_cast<U32>(one.size()));
    ScanMotorTest(1);
    EXPECT_EQ(Wire(), one);

    // One frame that claims 5 MiB; the driver fills the whole 4 MiB buffer and reports 5 MiB.
    Restart();
    const U32 fiveMiB = 5u << 20;
    std::string response = Frame(MAA_RESULT_END, 1, "", fiveMiB - MAA_RESULT_HEADER_SIZE);
    response.resize(fiveMiB, 'd');
    Answer(response);
    GetShadingData(1);
    EXPECT_TRUE(Wire() == response.substr(0, SCAN_MAA_RESPONSE_LENGTH));
    EXPECT_TRUE(LoggerHost_Contains("[MAA] result is larger than allocation (5242880)\n"));
    EXPECT_TRUE(written.empty());
    EXPECT_FALSE(vdev::ScanLocked());

    // The next command's buffer is cleared: past what its driver wrote, the
    // host gets zeros, not the last response.
    Restart();
    const std::string shortOne = Frame(MAA_RESULT_END, 1, "ok");
    Answer(shortOne, static_cast<U32>(shortOne.size() + MAA_RESULT_HEADER_SIZE));
    GetShadingData(1);
    EXPECT_EQ(Wire(), shortOne + std::string(MAA_RESULT_HEADER_SIZE, '\0'));
}

TEST_F(ScanDriver, SFRReadWriteRefusesAnUnmappedAddressAndCutsALongText) {
    const U32 addr = Map("REG_A");
    for (U32 bad : {0u, kMax, addr + 6, 0x00100000u}) {
        SCOPED_TRACE(bad);
        Restart();
        EXPECT_EQ(Seen(SFRReadWrite(1, bad, 2)), (Recs{End("critical error! invalid text argument", 0),
                                                       End("critical error! invalid text argument", 0)}));
        EXPECT_TRUE(vdev::Ioctls(vdev::kScanner).empty());
    }
    std::string longText(400, 't');
    Answer(Frame(MAA_RESULT_END, 1, "ok"));
    SFRReadWrite(1, Map(longText), 2);
    EXPECT_EQ(vdev::ScanCommands(),
              std::vector<std::string>{("SFRReadWrite(1,\"" + longText).substr(0, SCAN_MAA_COMMAND_LENGTH - 1)});
}

TEST_F(ScanDriver, GetADFInfoReturnsTheMechanismForTheShellToWrite) {
    struct Case { std::function<void()> script; Recs seen; } cases[] = {
        {[] { vdev::SetADFMecha(3, 258, 2); }, {Cont("[ GetADFInfo ]"), End("ADFType=3 MultiType=2 Version=258", 1)}},
        {[] { vdev::SetPresent(vdev::kScanner, false); },
         {Cont("[ GetADFInfo ]"), End("critical error! failed to open scan device", 1)}},
        {[] { vdev::FailIoctl(vdev::kScanner, IOC_ADF_MECHA_TYPE, EIO); },
         {Cont("[ GetADFInfo ]"), End("Read ADF Type Fails", 1)}},
        {[] { vdev::FailIoctl(vdev::kScanner, IOC_ADF_MULTI_MECHA_TYPE, EIO); },
         {Cont("[ GetADFInfo ]"), End("Read ADF Multi Type Fails", 1)}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.seen.back().data);
        Restart();
        c.script();
        EXPECT_EQ(Seen(GetADFInfo()), c.seen);
        EXPECT_EQ(vdev::OpenCount(vdev::kScanner), 0);
    }
}

// ---- the fax side and the JBIG codec ---------------------------------------------

using FaxJbig = FnTest;

TEST_F(FaxJbig, EachFaxNameSendsItsLineAndWritesHeaderAndResponse) {
    struct Case {
        const char *shell, *name, *line;
        bool scannerLock;
        // The driver's answer (a vdev::FaxTestAnswer), kept flat: nested here,
        // GCC 12 at -O2 warns that its string may be used uninitialised.
        std::string response = "LINE OK";
        std::optional<uint32_t> result = std::nullopt;
        uint32_t success = 1;
        Rec last = End("LINE OK", 1);
    } cases[] = {
        {"SPI_Set_Speaker_Test(2)", "SetSpeakerTest", "SetSpeakerTest(2)", false},
        {"SysPBA_IO_Fax_GPITest(1,2,3)", "SysPBA_IO_Fax_GPITest", "SysPBA_IO_Fax_GPITest(1,2,3)", true},
        {"SysPBA_IO_Fax_GPOTest(1,0,0xFFFFFFFF,4)", "SysPBA_IO_Fax_GPOTest", "SysPBA_IO_Fax_GPOTest(1,0,4294967295,4)",
         true},
        {"PhoneTest_OHD(1,2,3)", "PhoneTest_OHD", "PhoneTest_OHD(1,2,3)", true},
        {"PhoneTest_Dial(5,5,5)", "PhoneTest_Dial", "PhoneTest_Dial(5,5,5)", true},
        {"PhoneTest_Ring(0,1)", "PhoneTest_Ring", "PhoneTest_Ring(0,1)", true},
        {"UART_Test_FAX(9600,8,0,1)", "UART_Test_FAX", "UART_Test_FAX(9600,8,0,1)", true},
        {"Fax_Modul_Detect()", "FaxModuleDetect_To_SCB", "FaxModuleDetect_To_SCB()", false},
        // Without a response text the verdict follows the driver's success. The
        // count bounds the text; a count past the record is cut to it.
        {"PhoneTest_Ring(1,1)", "PhoneTest_Ring", "PhoneTest_Ring(1,1)", true, "", std::nullopt, 1,
         End("PhoneTest_Ring DONE", 1)},
        {"PhoneTest_Ring(1,1)", "PhoneTest_Ring", "PhoneTest_Ring(1,1)", true, "", std::nullopt, 0,
         End("PhoneTest_Ring FAIL", 0)},
        {"PhoneTest_Ring(1,1)", "PhoneTest_Ring", "PhoneTest_Ring(1,1)", true, "NO DIAL TONE", std::nullopt, 0,
         End("NO DIAL TONE", 0)},
        {"PhoneTest_Ring(1,1)", "PhoneTest_Ring", "PhoneTest_Ring(1,1)", true, "RING 3 TIMES", 6u, 1, End("RING 3", 1)},
        {"PhoneTest_Ring(1,1)", "PhoneTest_Ring", "PhoneTest_Ring(1,1)", true, std::string(1500, 'r'), 0xFFFFFFFFu, 1,
         End(std::string(FAX_MAA_RESPONSE_LENGTH, 'r'), 1)},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(std::string(c.shell) + " answered " + c.response.substr(0, 20));
        Restart();
        vdev::SetFaxTestAnswer({c.response, c.result, c.success});
        EXPECT_EQ(HostSees(c.shell), (Recs{Cont("[ " + std::string(c.name) + " ]", 1), c.last}));
        EXPECT_EQ(vdev::FaxCommands(), std::vector<std::string>{c.line});
        const std::vector<unsigned long> locked{IOCNR_SCAN_APP_LOCK, IOCNR_SCAN_APP_LOCK_RELEASE};
        EXPECT_EQ(Requests(vdev::kScanner), c.scannerLock ? locked : std::vector<unsigned long>{});
        EXPECT_EQ(vdev::Opens(vdev::kScanner), c.scannerLock ? 1u : 0u);
        EXPECT_EQ(vdev::OpenCount(vdev::kScanner) + vdev::OpenCount(vdev::kFax), 0);
        EXPECT_EQ(fdFaxDrv, -1);
        EXPECT_EQ(fdScnDrv, -1);
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
