// The scan reader inside a real JVM beside the print reader: packets on the
// emulated scan node become application transfers of the print daemon, made on
// the scan reader's own thread; capability and print-image requests are
// answered from the daemon on the channel they came on. Length rules and
// refusals are covered by the unit tests; here are the paths that need Java.
#include <gtest/gtest.h>

#include "print_Support.h"
#include "support/Bytes.h"

namespace {

const std::string kSizeRequest = Bytes({0x1B, 0x24, 0xF4, 0x00, 0, 0, 0, 0, 0, 0});
const std::string kDataRequest = Bytes({0x1B, 0x24, 0xF4, 0x01, 0, 0, 0, 0, 0, 0});
const std::string kImageRequest = Bytes({0x1B, 0x91, 0, 0, 0, 0, 0, 3, 0, 0, 0, 1, 0, 0, 0, 0});
const std::string kPcScan = Bytes({0x1B, 0xA8, 0x28, 0x02, 'o', 'k'});

class ScanChannel : public PrintJvmTest {
protected:
    static void ReadScanMsg(jobject daemon, jobject scanService) {
        jvm::CallVoid(daemon, "readScanMsg", "(Ljava/lang/Object;)V", scanService);
    }
    // Both readers started as the Java service starts them; the host configures
    // the device for both interfaces.
    void StartBoth() {
        StartReader(fixtures::kRecordingDaemon, false);
        if (HasFatalFailure()) return;
        jvm::CallVoid(daemon_, "initDevice", "()V");
        ASSERT_TRUE(WaitUntil([] { return LoggerHost_Contains("[USBAdp]Exited Initialization(), fdPrn:"); }));
        jobject daemon = daemon_;
        jobject scanService = jvm::New("java/lang/Object");
        jvm::StartDetached([daemon, scanService](JNIEnv *) { ReadScanMsg(daemon, scanService); }, "scan-reader");
        ASSERT_TRUE(WaitUntil([] { return LoggerHost_Contains("[USBAdp Scan] Waiting for the scan events"); }));
        vdev::QueueNotification(vdev::kPrn, printjvm::Notification(MFP_DEV_CONFIGURED, eMfp_Notif_Both));
        ASSERT_TRUE(WaitUntil([] { return LoggerHost_Contains("[USBAdp Scan] Received MFP_DEV_CONFIGURED event"); }));
        ASSERT_TRUE(WaitUntil([] { return vdev::PollTimeouts(vdev::kPrn).size() >= 1; }));
    }

    // Sends `request` on `node`, then a PC-scan packet on the same node as a
    // marker; returns what the device wrote on `node` once the marker reached
    // Java (each reader handles one packet after the other).
    static std::string Answer(const char *node, const std::string &request) {
        const int before = fixtures::AppCount();
        vdev::HostWrite(node, request);
        vdev::HostWrite(node, kPcScan);
        EXPECT_TRUE(WaitUntil([&] { return fixtures::AppCount() > before && fixtures::AppClosed(before); }));
        EXPECT_EQ(fixtures::AppBytes(before), kPcScan);
        auto bytes = vdev::HostRead(node);
        return std::string(bytes.begin(), bytes.end());
    }
};

TEST_F(ScanChannel, PacketsReachJavaWholeOnTheScanReadersThread) {
    StartBoth();
    if (HasFatalFailure()) return;
    const std::string xml = "<apps><app>Mail</app></apps>";
    std::string s2a = Bytes({0x1B, 0x9A, 0x03, 0, 0, 0, 0, static_cast<int>(xml.size())});
    const std::vector<std::pair<std::string, std::vector<std::string>>> packets = {
        {"pcscan", {Bytes({0x1B, 0xA8, 0x24, 0x01, 'a', 'b', 'c'})}},
        {"scan2pc", {s2a, xml.substr(0, 10), xml.substr(10)}},
        {"taviklight", {Bytes({0x1B, 0xAA, 0x01, 0x03}), "xyz"}},
        {"ids", {kImageRequest}},
    };
    for (const auto &p : packets)
        for (const std::string &t : p.second) vdev::HostWrite(vdev::kScan, t);
    ASSERT_TRUE(WaitUntil([&] { return fixtures::AppCount() == 4 && fixtures::AppClosed(3); }));
    for (int i = 0; i < 4; ++i) {
        std::string all;
        for (const std::string &t : packets[i].second) all += t;
        EXPECT_EQ(fixtures::AppType(i), packets[i].first);
        EXPECT_EQ(fixtures::AppBytes(i), all);
        EXPECT_TRUE(fixtures::AppClosed(i));
        EXPECT_EQ(fixtures::AppThread(i), "scan-reader");
    }
    // Header and XML are two writes of one transfer, every other packet one.
    EXPECT_EQ(fixtures::Calls("write"), 5);
    EXPECT_TRUE(vdev::HostRead(vdev::kScan).empty());
}

TEST_F(ScanChannel, CapabilityRequestsAreAnsweredOnTheirOwnChannel) {
    StartBoth();
    if (HasFatalFailure()) return;
    fixtures::SetIntReply("getCapXmlSize", 0x1234);
    const std::string xml = "<Capability><Model>TW-4020 \xc3\xa9</Model></Capability>";
    fixtures::SetReply("getCapXmlData", xml);
    fixtures::SetBytesReply("getPrintImage", std::string("\x89PNG\0\x01", 6));
    const std::string sizeReply = Bytes({0x1B, 0x24, 0xF4, 0, 0, 0, 0, 0, 0x12, 0x34});
    for (const char *node : {vdev::kScan, vdev::kPrn}) {
        SCOPED_TRACE(node);
        EXPECT_EQ(Answer(node, kSizeRequest), sizeReply);
        EXPECT_EQ(Answer(node, kDataRequest), xml);
    }
    // The image request exists on the print channel; on the scan channel the
    // same bytes are an ID-scan packet (the marker test above).
    EXPECT_EQ(Answer(vdev::kPrn, kImageRequest),
              Bytes({0x1B, 0x91, 0, 0, 0, 0, 0, 3, 0, 0, 0, 1, 0, 0, 0, 6}) + std::string("\x89PNG\0\x01", 6));
    EXPECT_EQ(fixtures::Calls("getCapXmlSize"), 2);
    EXPECT_EQ(fixtures::Calls("getPrintImage"), 1);
    EXPECT_TRUE(vdev::HostRead(vdev::kScan).empty());
}

TEST_F(ScanChannel, WhenJavaFailsTheHostGetsNoReplyAndTheNextRequestWorks) {
    StartBoth();
    if (HasFatalFailure()) return;
    fixtures::ThrowOn("getCapXmlSize", 1);
    EXPECT_EQ(Answer(vdev::kScan, kSizeRequest), "");
    fixtures::ReturnNull("getCapXmlData");
    EXPECT_EQ(Answer(vdev::kScan, kDataRequest), "");
    fixtures::ReturnNull("getCapXmlData", false);
    // Any other code is swallowed, even with Java ready to answer.
    EXPECT_EQ(Answer(vdev::kScan, Bytes({0x1B, 0x24, 0xF4, 0x07, 0, 0, 0, 0, 0, 0})), "");
    fixtures::ReturnNull("getPrintImage");
    testing::internal::CaptureStdout();
    EXPECT_EQ(Answer(vdev::kPrn, kImageRequest), "");
    const std::string out = testing::internal::GetCapturedStdout();
    EXPECT_NE(out.find("\r\n[VLX_Main] SetImageWrite() jGetPrintImage NULL or ImageSize = 0 return"), std::string::npos)
        << out;
    fixtures::SetIntReply("getCapXmlSize", 77);
    EXPECT_EQ(Answer(vdev::kScan, kSizeRequest), Bytes({0x1B, 0x24, 0xF4, 0, 0, 0, 0, 0, 0, 77}));
    EXPECT_EQ(fixtures::Calls("getCapXmlSize"), 2);
}

TEST_F(ScanChannel, ReadScanMsgReturnsToJavaWhenTheScanNodeIsMissing) {
    vdev::SetPresent(vdev::kScan, false);
    jobject daemon = jvm::New(fixtures::kRecordingDaemon);
    ReadScanMsg(daemon, daemon);  // a Java exception would fail the test
    EXPECT_EQ(LoggerHost_Count("[USBAdp Scan] Scan channel not present(/dev/usb/mfp_scan), errno:2\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp Scan] USBAdpScan_Init() fails\n"), 1);
    // The entry is free again: a second call gets as far as the node again.
    ReadScanMsg(daemon, daemon);
    EXPECT_EQ(LoggerHost_Count("[USBAdp Scan] USBAdpScan_Init() fails\n"), 2);
    ReadScanMsg(daemon, nullptr);
    EXPECT_EQ(LoggerHost_Count("[USBAdp Scan] (env(1) == NULL) || (p_scan_obj(0) == NULL)\n"), 1);
}

}  // namespace
