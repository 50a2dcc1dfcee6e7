// Reproducible bytes of every value, for payloads whose content a test checks
// end to end.
#pragma once

#include <cstdint>
#include <algorithm>
#include <cstring>
#include <random>
#include <string>

inline std::string RandomBytes(size_t size, uint64_t seed) {
    std::mt19937_64 rng(seed);
    std::string out(size, '\0');
    for (size_t i = 0; i < size; i += 8) {
        const uint64_t v = rng();
        std::memcpy(&out[i], &v, std::min<size_t>(8, size - i));
    }
    return out;
}
