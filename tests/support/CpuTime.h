// CPU time of a thread, to tell a wait from a busy loop.
#pragma once

#include <time.h>

#include <chrono>
#include <functional>
#include <thread>

inline long ThreadCpuMs() {
    timespec ts;
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &ts);
    return static_cast<long>(ts.tv_sec) * 1000 + ts.tv_nsec / 1000000;
}

struct WorkTime {
    long wallMs;
    long cpuMs;
};

// Runs `work` on this thread while another thread runs `stop` after stopAfterMs
// to make it return; the wall and CPU time `work` took.
inline WorkTime TimeUntilStopped(const std::function<void()> &work, const std::function<void()> &stop,
                                 int stopAfterMs) {
    std::thread stopper([&] {
        std::this_thread::sleep_for(std::chrono::milliseconds(stopAfterMs));
        stop();
    });
    const long cpuBefore = ThreadCpuMs();
    const auto start = std::chrono::steady_clock::now();
    work();
    WorkTime t{static_cast<long>(std::chrono::duration_cast<std::chrono::milliseconds>(
                                     std::chrono::steady_clock::now() - start)
                                     .count()),
               ThreadCpuMs() - cpuBefore};
    stopper.join();
    return t;
}
