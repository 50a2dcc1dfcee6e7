// Test access to the host logger stand-in: capture of every line logged.
#pragma once

#include <string>
#include <vector>

struct LoggedLine {
    int level;
    std::string levelName;
    std::string function;
    std::string text;  // the formatted message exactly as the caller produced it
};

// Starts recording every call (whatever the level filter) and drops earlier records.
void LoggerHost_StartCapture();
void LoggerHost_StopCapture();
std::vector<LoggedLine> LoggerHost_Captured();
// True when some captured line's text contains `needle`.
bool LoggerHost_Contains(const std::string &needle);
// Number of captured lines whose text equals `text` exactly.
int LoggerHost_Count(const std::string &text);
