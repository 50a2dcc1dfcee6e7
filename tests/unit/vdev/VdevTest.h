// Shared fixture of the vdev tests: a clean model per test.
#pragma once

#include <fcntl.h>
#include <unistd.h>

#include <chrono>

#include <gtest/gtest.h>

#include "common/UniqueFd.h"
#include "support/WaitUntil.h"
#include "vdev.h"

class VdevTest : public ::testing::Test {
protected:
    void SetUp() override { vdev::Reset(); }
    void TearDown() override { vdev::Reset(); }

    static UniqueFd Open(const char *path, int flags = O_RDWR) { return UniqueFd(::open(path, flags)); }
};

inline long ElapsedMs(std::chrono::steady_clock::time_point since) {
    return static_cast<long>(
        std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::steady_clock::now() - since).count());
}
