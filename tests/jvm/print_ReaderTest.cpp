// The print reader inside a real JVM: host transfers on the emulated print
// node become jobs and application transfers of the Java print daemon, byte
// for byte. Framing and classification cases are matrices of the reader's unit
// tests; here are the paths that need Java: its objects, its exceptions, its
// missing methods, and a job too large for any buffer.
#include <atomic>

#include "print_Hidden.h"
#include "print_Support.h"
#include "support/RandomBytes.h"

namespace {

using printjvm::AwaitJobBytes;

void Send(const std::vector<std::string> &transfers) {
    for (const std::string &t : transfers) vdev::HostWrite(vdev::kPrn, t);
}

void ExpectJob(int job, const std::string &bytes) {
    ASSERT_TRUE(fixtures::AwaitJobEnded(job, 10000)) << "job " << job << " did not end";
    EXPECT_TRUE(fixtures::JobBytes(job) == bytes) << "job " << job << ": " << fixtures::JobByteCount(job)
                                                  << " bytes delivered, " << bytes.size() << " sent";
}

using PrintReader = PrintJvmTest;

// Every cut of a UEL is covered by the reader's unit tests; here one cut shows
// the held bytes reaching Java in the right job.
TEST_F(PrintReader, UelCutAcrossTwoReadsIsJoined) {
    StartReader();
    if (HasFatalFailure()) return;
    const std::string page(120, 'p');
    Send({kUel + page + kUel.substr(0, 4), kUel.substr(4) + Framed("second")});
    ExpectJob(0, Framed(page));
    ExpectJob(1, Framed("second"));
    EXPECT_EQ(fixtures::JobFileName(0), "");
    EXPECT_EQ(fixtures::JobChunkSizes(1), (std::vector<int>{static_cast<int>(Framed("second").size())}));
    EXPECT_EQ(fixtures::Calls("processPrintCommand"), 2);
}

TEST_F(PrintReader, DcuNdAndFaxdReachJavaAndAnEmptyDcuIsRefused) {
    StartReader();
    if (HasFatalFailure()) return;
    auto header = [](char app, char length) {
        return std::string{'\x1b', '\x91', 0, 0, 0, 0, 0, app, 0, 0, 0, 0, 0, 0, 0, length};
    };
    Send({header(0x07, 5), "<dcu>", header(0x07, 0), header(0x0D, 0), header(0x0E, 0), Framed("after")});
    ExpectJob(0, Framed("after"));
    ASSERT_EQ(fixtures::AppCount(), 3);
    const std::vector<std::pair<std::string, std::string>> apps = {
        {"dcu", header(0x07, 5) + "<dcu>"}, {"networkrds", header(0x0D, 0)}, {"faxd", header(0x0E, 0)}};
    for (int i = 0; i < 3; ++i) {
        EXPECT_EQ(fixtures::AppType(i), apps[i].first);
        EXPECT_EQ(fixtures::AppBytes(i), apps[i].second);
        EXPECT_TRUE(fixtures::AppClosed(i));
    }
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
    StartReader(fixtures::kDaemonWithoutUpcalls);
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

// The reader waits up to five minutes for the rest of a UEL job; a close must
// not wait that out. What the job holds so far, the UEL bytes held at the end
// of the last transfer included, is its content.
TEST_F(PrintReader, CloseDuringAnOpenUelJobReturnsAtOnceAndEndsTheJob) {
    StartReader();
    if (HasFatalFailure()) return;
    const std::string head = kUel + "@PJL ENTER LANGUAGE=PCL\r\npages so far", cut = kUel.substr(0, 5);
    Send({head, cut});
    ASSERT_TRUE(WaitUntil([] {
        std::vector<int> t = vdev::PollTimeouts(vdev::kPrn);
        return vdev::PendingHostBytes(vdev::kPrn) == 0 && vdev::PollsInProgress(vdev::kPrn) > 0 && !t.empty() &&
               t.back() == 300000;
    }));
    std::atomic<jint> r{-1};
    std::atomic<bool> returned{false};
    jobject service = daemon_;
    jvm::StartDetached(
        [&, service](JNIEnv *) {
            r = jvm::CallInt(service, "USBPrintDrvClose", "()I");
            returned = true;
        },
        "close");
    const bool prompt = WaitUntil([&] { return returned.load(); }, 10000);
    if (!prompt) vdev::ExpirePoll(vdev::kPrn);  // let the close end before the test does
    ASSERT_TRUE(prompt || WaitUntil([&] { return returned.load(); }, 10000));
    EXPECT_TRUE(prompt) << "the close waited for the reader's poll";
    EXPECT_EQ(r.load(), 1);
    ExpectJob(0, head + cut);
    EXPECT_EQ(LoggerHost_Count(
                  "[USBAdp]NotifyEndOfData() called when usb cable is plugged out in between of data transfer\n"),
              1);
}

TEST_F(PrintReader, FortyMebibyteJobInMebibyteTransfersArrivesWhole) {
    StartReader();
    if (HasFatalFailure()) return;
    LoggerHost_StopCapture();
    const std::string stream = Framed(RandomBytes((40u << 20) - 2 * kUel.size(), 1234));
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
