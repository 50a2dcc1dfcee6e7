// The USB host's view of the library: what the print reader is doing, seen
// from outside (its thread's blocking call and vdev's records), and bounded
// waits on it. Nothing here sleeps a fixed time to let the library work.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <functional>

namespace sim {

// What a thread of this process is doing, from /proc/self/task/<tid>/syscall.
enum class ThreadWait {
    Running,   // on a CPU or runnable, not in a blocking call
    Poll,      // blocked in poll/ppoll: waiting for the host
    Sleep,     // in nanosleep: the print reader parks this way
    Other,     // blocked in any other call (futex, msgrcv, read, ...)
    Unknown,   // thread gone or the kernel does not tell
};
ThreadWait ProbeThread(pid_t tid);

// Polls `done` until it holds or `timeoutMs` (real time) has passed; the
// interval grows from 50 us to 2 ms. True when it held.
bool WaitUntil(const std::function<bool()> &done, int timeoutMs);

// Number of polls the library has made on the node so far.
size_t PollCount(const char *path);

// True when the reader thread has taken every host transfer on `path` and is
// blocked in poll: it waits for the host. Checked twice, 1 ms apart, on the
// same poll.
bool ReaderWaiting(pid_t reader, const char *path);

// Queues a bridge notification and waits until the library's SIGIO handler has
// taken it (MFP_IOC_GET_NOTIF). False on time-out (the notification stays).
bool NotifyAndWait(const char *path, uint8_t code, int32_t forWhom, int timeoutMs);

}  // namespace sim
