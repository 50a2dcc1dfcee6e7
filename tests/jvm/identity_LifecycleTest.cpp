// Hibernation as the Java service drives it (close, re-open, configuration
// check) around a running print reader, and the serial number the reader
// takes from the print daemon.
#include <dlfcn.h>

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

class Lifecycle : public PrintJvmTest {
protected:
    jint OpenCheck() { return jvm::CallInt(daemon_, "USBPrintDrvOpenChk", "()I"); }
};

TEST_F(Lifecycle, CloseEndsTheOpenJobAndReopenResumesWithTheNextJobWhole) {
    StartReader();
    vdev::HostWrite(vdev::kPrn, kUel + "first job, cut by the close");
    ASSERT_TRUE(printjvm::AwaitJobBytes(0, static_cast<long long>(kUel.size() + 27)));
    EXPECT_FALSE(fixtures::JobEnded(0));

    EXPECT_EQ(Hibernate(daemon_), 1);
    EXPECT_TRUE(fixtures::JobEnded(0));
    EXPECT_TRUE(LoggerHost_Contains(
        "[USBAdp]NotifyEndOfData() called when usb cable is plugged out in between of data transfer"));
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

    const std::string second = kUel + "second job" + kUel;
    vdev::HostWrite(vdev::kPrn, second);
    ASSERT_TRUE(printjvm::AwaitJobBytes(1, static_cast<long long>(second.size())));
    ASSERT_TRUE(fixtures::AwaitJobEnded(1, 10000));
    EXPECT_EQ(fixtures::JobBytes(1), second);
    EXPECT_EQ(fixtures::JobCount(), 2);
}

TEST_F(Lifecycle, ReopenWithTheCableOutLeavesTheDeviceUnconfigured) {
    StartReader();
    EXPECT_EQ(OpenCheck(), 1);
    vdev::QueueNotification(vdev::kPrn, printjvm::Notification(MFP_DEV_DISCONNECT));
    ASSERT_TRUE(WaitUntil([&] { return OpenCheck() == 0; }));
    EXPECT_EQ(Hibernate(daemon_), 1);
    EXPECT_EQ(Wake(daemon_), 1);
    EXPECT_EQ(OpenCheck(), 0);
    EXPECT_TRUE(LoggerHost_Contains("[USBAdp] IsDisconnected signal is set"));
    // The next configuration lets the reader go on.
    vdev::QueueNotification(vdev::kPrn, printjvm::Notification(MFP_DEV_CONFIGURED));
    ASSERT_TRUE(WaitUntil([&] { return OpenCheck() == 1; }));
    const std::string job = kUel + "after the cable" + kUel;
    vdev::HostWrite(vdev::kPrn, job);
    ASSERT_TRUE(printjvm::AwaitJobBytes(0, static_cast<long long>(job.size())));
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
    ASSERT_TRUE(WaitUntil([] { return fixtures::JobCount() > 0 && fixtures::JobEnded(fixtures::JobCount() - 1); },
                          20000));
    std::string all;
    int cut = 0;
    for (int j = 0; j < fixtures::JobCount(); ++j) {
        const std::string b = fixtures::JobBytes(j);
        all += b;
        const bool whole = b.size() > 2 * kUel.size() && b.rfind(kUel, 0) == 0 &&
                           b.compare(b.size() - kUel.size(), kUel.size(), kUel) == 0;
        cut += !whole;
    }
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
        EXPECT_NE(fixtures::Events().find(std::string(c.event) + "\n"), std::string::npos) << c.event;
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
