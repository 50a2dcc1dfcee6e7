// CPU time of the calling thread, to tell a wait from a busy loop.
#pragma once

#include <time.h>

inline long ThreadCpuMs() {
    timespec ts;
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &ts);
    return static_cast<long>(ts.tv_sec) * 1000 + ts.tv_nsec / 1000000;
}
