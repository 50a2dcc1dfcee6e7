// The scanner-side test functions as the host and the scanner driver see them:
// the command line each name sends, the driver's response frames on the wire,
// the lock's retries and the final failure records.
#include <cstring>
#include <functional>

#include "common/ByteOrder.h"
#include "maa/functions/MAA_ScanDriver.h"
#include "maa_functions/DriverFixture.h"
#include "platform/Platform.h"
#include "usbadapter/maadrivers.h"

using namespace drivertest;

namespace {

// One ready result frame, as the driver writes its response.
std::string Frame(U32 enContinue, U32 ulResult, const std::string &text, U32 sizeField) {
    U8 h[MAA_RESULT_HEADER_SIZE];
    WriteBE32(h, enContinue);
    WriteBE32(h + 4, ulResult);
    WriteBE32(h + 8, sizeField);
    return std::string(reinterpret_cast<char *>(h), sizeof h) + text;
}
std::string Frame(U32 enContinue, const std::string &text) {
    return Frame(enContinue, 1, text, static_cast<U32>(text.size()));
}

void Answer(const std::string &response, std::optional<uint32_t> result = std::nullopt, int status = 0) {
    vdev::SetScanTestAnswer({std::vector<uint8_t>(response.begin(), response.end()), result, 1, status});
}

using ScanDriver = DriverTest;

constexpr U32 kMax = 0xFFFFFFFFu;

TEST_F(ScanDriver, EveryNameSendsItsOwnCallAsTheCommandLineAndOneResult) {
    struct Case {
        std::function<TMAAResult *()> call;
        std::string line;
    } cases[] = {
        {[] { return ADFMotorTest(1, 2, 3, kMax); }, "ADFMotorTest(1,2,3,4294967295)"},
        {[] { return CompensateScanPositionValue(0, 7); }, "CompensateScanPositionValue(0,7)"},
        {[] { return DADFFeedTest(10, 20); }, "DADFFeedTest(10,20)"},
        {[] { return DADFPaperPathTimeTest(5); }, "DADFPaperPathTimeTest(5)"},
        {[] { return DADFSensorTest(); }, "DADFSensorTest()"},
        {[] { return GetScanFanTest(1); }, "GetScanFanTest(1)"},
        {[] { return GetScanSensorTest(kMax); }, "GetScanSensorTest(4294967295)"},
        {[] { return ManualCompensateScanDeSkew(1, 0, 2); }, "ManualCompensateScanDeSkew(1,0,2)"},
        {[] { return ManualCompensateScanPosition(1, 2, 3, 4, 5, 6); }, "ManualCompensateScanPosition(1,2,3,4,5,6)"},
        {[] { return ManualWidthAdjust(9, 8, 7); }, "ManualWidthAdjust(9,8,7)"},
        {[] { return PBA_IP_IfPathTest(0, 0, 0, 0); }, "PBA_IP_IfPathTest(0,0,0,0)"},
        {[] { return PlatenMotorNoiseTest(3); }, "PlatenMotorNoiseTest(3)"},
        {[] { return PWM_Scan_Test(1, 2, 3, 4, 5, 6, 7); }, "PWM_Scan_Test(1,2,3,4,5,6,7)"},
        {[] { return ScanMotorTest(1); }, "ScanMotorTest(1)"},
        {[] { return ScanPatchDetect_Test(); }, "ScanPatchDetect_Test()"},
        {[] { return ScanToInspectionDust(); }, "ScanToInspectionDust()"},
        {[] { return Step_Mot_Test_Scan(4, 3, 2, 1); }, "Step_Mot_Test_Scan(4,3,2,1)"},
        {[] { return SysPBA_IO_Scn_GPITest(1, 2, 3); }, "SysPBA_IO_Scn_GPITest(1,2,3)"},
        {[] { return SysPBA_IO_Scn_GPOTest(1, 2, 3, 4); }, "SysPBA_IO_Scn_GPOTest(1,2,3,4)"},
        {[] { return UART_Test_SCN(115200, 8, 0, 1); }, "UART_Test_SCN(115200,8,0,1)"},
        {[] { return GetShadingData(2); }, "GetShadingData(2)"},
        {[] { return ScanJobTest1(1); }, "ScanJobTest1(1)"},
        {[] { return ScanJobTest2(1, 2); }, "ScanJobTest2(1,2)"},
        {[] { return ScanJobTest3(1, 2, 3); }, "ScanJobTest3(1,2,3)"},
        {[] { return ScanJobTest4(1, 2, 3, 4); }, "ScanJobTest4(1,2,3,4)"},
        {[] { return ScanBalanceCorrection(kMax); }, "ScanBalanceCorrection(4294967295)"},
    };
    const std::string response = Frame(MAA_RESULT_END, "SCAN OK");
    for (const Case &c : cases) {
        SCOPED_TRACE(c.line);
        Restart();
        Answer(response);
        TMAAResult *r = c.call();
        EXPECT_EQ(vdev::ScanCommands(), std::vector<std::string>{c.line});
        EXPECT_EQ(Wire(), response);  // the one result, passed on as the driver made it
        EXPECT_TRUE(records.empty());
        EXPECT_EQ(r->enContinue, MAA_RESULT_NONE);  // nothing left for anyone to send
        EXPECT_EQ(Requests(vdev::kScanner),
                  (std::vector<unsigned long>{IOCNR_SCAN_APP_LOCK, IOC_MAA_TEST, IOCNR_SCAN_APP_LOCK_RELEASE}));
        EXPECT_EQ(vdev::OpenCount(vdev::kScanner), 0);
        EXPECT_EQ(fdScnDrv, -1);
    }
}

TEST_F(ScanDriver, TheRecordCarriesTheBufferJobAndLine) {
    Answer(Frame(MAA_RESULT_END, "x"));
    ScanMotorTest(4);
    std::vector<vdev::IoctlCall> calls = vdev::Ioctls(vdev::kScanner);
    ASSERT_EQ(calls.size(), 3u);
    ASSERT_EQ(calls[1].payload.size(), sizeof(TMAAScanTest));
    TMAAScanTest rec;
    std::memcpy(&rec, calls[1].payload.data(), sizeof rec);
    EXPECT_STREQ(rec.string, "ScanMotorTest(4)");
    EXPECT_NE(rec.bufphys, 0u);
    EXPECT_EQ(rec.bufsize, static_cast<U32>(SCAN_MAA_RESPONSE_LENGTH));
    EXPECT_EQ(rec.jobid, static_cast<U32>(SCAN_MAA_TEST_ID));
    // The block is gone afterwards: its address reaches nothing.
    EXPECT_EQ(DataBlock_HostFromKerVirt(rec.bufphys, 1), nullptr);
}

TEST_F(ScanDriver, ALockThatNeverAnswersGivesUpAfterThirtyOnesecondRetries) {
    vdev::SetScanLockDefault(0);
    TMAAResult *r = ScanMotorTest(1);
    EXPECT_EQ(records, std::vector<Record>{End0("scanner is busy or in sleep")});
    EXPECT_EQ(Returned(r), End0("scanner is busy or in sleep"));
    const std::vector<unsigned long> req = Requests(vdev::kScanner);
    EXPECT_EQ(req, std::vector<unsigned long>(31, IOCNR_SCAN_APP_LOCK));  // never released, never tested
    EXPECT_EQ(sleeps, std::vector<U32>(30, 1000));
    EXPECT_TRUE(vdev::ScanCommands().empty());
    EXPECT_EQ(Wire(), "");
    EXPECT_EQ(vdev::OpenCount(vdev::kScanner), 0);
}

TEST_F(ScanDriver, ALockTakenOnTheLastAttemptStillRunsTheCommand) {
    std::vector<int> refusals(30, 2);
    vdev::QueueScanLockAnswers(refusals);
    Answer(Frame(MAA_RESULT_END, "late"));
    ScanMotorTest(1);
    EXPECT_EQ(sleeps.size(), 30u);
    EXPECT_EQ(Wire(), Frame(MAA_RESULT_END, "late"));
    EXPECT_FALSE(vdev::ScanLocked());
    EXPECT_EQ(CountOf(Requests(vdev::kScanner), IOCNR_SCAN_APP_LOCK_RELEASE), 1u);
}

TEST_F(ScanDriver, AResponseLargerThanTheBufferIsSentAsExactlyFourMiB) {
    const U32 fiveMiB = 5u << 20;
    // One frame that claims 5 MiB; the driver fills the whole 4 MiB buffer and
    // reports 5 MiB.
    std::string response = Frame(MAA_RESULT_END, 1, "", fiveMiB - MAA_RESULT_HEADER_SIZE);
    response.resize(fiveMiB, 'd');
    Answer(response);
    GetShadingData(1);
    const std::string wire = Wire();
    ASSERT_EQ(wire.size(), static_cast<size_t>(SCAN_MAA_RESPONSE_LENGTH));
    EXPECT_EQ(wire, response.substr(0, SCAN_MAA_RESPONSE_LENGTH));
    EXPECT_TRUE(Logged(30000, "[MAA] result is larger than allocation (5242880)\n"));
    EXPECT_TRUE(records.empty());
    EXPECT_FALSE(vdev::ScanLocked());
}

TEST_F(ScanDriver, OnlyTheReportedCountOfTheResponseIsSent) {
    const std::string two = Frame(MAA_RESULT_CONTINUE, "one") + Frame(MAA_RESULT_END, "two");
    Answer(two, static_cast<U32>(Frame(MAA_RESULT_CONTINUE, "one").size()));
    ScanMotorTest(1);
    EXPECT_EQ(Wire(), Frame(MAA_RESULT_CONTINUE, "one"));
}

TEST_F(ScanDriver, AFailedTestCommandReleasesTheLockAndSaysSo) {
    for (int status : {5, -EIO}) {
        SCOPED_TRACE(status);
        Restart();
        Answer(Frame(MAA_RESULT_END, "never sent"), std::nullopt, status);
        ScanMotorTest(1);
        EXPECT_EQ(records, std::vector<Record>{End0("critical error! failed to control device")});
        EXPECT_EQ(Requests(vdev::kScanner),
                  (std::vector<unsigned long>{IOCNR_SCAN_APP_LOCK, IOC_MAA_TEST, IOCNR_SCAN_APP_LOCK_RELEASE}));
        EXPECT_FALSE(vdev::ScanLocked());
        EXPECT_EQ(Wire(), "");
    }
}

TEST_F(ScanDriver, AMissingScannerIsACriticalErrorRecord) {
    vdev::SetPresent(vdev::kScanner, false);
    ScanMotorTest(1);
    EXPECT_EQ(records, std::vector<Record>{End0("critical error! failed to open scan device")});
    EXPECT_TRUE(vdev::Ioctls(vdev::kScanner).empty());
    EXPECT_TRUE(sleeps.empty());
}

TEST_F(ScanDriver, SFRReadWriteQuotesItsTextAndRefusesAnUnmappedAddress) {
    char text[] = "REG_A";
    const U32 addr = MAA_AddrMap(text, sizeof text);
    Answer(Frame(MAA_RESULT_END, "sfr"));
    SFRReadWrite(0, addr, kMax);
    EXPECT_EQ(vdev::ScanCommands(), std::vector<std::string>{"SFRReadWrite(0,\"REG_A\",4294967295)"});
    EXPECT_EQ(Wire(), Frame(MAA_RESULT_END, "sfr"));

    for (U32 bad : {0u, kMax, addr + static_cast<U32>(sizeof text), 0x00100000u}) {
        SCOPED_TRACE(bad);
        records.clear();
        vdev::ClearIoctls();
        TMAAResult *r = SFRReadWrite(1, bad, 2);
        EXPECT_EQ(records, std::vector<Record>{End0("critical error! invalid text argument")});
        EXPECT_EQ(Returned(r), End0("critical error! invalid text argument"));
        EXPECT_TRUE(vdev::Ioctls(vdev::kScanner).empty());
    }
    EXPECT_EQ(vdev::ScanCommands().size(), 1u);
}

TEST_F(ScanDriver, ALongTextIsCutToTheCommandLength) {
    std::string longText(400, 't');
    const U32 addr = MAA_AddrMap(longText.data(), static_cast<U32>(longText.size() + 1));
    Answer(Frame(MAA_RESULT_END, "ok"));
    SFRReadWrite(1, addr, 2);
    ASSERT_EQ(vdev::ScanCommands().size(), 1u);
    EXPECT_EQ(vdev::ScanCommands()[0], ("SFRReadWrite(1,\"" + longText).substr(0, SCAN_MAA_COMMAND_LENGTH - 1));
}

TEST_F(ScanDriver, GetADFInfoReturnsTheMechanismForTheShellToWrite) {
    vdev::SetADFMecha(3, 258, 2);
    TMAAResult *r = GetADFInfo();
    EXPECT_EQ(records, std::vector<Record>{Cont("[ GetADFInfo ]")});
    EXPECT_EQ(Returned(r), End1("ADFType=3 MultiType=2 Version=258"));
    EXPECT_EQ(vdev::OpenCount(vdev::kScanner), 0);

    struct Failure {
        std::function<void()> script;
        std::string text;
    } failures[] = {
        {[] { vdev::SetPresent(vdev::kScanner, false); }, "critical error! failed to open scan device"},
        {[] { vdev::FailIoctl(vdev::kScanner, IOC_ADF_MECHA_TYPE, EIO); }, "Read ADF Type Fails"},
        {[] { vdev::FailIoctl(vdev::kScanner, IOC_ADF_MULTI_MECHA_TYPE, EIO); }, "Read ADF Multi Type Fails"},
    };
    for (const Failure &f : failures) {
        SCOPED_TRACE(f.text);
        vdev::Reset();
        f.script();
        EXPECT_EQ(Returned(GetADFInfo()), End1(f.text));
    }
}

}  // namespace
