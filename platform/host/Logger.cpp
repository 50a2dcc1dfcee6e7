// Host stand-in of the controller's logger: one line per call to stderr or to
// the file named by USBADAPTER_LOG, filtered by USBADAPTER_LOG_LEVEL.
#include <fcntl.h>
#include <unistd.h>

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <atomic>
#include <mutex>

#include "LoggerHost.h"
#include "platform/Logger.h"

namespace {

struct Sink {
    int fd = 2;
    int threshold = 20000;
    Sink() {
        if (const char *path = std::getenv("USBADAPTER_LOG"); path && *path) {
            int f = ::open(path, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644);
            if (f >= 0) fd = f;
        }
        if (const char *lvl = std::getenv("USBADAPTER_LOG_LEVEL"); lvl && *lvl) {
            if (!std::strcmp(lvl, "ERROR")) threshold = 40000;
            else if (!std::strcmp(lvl, "WARN")) threshold = 30000;
            else if (!std::strcmp(lvl, "INFO")) threshold = 20000;
            else if (!std::strcmp(lvl, "FINE") || !std::strcmp(lvl, "DEBUG")) threshold = 10000;
            else if (!std::strcmp(lvl, "OFF")) threshold = 1 << 30;
            else threshold = std::atoi(lvl);
        }
    }
};

Sink &sink() {
    static Sink s;
    return s;
}

std::mutex captureMutex;
std::atomic<bool> capturing{false};
std::vector<LoggedLine> captured;

}  // namespace

extern "C" void Logger_PrintDelay(int, int level, const char *levelName, const char *,
                                  const char *function, const char *format, ...) {
    // Lines below the threshold are not even formatted unless a test captures them.
    if (!capturing.load(std::memory_order_relaxed) && level < sink().threshold) return;
    char text[2048];
    va_list ap;
    va_start(ap, format);
    int n = std::vsnprintf(text, sizeof text, format, ap);
    va_end(ap);
    if (n < 0) return;

    {
        std::lock_guard<std::mutex> lock(captureMutex);
        if (capturing) captured.push_back({level, levelName ? levelName : "", function ? function : "", text});
    }

    Sink &s = sink();
    if (level < s.threshold) return;
    // Messages carry their own "\r\n" decorations; the file gets one clean line each.
    const char *body = text;
    while (*body == '\r' || *body == '\n') ++body;
    size_t len = std::strlen(body);
    while (len && (body[len - 1] == '\n' || body[len - 1] == '\r')) --len;
    char line[2300];
    int m = std::snprintf(line, sizeof line, "%-5s %s: %.*s\n", levelName ? levelName : "?",
                          function ? function : "?", static_cast<int>(len), body);
    if (m > 0) {
        ssize_t w = ::write(s.fd, line, static_cast<size_t>(m) < sizeof line ? m : sizeof line - 1);
        (void)w;
    }
}

void LoggerHost_StartCapture() {
    std::lock_guard<std::mutex> lock(captureMutex);
    captured.clear();
    capturing = true;
}

void LoggerHost_StopCapture() {
    std::lock_guard<std::mutex> lock(captureMutex);
    capturing = false;
}

std::vector<LoggedLine> LoggerHost_Captured() {
    std::lock_guard<std::mutex> lock(captureMutex);
    return captured;
}

bool LoggerHost_Contains(const std::string &needle) {
    std::lock_guard<std::mutex> lock(captureMutex);
    for (const auto &l : captured)
        if (l.text.find(needle) != std::string::npos) return true;
    return false;
}

int LoggerHost_Count(const std::string &text) {
    std::lock_guard<std::mutex> lock(captureMutex);
    int n = 0;
    for (const auto &l : captured) n += l.text == text;
    return n;
}
