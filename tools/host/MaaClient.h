// Host side of the printer's factory test shell over its USB print channel:
// the start and stop handshake, command lines, the records and files the
// device sends back, downloads and saved-command (auto) sessions.
//
// Wire format (device to host): result records are a 12-byte header of three
// big-endian words (continue flag, result code, data size) and the data;
// transfer frames are "#$%", an operation code (1 file, 0xA0 end of files)
// and the size twice, then the file's bytes. In a buffer the device forwards,
// transfer frames behind the end of files come without their bytes.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace maahost {

// A byte channel to the printer's print interface.
class Channel {
public:
    virtual ~Channel() = default;
    // Sends every byte (false on failure).
    virtual bool Send(const void *data, size_t size) = 0;
    // Up to `size` bytes; 0 when nothing arrived within timeoutMs, -1 on an error.
    virtual ssize_t Receive(void *data, size_t size, int timeoutMs) = 0;
};

// Plain read/write/poll on a descriptor: a printer-class device node such as
// /dev/usb/lp0, a pipe, a socket.
class FdChannel : public Channel {
public:
    explicit FdChannel(int fd) : fd_(fd) {}
    bool Send(const void *data, size_t size) override;
    ssize_t Receive(void *data, size_t size, int timeoutMs) override;

private:
    int fd_;
};

enum : uint32_t { kContinue = 0, kEnd = 1, kNone = 2 };  // continue flag of a record
enum : uint8_t { kOpH2T = 0, kOpT2H = 1, kOpJigStart = 2, kOpJigEnd = 3, kOpAutoStart = 4, kOpAutoEnd = 5, kOpFileEnd = 0xA0 };

struct Frame {
    enum class Kind { Result, File, FileEnd, Transfer };
    Kind kind = Kind::Result;
    uint32_t status = 0;  // Result: continue flag; Transfer: operation code
    uint32_t result = 0;
    std::string data;     // record data or file contents
    bool headerOnly = false;  // a transfer frame whose size announced bytes that were not sent

    bool operator==(const Frame &) const = default;
};

// Empty when a download of `size` bytes can be sent, else why not: its size
// travels in a 32-bit field.
std::string CheckDownloadSize(uint64_t size);
// True when the line calls a function (a name followed by "(" outside string
// literals): only such a line may take long before its records come, so only
// it gets the long silence wait.
bool CallsFunction(const std::string &line);

// The device runs an auto session's saved lines up to the first empty one, so
// blank lines (empty or only blanks and tabs) are removed from an auto script;
// returns how many.
size_t DropBlankLines(std::vector<std::string> *lines);

// One readable line: "| text", "= result N: text", "<file N bytes>", ...
std::string Describe(const Frame &frame);
// Hex of bytes, "1b 77 4d ...".
std::string Hex(const std::string &bytes);

class Session {
public:
    // timeoutMs bounds each wait for an answer the device owes (handshakes,
    // the download address, the rest of a frame).
    explicit Session(Channel &channel, int timeoutMs = 5000) : ch_(channel), timeoutMs_(timeoutMs) {}

    // ESC "w" "MAASTART"; true when ESC "w" "MAA-OK" came back.
    bool Start();
    // "MAA-STOP"; true when acknowledged.
    bool Stop();
    // Sends one command line, CR-terminated.
    bool SendLine(const std::string &line);
    // Sends one command line and hands every frame that comes
    // back to onFrame, until `quietMs` passes without one. After a final
    // record (or the end of files) the wait shortens to lingerMs, for the
    // records of further statements on the same line. Returns the number of
    // frames; -1 when a frame was cut off or the channel failed (Error()).
    int Command(const std::string &line, const std::function<void(const Frame &)> &onFrame, int quietMs,
                int lingerMs = 100);
    // Reads frames already on their way (same rules as Command without a line).
    int Collect(const std::function<void(const Frame &)> &onFrame, int quietMs, int lingerMs = 100);
    // Downloads bytes into a device buffer; its address for test functions.
    // Nothing is sent when CheckDownloadSize refuses the size.
    std::optional<uint32_t> Download(const std::string &bytes);
    // Special command without data: auto or JIG mode start (with the size of
    // the device's saved-command buffer) and end.
    bool SendSpecial(uint8_t op, uint32_t size);

    const std::string &Error() const { return error_; }
    // Raw bytes of every frame as received, for --raw output (cleared by the caller).
    std::string rawLog;

private:
    bool ReadExact(std::string *out, size_t n, int timeoutMs);
    // 1 a frame, 0 silence, -1 error or a cut frame.
    int ReadFrame(Frame *frame, int timeoutMs);
    bool Fail(const std::string &message);

    Channel &ch_;
    int timeoutMs_;
    std::string rx_;  // received, not yet decoded
    bool filesEnded_ = false;  // transfer frames come without data (see ReadFrame)
    std::string error_;
};

}  // namespace maahost
