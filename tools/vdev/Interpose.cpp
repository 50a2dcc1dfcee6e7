// The libc entry points vdev takes over. Every variant a build may call is
// defined here (fortified, large-file and 64-bit-time names included) so a call
// cannot slip past the model; each looks the descriptor up in one atomic table
// and hands foreign descriptors straight to the next definition (libc, or a
// sanitizer's interceptor in front of it).
//
// The plain declarations are wanted: no fortify wrappers, no large-file or
// time64 renaming of open/fcntl/ioctl in this file.
#undef _FORTIFY_SOURCE
#undef _FILE_OFFSET_BITS
#undef _TIME_BITS

#include <dlfcn.h>
#include <fcntl.h>
#include <poll.h>
#include <stdarg.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>

#include "Model.h"

#define VDEV_EXPORT extern "C" __attribute__((visibility("default")))

extern "C" {
[[noreturn]] void __chk_fail(void);
int __open_2(const char *path, int flags);
int __open64_2(const char *path, int flags);
int __openat_2(int dirfd, const char *path, int flags);
int __openat64_2(int dirfd, const char *path, int flags);
ssize_t __read_chk(int fd, void *buf, size_t n, size_t buflen);
int __poll_chk(struct pollfd *fds, nfds_t n, int timeout, size_t fdslen);
int __ioctl_time64(int fd, unsigned long request, ...);
int __fcntl_time64(int fd, int cmd, ...);
}

namespace {

using OpenFn = int (*)(const char *, int, ...);
using OpenatFn = int (*)(int, const char *, int, ...);
using Open2Fn = int (*)(const char *, int);
using Openat2Fn = int (*)(int, const char *, int);
using CloseFn = int (*)(int);
using ReadFn = ssize_t (*)(int, void *, size_t);
using ReadChkFn = ssize_t (*)(int, void *, size_t, size_t);
using WriteFn = ssize_t (*)(int, const void *, size_t);
using PollFn = int (*)(struct pollfd *, nfds_t, int);
using PollChkFn = int (*)(struct pollfd *, nfds_t, int, size_t);
using IoctlFn = int (*)(int, unsigned long, ...);
using FcntlFn = int (*)(int, int, ...);

template <typename Fn>
struct Real {
    const char *name;
    std::atomic<Fn> fn{nullptr};
    std::atomic<bool> looked{false};

    // Null when this libc has no such symbol (the caller falls back to the
    // base function). dlsym may allocate but never calls back into these.
    Fn get() {
        Fn f = fn.load(std::memory_order_acquire);
        if (f || looked.load(std::memory_order_acquire)) return f;
        f = reinterpret_cast<Fn>(dlsym(RTLD_NEXT, name));
        fn.store(f, std::memory_order_release);
        looked.store(true, std::memory_order_release);
        return f;
    }
};

Real<OpenFn> rOpen{"open"};
Real<OpenFn> rOpen64{"open64"};
Real<OpenatFn> rOpenat{"openat"};
Real<OpenatFn> rOpenat64{"openat64"};
Real<Open2Fn> rOpen2{"__open_2"};
Real<Open2Fn> rOpen64_2{"__open64_2"};
Real<Openat2Fn> rOpenat2{"__openat_2"};
Real<Openat2Fn> rOpenat64_2{"__openat64_2"};
Real<CloseFn> rClose{"close"};
Real<ReadFn> rRead{"read"};
Real<ReadChkFn> rReadChk{"__read_chk"};
Real<WriteFn> rWrite{"write"};
Real<PollFn> rPoll{"poll"};
Real<PollChkFn> rPollChk{"__poll_chk"};
Real<IoctlFn> rIoctl{"ioctl"};
Real<IoctlFn> rIoctlTime64{"__ioctl_time64"};
Real<FcntlFn> rFcntl{"fcntl"};
Real<FcntlFn> rFcntl64{"fcntl64"};
Real<FcntlFn> rFcntlTime64{"__fcntl_time64"};

__attribute__((constructor)) void ResolveAll() {
    (void)rOpen.get(), (void)rOpen64.get(), (void)rOpenat.get(), (void)rOpenat64.get();
    (void)rOpen2.get(), (void)rOpen64_2.get(), (void)rOpenat2.get(), (void)rOpenat64_2.get();
    (void)rClose.get(), (void)rRead.get(), (void)rReadChk.get(), (void)rWrite.get();
    (void)rPoll.get(), (void)rPollChk.get(), (void)rIoctl.get(), (void)rIoctlTime64.get();
    (void)rFcntl.get(), (void)rFcntl64.get(), (void)rFcntlTime64.get();
}

template <typename Fn>
Fn Pick(Real<Fn> &variant, Real<Fn> &base) {
    Fn f = variant.get();
    return f ? f : base.get();
}

bool NeedsMode(int flags) { return (flags & O_CREAT) || (flags & O_TMPFILE) == O_TMPFILE; }

int OpenAny(const char *path, int flags, mode_t mode, OpenFn real) {
    int node = vdev::detail::FindNode(path);
    if (node >= 0) return vdev::detail::Open(node, flags);
    return real(path, flags, mode);
}

int OpenatAny(int dirfd, const char *path, int flags, mode_t mode, OpenatFn real) {
    // Node paths are absolute, so the directory descriptor never matters.
    int node = vdev::detail::FindNode(path);
    if (node >= 0) return vdev::detail::Open(node, flags);
    return real(dirfd, path, flags, mode);
}

int PollAny(struct pollfd *fds, nfds_t n, int timeout, PollFn real) {
    for (nfds_t i = 0; i < n; ++i) {
        if (vdev::detail::FdEntry(fds[i].fd)) return vdev::detail::Poll(fds, n, timeout);
    }
    return real(fds, n, timeout);
}

int IoctlAny(int fd, unsigned long request, void *arg, IoctlFn real) {
    if (uint32_t e = vdev::detail::FdEntry(fd)) return vdev::detail::Ioctl(fd, e, request, arg);
    return real(fd, request, arg);
}

int FcntlAny(int fd, int cmd, void *arg, FcntlFn real) {
    int result;
    if (uint32_t e = vdev::detail::FdEntry(fd)) {
        if (vdev::detail::Fcntl(fd, e, cmd, arg, &result)) return result;
    }
    return real(fd, cmd, arg);
}

}  // namespace

namespace vdev::detail {

int RealOpen(const char *path, int flags, mode_t mode) { return rOpen.get()(path, flags, mode); }
int RealClose(int fd) { return rClose.get()(fd); }
ssize_t RealRead(int fd, void *buf, size_t n) { return rRead.get()(fd, buf, n); }
ssize_t RealWrite(int fd, const void *buf, size_t n) { return rWrite.get()(fd, buf, n); }
int RealPoll(struct pollfd *fds, nfds_t n, int timeout) { return rPoll.get()(fds, n, timeout); }
int RealFcntl(int fd, int cmd, void *arg) { return rFcntl.get()(fd, cmd, arg); }

}  // namespace vdev::detail

#define VDEV_MODE(flags)                          \
    mode_t mode = 0;                              \
    if (NeedsMode(flags)) {                       \
        va_list ap;                               \
        va_start(ap, flags);                      \
        mode = static_cast<mode_t>(va_arg(ap, int)); \
        va_end(ap);                               \
    }

#define VDEV_ARG(last)              \
    void *arg;                      \
    {                               \
        va_list ap;                 \
        va_start(ap, last);         \
        arg = va_arg(ap, void *);   \
        va_end(ap);                 \
    }

VDEV_EXPORT int open(const char *path, int flags, ...) {
    VDEV_MODE(flags);
    return OpenAny(path, flags, mode, rOpen.get());
}

VDEV_EXPORT int open64(const char *path, int flags, ...) {
    VDEV_MODE(flags);
    return OpenAny(path, flags, mode, Pick(rOpen64, rOpen));
}

VDEV_EXPORT int openat(int dirfd, const char *path, int flags, ...) {
    VDEV_MODE(flags);
    return OpenatAny(dirfd, path, flags, mode, rOpenat.get());
}

VDEV_EXPORT int openat64(int dirfd, const char *path, int flags, ...) {
    VDEV_MODE(flags);
    return OpenatAny(dirfd, path, flags, mode, Pick(rOpenat64, rOpenat));
}

// The fortified opens are only called without O_CREAT, so no mode follows.
VDEV_EXPORT int __open_2(const char *path, int flags) {
    if (vdev::detail::FindNode(path) < 0 && rOpen2.get()) return rOpen2.get()(path, flags);
    return OpenAny(path, flags, 0, rOpen.get());
}

VDEV_EXPORT int __open64_2(const char *path, int flags) {
    if (vdev::detail::FindNode(path) < 0 && rOpen64_2.get()) return rOpen64_2.get()(path, flags);
    return OpenAny(path, flags, 0, Pick(rOpen64, rOpen));
}

VDEV_EXPORT int __openat_2(int dirfd, const char *path, int flags) {
    if (vdev::detail::FindNode(path) < 0 && rOpenat2.get()) return rOpenat2.get()(dirfd, path, flags);
    return OpenatAny(dirfd, path, flags, 0, rOpenat.get());
}

VDEV_EXPORT int __openat64_2(int dirfd, const char *path, int flags) {
    if (vdev::detail::FindNode(path) < 0 && rOpenat64_2.get()) return rOpenat64_2.get()(dirfd, path, flags);
    return OpenatAny(dirfd, path, flags, 0, Pick(rOpenat64, rOpenat));
}

VDEV_EXPORT int close(int fd) {
    if (uint32_t e = vdev::detail::FdEntry(fd)) return vdev::detail::Close(fd, e);
    return rClose.get()(fd);
}

VDEV_EXPORT ssize_t read(int fd, void *buf, size_t n) {
    if (uint32_t e = vdev::detail::FdEntry(fd)) return vdev::detail::Read(fd, e, buf, n);
    return rRead.get()(fd, buf, n);
}

VDEV_EXPORT ssize_t __read_chk(int fd, void *buf, size_t n, size_t buflen) {
    if (uint32_t e = vdev::detail::FdEntry(fd)) {
        if (n > buflen) __chk_fail();
        return vdev::detail::Read(fd, e, buf, n);
    }
    if (ReadChkFn f = rReadChk.get()) return f(fd, buf, n, buflen);
    if (n > buflen) __chk_fail();
    return rRead.get()(fd, buf, n);
}

VDEV_EXPORT ssize_t write(int fd, const void *buf, size_t n) {
    if (uint32_t e = vdev::detail::FdEntry(fd)) return vdev::detail::Write(fd, e, buf, n);
    return rWrite.get()(fd, buf, n);
}

VDEV_EXPORT int poll(struct pollfd *fds, nfds_t n, int timeout) { return PollAny(fds, n, timeout, rPoll.get()); }

VDEV_EXPORT int __poll_chk(struct pollfd *fds, nfds_t n, int timeout, size_t fdslen) {
    if (fdslen / sizeof(*fds) < n) __chk_fail();
    if (PollChkFn f = rPollChk.get()) {
        for (nfds_t i = 0; i < n; ++i) {
            if (vdev::detail::FdEntry(fds[i].fd)) return vdev::detail::Poll(fds, n, timeout);
        }
        return f(fds, n, timeout, fdslen);
    }
    return PollAny(fds, n, timeout, rPoll.get());
}

VDEV_EXPORT int ioctl(int fd, unsigned long request, ...) __THROW {
    VDEV_ARG(request);
    return IoctlAny(fd, request, arg, rIoctl.get());
}

VDEV_EXPORT int __ioctl_time64(int fd, unsigned long request, ...) {
    VDEV_ARG(request);
    return IoctlAny(fd, request, arg, Pick(rIoctlTime64, rIoctl));
}

VDEV_EXPORT int fcntl(int fd, int cmd, ...) {
    VDEV_ARG(cmd);
    return FcntlAny(fd, cmd, arg, rFcntl.get());
}

VDEV_EXPORT int fcntl64(int fd, int cmd, ...) {
    VDEV_ARG(cmd);
    return FcntlAny(fd, cmd, arg, Pick(rFcntl64, rFcntl));
}

VDEV_EXPORT int __fcntl_time64(int fd, int cmd, ...) {
    VDEV_ARG(cmd);
    return FcntlAny(fd, cmd, arg, Pick(rFcntlTime64, rFcntl));
}
