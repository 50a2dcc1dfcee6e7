// A fuzz target's failed check: says what failed and aborts, so libFuzzer
// keeps the input.
#pragma once

#include <cstdio>
#include <cstdlib>

[[noreturn]] inline void fail(const char *what) {
    std::fprintf(stderr, "\n== fuzz check failed: %s\n", what);
    std::abort();
}

#define CHECK(cond, what)        \
    do {                         \
        if (!(cond)) fail(what); \
    } while (0)
