// main() of the JVM test binaries. A reader entry never returns, so a test that
// started one leaves a thread inside the library for good. Returning from main
// would run exit(): static destructors and the JVM's exit hooks while that thread
// still uses them. Instead the result is flushed and the process ends with
// _exit(result): nothing else runs, and CTest sees gtest's status.
#include <gtest/gtest.h>

#include <cstdio>
#include <unistd.h>

int main(int argc, char **argv) {
    testing::InitGoogleTest(&argc, argv);
    int result = RUN_ALL_TESTS();
    std::fflush(nullptr);
    _exit(result);
}
