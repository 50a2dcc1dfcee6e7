// The gadget bridge driver model behind /dev/usb/mfp_prn and /dev/usb/mfp_scan:
// time-outs, descriptors, Device ID, connect, vendor records and requests, scan
// commands. Notifications are the framework's (signal-safe path).
#include <fcntl.h>

#include <array>
#include <cerrno>
#include <chrono>
#include <condition_variable>
#include <cstring>
#include <deque>

#include "Model.h"
#include "vdev.h"

namespace vdev {

namespace {

struct Bridge {
    mfp_to_t timeouts = kInitialTimeouts;
    std::optional<DescriptorRequest> descriptor;
    std::optional<std::vector<uint8_t>> deviceId;
    std::optional<uint8_t> connect, portStatus;
    std::vector<uint8_t> vendorCommands;
    std::vector<vendor_cmd_t> vendorRecords;
    std::vector<std::vector<uint8_t>> vendorData;
    std::deque<std::array<uint8_t, VENDOR_REQ_SIZE>> vendorRequests;
    std::deque<std::array<uint8_t, SCAN_CMD_SIZE>> scanCommands;
    std::condition_variable scanCv;
};

// Never destroyed, like the framework's state. Guarded by the model mutex.
Bridge &B() {
    static Bridge *b = new Bridge;
    return *b;
}

void Keep(std::vector<uint8_t> &payload, const void *p, size_t size) {
    const uint8_t *b = static_cast<const uint8_t *>(p);
    payload.assign(b, b + size);
}

// One byte passed either by address or, as some callers do, as the value.
uint8_t ByteArg(void *arg) {
    if (!detail::IsPointer(arg)) return static_cast<uint8_t>(reinterpret_cast<uintptr_t>(arg));
    return *static_cast<const uint8_t *>(arg);
}

// A descriptor string: `size` bytes (not necessarily NUL-terminated), cut at
// the first NUL. False when the pointer cannot be read.
bool CopyString(const U8 *p, size_t size, std::string &out) {
    out.clear();
    if (size == 0) return true;
    if (!detail::IsPointer(p)) return false;
    const char *c = reinterpret_cast<const char *>(p);
    out.assign(c, strnlen(c, size));
    return true;
}

int SetDescriptor(detail::IoctlContext &ctx, void *arg) {
    if (!detail::IsPointer(arg)) return -EFAULT;
    DescriptorRequest d;
    std::memcpy(&d.param, arg, sizeof d.param);
    Keep(ctx.payload, arg, sizeof d.param);
    if (ctx.injectedError) return -ctx.injectedError;
    const desc_str_t s = d.param.stDevStrID;
    if (!CopyString(s.pub_mf_string, d.param.ubMf_string_size, d.manufacturer) ||
        !CopyString(s.pub_pd_string, d.param.ubPd_string_size, d.product) ||
        !CopyString(s.pub_serial_string, d.param.ubSerial_string_size, d.serial) ||
        !CopyString(s.pub_dev_id_1284, d.param.uwDev_id_1284_size, d.deviceId)) {
        return -EFAULT;
    }
    B().descriptor = std::move(d);
    return 0;
}

template <size_t N>
int PopAnswer(detail::IoctlContext &ctx, std::deque<std::array<uint8_t, N>> &q, void *arg) {
    if (ctx.injectedError) return -ctx.injectedError;
    if (!detail::IsPointer(arg)) return -EFAULT;
    if (q.empty()) return -EAGAIN;
    std::memcpy(arg, q.front().data(), N);
    Keep(ctx.payload, q.front().data(), N);
    q.pop_front();
    return 0;
}

int WaitScanCommand(detail::IoctlContext &ctx, void *arg) {
    if (ctx.injectedError) return -ctx.injectedError;
    if (!detail::IsPointer(arg)) return -EFAULT;
    Bridge &b = B();
    if (b.scanCommands.empty() && (ctx.statusFlags & O_NONBLOCK)) return -EAGAIN;
    auto ready = [&] { return !b.scanCommands.empty() || !detail::NodeAlive(ctx.node, ctx.generation); };
    if (uint32_t to = b.timeouts.ul_scan_read_to) {
        b.scanCv.wait_for(ctx.lock, std::chrono::milliseconds(to), ready);
    } else {
        b.scanCv.wait(ctx.lock, ready);
    }
    if (!detail::NodeAlive(ctx.node, ctx.generation)) return -EIO;
    if (b.scanCommands.empty()) return -ETIMEDOUT;
    return PopAnswer(ctx, b.scanCommands, arg);
}

}  // namespace

namespace detail {

uint32_t BridgePrnReadTimeout() { return B().timeouts.ul_prn_read_to; }
uint32_t BridgeScanReadTimeout() { return B().timeouts.ul_scan_read_to; }

void BridgeReset() {
    Bridge &b = B();
    b.timeouts = kInitialTimeouts;
    b.descriptor.reset();
    b.deviceId.reset();
    b.connect.reset();
    b.portStatus.reset();
    b.vendorCommands.clear();
    b.vendorRecords.clear();
    b.vendorData.clear();
    b.vendorRequests.clear();
    b.scanCommands.clear();
    b.scanCv.notify_all();
}

int BridgeIoctl(IoctlContext &ctx, unsigned long request, void *arg) {
    Bridge &b = B();
    const int fail = ctx.injectedError;
    switch (request) {
    case IOCNR_GET_MFP_TO:
        if (fail) return -fail;
        if (!IsPointer(arg)) return -EFAULT;
        std::memcpy(arg, &b.timeouts, sizeof b.timeouts);
        Keep(ctx.payload, &b.timeouts, sizeof b.timeouts);
        return 0;
    case IOCNR_SET_MFP_TO:
        if (!IsPointer(arg)) return -EFAULT;
        Keep(ctx.payload, arg, sizeof(mfp_to_t));
        if (fail) return -fail;
        std::memcpy(&b.timeouts, arg, sizeof b.timeouts);
        return 0;
    case IOCNR_SET_DESC_REQ: return SetDescriptor(ctx, arg);
    case IOCNR_SET_DEVICE_ID: {
        if (!IsPointer(arg)) return -EFAULT;
        Keep(ctx.payload, arg, strnlen(static_cast<const char *>(arg), DEV_ID_MAX_SIZE));
        if (fail) return -fail;
        b.deviceId = ctx.payload;
        return 0;
    }
    case IOCNR_SET_DEV_CONNECT:
    case IOCNR_SET_PORT_STATUS: {
        uint8_t v = ByteArg(arg);
        Keep(ctx.payload, &v, 1);
        if (fail) return -fail;
        (request == IOCNR_SET_DEV_CONNECT ? b.connect : b.portStatus) = v;
        return 0;
    }
    case IOCNR_SET_DEV_VENDOR: {
        vendor_cmd_t rec;
        std::memset(&rec, 0, sizeof rec);
        if (IsPointer(arg)) {
            std::memcpy(&rec, arg, sizeof rec);
            Keep(ctx.payload, &rec, sizeof rec);
        } else {
            rec.bRequest = ByteArg(arg);
            Keep(ctx.payload, &rec.bRequest, 1);
        }
        if (fail) return -fail;
        b.vendorCommands.push_back(rec.bRequest);
        b.vendorRecords.push_back(rec);
        return 0;
    }
    case IOCNR_SET_VENDOR_REQ:
        if (!IsPointer(arg)) return -EFAULT;
        Keep(ctx.payload, arg, VENDOR_DATA_SIZE);
        if (fail) return -fail;
        b.vendorData.push_back(ctx.payload);
        return 0;
    case IOCNR_GET_VENDOR_REQ: return PopAnswer(ctx, b.vendorRequests, arg);
    case IOCNR_GET_CMD_SCAN: return PopAnswer(ctx, b.scanCommands, arg);
    case IOCNR_WAIT_CMD_SCAN: return WaitScanCommand(ctx, arg);
    default: return fail ? -fail : -ENOTTY;
    }
}

}  // namespace detail

// ---- test-side API ------------------------------------------------------------------

mfp_to_t Timeouts() {
    std::lock_guard lk(detail::ModelMutex());
    return B().timeouts;
}

void SetTimeouts(const mfp_to_t &to) {
    std::lock_guard lk(detail::ModelMutex());
    B().timeouts = to;
}

std::optional<DescriptorRequest> LastDescriptor() {
    std::lock_guard lk(detail::ModelMutex());
    return B().descriptor;
}

std::optional<std::vector<uint8_t>> LastDeviceId() {
    std::lock_guard lk(detail::ModelMutex());
    return B().deviceId;
}

std::optional<uint8_t> ConnectState() {
    std::lock_guard lk(detail::ModelMutex());
    return B().connect;
}

std::optional<uint8_t> PortStatus() {
    std::lock_guard lk(detail::ModelMutex());
    return B().portStatus;
}

std::vector<uint8_t> VendorCommands() {
    std::lock_guard lk(detail::ModelMutex());
    return B().vendorCommands;
}

std::vector<vendor_cmd_t> VendorRecords() {
    std::lock_guard lk(detail::ModelMutex());
    return B().vendorRecords;
}

std::vector<std::vector<uint8_t>> VendorData() {
    std::lock_guard lk(detail::ModelMutex());
    return B().vendorData;
}

std::optional<vendor_cmd_t> HostVendorRequest(uint8_t bRequest, uint16_t wValue, uint16_t wIndex) {
    std::lock_guard lk(detail::ModelMutex());
    const auto &recs = B().vendorRecords;
    for (auto it = recs.rbegin(); it != recs.rend(); ++it)
        if (it->bRequest == bRequest && it->wValue == wValue && it->wIndex == wIndex) return *it;
    return std::nullopt;
}

void QueueVendorRequest(const uint8_t (&req)[VENDOR_REQ_SIZE]) {
    std::lock_guard lk(detail::ModelMutex());
    std::array<uint8_t, VENDOR_REQ_SIZE> a;
    std::memcpy(a.data(), req, a.size());
    B().vendorRequests.push_back(a);
}

void QueueScanCommand(const uint8_t (&cmd)[SCAN_CMD_SIZE]) {
    std::lock_guard lk(detail::ModelMutex());
    std::array<uint8_t, SCAN_CMD_SIZE> a;
    std::memcpy(a.data(), cmd, a.size());
    B().scanCommands.push_back(a);
    B().scanCv.notify_all();
}

}  // namespace vdev
