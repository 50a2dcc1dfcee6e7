// The library's logging: every line goes to the platform's Logger_PrintDelay.
#pragma once

#include "platform/Logger.h"

#define USBADP_LEVEL_ERROR 40000, "ERROR"
#define USBADP_LEVEL_WARN 30000, "WARN"
#define USBADP_LEVEL_INFO 20000, "INFO"
#define USBADP_LEVEL_FINE 10000, "FINE"
#define USBADP_LEVEL_DEBUG 10000, "DEBUG"

// USBADP_LOG(ERROR|WARN|INFO|FINE|DEBUG, format, values...)
#define USBADP_LOG(level, ...) \
    Logger_PrintDelay(20000, USBADP_LEVEL_##level, "Unknown", __func__, __VA_ARGS__)

// For signal handlers: the platform logger may lock or allocate, so the line is
// queued without either and printed later through USBADP_LOG's path by a worker
// thread. Up to three integer values, passed as long: formats use %ld.
#define USBADP_LOG_ASYNC(level, format, ...) \
    Log_Deferred(USBADP_LEVEL_##level, __func__, format __VA_OPT__(, ) __VA_ARGS__)

void Log_Deferred(int level, const char *levelName, const char *function, const char *format,
                  long a = 0, long b = 0, long c = 0) noexcept;
// Prints every queued deferred line now (on the calling thread); tests and
// shutdown use it. The worker does the same whenever lines arrive.
void Log_FlushDeferred() noexcept;
// Starts the worker that prints deferred lines; call from a normal thread
// before installing a handler that logs (idempotent).
void Log_StartDeferredWorker() noexcept;
// Lines lost because the queue was full.
unsigned long Log_DeferredDropped() noexcept;
