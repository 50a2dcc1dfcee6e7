// SIGIO sent to one thread at a fixed rate, as the bridge's notifications reach
// whatever thread the kernel picks. The handler does nothing and is installed
// without SA_RESTART, as the library's is, so every wait it lands in sees EINTR.
#pragma once

#include <pthread.h>
#include <signal.h>

#include <atomic>
#include <chrono>
#include <thread>

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
