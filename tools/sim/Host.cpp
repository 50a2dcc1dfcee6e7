#include "Host.h"

#include <fcntl.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <thread>

#include "vdev.h"

namespace sim {

ThreadWait ProbeThread(pid_t tid) {
    char path[64];
    std::snprintf(path, sizeof path, "/proc/self/task/%d/syscall", static_cast<int>(tid));
    int fd = ::open(path, O_RDONLY | O_CLOEXEC);
    if (fd < 0) return ThreadWait::Unknown;
    char text[256];
    ssize_t n = ::read(fd, text, sizeof text - 1);
    ::close(fd);
    if (n <= 0) return ThreadWait::Unknown;
    text[n] = '\0';
    if (text[0] == 'r') return ThreadWait::Running;  // "running"
    long nr = std::strtol(text, nullptr, 10);
    if (nr < 0) return ThreadWait::Running;  // in user space
#ifdef SYS_poll
    if (nr == SYS_poll) return ThreadWait::Poll;
#endif
    if (nr == SYS_ppoll) return ThreadWait::Poll;
#ifdef SYS_nanosleep
    if (nr == SYS_nanosleep) return ThreadWait::Sleep;
#endif
    if (nr == SYS_clock_nanosleep) return ThreadWait::Sleep;
    return ThreadWait::Other;
}

bool WaitUntil(const std::function<bool()> &done, int timeoutMs) {
    using Clock = std::chrono::steady_clock;
    const auto deadline = Clock::now() + std::chrono::milliseconds(timeoutMs);
    auto interval = std::chrono::microseconds(50);
    for (;;) {
        if (done()) return true;
        if (Clock::now() >= deadline) return done();
        std::this_thread::sleep_for(interval);
        interval = std::min(interval * 2, std::chrono::microseconds(2000));
    }
}

size_t PollCount(const char *path) { return vdev::PollTimeouts(path).size(); }

bool ReaderWaiting(pid_t reader, const char *path) {
    // In poll, and on the node: a test function polling a socket is busy.
    if (reader <= 0 || vdev::PendingHostBytes(path) != 0 || ProbeThread(reader) != ThreadWait::Poll ||
        vdev::PollsInProgress(path) == 0)
        return false;
    size_t polls = PollCount(path);
    std::this_thread::sleep_for(std::chrono::milliseconds(1));
    return vdev::PendingHostBytes(path) == 0 && ProbeThread(reader) == ThreadWait::Poll && PollCount(path) == polls &&
           vdev::PollsInProgress(path) != 0;
}

bool NotifyAndWait(const char *path, uint8_t code, int32_t forWhom, int timeoutMs) {
    mfp_notif_t n{};
    n.ub_notif = code;
    n.ub_intf = forWhom;
    vdev::QueueNotification(path, n);
    return WaitUntil([&] { return vdev::PendingNotifications(path) == 0; }, timeoutMs);
}

}  // namespace sim
