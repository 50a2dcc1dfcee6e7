// vdev: a user-space model of the printer's kernel drivers for tests and the
// simulator. Linked into a process (static into test binaries, or preloaded), it
// interposes open/close/read/write/poll/ioctl/fcntl for the emulated node paths
// only; every other descriptor goes straight to libc.
//
// An emulated node is one end of a socketpair (so poll works natively); the
// other end is the "host" side driven through this API. Every call here is
// thread-safe and may be used while the library is blocked in read or poll.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "usbadapter/mfpbridge.h"

namespace vdev {

// Node paths the model knows. Later models (scanner, fax, JBIG) add their own.
inline constexpr const char *kPrn = MS_PRN_FILE_NAME;
inline constexpr const char *kScan = MS_SCAN_FILE_NAME;

// Forgets every node's state, recorded call and pending data, closes host ends,
// and marks all known nodes present. Descriptors the library still holds on a
// node become dead (reads give 0, writes fail with EIO).
void Reset();

// A node that is not present makes open() fail with ENOENT.
void SetPresent(const char *path, bool present);
// Number of descriptors currently open on the node.
int OpenCount(const char *path);

// ---- host side -----------------------------------------------------------
// One host transfer: the library's read() returns at most one transfer's bytes
// (a transfer larger than the read size is returned over several reads).
void HostWrite(const char *path, const void *data, size_t size);
void HostWrite(const char *path, const std::string &bytes);
// Everything the device side has written so far, removed from the model.
std::vector<uint8_t> HostRead(const char *path);
// Waits (real time, bounded) until at least `size` bytes written by the device
// are available, then returns all of them; returns what there is on time-out.
std::vector<uint8_t> HostReadAtLeast(const char *path, size_t size, int timeoutMs);

// Queues a notification for MFP_IOC_GET_NOTIF and, when the owner has switched
// on O_ASYNC, raises SIGIO to the owner (F_SETOWN pid) as the driver does.
void QueueNotification(const char *path, const mfp_notif_t &notif);
size_t PendingNotifications(const char *path);

// ---- virtual time -------------------------------------------------------
// The next (or the currently blocked) poll on the node returns 0 (time-out) at
// once, whatever its time-out, if no data is pending. Counts accumulate.
void ExpirePoll(const char *path, int count = 1);
// The same for a blocking read with nothing pending: it returns 0 at once.
void ExpireRead(const char *path, int count = 1);
// When on, every poll/read on the node with nothing pending times out at once.
void SetInstantTimeouts(const char *path, bool on);

// ---- driver state, for assertions -----------------------------------------
struct IoctlCall {
    std::string path;
    unsigned long request;
    std::vector<uint8_t> payload;  // bytes passed in (write) or returned (read)
    int result;
};
std::vector<IoctlCall> Ioctls(const char *path = nullptr);
void ClearIoctls();

// Time-outs passed to poll on the node, in call order.
std::vector<int> PollTimeouts(const char *path);

mfp_to_t Timeouts();                     // last IOCNR_SET_MFP_TO (initial values otherwise)
void SetTimeouts(const mfp_to_t &to);    // what IOCNR_GET_MFP_TO answers

struct DescriptorRequest {
    desc_param_t param;  // pointer fields as the library passed them
    std::string manufacturer, product, serial, deviceId;  // copied at ioctl time
};
std::optional<DescriptorRequest> LastDescriptor();
std::optional<std::vector<uint8_t>> LastDeviceId();   // IOCNR_SET_DEVICE_ID payload
std::optional<uint8_t> ConnectState();                // IOCNR_SET_DEV_CONNECT
std::vector<uint8_t> VendorCommands();                // IOCNR_SET_DEV_VENDOR values, in order
std::vector<std::vector<uint8_t>> VendorData();       // IOCNR_SET_VENDOR_REQ payloads
void QueueVendorRequest(const uint8_t (&req)[VENDOR_REQ_SIZE]);  // IOCNR_GET_VENDOR_REQ answer
void QueueScanCommand(const uint8_t (&cmd)[SCAN_CMD_SIZE]);      // GET/WAIT_CMD_SCAN answer

// F_SETOWN and O_ASYNC as kept by the model for the node.
int Owner(const char *path);
bool AsyncEnabled(const char *path);
// Flags last set with F_SETFL (O_NONBLOCK etc.) on the most recent descriptor.
int StatusFlags(const char *path);
// Flags F_GETFL answers at the next call (to emulate a node opened non-blocking).
void ForceStatusFlags(const char *path, int flags);

// Make the next `count` ioctls with `request` on the node fail with `err`.
void FailIoctl(const char *path, unsigned long request, int err, int count = 1);

}  // namespace vdev
