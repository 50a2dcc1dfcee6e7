// The print reader inside a real JVM as the Java service drives it: close,
// re-open, configuration check and cable pulls around jobs in progress, and
// the serial number the reader takes from the print daemon. Framing,
// classification and large jobs are the reader's unit tests; the soak sends
// transfers of up to one read through Java.
#include <dlfcn.h>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <string>
#include <thread>

#include "maa/MAA_Types.h"
#include "print_Support.h"
#include "support/Bytes.h"

namespace {

using printjvm::Hibernate;
using printjvm::kUel;
using printjvm::Wake;

const std::string kPulledLine =
    "[USBAdp]NotifyEndOfData() called when usb cable is plugged out in between of data transfer\n";

class Lifecycle : public PrintJvmTest {
protected:
    jint OpenCheck() { return jvm::CallInt(daemon_, "USBPrintDrvOpenChk", "()I"); }
    // The host sends a framed job: it becomes job `job`, whole and ended.
    static void ExpectNextJobWhole(int job) {
        const std::string bytes = Framed("job " + std::to_string(job));
        vdev::HostWrite(vdev::kPrn, bytes);
        ASSERT_TRUE(fixtures::AwaitJobEnded(job, 10000));
        EXPECT_EQ(fixtures::JobBytes(job), bytes);
        EXPECT_EQ(fixtures::JobCount(), job + 1);
    }
};

// The reader waits up to five minutes for the rest of a UEL job; a close must
// not wait that out. What the job holds so far, the UEL bytes held at the end
// of the last transfer included, is its content. Re-opened, the reader goes on
// with the next job.
TEST_F(Lifecycle, CloseDuringAnOpenUelJobReturnsAtOnceEndsTheJobAndReopenResumes) {
    StartReader();
    if (HasFatalFailure()) return;
    const std::string head = kUel + "@PJL ENTER LANGUAGE=PCL\r\npages so far", cut = kUel.substr(0, 5);
    vdev::HostWrite(vdev::kPrn, head);
    vdev::HostWrite(vdev::kPrn, cut);
    ASSERT_TRUE(WaitUntil([] {
        std::vector<int> t = vdev::PollTimeouts(vdev::kPrn);
        return vdev::PendingHostBytes(vdev::kPrn) == 0 && vdev::PollsInProgress(vdev::kPrn) > 0 && !t.empty() &&
               t.back() == 300000;
    }));
    EXPECT_FALSE(fixtures::JobEnded(0));
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
    EXPECT_TRUE(fixtures::JobEnded(0));
    EXPECT_EQ(fixtures::JobBytes(0), head + cut);
    EXPECT_THAT(fixtures::EventLines(), testing::Contains("processPrintCommand:")) << "the job has no file name";
    EXPECT_EQ(LoggerHost_Count(kPulledLine), 1);
    EXPECT_EQ(vdev::OpenCount(vdev::kPrn), 0);
    EXPECT_TRUE(LoggerHost_Contains("[USBAdp][Hibernation] Complete Print USB Driver Closed"));

    EXPECT_EQ(Wake(daemon_), 1);
    EXPECT_EQ(OpenCheck(), 1);
    EXPECT_EQ(vdev::OpenCount(vdev::kPrn), 1);
    // Re-open builds the Device ID without asking the daemon for its status.
    const int statusCalls = fixtures::Calls("getPrinterStatus");
    ASSERT_TRUE(vdev::LastDescriptor());
    EXPECT_NE(vdev::LastDescriptor()->deviceId.find("STATUS:IDLE;"), std::string::npos);
    EXPECT_EQ(fixtures::Calls("getPrinterStatus"), statusCalls);
    ExpectNextJobWhole(1);
}

// A cable pulled during a job ends it; re-opened with the cable still out, the
// device stays unconfigured until the host configures it again.
TEST_F(Lifecycle, CablePulledDuringAJobEndsItAndTheReaderWaitsForTheNextConfiguration) {
    StartReader();
    if (HasFatalFailure()) return;
    vdev::HostWrite(vdev::kPrn, "ab");
    // The reader has the two bytes and waits for the rest of the burst.
    ASSERT_TRUE(WaitUntil([] { return vdev::PollTimeouts(vdev::kPrn).size() == 2; }));
    vdev::QueueNotification(vdev::kPrn, printjvm::Notification(MFP_DEV_DISCONNECT));
    ASSERT_TRUE(WaitUntil([&] { return OpenCheck() == 0; }));
    vdev::ExpirePoll(vdev::kPrn);
    ASSERT_TRUE(fixtures::AwaitJobEnded(0, 10000));
    EXPECT_EQ(fixtures::JobBytes(0), "ab");
    EXPECT_EQ(LoggerHost_Count(kPulledLine), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp]NotifyEndOfData() called -- 2\n"), 0);

    EXPECT_EQ(Hibernate(daemon_), 1);
    EXPECT_EQ(Wake(daemon_), 1);
    EXPECT_EQ(OpenCheck(), 0);
    EXPECT_TRUE(LoggerHost_Contains("[USBAdp] IsDisconnected signal is set"));
    vdev::QueueNotification(vdev::kPrn, printjvm::Notification(MFP_DEV_CONFIGURED));
    ASSERT_TRUE(WaitUntil([&] { return OpenCheck() == 1; }));
    ExpectNextJobWhole(1);
}

// Close and re-open racing with a stream of jobs: every job but the one the
// close cut arrives whole.
TEST_F(Lifecycle, HibernationRacingWithJobsLosesOnlyTheCutJob) {
    StartReader();
    constexpr int kJobs = 40;
    std::thread host([&] {
        for (int i = 0; i < kJobs; ++i) {
            vdev::HostWrite(vdev::kPrn, kUel + "job " + std::to_string(i) + ";" + kUel);
            std::this_thread::sleep_for(std::chrono::milliseconds(20));
        }
    });
    constexpr int kRounds = 3;
    for (int round = 0; round < kRounds; ++round) {
        std::this_thread::sleep_for(std::chrono::milliseconds(150));
        EXPECT_EQ(Hibernate(daemon_), 1);
        EXPECT_EQ(Wake(daemon_), 1);
    }
    host.join();
    ASSERT_TRUE(WaitUntil([] { return vdev::PendingHostBytes(vdev::kPrn) == 0; }, 20000));
    // The node is empty once the reader has taken the last transfer, which may
    // still be on its way to Java: wait for the last job's text, or time out
    // and name what is missing.
    std::string all;
    int cut = 0;
    WaitUntil(
        [&] {
            all.clear();
            cut = 0;
            for (int j = 0; j < fixtures::JobCount(); ++j) {
                const std::string b = fixtures::JobBytes(j);
                all += b;
                const bool whole = b.size() > 2 * kUel.size() && b.rfind(kUel, 0) == 0 &&
                                   b.compare(b.size() - kUel.size(), kUel.size(), kUel) == 0;
                cut += !whole;
            }
            return fixtures::JobCount() > 0 && fixtures::JobEnded(fixtures::JobCount() - 1) &&
                   all.find("job " + std::to_string(kJobs - 1) + ";") != std::string::npos;
        },
        20000);
    EXPECT_LE(cut, kRounds) << "only a job open at a close is cut";
    for (int i = 0; i < kJobs; ++i)
        EXPECT_NE(all.find("job " + std::to_string(i) + ";"), std::string::npos) << "job " << i << " lost";
}

// ---- the serial number the host sees -------------------------------------------------

struct SerialCase {
    const char *name;
    const char *mcSerial;  // getMcSerial's answer; null: answers null
    int inConf;            // checkMcSerialInConf's answer
    const char *usb;       // the serial the host sees
};

class SerialFromDaemon : public PrintJvmTest, public ::testing::WithParamInterface<SerialCase> {};

TEST_P(SerialFromDaemon, ReachesTheHostOrFallsBackToTheDefault) {
    const SerialCase &c = GetParam();
    if (c.mcSerial)
        fixtures::SetReply("getMcSerial", c.mcSerial);
    else
        fixtures::ReturnNull("getMcSerial");
    fixtures::SetIntReply("checkMcSerialInConf", c.inConf);
    StartReader();
    auto d = vdev::LastDescriptor();
    ASSERT_TRUE(d);
    EXPECT_EQ(d->serial, c.usb);
    EXPECT_EQ(d->param.ubSerial_string_size, std::string(c.usb).size() + 1);
    auto rec = vdev::HostVendorRequest(0x49, 0, 1);
    ASSERT_TRUE(rec);
    EXPECT_EQ(std::string(reinterpret_cast<const char *>(rec->data)), c.usb);
    // The model's row of the product table.
    EXPECT_EQ(U16{d->param.uwPid}, 0x0160);
    EXPECT_EQ(d->deviceId,
              "MFG:Tarnwel;CMD:PCL5E,PCL6,POSTSCRIPT,FAX,FWV,QMDS,EXT,SBC;MDL:TW-4020 MFP;CLS:printer;"
              "MODE:QML7,SCN;CID:NV_PCL6_BW;STATUS:IDLE;");
}

INSTANTIATE_TEST_SUITE_P(
    Cases, SerialFromDaemon,
    ::testing::Values(SerialCase{"InStep", "ABC1234567", 0, "ABC1234567"},
                      SerialCase{"OutOfStep", "ABC1234567", 1, "0000-00000000000"},
                      SerialCase{"NullSerial", nullptr, 0, "0000-00000000000"},
                      SerialCase{"Invalid", "ABC 1234567", 0, "0000-00000000000"}),
    [](const auto &info) { return std::string(info.param.name); });

// ---- setters for factory tooling -----------------------------------------------------

using Setter = TMAAResult *(*)(U8 *);

Setter Exported(const char *name) {
    void *lib = ::dlopen(USBADAPTER_SONAME, RTLD_NOW | RTLD_NOLOAD);
    return lib ? reinterpret_cast<Setter>(::dlsym(lib, name)) : nullptr;
}

std::string Text(const TMAAResult *r) {
    return r && r->pubData ? std::string(reinterpret_cast<const char *>(r->pubData), r->ulDataSize) : "";
}

TEST_F(Lifecycle, SettersPassTheSerialToTheDaemonAndReportItsAnswer) {
    StartReader();
    struct Case {
        const char *setter;
        const char *serial;  // null passes null
        const char *event;
        const char *result;
    } const cases[] = {
        {"USB_SetSerialNumber", "NEW1234567", "maaUSBSetSerialNumber:NEW1234567", "USB SerialNumber=NEW1234567"},
        {"USB_SetSerialNumber", nullptr, "maaUSBSetSerialNumber:0000-00000000000",
         "USB SerialNumber=0000-00000000000"},
        {"USB_SetSnNoPowerOff", "ABC", "maaUSBSetSnNoPowerOff:0000-00000000000", "USB SerialNumber=0000-00000000000"},
    };
    for (const Case &c : cases) {
        Setter set = Exported(c.setter);
        ASSERT_NE(set, nullptr) << c.setter;
        std::string buf = c.serial ? c.serial : "";
        TMAAResult *r = set(c.serial ? reinterpret_cast<U8 *>(buf.data()) : nullptr);
        EXPECT_EQ(Text(r), c.result);
        EXPECT_EQ(r->enContinue, MAA_RESULT_END);
        EXPECT_THAT(fixtures::EventLines(), testing::Contains(c.event));
        if (c.serial) {
            EXPECT_EQ(buf, c.serial) << "a short buffer is left as it is";
        }
    }
    EXPECT_EQ(ReadFile(root_ / "/halvard/sys/statusinfo/usb_version.txt"), "0000-00000000000\tTW-M4000 Series");

    fixtures::ReturnNull("maaUSBSetSnNoPowerOff");
    std::string ok = "GOOD1234567";
    EXPECT_EQ(Text(Exported("USB_SetSnNoPowerOff")(reinterpret_cast<U8 *>(ok.data()))), "USB Serial = Write Fail");
    fixtures::ReturnNull("maaUSBSetSerialNumber");
    EXPECT_EQ(Text(Exported("USB_SetSerialNumber")(reinterpret_cast<U8 *>(ok.data()))), "USB SerialNumber=NG");
    // A long invalid serial is replaced in the caller's buffer.
    std::string longBad = "BAD SERIAL 123456789";
    Exported("USB_SetSerialNumber")(reinterpret_cast<U8 *>(longBad.data()));
    EXPECT_STREQ(longBad.c_str(), "0000-00000000000");
}

}  // namespace
