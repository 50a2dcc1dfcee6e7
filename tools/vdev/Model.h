// vdev internals shared by the libc entry points (Interpose.cpp), the node
// framework (vdev.cpp) and the node models (Bridge.cpp, ...).
#pragma once

#include <poll.h>
#include <sys/types.h>

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <mutex>
#include <vector>

#include "usbadapter/maadrivers.h"
#include "usbadapter/mfpbridge.h"

namespace vdev::detail {

// ---- the libc functions behind the entry points ------------------------------
// Resolved with dlsym(RTLD_NEXT) once at load time (so a signal handler never
// runs dlsym) and lazily as a fallback.
int RealOpen(const char *path, int flags, mode_t mode);
int RealClose(int fd);
ssize_t RealRead(int fd, void *buf, size_t n);
ssize_t RealWrite(int fd, const void *buf, size_t n);
int RealPoll(struct pollfd *fds, nfds_t n, int timeout);
int RealFcntl(int fd, int cmd, void *arg);

// ---- descriptor table ------------------------------------------------------------
// One atomic word per descriptor number: 0 for every descriptor vdev does not
// own, else the node index + 1 in the low byte and the node generation above.
// It is the whole fast path for foreign descriptors and is safe to read in a
// signal handler.
inline constexpr int kMaxFd = 65536;
extern std::atomic<uint32_t> gFdTable[kMaxFd];

inline uint32_t FdEntry(int fd) {
    if (fd < 0 || fd >= kMaxFd) return 0;
    return gFdTable[fd].load(std::memory_order_acquire);
}
inline int EntryNode(uint32_t e) { return static_cast<int>(e & 0xFF) - 1; }
inline uint32_t EntryGeneration(uint32_t e) { return e >> 8; }

// Node index of an emulated path, -1 for any other path (null included).
int FindNode(const char *path);

// Behaviour of an emulated descriptor; `entry` is its FdEntry.
int Open(int node, int flags);
int Close(int fd, uint32_t entry);
ssize_t Read(int fd, uint32_t entry, void *buf, size_t n);
ssize_t Write(int fd, uint32_t entry, const void *buf, size_t n);
// False when the command is not the model's: pass it to the descriptor.
bool Fcntl(int fd, uint32_t entry, int cmd, void *arg, int *result);
int Ioctl(int fd, uint32_t entry, unsigned long request, void *arg);
// At least one of `fds` is emulated.
int Poll(struct pollfd *fds, nfds_t n, int timeout);

// ---- node models --------------------------------------------------------------
// One ioctl as a node model sees it. The model lock is held (a model may wait
// on a condition variable with it); the call is recorded with `payload` and the
// result afterwards.
struct IoctlContext {
    int node;
    int statusFlags;                       // of the descriptor (O_NONBLOCK, ...)
    uint32_t generation;                   // the descriptor's; see NodeAlive()
    int injectedError;                     // FailIoctl: copy the input, then fail with it
    std::unique_lock<std::mutex> &lock;
    std::vector<uint8_t> &payload;         // bytes passed in, or returned
};

// A driver model behind one or more node paths. A new device joins by adding a
// row to the registry in vdev.cpp.
struct NodeModel {
    const char *path;
    // Read time-out in ms of a blocking read with nothing pending; 0 or a null
    // function: no time-out. Called with the model lock held.
    uint32_t (*readTimeoutMs)();
    // Serves a request; returns the ioctl result (>= 0) or -errno. Unknown
    // requests: -ENOTTY (or -injectedError). Null: every request is ENOTTY.
    int (*ioctl)(IoctlContext &ctx, unsigned long request, void *arg);
    // Forgets the model's driver state (model lock held). May be shared by rows.
    void (*reset)();
    // MFP_IOC_GET_NOTIF is served from the node's notification queue.
    bool notifications;
};

std::mutex &ModelMutex();
// False once Reset() has made descriptors of `generation` dead.
bool NodeAlive(int node, uint32_t generation);
// A value of `arg` that can be a user pointer (not NULL, not a small integer).
inline bool IsPointer(const void *arg) { return reinterpret_cast<uintptr_t>(arg) >= 4096; }

// The gadget bridge model (Bridge.cpp).
uint32_t BridgePrnReadTimeout();
uint32_t BridgeScanReadTimeout();
int BridgeIoctl(IoctlContext &ctx, unsigned long request, void *arg);
void BridgeReset();

// The scanner, fax and JBIG codec models (Scanner.cpp, Fax.cpp, Jbig.cpp).
int ScannerIoctl(IoctlContext &ctx, unsigned long request, void *arg);
void ScannerReset();
int FaxIoctl(IoctlContext &ctx, unsigned long request, void *arg);
void FaxReset();
int JbigIoctl(IoctlContext &ctx, unsigned long request, void *arg);
void JbigReset();

}  // namespace vdev::detail
