// The bridge's ioctl set as the model serves it: what each request stores or
// answers, how calls are recorded, and injected failures.
#include <atomic>
#include <cstring>
#include <string>
#include <thread>

#include "vdev/VdevTest.h"

using Ioctls = VdevTest;

namespace {

std::vector<uint8_t> Bytes(const void *p, size_t n) {
    const uint8_t *b = static_cast<const uint8_t *>(p);
    return {b, b + n};
}

}  // namespace

TEST_F(Ioctls, DescriptorStringsAreCopiedByTheirSizeFields) {
    UniqueFd fd = Open(vdev::kPrn);
    char mf[3] = {'A', 'C', 'M'};  // not terminated: the size alone bounds it
    char pd[] = "MODEL 9\0tail";
    char serial[] = "";
    std::string devId(300, 'D');  // longer than a byte size field could say
    desc_param_t d{};
    d.uwVid = 0x1234;
    d.uwPid = 0x5678;
    d.uwLangID = 0x0409;
    d.ubMf_string_size = sizeof mf;
    d.ubPd_string_size = sizeof pd;
    d.ubSerial_string_size = 1;
    d.uwDev_id_1284_size = static_cast<U16>(devId.size() + 1);
    d.stDevStrID.pub_mf_string = reinterpret_cast<U8 *>(mf);
    d.stDevStrID.pub_pd_string = reinterpret_cast<U8 *>(pd);
    d.stDevStrID.pub_serial_string = reinterpret_cast<U8 *>(serial);
    d.stDevStrID.pub_dev_id_1284 = reinterpret_cast<U8 *>(devId.data());
    ASSERT_EQ(ioctl(fd.get(), IOCNR_SET_DESC_REQ, &d), 0);
    // Copied at call time: later changes of the buffers do not show.
    mf[0] = 'X';
    devId[0] = 'X';

    std::optional<vdev::DescriptorRequest> got = vdev::LastDescriptor();
    ASSERT_TRUE(got);
    EXPECT_EQ(got->manufacturer, "ACM");
    EXPECT_EQ(got->product, "MODEL 9");
    EXPECT_EQ(got->serial, "");
    EXPECT_EQ(got->deviceId, std::string(300, 'D'));
    EXPECT_EQ(U16{got->param.uwPid}, 0x5678);  // packed fields: copied, not bound
    EXPECT_EQ(U16{got->param.uwLangID}, 0x0409);
    EXPECT_EQ(U16{got->param.uwDev_id_1284_size}, 301);
    std::vector<vdev::IoctlCall> calls = vdev::Ioctls(vdev::kPrn);
    ASSERT_EQ(calls.size(), 1u);
    EXPECT_EQ(calls[0].payload, Bytes(&d, sizeof d));
}

TEST_F(Ioctls, UnreadableDescriptorStringIsRefusedWithEfault) {
    UniqueFd fd = Open(vdev::kPrn);
    desc_param_t d{};
    d.ubMf_string_size = 4;  // pointer left null
    errno = 0;
    EXPECT_EQ(ioctl(fd.get(), IOCNR_SET_DESC_REQ, &d), -1);
    EXPECT_EQ(errno, EFAULT);
    EXPECT_FALSE(vdev::LastDescriptor());
    EXPECT_EQ(ioctl(fd.get(), IOCNR_SET_DESC_REQ, nullptr), -1);
    EXPECT_EQ(errno, EFAULT);
}

TEST_F(Ioctls, TimeoutsAreKeptAndAnswered) {
    UniqueFd fd = Open(vdev::kPrn);
    mfp_to_t to{};
    ASSERT_EQ(ioctl(fd.get(), IOCNR_GET_MFP_TO, &to), 0);
    EXPECT_EQ(std::memcmp(&to, &vdev::kInitialTimeouts, sizeof to), 0);
    to.ul_prn_read_to = 5000;
    to.ul_scan_write_to = 77;
    ASSERT_EQ(ioctl(fd.get(), IOCNR_SET_MFP_TO, &to), 0);
    EXPECT_EQ(U32{vdev::Timeouts().ul_prn_read_to}, 5000u);
    EXPECT_EQ(U32{vdev::Timeouts().ul_scan_write_to}, 77u);

    mfp_to_t answer{1, 2, 3, 4};
    vdev::SetTimeouts(answer);
    mfp_to_t back{};
    ASSERT_EQ(ioctl(fd.get(), IOCNR_GET_MFP_TO, &back), 0);
    EXPECT_EQ(std::memcmp(&back, &answer, sizeof back), 0);
}

TEST_F(Ioctls, DeviceRecordsAreKept) {
    UniqueFd fd = Open(vdev::kPrn);
    char id[200] = "MFG:MFR;CMD:PCL6;";
    ASSERT_EQ(ioctl(fd.get(), IOCNR_SET_DEVICE_ID, id), 0);
    ASSERT_TRUE(vdev::LastDeviceId());
    EXPECT_EQ(*vdev::LastDeviceId(), Bytes(id, std::strlen(id)));

    U8 one = 1;
    ASSERT_EQ(ioctl(fd.get(), IOCNR_SET_DEV_CONNECT, &one), 0);
    EXPECT_EQ(vdev::ConnectState(), 1);
    ASSERT_EQ(ioctl(fd.get(), IOCNR_SET_DEV_CONNECT, 0), 0) << "a byte passed by value is taken too";
    EXPECT_EQ(vdev::ConnectState(), 0);
    U8 status = 0x18;
    ASSERT_EQ(ioctl(fd.get(), IOCNR_SET_PORT_STATUS, &status), 0);
    EXPECT_EQ(vdev::PortStatus(), 0x18);

    vendor_cmd_t v{};
    v.bRequest = 0x49;
    v.wIndex = 1;
    std::memcpy(v.data, "SERIAL", 6);
    v.data[VENDOR_CMD_DATA_SIZE - 1] = 0xEE;  // the driver reads the whole record
    ASSERT_EQ(ioctl(fd.get(), IOCNR_SET_DEV_VENDOR, &v), 0);
    v.bRequest = 0x56;
    ASSERT_EQ(ioctl(fd.get(), IOCNR_SET_DEV_VENDOR, &v), 0);
    EXPECT_EQ(vdev::VendorCommands(), (std::vector<uint8_t>{0x49, 0x56}));
    ASSERT_EQ(vdev::VendorRecords().size(), 2u);
    EXPECT_EQ(U16{vdev::VendorRecords()[0].wIndex}, 1);
    EXPECT_EQ(vdev::VendorRecords()[0].data[VENDOR_CMD_DATA_SIZE - 1], 0xEE);
    EXPECT_EQ(vdev::Ioctls().back().payload.size(), sizeof(vendor_cmd_t));

    uint8_t data[VENDOR_DATA_SIZE] = {1, 2, 3, 4, 5, 6, 7, 8};
    ASSERT_EQ(ioctl(fd.get(), IOCNR_SET_VENDOR_REQ, data), 0);
    EXPECT_EQ(vdev::VendorData(), (std::vector<std::vector<uint8_t>>{Bytes(data, 8)}));
}

TEST_F(Ioctls, QueuedAnswersAreHandedOutOnceOldestFirst) {
    UniqueFd fd = Open(vdev::kScan);
    const uint8_t req1[VENDOR_REQ_SIZE] = {0xC1, 0x0D, 0, 0, 0, 0, 8, 0};
    const uint8_t req2[VENDOR_REQ_SIZE] = {0xC1, 0x02, 0, 0, 0, 0, 16, 0};
    vdev::QueueVendorRequest(req1);
    vdev::QueueVendorRequest(req2);
    uint8_t got[VENDOR_REQ_SIZE];
    ASSERT_EQ(ioctl(fd.get(), IOCNR_GET_VENDOR_REQ, got), 0);
    EXPECT_EQ(Bytes(got, 8), Bytes(req1, 8));
    ASSERT_EQ(ioctl(fd.get(), IOCNR_GET_VENDOR_REQ, got), 0);
    EXPECT_EQ(Bytes(got, 8), Bytes(req2, 8));
    EXPECT_EQ(ioctl(fd.get(), IOCNR_GET_VENDOR_REQ, got), -1);
    EXPECT_EQ(errno, EAGAIN);

    const uint8_t cmd[SCAN_CMD_SIZE] = {0x1B, 0xA8, 1, 2};
    uint8_t scan[SCAN_CMD_SIZE];
    EXPECT_EQ(ioctl(fd.get(), IOCNR_GET_CMD_SCAN, scan), -1);
    EXPECT_EQ(errno, EAGAIN);
    vdev::QueueScanCommand(cmd);
    ASSERT_EQ(ioctl(fd.get(), IOCNR_GET_CMD_SCAN, scan), 0);
    EXPECT_EQ(Bytes(scan, 4), Bytes(cmd, 4));
}

TEST_F(Ioctls, WaitCmdScanBlocksUntilACommandIsQueued) {
    UniqueFd fd = Open(vdev::kScan);
    std::atomic<int> result{-2};
    uint8_t scan[SCAN_CMD_SIZE] = {};
    std::thread waiter([&] { result = ioctl(fd.get(), IOCNR_WAIT_CMD_SCAN, scan); });
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
    EXPECT_EQ(result.load(), -2);
    const uint8_t cmd[SCAN_CMD_SIZE] = {9, 8, 7, 6};
    vdev::QueueScanCommand(cmd);
    waiter.join();
    EXPECT_EQ(result.load(), 0);
    EXPECT_EQ(Bytes(scan, 4), Bytes(cmd, 4));

    mfp_to_t to = vdev::Timeouts();
    to.ul_scan_read_to = 30;
    vdev::SetTimeouts(to);
    EXPECT_EQ(ioctl(fd.get(), IOCNR_WAIT_CMD_SCAN, scan), -1);
    EXPECT_EQ(errno, ETIMEDOUT);
}

TEST_F(Ioctls, UnknownRequestFailsWithEnottyAndIsRecorded) {
    UniqueFd fd = Open(vdev::kPrn);
    uint8_t window[WINDOW_DATA_SIZE];
    errno = 0;
    EXPECT_EQ(ioctl(fd.get(), _IOR('k', 61, int), window), -1);
    EXPECT_EQ(errno, ENOTTY);
    std::vector<vdev::IoctlCall> calls = vdev::Ioctls();
    ASSERT_EQ(calls.size(), 1u);
    EXPECT_EQ(calls[0].path, vdev::kPrn);
    EXPECT_EQ(calls[0].result, -1);
    EXPECT_EQ(calls[0].error, ENOTTY);
}

TEST_F(Ioctls, CallsAreRecordedInOrderAcrossNodesAndPaths) {
    UniqueFd prn = Open(vdev::kPrn);
    UniqueFd scan = Open(vdev::kScan);
    mfp_to_t to{};
    mfp_notif_t n{};
    ASSERT_EQ(ioctl(prn.get(), IOCNR_GET_MFP_TO, &to), 0);
    EXPECT_EQ(ioctl(prn.get(), MFP_IOC_GET_NOTIF, &n), -1);
    vdev::QueueNotification(vdev::kScan, mfp_notif_t{SCAN_COMMAND, {}, eMfp_Notif_Scan});
    ASSERT_EQ(ioctl(scan.get(), MFP_IOC_GET_NOTIF, &n), 0);
    U8 one = 1;
    ASSERT_EQ(ioctl(prn.get(), IOCNR_SET_DEV_CONNECT, &one), 0);

    std::vector<vdev::IoctlCall> all = vdev::Ioctls();
    ASSERT_EQ(all.size(), 4u);
    EXPECT_EQ(all[0].request, IOCNR_GET_MFP_TO);
    EXPECT_EQ(all[0].payload, Bytes(&to, sizeof to));
    EXPECT_EQ(all[1].request, MFP_IOC_GET_NOTIF);
    EXPECT_EQ(all[1].result, -1);
    EXPECT_EQ(all[1].error, EAGAIN);
    EXPECT_TRUE(all[1].payload.empty());
    EXPECT_EQ(all[2].path, vdev::kScan);
    EXPECT_EQ(all[2].payload, Bytes(&n, sizeof n));
    EXPECT_EQ(all[3].request, IOCNR_SET_DEV_CONNECT);
    EXPECT_EQ(all[3].payload, std::vector<uint8_t>{1});

    EXPECT_EQ(vdev::Ioctls(vdev::kScan).size(), 1u);
    vdev::ClearIoctls();
    EXPECT_TRUE(vdev::Ioctls().empty());
}

TEST_F(Ioctls, InjectedFailuresHitTheNextCallsOfThatRequestOnly) {
    UniqueFd fd = Open(vdev::kPrn);
    vdev::FailIoctl(vdev::kPrn, IOCNR_SET_MFP_TO, EIO, 2);
    vdev::FailIoctl(vdev::kPrn, MFP_IOC_GET_NOTIF, EINTR);
    vdev::QueueNotification(vdev::kPrn, mfp_notif_t{MFP_DEV_RESET, {}, eMfp_Notif_Prn});

    mfp_to_t to{7, 7, 7, 7};
    U8 one = 1;
    EXPECT_EQ(ioctl(fd.get(), IOCNR_SET_DEV_CONNECT, &one), 0) << "other requests are unaffected";
    EXPECT_EQ(ioctl(fd.get(), IOCNR_SET_MFP_TO, &to), -1);
    EXPECT_EQ(errno, EIO);
    EXPECT_EQ(ioctl(fd.get(), IOCNR_SET_MFP_TO, &to), -1);
    mfp_to_t kept = vdev::Timeouts();
    EXPECT_EQ(std::memcmp(&kept, &vdev::kInitialTimeouts, sizeof kept), 0) << "a failed set changes nothing";
    EXPECT_EQ(ioctl(fd.get(), IOCNR_SET_MFP_TO, &to), 0);
    EXPECT_EQ(U32{vdev::Timeouts().ul_prn_read_to}, 7u);

    mfp_notif_t n{};
    EXPECT_EQ(ioctl(fd.get(), MFP_IOC_GET_NOTIF, &n), -1);
    EXPECT_EQ(errno, EINTR);
    EXPECT_EQ(vdev::PendingNotifications(vdev::kPrn), 1u) << "a failed GET_NOTIF does not consume";
    EXPECT_EQ(ioctl(fd.get(), MFP_IOC_GET_NOTIF, &n), 0);

    std::vector<vdev::IoctlCall> calls = vdev::Ioctls();
    ASSERT_EQ(calls.size(), 6u);
    EXPECT_EQ(calls[1].result, -1);
    EXPECT_EQ(calls[1].error, EIO);
    EXPECT_EQ(calls[1].payload, Bytes(&to, sizeof to)) << "what the library passed is recorded";
    EXPECT_EQ(calls[4].error, EINTR);
}
