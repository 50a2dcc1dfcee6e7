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

// Bytes already taken off `fd` that belong in front of what it gives next (a
// reader that took a whole transfer before it knew who the transfer is for).
// Until they are used up, Wait_PollIn reports fd ready at once and Wait_Read
// returns them first, at most as many as the one read of the node would have
// given: with `more` (the read that took them was filled, so the transfer may
// go on) a read that wants more than is left takes the rest from the node
// when it has data at once. The bytes stay the caller's; one descriptor at a
// time, used from its reader's thread only. Size 0 drops what is left.
void Wait_PutBack(int fd, const void *data, size_t size, bool more);
// Bytes put back on `fd` not yet read.
size_t Wait_PutBackLeft(int fd);

// A descriptor reporting any of these is ready again at once and gives
// nothing (hung up, failed, closed).
inline bool Wait_HungUp(short revents) { return (revents & (POLLHUP | POLLERR | POLLNVAL)) != 0; }

// Lets the rest of a wait that began at startMs and was to last periodMs pass
// without spinning (a channel that reports readiness but gives nothing must
// not be polled in a tight loop); returns early when gone().
void Wait_IdleRest(int64_t startMs, int periodMs, WaitGoneFn gone = nullptr);
