// Waiting in real time for something another thread does.
#pragma once

#include <chrono>
#include <thread>

// Polls `pred` every millisecond until it holds or `ms` have passed; true when it held.
template <typename Pred>
bool WaitUntil(Pred pred, int ms = 10000) {
    auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(ms);
    while (!pred()) {
        if (std::chrono::steady_clock::now() > end) return false;
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
    return true;
}
