/* Platform logger of the controller. On a PC the host stand-in provides it. */
#ifndef PLATFORM_LOGGER_H
#define PLATFORM_LOGGER_H

#ifdef __cplusplus
extern "C" {
#endif

/* module, level number (40000 ERROR, 30000 WARN, 20000 INFO, 10000 FINE/DEBUG), level name,
 * component, calling function, printf format and values. */
void Logger_PrintDelay(int module, int level, const char *levelName, const char *component,
                       const char *function, const char *format, ...)
    __attribute__((format(printf, 6, 7)));

#ifdef __cplusplus
}
#endif

#endif
