#include "common/Log.h"

#include <pthread.h>
#include <semaphore.h>

#include <atomic>
#include <cerrno>
#include <mutex>

namespace {

// Bounded multi-producer queue; producers only use atomics so a signal handler
// on any thread can add a line. A full queue drops the line and counts it.
struct Entry {
    std::atomic<unsigned long> seq;
    int level;
    const char *levelName;
    const char *function;
    const char *format;
    long args[3];
};

constexpr unsigned long kSlots = 256;
Entry ring[kSlots];
std::atomic<unsigned long> head{0};
unsigned long tail = 0;  // consumer side, guarded by drainMutex
std::atomic<unsigned long> dropped{0};
std::mutex drainMutex;
sem_t wake;
std::atomic<int> workerState{0};  // 0 none, 1 starting, 2 running

struct RingInit {
    RingInit() {
        for (unsigned long i = 0; i < kSlots; ++i) ring[i].seq.store(i, std::memory_order_relaxed);
        sem_init(&wake, 0, 0);
    }
} ringInit;

void *worker(void *) {
    for (;;) {
        while (sem_wait(&wake) != 0 && errno == EINTR) {
        }
        Log_FlushDeferred();
    }
    return nullptr;
}

// Started from a normal thread the first time a deferred line may be produced
// (first call from outside a handler is guaranteed by Log_StartDeferredWorker).
void startWorker() {
    int expected = 0;
    if (!workerState.compare_exchange_strong(expected, 1)) return;
    pthread_t t;
    if (pthread_create(&t, nullptr, worker, nullptr) == 0) {
        pthread_detach(t);
        workerState.store(2);
    } else {
        workerState.store(0);
    }
}

}  // namespace

void Log_StartDeferredWorker() noexcept { startWorker(); }

void Log_Deferred(int level, const char *levelName, const char *function, const char *format, long a,
                  long b, long c) noexcept {
    unsigned long pos = head.load(std::memory_order_relaxed);
    Entry *e;
    for (;;) {
        e = &ring[pos % kSlots];
        unsigned long seq = e->seq.load(std::memory_order_acquire);
        if (seq == pos) {
            if (head.compare_exchange_weak(pos, pos + 1, std::memory_order_relaxed)) break;
        } else if (seq < pos) {
            dropped.fetch_add(1, std::memory_order_relaxed);
            return;
        } else {
            pos = head.load(std::memory_order_relaxed);
        }
    }
    e->level = level;
    e->levelName = levelName;
    e->function = function;
    e->format = format;
    e->args[0] = a;
    e->args[1] = b;
    e->args[2] = c;
    e->seq.store(pos + 1, std::memory_order_release);
    if (workerState.load(std::memory_order_acquire) == 2) sem_post(&wake);
}

void Log_FlushDeferred() noexcept {
    std::lock_guard<std::mutex> lock(drainMutex);
    for (;;) {
        Entry &e = ring[tail % kSlots];
        if (e.seq.load(std::memory_order_acquire) != tail + 1) return;
        int level = e.level;
        const char *levelName = e.levelName, *function = e.function, *format = e.format;
        long a = e.args[0], b = e.args[1], c = e.args[2];
        e.seq.store(tail + kSlots, std::memory_order_release);
        ++tail;
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-nonliteral"
#pragma GCC diagnostic ignored "-Wformat-security"
        // Unused trailing values are ignored by the formatter.
        Logger_PrintDelay(20000, level, levelName, "Unknown", function, format, a, b, c);
#pragma GCC diagnostic pop
    }
}

unsigned long Log_DeferredDropped() noexcept { return dropped.load(); }
