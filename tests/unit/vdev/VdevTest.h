// Shared fixture of the vdev tests: a clean model per test.
#pragma once

#include <fcntl.h>
#include <unistd.h>

#include <chrono>
#include <thread>

#include <gtest/gtest.h>

#include "common/UniqueFd.h"
#include "vdev.h"

class VdevTest : public ::testing::Test {
protected:
    void SetUp() override { vdev::Reset(); }
    void TearDown() override { vdev::Reset(); }

    static UniqueFd Open(const char *path, int flags = O_RDWR) { return UniqueFd(::open(path, flags)); }
};

// Polls `pred` until it holds or `ms` have passed; true when it held.
template <typename Pred>
bool WaitUntil(Pred pred, int ms = 3000) {
    auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(ms);
    while (!pred()) {
        if (std::chrono::steady_clock::now() > end) return false;
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
    return true;
}

inline long ElapsedMs(std::chrono::steady_clock::time_point since) {
    return static_cast<long>(
        std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::steady_clock::now() - since).count());
}
