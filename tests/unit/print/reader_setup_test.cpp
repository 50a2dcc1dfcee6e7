// Preparation of the print node on MFP_DEV_INIT: owner and asynchronous
// notification, blocking reads, the driver's read time-out, the serial number.
#include <fcntl.h>
#include <unistd.h>

#include <cstring>

#include "adapter/Descriptors.h"
#include "common/UniqueFd.h"
#include "print/PrintRecorder.h"

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

}  // namespace
