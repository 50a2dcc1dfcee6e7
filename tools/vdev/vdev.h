// vdev: a user-space model of the printer's kernel drivers for tests and the
// simulator. Linked into a process (static into test binaries, or preloaded), it
// interposes open/close/read/write/poll/ioctl/fcntl for the emulated node paths
// only; every other descriptor goes straight to libc.
//
// An emulated node is one end of a socketpair (so poll works natively); the
// other end is the "host" side driven through this API. Every call here is
// thread-safe and may be used while the library is blocked in read or poll.
//
// How the model behaves where a real driver leaves a choice:
// - Host transfers are queued in the model; the node's socket carries a marker
//   while any is pending, so poll(POLLIN) is ready exactly when a read would
//   return data. A read returns bytes of one transfer only; what does not fit is
//   returned by the next reads. A zero-length transfer makes one read return 0.
// - Transfers queued before the node is opened wait for the first reader; they
//   survive close and re-open, not Reset().
// - Device writes (the library's write) never block and are kept for HostRead.
// - A blocking read with nothing pending waits for a transfer, the node's read
//   time-out (ul_prn_read_to / ul_scan_read_to of Timeouts(), real ms, 0 = none),
//   an ExpireRead or instant time-outs; then it returns 0. With O_NONBLOCK it
//   fails with EAGAIN at once. A signal interrupts it with EINTR, as it does a
//   driver read (and poll).
// - Queuing MFP_DEV_DISCONNECT (a cable pull) discards the host transfers not
//   yet read, on every bridge node, as the real bridge loses what was in flight.
// - MFP_IOC_GET_NOTIF on an empty queue fails with EAGAIN. It never blocks,
//   locks or allocates, so a SIGIO handler may call it whatever the interrupted
//   thread was doing (inside vdev included).
// - F_SETFL / F_GETFL / F_SETOWN / F_GETOWN on a node descriptor are the model's
//   (the socket never sees O_ASYNC); other fcntl commands go to the socket.
// - dup()/dup2()/F_DUPFD copies of a node descriptor are not emulated, and a
//   node descriptor must be closed with close() (not dup2 over it); select,
//   ppoll and epoll see the socket natively (no virtual time, not recorded).
// - Each list of recorded calls (ioctls, poll time-outs, read sizes) holds at
//   most kRecordLimit entries; past that its older half is dropped.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "usbadapter/maadrivers.h"
#include "usbadapter/mfpbridge.h"

namespace vdev {

// Node paths the model knows.
inline constexpr const char *kPrn = MS_PRN_FILE_NAME;
inline constexpr const char *kScan = MS_SCAN_FILE_NAME;
inline constexpr const char *kScanner = SCAN_DEVICE_NAME;
inline constexpr const char *kFax = FAX_DEVICE_NAME;
inline constexpr const char *kJbigEnc = JBIG_ENC_DEVICE_NAME;
inline constexpr const char *kJbigDec = JBIG_DEC_DEVICE_NAME;

// Driver time-outs before any IOCNR_SET_MFP_TO (and after Reset), in ms.
inline constexpr mfp_to_t kInitialTimeouts = {5000, 5000, 5000, 5000};
inline constexpr size_t kRecordLimit = 1 << 16;
// Notifications a node holds before QueueNotification refuses more.
inline constexpr size_t kNotificationCapacity = 256;

// Every function taking a path throws std::invalid_argument for a path that is
// not an emulated node.

// Forgets every node's state, recorded call and pending data, closes host ends,
// and marks all known nodes present. Descriptors the library still holds on a
// node become dead (reads give 0, writes fail with EIO).
void Reset();

// A node that is not present makes open() fail with ENOENT.
void SetPresent(const char *path, bool present);
// Number of descriptors currently open on the node.
int OpenCount(const char *path);
// Successful opens of the node since Reset().
size_t Opens(const char *path);

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
// Bytes of host transfers not yet read by the library.
size_t PendingHostBytes(const char *path);

// Queues a notification for MFP_IOC_GET_NOTIF and, when the owner has switched
// on O_ASYNC, raises SIGIO to the owner (F_SETOWN pid) as the driver does.
// Throws std::length_error when kNotificationCapacity are already pending.
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
    int error;                     // errno when result is -1, else 0
};
// Calls in the order they were made (all nodes when path is null).
std::vector<IoctlCall> Ioctls(const char *path = nullptr);
void ClearIoctls();

// Time-outs passed to poll on the node, in call order.
std::vector<int> PollTimeouts(const char *path);
// Sizes the library asked for in read() on the node, in call order.
std::vector<size_t> ReadSizes(const char *path);
// Polls and reads made on the node since Reset(), not bounded like the lists
// above (a waiter can compare them safely).
size_t PollCalls(const char *path);
size_t ReadCalls(const char *path);
// Polls on the node under way right now (a thread blocked in poll on it).
int PollsInProgress(const char *path);
// Polls on the node that ended in a time-out (real or virtual) since Reset().
size_t ExpiredPolls(const char *path);

mfp_to_t Timeouts();                     // last IOCNR_SET_MFP_TO (initial values otherwise)
void SetTimeouts(const mfp_to_t &to);    // what IOCNR_GET_MFP_TO answers

struct DescriptorRequest {
    desc_param_t param;  // pointer fields as the library passed them
    // Copied at ioctl time: each string's size field of bytes, cut at the first
    // NUL (the sizes count the terminator).
    std::string manufacturer, product, serial, deviceId;
};
std::optional<DescriptorRequest> LastDescriptor();
// IOCNR_SET_DEVICE_ID payload: the text up to its NUL, at most DEV_ID_MAX_SIZE
// bytes (callers hand buffers shorter than the ioctl's size).
std::optional<std::vector<uint8_t>> LastDeviceId();
std::optional<uint8_t> ConnectState();                // IOCNR_SET_DEV_CONNECT
std::optional<uint8_t> PortStatus();                  // IOCNR_SET_PORT_STATUS
// IOCNR_SET_DEV_VENDOR: the driver reads a whole vendor_cmd_t although the
// ioctl number encodes one byte. VendorCommands() are the records' bRequest
// values, VendorRecords() the records, both in order.
std::vector<uint8_t> VendorCommands();
std::vector<vendor_cmd_t> VendorRecords();
std::vector<std::vector<uint8_t>> VendorData();       // IOCNR_SET_VENDOR_REQ payloads
// What a host's vendor control request (bRequest, wValue, wIndex) is answered
// with: the newest record staged with IOCNR_SET_DEV_VENDOR for exactly that
// triple (the model's matching; the real driver's is its own). Nothing when no
// such record was staged since Reset().
std::optional<vendor_cmd_t> HostVendorRequest(uint8_t bRequest, uint16_t wValue, uint16_t wIndex);
// Answers for IOCNR_GET_VENDOR_REQ, and for IOCNR_GET_CMD_SCAN / WAIT_CMD_SCAN,
// oldest first. An empty queue: GET fails with EAGAIN; WAIT blocks until one is
// queued (ETIMEDOUT after ul_scan_read_to, EAGAIN with O_NONBLOCK).
void QueueVendorRequest(const uint8_t (&req)[VENDOR_REQ_SIZE]);
void QueueScanCommand(const uint8_t (&cmd)[SCAN_CMD_SIZE]);

// F_SETOWN and O_ASYNC as kept by the model for the node: the owner of the
// newest open descriptor, and whether any open descriptor has O_ASYNC.
// SIGIO goes to the owner of every open descriptor with O_ASYNC.
int Owner(const char *path);
bool AsyncEnabled(const char *path);
// Flags last set with F_SETFL (O_NONBLOCK etc.) on the most recent descriptor.
int StatusFlags(const char *path);
// Flags F_GETFL answers at the next call (to emulate a node opened non-blocking):
// that descriptor's status flags become `flags` (O_NONBLOCK then really makes
// its reads non-blocking) until the library sets them again.
void ForceStatusFlags(const char *path, int flags);

// Make the next `count` ioctls with `request` on the node fail with `err`.
void FailIoctl(const char *path, unsigned long request, int err, int count = 1);

// ---- scanner driver (/dev/scanner) ----------------------------------------------
// IOCNR_SCAN_APP_LOCK returns the queued answers, oldest first, then the
// default (SCAN_APP_LOCK_TAKEN after Reset). Answer 1 takes the lock;
// IOCNR_SCAN_APP_LOCK_RELEASE drops it.
void QueueScanLockAnswers(const std::vector<int> &answers);
void SetScanLockDefault(int answer);
bool ScanLocked();
// How IOC_MAA_TEST answers (every call, until changed; Reset: empty response).
// The response is written into the caller's data block found through its
// kernel address (bufphys), at most bufsize bytes; an address that is not a
// live block fails the call with EFAULT. `result` is what the driver reports
// (default: the response size; it may exceed the buffer). `status` >= 0 is the
// ioctl's return value; < 0 fails the call with errno -status.
struct ScanTestAnswer {
    std::vector<uint8_t> response;
    std::optional<uint32_t> result;
    uint32_t success = 1;
    int status = 0;
};
void SetScanTestAnswer(const ScanTestAnswer &answer);
// Command lines IOC_MAA_TEST received, in order (the record: Ioctls()).
std::vector<std::string> ScanCommands();
// What IOC_ADF_MECHA_TYPE and IOC_ADF_MULTI_MECHA_TYPE answer (Reset: zeros).
void SetADFMecha(uint32_t type, uint32_t version, uint32_t multiType);

// ---- fax driver (/dev/fax) --------------------------------------------------------
// How IOCNR_FAX_MAA_TEST answers: the response text (cut to the record's
// FAX_MAA_RESPONSE_LENGTH), `result` (default: the bytes copied), `success`,
// and `status` as for the scanner.
struct FaxTestAnswer {
    std::string response;
    std::optional<uint32_t> result;
    uint32_t success = 1;
    int status = 0;
};
void SetFaxTestAnswer(const FaxTestAnswer &answer);
std::vector<std::string> FaxCommands();

// ---- JBIG codec (/dev/jbigenc, /dev/jbigdec) -------------------------------------
// ulStatus that JBIG_IOC_SELFTEST answers on the node (Reset: 0, a pass), and
// the number of JBIG_IOC_RESET calls it received.
void SetJbigSelfTestStatus(const char *path, uint32_t status);
int JbigResets(const char *path);

}  // namespace vdev
