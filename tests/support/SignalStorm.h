// SIGIO sent to one thread at a fixed rate, as the bridge's notifications reach
// whatever thread the kernel picks. The handler does nothing and is installed
// without SA_RESTART, as the library's is, so every wait it lands in sees EINTR.
#pragma once

#include <pthread.h>
#include <signal.h>

#include <atomic>
#include <chrono>
#include <functional>
#include <thread>

#include <gtest/gtest.h>

#include "support/WaitUntil.h"

class SignalStorm {
public:
    explicit SignalStorm(pthread_t target, std::chrono::microseconds every = std::chrono::microseconds(500))
        : target_(target) {
        struct sigaction sa {};
        sa.sa_handler = [](int) { ++delivered_; };
        sigemptyset(&sa.sa_mask);
        sigaction(SIGIO, &sa, &old_);
        thread_ = std::thread([this, every] {
            while (!stop_) {
                pthread_kill(target_, SIGIO);
                std::this_thread::sleep_for(every);
            }
        });
    }
    ~SignalStorm() {
        stop_ = true;
        thread_.join();
        sigaction(SIGIO, &old_, nullptr);
    }
    SignalStorm(const SignalStorm &) = delete;
    SignalStorm &operator=(const SignalStorm &) = delete;

    static int Delivered() { return delivered_; }

private:
    pthread_t target_;
    struct sigaction old_ {};
    std::atomic<bool> stop_{false};
    std::thread thread_;
    static inline std::atomic<int> delivered_{0};
};

// Runs `work` on this thread under a storm while `host` plays the host on
// another. If `work` has not returned `boundMs` after the host is done, the
// test fails and `rescue` (a cable pull, say) is to make it return.
inline void UnderSignals(const std::function<void()> &work, const std::function<void()> &host, int boundMs,
                         const std::function<void()> &rescue) {
    std::atomic<bool> done{false};
    std::thread h([&] {
        host();
        if (!WaitUntil([&] { return done.load(); }, boundMs)) {
            ADD_FAILURE() << "still waiting under signals";
            rescue();
        }
    });
    {
        SignalStorm storm(pthread_self());
        work();
    }
    done = true;
    h.join();
}
