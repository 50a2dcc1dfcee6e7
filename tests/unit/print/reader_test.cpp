// The reader's node and its waits. Preparation of the print node on
// MFP_DEV_INIT: owner and asynchronous notification, blocking reads, the
// driver's read time-out, the serial number. Then the reader under the
// bridge's signals: SIGIO lands on the reader's thread in the middle of its
// waits. A signal is no time-out, no error and no empty read: nothing changes
// at the Java side, and silence still ends a job on time. (Pins a departure:
// signals are not time-outs.) Also: a node that reports readiness but gives
// nothing must not make the reader spin.
#include <pthread.h>

#include <atomic>
#include <chrono>
#include <thread>

#include "adapter/Descriptors.h"
#include "common/UniqueFd.h"
#include "print/PrintRecorder.h"
#include "support/CpuTime.h"
#include "support/SignalStorm.h"
#include "support/WaitUntil.h"

namespace {

class ReaderSetup : public ::testing::Test {
protected:
    void SetUp() override {
        vdev::Reset();
        LoggerHost_StartCapture();
        if (fdPrn > 0) ::close(fdPrn);
        fdPrn = 0;
        // Descriptor 0 lends its flags to the node: make it a known one.
        savedStdin_.reset(::dup(0));
        UniqueFd null(::open("/dev/null", O_RDONLY));
        ASSERT_TRUE(null);
        ASSERT_EQ(::dup2(null.get(), 0), 0);
    }
    void TearDown() override {
        if (savedStdin_) ::dup2(savedStdin_.get(), 0);
        else ::close(0);
        if (fdPrn > 0) ::close(fdPrn);
        fdPrn = 0;
        vdev::Reset();
    }

    UniqueFd savedStdin_;
};

TEST_F(ReaderSetup, NodeIsOpenedOnceOwnedAsyncBlockingWithFiveSecondReads) {
    vdev::SetTimeouts({1, 2, 3, 4});
    ASSERT_EQ(::fcntl(0, F_SETFL, O_NONBLOCK), 0);  // taken over by the node, then cleared

    Initialization();

    ASSERT_GT(fdPrn.load(), 0);
    EXPECT_EQ(vdev::OpenCount(vdev::kPrn), 1);
    EXPECT_EQ(vdev::Owner(vdev::kPrn), ::getpid());
    EXPECT_TRUE(vdev::AsyncEnabled(vdev::kPrn));
    EXPECT_EQ(vdev::StatusFlags(vdev::kPrn) & O_NONBLOCK, 0);
    mfp_to_t to = vdev::Timeouts();
    EXPECT_EQ(to.ul_prn_read_to, 5000u);
    EXPECT_EQ(to.ul_prn_write_to, 2u);
    EXPECT_EQ(to.ul_scan_read_to, 3u);
    EXPECT_EQ(to.ul_scan_write_to, 4u);
    EXPECT_TRUE(LoggerHost_Contains("[USBAdp] FdPrn flags: "));
    EXPECT_EQ(std::string(reinterpret_cast<char *>(aub_serial_str)), "0000-00000000000");
    EXPECT_TRUE(LoggerHost_Contains("[USBAdp]Exited Initialization(), fdPrn:"));

    // An open node is not opened again.
    const int first = fdPrn;
    Initialization();
    EXPECT_EQ(fdPrn.load(), first);
    EXPECT_EQ(vdev::OpenCount(vdev::kPrn), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp]Initialization fdPrn open\n"), 1);
}

TEST_F(ReaderSetup, MissingNodeIsLoggedAndOpenedOnTheNextSetUp) {
    vdev::SetPresent(vdev::kPrn, false);
    Initialization();
    EXPECT_EQ(fdPrn.load(), 0);
    EXPECT_EQ(LoggerHost_Count("[USBAdp]Cannot open the device file of print, errno:2\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp]Error in opening file: /dev/usb/mfp_prn\n"), 1);

    vdev::SetPresent(vdev::kPrn, true);
    Initialization();
    EXPECT_GT(fdPrn.load(), 0);
    EXPECT_EQ(vdev::OpenCount(vdev::kPrn), 1);
}

TEST_F(ReaderSetup, FailedTimeOutQueryStopsTheSetUp) {
    vdev::FailIoctl(vdev::kPrn, IOCNR_GET_MFP_TO, EIO);
    Initialization();
    EXPECT_EQ(LoggerHost_Count("[USBAdp]ioctl failed.\n"), 1);
    for (const vdev::IoctlCall &c : vdev::Ioctls(vdev::kPrn)) EXPECT_NE(c.request, IOCNR_SET_MFP_TO);
    EXPECT_FALSE(LoggerHost_Contains("[USBAdp]Exited Initialization()"));
}

// ---- under signals ----------------------------------------------------------

using Clock = std::chrono::steady_clock;

class ReaderSignals : public ReaderTest {
protected:
    void SetUp() override {
        ReaderTest::SetUp();
        // Real time: the waits must really be waits for a signal to land in.
        vdev::SetInstantTimeouts(vdev::kPrn, false);
    }

    // Runs `pass` under a SIGIO storm while `host` plays the host; parks the
    // reader if it is still waiting 5 s later. Returns how long it took.
    static long PassUnderSignals(void (*pass)(), const std::function<void()> &host) {
        const auto start = Clock::now();
        UnderSignals(pass, host, 5000, [] { IsConfigured = 0; });
        IsConfigured = 1;
        return static_cast<long>(std::chrono::duration_cast<std::chrono::milliseconds>(Clock::now() - start).count());
    }
};

TEST_F(ReaderSignals, JobWithoutUelEndsAfterOneSilencePeriod) {
    slPollTimeout = 300;  // the silence period, shortened
    vdev::HostWrite(vdev::kPrn, "page data without any UEL");
    USBAdapter_ReadPass();
    ASSERT_EQ(rec::Jobs().size(), 1u);
    const long ms = PassUnderSignals(USBAdapter_ReadPass, [] {});
    auto jobs = rec::Jobs();
    ASSERT_EQ(jobs.size(), 1u);
    EXPECT_EQ(jobs[0].bytes, "page data without any UEL");
    EXPECT_TRUE(jobs[0].ended);
    EXPECT_GE(ms, 250);
    EXPECT_LT(ms, 3000) << "signals postponed the end of the silence";
    EXPECT_EQ(LoggerHost_Count("[USBAdp]NotifyEndOfData() called -- 2\n"), 1);
    EXPECT_FALSE(LoggerHost_Contains("Error in poll"));
}

TEST_F(ReaderSignals, ApplicationHeaderArrivingLateIsNotDropped) {
    const std::string nd = {'\x1b', '\x91', 0, 0, 0, 0, 0, 0x0D, 0, 0, 0, 0, 0, 0, 0, 0};
    vdev::HostWrite(vdev::kPrn, nd.substr(0, 2));
    PassUnderSignals(USBAdapter_ReadPass, [&] {
        // The header's rest comes while the classifier waits in its read.
        WaitUntil([] { return vdev::PendingHostBytes(vdev::kPrn) == 0; }, 2000);
        std::this_thread::sleep_for(std::chrono::milliseconds(100));
        vdev::HostWrite(vdev::kPrn, nd.substr(2));
    });
    auto apps = rec::Apps();
    ASSERT_EQ(apps.size(), 1u);
    EXPECT_EQ(apps[0].type, "networkrds");
    EXPECT_EQ(apps[0].writes, (std::vector<std::string>{nd}));
    EXPECT_TRUE(rec::Jobs().empty());
    EXPECT_GT(SignalStorm::Delivered(), 0);
}

// A node that says it is ready and then gives nothing (here: hung up). The
// reader lets each poll period pass instead of asking again at once, with or
// without UEL bytes held from the last chunk.
TEST_F(ReaderSignals, HungUpNodeDoesNotMakeTheReaderSpin) {
    const struct {
        const char *name;
        std::string before;  // what the host sent before the node hung up
        size_t jobs;
    } rows[] = {{"idle", "", 0}, {"held UEL bytes", "page\x1b%-12", 1}};
    for (const auto &r : rows) {
        SCOPED_TRACE(r.name);
        Restart(true);
        IsConfigured = 1;
        if (!r.before.empty()) Send({r.before}, false);
        vdev::Reset();  // the reader's descriptor is dead: ready, and reads give 0
        const WorkTime t = TimeUntilStopped(
            [] {
                for (int passes = 0; IsConfigured && passes < 1000000; ++passes) USBAdapter_ReadPass();
            },
            [] { IsConfigured = 0; }, 600);
        EXPECT_GE(t.wallMs, 500);
        EXPECT_LT(t.wallMs, 3000) << "parking is noticed while idling";
        EXPECT_LT(t.cpuMs, t.wallMs / 5) << "the reader spun on a node with nothing to give";
        USBAdapter_EndJobOnPark();
        auto jobs = rec::Jobs();
        ASSERT_EQ(jobs.size(), r.jobs);
        for (const rec::Job &j : jobs) {
            EXPECT_EQ(j.bytes, r.before);
            EXPECT_TRUE(j.ended);
        }
    }
}

}  // namespace
