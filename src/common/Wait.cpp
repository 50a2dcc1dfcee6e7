#include "common/Wait.h"

#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstring>

namespace {

// Longest single sleep of Wait_IdleRest: gone() is looked at this often, since the
// signal that changes it may land on another thread.
constexpr int kIdleSliceMs = 50;

int remaining(int64_t deadline) {
    if (deadline < 0) return -1;
    return static_cast<int>(std::max<int64_t>(0, deadline - Wait_NowMs()));
}

// What Wait_PutBack left. Only the descriptor is looked at from other threads
// (their reads of other descriptors pass by).
std::atomic<int> backFd{-1};
const char *backData;
size_t backLeft;
bool backMore;

bool putBackOn(int fd) { return fd >= 0 && backFd.load(std::memory_order_relaxed) == fd; }

}  // namespace

void Wait_PutBack(int fd, const void *data, size_t size, bool more) {
    backData = static_cast<const char *>(data);
    backLeft = size;
    backMore = more;
    backFd.store(size > 0 ? fd : -1, std::memory_order_relaxed);
}

size_t Wait_PutBackLeft(int fd) { return putBackOn(fd) ? backLeft : 0; }

int64_t Wait_NowMs() {
    // Deadlines are in milliseconds of seconds-long waits: the coarse clock is
    // fine enough and costs nothing on every read of a download.
    timespec ts;
    clock_gettime(CLOCK_MONOTONIC_COARSE, &ts);
    return static_cast<int64_t>(ts.tv_sec) * 1000 + ts.tv_nsec / 1000000;
}

int Wait_PollIn(int fd, int timeoutMs, short *revents, WaitGoneFn gone, int wakeFd) {
    if (putBackOn(fd)) {
        if (revents) *revents = POLLIN;
        return 1;
    }
    const int64_t deadline = timeoutMs < 0 ? -1 : Wait_NowMs() + timeoutMs;
    int wait = timeoutMs;
    for (;;) {
        pollfd pfd[2] = {{fd, POLLIN, 0}, {wakeFd, POLLIN, 0}};
        int r = ::poll(pfd, wakeFd >= 0 ? 2 : 1, wait);
        if (revents) *revents = pfd[0].revents;
        if (r > 0 && pfd[0].revents) return 1;
        if (r > 0 && (pfd[1].revents & POLLIN)) {
            // Only the wake-up: drained before gone() is asked, so one that
            // comes after the answer is not lost.
            uint64_t count;
            ssize_t n = ::read(wakeFd, &count, sizeof count);
            (void)n;
        } else if (r > 0) {
            wakeFd = -1;  // a wake-up descriptor that failed is not watched again
        } else if (r == 0 || errno != EINTR) {
            return r;
        }
        if (gone && gone()) {
            errno = EINTR;
            return -1;
        }
        wait = remaining(deadline);
    }
}

ssize_t Wait_Read(int fd, void *buf, size_t size, WaitGoneFn gone) {
    if (putBackOn(fd) && size > 0) {
        const size_t n = std::min(size, backLeft);
        std::memcpy(buf, backData, n);
        backData += n;
        backLeft -= n;
        if (backLeft > 0) return static_cast<ssize_t>(n);
        const bool more = backMore;
        Wait_PutBack(-1, nullptr, 0, false);
        // The transfer may go on behind what was put back: the rest of this
        // read, if the node has it now.
        pollfd p{fd, POLLIN, 0};
        if (more && n < size && ::poll(&p, 1, 0) > 0 && (p.revents & POLLIN)) {
            ssize_t r = Wait_Read(fd, static_cast<char *>(buf) + n, size - n, gone);
            if (r > 0) return static_cast<ssize_t>(n) + r;
        }
        return static_cast<ssize_t>(n);
    }
    for (;;) {
        ssize_t n = ::read(fd, buf, size);
        if (n >= 0 || errno != EINTR) return n;
        if (gone && gone()) return -1;
    }
}

void Wait_IdleRest(int64_t startMs, int periodMs, WaitGoneFn gone) {
    const int64_t deadline = startMs + std::max(periodMs, 0);
    for (int left = remaining(deadline); left > 0; left = remaining(deadline)) {
        if (gone && gone()) return;
        timespec ts{0, static_cast<long>(std::min(left, kIdleSliceMs)) * 1000000L};
        ::nanosleep(&ts, nullptr);
    }
}
