// Waits on a device node that survive signals. The bridge's notifications come
// as SIGIO, installed without SA_RESTART, on whatever thread the kernel picks:
// an interrupted wait is neither a time-out nor an error nor an empty read. It
// goes on towards the deadline it started with, so a stream of signals never
// postpones a time-out.
#pragma once

#include <poll.h>
#include <sys/types.h>

#include <cstddef>
#include <cstdint>

// Asked after each interruption (and while idling): true ends the wait at once,
// because what it waits for can no longer come (the cable is gone, the channel
// is being closed). Null: never.
using WaitGoneFn = bool (*)();

// Milliseconds on the monotonic clock.
int64_t Wait_NowMs();

// poll(2) for input on one descriptor within timeoutMs (< 0: no limit).
// > 0 ready (revents set), 0 time-out, -1 error with errno; -1 with EINTR only
// when gone() asked to stop. wakeFd (an eventfd, non-blocking; < 0: none) is
// watched as well: whoever changes what gone() answers writes to it, so the
// wait ends at once and not at the next signal. Each wake-up is drained.
int Wait_PollIn(int fd, int timeoutMs, short *revents, WaitGoneFn gone = nullptr, int wakeFd = -1);

// read(2) that resumes after a signal; -1 with EINTR only when gone() asked to
// stop.
ssize_t Wait_Read(int fd, void *buf, size_t size, WaitGoneFn gone = nullptr);

// A descriptor reporting any of these is ready again at once and gives
// nothing (hung up, failed, closed).
inline bool Wait_HungUp(short revents) { return (revents & (POLLHUP | POLLERR | POLLNVAL)) != 0; }

// Lets the rest of a wait that began at startMs and was to last periodMs pass
// without spinning (a channel that reports readiness but gives nothing must
// not be polled in a tight loop); returns early when gone().
void Wait_IdleRest(int64_t startMs, int periodMs, WaitGoneFn gone = nullptr);
