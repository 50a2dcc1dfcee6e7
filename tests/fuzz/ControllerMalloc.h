// The controller's allocator, for the targets linked with malloc and calloc
// wrapped (CMakeLists.txt). Include from exactly one file of a target.
//
// The controller is a 32-bit machine: an allocation of the size a host may
// announce (up to 2 GiB for an application body, 256 MiB for the test
// shell's downloads, 64 MiB for its saved commands) fails there. Here a large
// allocation fails too, quietly, so the product's allocation-failure paths
// run. The bound is lower than the controller's so that each input stays
// fast: ASan clears shadow memory for every large block, and inputs that
// announce hundreds of MiB cut the run rate to a third.
#pragma once

#include <cerrno>
#include <cstddef>

constexpr size_t kControllerAllocLimit = size_t{4} << 20;

extern "C" void *__real_malloc(size_t size);
extern "C" void *__wrap_malloc(size_t size) {
    if (size > kControllerAllocLimit) {
        errno = ENOMEM;
        return nullptr;
    }
    return __real_malloc(size);
}

extern "C" void *__real_calloc(size_t count, size_t size);
extern "C" void *__wrap_calloc(size_t count, size_t size) {
    size_t total;
    if (__builtin_mul_overflow(count, size, &total) || total > kControllerAllocLimit) {
        errno = ENOMEM;
        return nullptr;
    }
    return __real_calloc(count, size);
}
