// The bridge's ioctl set as the model serves it: what each request stores or
// answers, queued answers handed out once, how calls are recorded, and
// injected failures.
#include <sys/ioctl.h>

#include <cstring>
#include <functional>
#include <string>
#include <vector>

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

TEST_F(Ioctls, SetRequestsAreKeptAsTheDriverGotThem) {
    UniqueFd fd = Open(vdev::kPrn);
    char id[200] = "MFG:MFR;CMD:PCL6;";
    U8 connect = 1, status = 0x18;
    vendor_cmd_t v{};
    v.bRequest = 0x49;
    v.data[VENDOR_CMD_DATA_SIZE - 1] = 0xEE;  // the driver reads the whole record
    uint8_t data[VENDOR_DATA_SIZE] = {1, 2, 3, 4, 5, 6, 7, 8};
    mfp_to_t to{7, 8, 9, 10};
    struct Row {
        unsigned long request;
        void *arg;
        std::function<std::vector<uint8_t>()> kept;
        std::vector<uint8_t> expected;
    } rows[] = {
        {IOCNR_SET_DEVICE_ID, id, [] { return vdev::LastDeviceId().value_or(std::vector<uint8_t>{}); },
         Bytes(id, std::strlen(id))},
        {IOCNR_SET_DEV_CONNECT, &connect, [] { return std::vector<uint8_t>{vdev::ConnectState().value_or(9)}; }, {1}},
        {IOCNR_SET_PORT_STATUS, &status, [] { return std::vector<uint8_t>{vdev::PortStatus().value_or(9)}; }, {0x18}},
        {IOCNR_SET_DEV_VENDOR, &v,
         [] {
             auto r = vdev::VendorRecords();
             return r.empty() ? std::vector<uint8_t>{} : Bytes(&r.back(), sizeof r.back());
         },
         Bytes(&v, sizeof v)},
        {IOCNR_SET_VENDOR_REQ, data, [] { return vdev::VendorData().at(0); }, Bytes(data, 8)},
        {IOCNR_SET_MFP_TO, &to, [] { mfp_to_t t = vdev::Timeouts(); return Bytes(&t, sizeof t); }, Bytes(&to, sizeof to)},
    };
    for (const Row &r : rows) {
        SCOPED_TRACE(r.request);
        ASSERT_EQ(ioctl(fd.get(), r.request, r.arg), 0);
        EXPECT_EQ(r.kept(), r.expected);
        EXPECT_EQ(vdev::Ioctls().back().request, r.request);
    }
    mfp_to_t back{};
    ASSERT_EQ(ioctl(fd.get(), IOCNR_GET_MFP_TO, &back), 0);
    EXPECT_EQ(Bytes(&back, sizeof back), Bytes(&to, sizeof to));
    errno = 0;
    EXPECT_EQ(ioctl(fd.get(), _IOR('k', 61, int), data), -1);
    EXPECT_EQ(errno, ENOTTY);
    EXPECT_EQ(vdev::Ioctls().size(), std::size(rows) + 2);
}

// Notifications, vendor requests and scan commands: oldest first, once, then EAGAIN.
TEST_F(Ioctls, QueuedAnswersAreHandedOutOnceThenEagain) {
    UniqueFd fd = Open(vdev::kScan);
    struct Row {
        unsigned long request;
        std::function<void(uint8_t)> queue;  // queues an answer whose first byte is the argument
    } rows[] = {
        {MFP_IOC_GET_NOTIF, [](uint8_t b) { vdev::QueueNotification(vdev::kScan, mfp_notif_t{b, {}, eMfp_Notif_Scan}); }},
        {IOCNR_GET_VENDOR_REQ, [](uint8_t b) { vdev::QueueVendorRequest({b, 0x0D, 0, 0, 0, 0, 8, 0}); }},
        {IOCNR_GET_CMD_SCAN, [](uint8_t b) { vdev::QueueScanCommand({b, 0xA8, 1, 2}); }},
    };
    for (const Row &r : rows) {
        SCOPED_TRACE(r.request);
        uint8_t got[64];
        got[0] = 0x77;
        errno = 0;
        EXPECT_EQ(ioctl(fd.get(), r.request, got), -1);
        EXPECT_EQ(errno, EAGAIN);
        EXPECT_EQ(got[0], 0x77) << "a failed call leaves the record alone";
        r.queue(1);
        r.queue(2);
        for (uint8_t first : {1, 2}) {
            ASSERT_EQ(ioctl(fd.get(), r.request, got), 0);
            EXPECT_EQ(got[0], first);
        }
        EXPECT_EQ(ioctl(fd.get(), r.request, got), -1);
        EXPECT_EQ(errno, EAGAIN);
    }
    // A notification for the other node is not this node's.
    vdev::QueueNotification(vdev::kPrn, mfp_notif_t{MFP_DEV_RESET, {}, eMfp_Notif_Prn});
    mfp_notif_t n{};
    EXPECT_EQ(ioctl(fd.get(), MFP_IOC_GET_NOTIF, &n), -1);
}
