// The print reader inside a real JVM: host transfers on the emulated print
// node become jobs of the Java print daemon, byte for byte.
#include <cstring>
#include <random>

#include <atomic>

#include "print_Hidden.h"
#include "print_Support.h"

namespace {

using printjvm::AwaitJobBytes;
using printjvm::kUel;
using printjvm::WaitUntil;

std::string Framed(const std::string &payload) { return kUel + payload + kUel; }

void Send(const std::vector<std::string> &transfers) {
    for (const std::string &t : transfers) vdev::HostWrite(vdev::kPrn, t);
}

void ExpectJob(int job, const std::string &bytes) {
    ASSERT_TRUE(fixtures::AwaitJobEnded(job, 10000)) << "job " << job << " did not end";
    EXPECT_TRUE(fixtures::JobBytes(job) == bytes) << "job " << job << ": " << fixtures::JobByteCount(job)
                                                  << " bytes delivered, " << bytes.size() << " sent";
}

using PrintReader = PrintJvmTest;

TEST_F(PrintReader, UelFramedJobInOneReadIsOneJobOfOnePass) {
    StartReader();
    if (HasFatalFailure()) return;
    const std::string job = Framed("@PJL ENTER LANGUAGE=PCL\r\n" + std::string(300, 'x'));
    Send({job});
    ExpectJob(0, job);
    EXPECT_EQ(fixtures::JobFileName(0), "");
    EXPECT_EQ(fixtures::JobChunkSizes(0), (std::vector<int>{static_cast<int>(job.size())}));
    EXPECT_EQ(fixtures::Calls("processPrintCommand"), 1);
    // The next wait for data is the short one again.
    ASSERT_TRUE(WaitUntil([] { return vdev::PollTimeouts(vdev::kPrn).size() == 3; }));
    EXPECT_EQ(vdev::PollTimeouts(vdev::kPrn), (std::vector<int>{5000, 5000, 5000}));
}

TEST_F(PrintReader, UelCutAfterEachOfItsFirstEightBytesIsJoinedAcrossReads) {
    StartReader();
    if (HasFatalFailure()) return;
    const std::string page(120, 'p');
    for (int k = 1; k <= 8; ++k) {
        SCOPED_TRACE(k);
        Send({kUel + page + kUel.substr(0, k), kUel.substr(k) + Framed("second")});
        ExpectJob(2 * (k - 1), Framed(page));
        ExpectJob(2 * (k - 1) + 1, Framed("second"));
    }
}

TEST_F(PrintReader, HeldUelBytesBecomeAJobOfTheirOwnAfterSilence) {
    StartReader();
    if (HasFatalFailure()) return;
    Send({Framed("A") + kUel.substr(0, 5)});
    ExpectJob(0, Framed("A"));
    EXPECT_EQ(fixtures::JobCount(), 1);
    Silence();
    ExpectJob(1, kUel.substr(0, 5));
}

TEST_F(PrintReader, DataWithoutUelIsOneJobUntilSilence) {
    StartReader();
    if (HasFatalFailure()) return;
    Send({"first ", "second part ", "third"});
    ASSERT_TRUE(AwaitJobBytes(0, 23));
    EXPECT_FALSE(fixtures::JobEnded(0));
    Silence();
    ExpectJob(0, "first second part third");
    EXPECT_EQ(fixtures::JobCount(), 1);
}

TEST_F(PrintReader, DataInFrontOfAUelEndsTheJobAtThatUel) {
    StartReader();
    if (HasFatalFailure()) return;
    Send({"end of a job" + kUel + Framed("next")});
    ExpectJob(0, "end of a job" + kUel);
    ExpectJob(1, Framed("next"));
}

TEST_F(PrintReader, ShortPjlPrefixIsDeliveredWithoutAFurtherRead) {
    StartReader();
    if (HasFatalFailure()) return;
    const std::string head = kUel + "@PJL\r\n";
    Send({head});
    ASSERT_TRUE(AwaitJobBytes(0, static_cast<long long>(head.size())));
    EXPECT_EQ(vdev::ReadSizes(vdev::kPrn), (std::vector<size_t>{2, 78}));
    Send({"page" + kUel});
    ExpectJob(0, head + "page" + kUel);
    EXPECT_EQ(fixtures::JobChunkSizes(0), (std::vector<int>{15, 13}));
}

TEST_F(PrintReader, EscapeWithUnknownSelectorIsPrintData) {
    StartReader();
    if (HasFatalFailure()) return;
    const std::string job = "\x1b" "E\x1b&l1O a PCL page";
    Send({job});
    ASSERT_TRUE(AwaitJobBytes(0, static_cast<long long>(job.size())));
    Silence();
    ExpectJob(0, job);
    EXPECT_EQ(fixtures::JobChunkSizes(0), (std::vector<int>{static_cast<int>(job.size())}));
}

TEST_F(PrintReader, EmptyDcuIsRefusedWhileEmptyNdAndFaxdReachJava) {
    StartReader();
    if (HasFatalFailure()) return;
    auto header = [](char app) { return std::string{'\x1b', '\x91', 0, 0, 0, 0, 0, app, 0, 0, 0, 0, 0, 0, 0, 0}; };
    Send({header(0x07), header(0x0D), header(0x0E), Framed("after")});
    ExpectJob(0, Framed("after"));
    ASSERT_EQ(fixtures::AppCount(), 2);
    EXPECT_EQ(fixtures::AppType(0), "networkrds");
    EXPECT_EQ(fixtures::AppBytes(0), header(0x0D));
    EXPECT_TRUE(fixtures::AppClosed(0));
    EXPECT_EQ(fixtures::AppType(1), "faxd");
    EXPECT_EQ(fixtures::AppBytes(1), header(0x0E));
    EXPECT_EQ(fixtures::AppWriteCount(1), 1);
    EXPECT_TRUE(fixtures::AppClosed(1));
    EXPECT_EQ(LoggerHost_Count("[USBAdp] [DCU] slDCUPacketLen[0] <= 0\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Error in executing Host App\n"), 1);
}

TEST_F(PrintReader, JavaExceptionInAChunkLeavesTheJobGoing) {
    StartReader();
    if (HasFatalFailure()) return;
    fixtures::ThrowOn("addBufferToList", 1);
    Send({"first chunk"});
    ASSERT_TRUE(fixtures::AwaitCalls("addBufferToList", 1, 10000));
    Send({"second chunk"});
    ASSERT_TRUE(AwaitJobBytes(0, 12));
    Silence();
    ExpectJob(0, "second chunk");  // the chunk Java threw on is not kept by it
    EXPECT_NE(fixtures::Events().find("addBufferToList:0:11!throw"), std::string::npos) << fixtures::Events();
}

TEST_F(PrintReader, DaemonWithoutPrintCommandGetsNoJobAndTheReaderGoesOn) {
    StartReader(fixtures::kDaemonWithoutPrintCommand);
    if (HasFatalFailure()) return;
    Send({"job data"});
    ASSERT_TRUE(WaitUntil([] { return LoggerHost_Count("[USBAdp] globalUSBPrintFileStreamObj == NULL\n") == 1; }));
    Silence();
    ASSERT_TRUE(WaitUntil([] { return LoggerHost_Count("[USBAdp] globalUSBPrintFileStreamObj == NULL\n") == 2; }));
    // RegisterJob answered 1: the reader went on to pass the data.
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Error in RegisterJob()::can't find processPrintCommand().\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp]receiving 1\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp]returning back\n"), 0);
    Send({Framed("again")});
    ASSERT_TRUE(WaitUntil([] {
        return LoggerHost_Count("[USBAdp] Error in RegisterJob()::can't find processPrintCommand().\n") == 2;
    }));
    EXPECT_EQ(fixtures::JobCount(), 0);
}

TEST_F(PrintReader, RefusedJobDropsItsChunkAndTheNextOneTriesAgain) {
    StartReader();
    if (HasFatalFailure()) return;
    fixtures::ReturnNull("processPrintCommand");
    Send({Framed("refused")});
    ASSERT_TRUE(WaitUntil([] { return LoggerHost_Count("[USBAdp]returning back\n") == 1; }));
    fixtures::ReturnNull("processPrintCommand", false);
    Send({Framed("accepted")});
    ExpectJob(0, Framed("accepted"));
    EXPECT_EQ(fixtures::JobCount(), 1);
}

TEST_F(PrintReader, CablePulledDuringAJobEndsItAndThePlugResumesReading) {
    StartReader();
    if (HasFatalFailure()) return;
    Send({"ab"});
    // The reader has the two bytes and waits for the rest of the burst.
    ASSERT_TRUE(WaitUntil([] { return vdev::PollTimeouts(vdev::kPrn).size() == 2; }));
    vdev::QueueNotification(vdev::kPrn, printjvm::Notification(MFP_DEV_DISCONNECT));
    ASSERT_TRUE(WaitUntil([] { return vdev::PendingNotifications(vdev::kPrn) == 0; }));
    Silence();
    ExpectJob(0, "ab");
    EXPECT_EQ(LoggerHost_Count("[USBAdp]NotifyEndOfData() called when usb cable is plugged out in between of data "
                               "transfer\n"),
              1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp]NotifyEndOfData() called -- 2\n"), 0);

    vdev::QueueNotification(vdev::kPrn, printjvm::Notification(MFP_DEV_CONFIGURED));
    Send({Framed("after plug")});
    ExpectJob(1, Framed("after plug"));
}

TEST_F(PrintReader, ClosingTheChannelParksTheReaderAndEndsTheJob) {
    StartReader();
    if (HasFatalFailure()) return;
    auto *hibernation = hidden::Variable<std::atomic<U8>>("hibernation_flag");
    auto *canClose = hidden::Variable<std::atomic<U8>>("IsCanClose");
    ASSERT_TRUE(hibernation && canClose);
    Send({"ab"});
    ASSERT_TRUE(WaitUntil([] { return vdev::PollTimeouts(vdev::kPrn).size() == 2; }));
    EXPECT_EQ(canClose->load(), 0);
    *hibernation = 1;  // what the close entry does
    Silence();
    ExpectJob(0, "ab");
    ASSERT_TRUE(WaitUntil([&] { return canClose->load() == 1; }, 5000));
    // Parked: the node is left alone.
    const size_t polls = vdev::PollTimeouts(vdev::kPrn).size();
    std::this_thread::sleep_for(std::chrono::milliseconds(1200));
    EXPECT_EQ(vdev::PollTimeouts(vdev::kPrn).size(), polls);

    *hibernation = 0;  // re-opened
    Send({Framed("resumed")});
    ExpectJob(1, Framed("resumed"));
    EXPECT_EQ(canClose->load(), 0);
}

// Three framed jobs with escapes, partial and spoiled UELs in their data, cut
// once at every offset (but the last two, where the end of the stream would
// wait out a real time-out).
TEST_F(PrintReader, FramedJobsSurviveEveryCut) {
    StartReader();
    if (HasFatalFailure()) return;
    const std::vector<std::string> jobs = {Framed("page \x1b%-1234 \x1b\x1b%-12345Y end"), Framed(""),
                                           Framed("\x1b" "E@PJL SET COPIES=2\r\n\x1b%-1")};
    std::string stream;
    for (const std::string &j : jobs) stream += j;
    LoggerHost_StopCapture();
    int next = 0;
    for (size_t cut = 1; cut + 2 < stream.size(); ++cut) {
        SCOPED_TRACE(cut);
        Send({stream.substr(0, cut), stream.substr(cut)});
        for (const std::string &j : jobs) ExpectJob(next++, j);
        if (HasFailure()) return;
    }
}

TEST_F(PrintReader, FortyMebibyteJobInMebibyteTransfersArrivesWhole) {
    StartReader();
    if (HasFatalFailure()) return;
    LoggerHost_StopCapture();
    std::mt19937_64 rng(1234);
    std::string body((40u << 20) - 2 * kUel.size(), '\0');
    for (size_t i = 0; i + 8 <= body.size(); i += 8) {
        uint64_t v = rng();
        std::memcpy(&body[i], &v, 8);
    }
    const std::string stream = Framed(body);
    std::string sent;
    for (size_t at = 0; at < stream.size(); at += 1u << 20) {
        std::string t = stream.substr(at, 1u << 20);
        if (at > 0 && t[0] == '\x1b') t[0] = 'A';  // a transfer starting with ESC would be classified
        sent += t;
        vdev::HostWrite(vdev::kPrn, t);
    }
    ASSERT_TRUE(fixtures::AwaitJobEnded(0, 60000));
    EXPECT_EQ(fixtures::JobByteCount(0), static_cast<long long>(sent.size()));
    EXPECT_EQ(fixtures::JobSha256(0), fixtures::Sha256(sent));
    EXPECT_EQ(fixtures::JobCount(), 1);
}

}  // namespace
