// What the host sees of the device: descriptors, Device ID and serial number as
// staged in the bridge, the report file, and close/re-open of the print node.
#include <fcntl.h>
#include <unistd.h>

#include <cstring>
#include <string>

#include <gtest/gtest.h>

#include "LoggerHost.h"
#include "adapter/Descriptors.h"
#include "adapter/Lifecycle.h"
#include "adapter/ProductConfig.h"
#include "adapter/SerialNumber.h"
#include "adapter/USB.h"
#include "support/Bytes.h"
#include "support/TempRoot.h"
#include "vdev.h"

namespace {

template <size_t N>
void Put(U8 (&buf)[N], const std::string &s) {
    ASSERT_LT(s.size(), N);
    std::memset(buf, 0, N);
    std::memcpy(buf, s.data(), s.size());
}

std::string Str(const U8 *s) { return reinterpret_cast<const char *>(s); }

class Identity : public ::testing::Test {
protected:
    void SetUp() override {
        vdev::Reset();
        LoggerHost_StartCapture();
        fdPrn = ::open(vdev::kPrn, O_RDWR);
        ASSERT_GT(fdPrn.load(), 0);
        Put(aub_mf_string, "Tarnwel Electronics Co., Ltd.");
        Put(manufacturingString, "MFR");
        Put(deviceClassName, "CLASS");
        Put(aub_pd_string, "MODEL");
        Put(aub_serial_str, "ABC1234567");
        IsConfigured = 0;
        IsDisconnected = 0;
        hibernation_flag = 0;
        startreading_enter = 0;
        IsCanClose = 0;
    }
    void TearDown() override {
        if (fdPrn.load() > 0) ::close(fdPrn.exchange(0));
    }
    TempRoot root_;
};

// ---- Device ID -------------------------------------------------------------------

TEST_F(Identity, ModelGroupsSwitchCommandSetsAndCompatibleIds) {
    struct Case {
        const char *model;
        const char *cmd;
        const char *cid;
    } const cases[] = {
        {"MODEL", "PCL5E,PCL6,POSTSCRIPT,FAX,FWV,QMDS,EXT,SBC", ""},
        {"tw-m4020cdn", "PCL5E,PCL6,POSTSCRIPT,FAX,FWV,QMDS,EXT,SBC", "CID:NV_PCL6_Color;"},
        {"TW-M4030 plus", "PCL5E,PCL6,POSTSCRIPT,FAX,FWV,QMDS,EXT,SBC", "CID:NV_PCL6_BW;"},
        {"TW-X7100", "PCL5E,PCL6,POSTSCRIPT,FAX,FWV,QMDS,XPS,EXT,SBC", "CID:NV_PCL6_BW;CID:NV_XPS_BW;"},
        {"TW-X7200", "PCL5E,PCL6,POSTSCRIPT,PDF,TIFF,JPEG,FAX,FWV,QMDS,XPS,EXT,SBC",
         "CID:NV_PCL6_Color;CID:NV_XPS_Color;"},
        {"tw-c5050", "PCL5E,PCL6,POSTSCRIPT,PDF,TIFF,JPEG,FAX,FWV,QMDS,EXT,SBC", "CID:NV_PCL6_Color;"},
    };
    for (const Case &c : cases) {
        for (void (*build)() : {SetDeviceIDString, SetDeviceIDString_reOpen}) {
            Put(aub_pd_string, c.model);
            build();
            EXPECT_EQ(Str(aub_dev1284_str), std::string("MFG:MFR;CMD:") + c.cmd + ";MDL:" + c.model +
                                                ";CLS:CLASS;MODE:QML7,SCN;" + c.cid + "STATUS:IDLE;")
                << c.model;
        }
    }
    EXPECT_TRUE(LoggerHost_Contains("[USBAdp] aub_dev1284_str, sizeof: 200::length: 101"));
}

TEST_F(Identity, LongestJavaStringsAreCutToTheDeviceIdBuffer) {
    Put(manufacturingString, std::string(19, 'M'));
    Put(deviceClassName, std::string(19, 'C'));
    Put(aub_pd_string, "TW-X7200" + std::string(31, 'x'));
    SetDeviceIDString_reOpen();
    std::string id = Str(aub_dev1284_str);
    EXPECT_EQ(id.size(), sizeof aub_dev1284_str - 1);
    EXPECT_EQ(id.rfind("MFG:" + std::string(19, 'M') + ";CMD:", 0), 0u);
    EXPECT_TRUE(LoggerHost_Contains("[USBAdp] Device ID cut to 199 bytes"));
}

// ---- descriptors -------------------------------------------------------------------

TEST_F(Identity, DescriptorRequestCarriesIdsStringsAndSizesWithTheirNul) {
    struct Case {
        const char *model;
        const char *serial;
        U16 pid;
        S32 (*set)() = MfpDevSetDesc;
        std::optional<uint8_t> connect = 1;  // what the device was told last
    } const cases[] = {
        // First, while nothing has connected: the MAA variant keeps the default
        // product id and does not connect.
        {"TW-M4020cdn", "ABC1234567", DEV_PRODUCT_ID, MAAMfpDevSetDesc, std::nullopt},
        {"TW-M4020cdn", "ABC1234567", 0x0121},
        {"tw-m4020CDN Series", "ABC1234567", 0x0121},  // any case, any tail
        {"TW-M4020", "", 0x0110},                      // an empty serial still has its NUL
        {"TW-M402", "ABC1234567", DEV_PRODUCT_ID},     // shorter than every prefix
        {"Other", "ABC1234567", DEV_PRODUCT_ID},
    };
    for (const Case &c : cases) {
        Put(aub_pd_string, c.model);
        Put(aub_serial_str, c.serial);
        SetDeviceIDString_reOpen();
        ASSERT_EQ(c.set(), 0) << c.model;
        auto d = vdev::LastDescriptor();
        ASSERT_TRUE(d) << c.model;
        EXPECT_EQ(U16{d->param.uwVid}, DEV_VENDOR_ID);
        EXPECT_EQ(U16{d->param.uwPid}, c.pid) << c.model;
        EXPECT_EQ(U16{d->param.uwLangID}, 0x0409);
        EXPECT_EQ(d->param.ubMf_string_size, std::strlen("Tarnwel Electronics Co., Ltd.") + 1);
        EXPECT_EQ(d->param.ubPd_string_size, std::strlen(c.model) + 1);
        EXPECT_EQ(d->param.ubSerial_string_size, std::strlen(c.serial) + 1);
        EXPECT_EQ(U16{d->param.uwDev_id_1284_size}, std::strlen(Str(aub_dev1284_str).c_str()) + 1);
        EXPECT_EQ(d->product, c.model);
        EXPECT_EQ(d->serial, c.serial);
        EXPECT_EQ(d->deviceId, Str(aub_dev1284_str));
        EXPECT_EQ(vdev::ConnectState(), c.connect);
    }
    EXPECT_TRUE(LoggerHost_Contains("Setting Descriptors Request made successfully to driver."));
}

// Every row of the product table is reachable: no earlier prefix hides it.
TEST_F(Identity, EveryProductTableRowIsReachable) {
    U32 n = 0;
    const TProductIdRow *rows = ProductConfig_Table(&n);
    ASSERT_GT(n, 0u);
    for (U32 i = 0; i < n; ++i)
        EXPECT_EQ(ProductConfig_ProductId(reinterpret_cast<const U8 *>(rows[i].prefix)), rows[i].pid)
            << rows[i].prefix;
}

TEST_F(Identity, FailedDescriptorOrConnectRequestAnswersMinusOne) {
    for (unsigned long req : {IOCNR_SET_DESC_REQ, IOCNR_SET_DEV_CONNECT}) {
        vdev::FailIoctl(vdev::kPrn, req, EIO);
        EXPECT_EQ(MfpDevSetDesc(), -1);
    }
    vdev::FailIoctl(vdev::kPrn, IOCNR_SET_DESC_REQ, EIO);
    EXPECT_EQ(MAAMfpDevSetDesc(), -1);
    EXPECT_TRUE(LoggerHost_Contains("Setting Descriptors Request to driver Unsuccessful."));
}

// ---- serial number ---------------------------------------------------------------

TEST_F(Identity, SerialNumberRecordIsStagedForTheHost) {
    ASSERT_EQ(USBADP_SetSerialNumber(), 0);
    auto rec = vdev::HostVendorRequest(0x49, 0, 1);
    ASSERT_TRUE(rec);
    EXPECT_EQ(std::string(reinterpret_cast<const char *>(rec->data)), "ABC1234567");
    EXPECT_EQ(rec->data[10], 0);

    Put(aub_serial_str, "");
    EXPECT_EQ(USBADP_SetSerialNumber(), -1);
    int fd = fdPrn.exchange(0);
    Put(aub_serial_str, "XYZ9876543");
    vdev::ClearIoctls();
    EXPECT_EQ(USBADP_SetSerialNumber(), -1);
    EXPECT_TRUE(vdev::Ioctls().empty());
    fdPrn = fd;
}

TEST(SerialValidity, RulesOfLengthAndCharacters) {
    struct Case {
        const char *serial;
        bool valid;
    } const cases[] = {
        {"ABC123", false},             // 6
        {"ABC1234", true},             // 7
        {"ABCDEFGHIJKLMNOP", true},    // 16
        {"ABCDEFGHIJKLMNOPQ", false},  // 17
        {"ABCDEFG HIJ", true},         // blank at position 7
        {"ABC DEFGH", false},          // blank at position 3
        {"ABCDEF,GH", false},          // comma at 6
        {"ABCDEFG\\H", true},          // backslash at 7
        {"0000-00000000000", true},
        {"", false},
    };
    for (const Case &c : cases) {
        std::string s = c.serial;
        EXPECT_EQ(IsValidUSBSerialString(reinterpret_cast<U8 *>(s.data())), c.valid) << '"' << c.serial << '"';
        EXPECT_EQ(s, c.serial) << "the caller's text is not changed";
    }
    EXPECT_FALSE(IsValidUSBSerialString(nullptr));
    std::string huge(300, 'A');  // length 300 is 44 in 8 bits: still too long
    EXPECT_FALSE(IsValidUSBSerialString(reinterpret_cast<U8 *>(huge.data())));
    std::string wraps(256 + 10, 'A');  // 266 is 10 in 8 bits: taken as short, yet all 16 pass
    EXPECT_TRUE(IsValidUSBSerialString(reinterpret_cast<U8 *>(wraps.data())));
}

TEST_F(Identity, ReportFileTakesFourCharactersAndTheSeriesName) {
    struct Case {
        const char *in;
        const char *file;
    } const cases[] = {
        {"ABCDEFGH", "ABCD\tTW-M4000 Series"},
        {"AB", "AB\tTW-M4000 Series"},
    };
    for (const Case &c : cases) {
        WriteSerialString(reinterpret_cast<U8 *>(::strdup(c.in)));  // takes the buffer
        EXPECT_EQ(ReadFile(root_ / REPORT_FILE), c.file);
    }
}

// ---- close and re-open -------------------------------------------------------------

TEST_F(Identity, CloseForgetsTheNodeEvenWhenItFails) {
    // Before the reader started: no wait.
    EXPECT_EQ(USBAdapter_IF_PrintClose(), 1);
    EXPECT_EQ(fdPrn.load(), 0);
    EXPECT_EQ(vdev::OpenCount(vdev::kPrn), 0);
    EXPECT_EQ(hibernation_flag.load(), 1);

    int real = fdPrn.exchange(::open("/dev/null", O_RDONLY));
    ::close(fdPrn.load());  // now a closed descriptor: close fails
    EXPECT_EQ(USBAdapter_IF_PrintClose(), 0);
    EXPECT_EQ(fdPrn.load(), 0);
    EXPECT_TRUE(LoggerHost_Contains("[USBAdp] close on print channel failed, errno: 9"));
    // Not open at all: standard input is never closed in its place.
    EXPECT_EQ(USBAdapter_IF_PrintClose(), 0);
    EXPECT_NE(::fcntl(0, F_GETFD), -1);
    ::close(real);
}

TEST_F(Identity, ReopenSetsTheNodeUpAgainAndResumes) {
    struct Case {
        U8 disconnected;
        U8 configured;
    } const cases[] = {{0, 1}, {1, 0}};
    for (const Case &c : cases) {
        ASSERT_EQ(USBAdapter_IF_PrintClose(), 1);
        IsDisconnected = c.disconnected;
        Put(aub_serial_str, "bad serial");
        const size_t opens = vdev::Opens(vdev::kPrn);
        EXPECT_EQ(USBAdapter_IF_PrintInit(), 1);
        EXPECT_EQ(vdev::Opens(vdev::kPrn), opens + 1);
        EXPECT_GT(fdPrn.load(), 0);
        EXPECT_EQ(hibernation_flag.load(), 0);
        EXPECT_EQ(USBAdapter_IF_PrintDrvOpenCheck(), c.configured);
        EXPECT_TRUE(vdev::AsyncEnabled(vdev::kPrn));
        EXPECT_EQ(vdev::Timeouts().ul_prn_read_to, 5000u);
        // A damaged serial is replaced by the default, and the host gets it.
        ASSERT_TRUE(vdev::LastDescriptor());
        EXPECT_EQ(vdev::LastDescriptor()->serial, "0000-00000000000");
        EXPECT_EQ(vdev::ConnectState(), 1);
        auto rec = vdev::HostVendorRequest(0x49, 0, 1);
        ASSERT_TRUE(rec);
        EXPECT_EQ(std::string(reinterpret_cast<const char *>(rec->data)), "0000-00000000000");
    }
    EXPECT_TRUE(LoggerHost_Contains("[USBAdp] IsDisconnected signal is set"));
}

TEST_F(Identity, ReopenThatCannotSetTheNodeUpAnswersZero) {
    ASSERT_EQ(USBAdapter_IF_PrintClose(), 1);
    vdev::SetPresent(vdev::kPrn, false);
    EXPECT_EQ(USBAdapter_IF_PrintInit(), 0);
    EXPECT_EQ(fdPrn.load(), 0);
    vdev::SetPresent(vdev::kPrn, true);
    vdev::FailIoctl(vdev::kPrn, IOCNR_SET_DESC_REQ, EIO);
    EXPECT_EQ(USBAdapter_IF_PrintInit(), 0);
    EXPECT_EQ(hibernation_flag.load(), 1);
}

}  // namespace
