// The session journal: one JSON object per line, per event, in the order the
// simulator saw them. Host actions and what the host read back are written by
// the simulator; what the Java side received is taken from the reference
// service's journal.jsonl and merged in with "src":"java".
#pragma once

#include <chrono>
#include <cstdint>
#include <cstdio>
#include <map>
#include <string>
#include <string_view>
#include <vector>

namespace sim {

std::string JsonEscape(std::string_view text);

// One flat JSON object, fields in the order added.
class JsonLine {
public:
    explicit JsonLine(std::string_view event) { Str("event", event); }
    JsonLine &Str(std::string_view key, std::string_view value);
    JsonLine &Num(std::string_view key, long long value);
    JsonLine &Bool(std::string_view key, bool value);
    JsonLine &Raw(std::string_view key, std::string_view json);  // value already JSON
    const std::string &Body() const { return body_; }  // "k":v,... without braces

private:
    void Key(std::string_view key);
    std::string body_;
};

// A flat object as the Java side writes it: string values unescaped, numbers
// as their text. False when the line is not such an object.
bool ParseFlatJson(const std::string &line, std::map<std::string, std::string> *fields);

class Journal {
public:
    ~Journal();
    bool Open(const std::string &path, std::string *error);
    // Writes {"seq":N,"ms":T,"src":SRC,<line>} and flushes.
    void Write(const char *src, const JsonLine &line);
    // A line of the Java side's journal, with seq, ms and "src":"java" in front.
    void WriteJava(const std::string &javaLine);
    long long ElapsedMs() const;
    const std::string &Path() const { return path_; }
    // Echo every line to stdout as well.
    void SetEcho(bool on) { echo_ = on; }

private:
    void Emit(const char *src, std::string_view body);
    std::FILE *file_ = nullptr;
    std::string path_;
    uint64_t seq_ = 0;
    bool echo_ = false;
    std::chrono::steady_clock::time_point start_ = std::chrono::steady_clock::now();
};

// New complete lines of a file another writer appends to.
class FileTail {
public:
    explicit FileTail(std::string path = {}) : path_(std::move(path)) {}
    void SetPath(std::string path) { path_ = std::move(path); }
    std::vector<std::string> NewLines();

private:
    std::string path_;
    long long offset_ = 0;
};

}  // namespace sim
