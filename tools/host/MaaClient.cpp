#include "MaaClient.h"

#include <poll.h>
#include <unistd.h>

#include <cctype>
#include <cerrno>
#include <chrono>
#include <cstdint>
#include <cstdio>

#include "common/ByteOrder.h"

namespace maahost {
namespace {

const std::string kStart("\x1bwMAASTART", 10);
const std::string kAck("\x1bwMAA-OK", 8);
const std::string kStop("MAA-STOP\r");
constexpr size_t kHeaderSize = 12;

uint32_t Word(const std::string &s, size_t at) { return ReadBE32(reinterpret_cast<const uint8_t *>(s.data() + at)); }

std::string Special(uint8_t op, uint32_t size) {
    std::string s = "#$%";
    s += static_cast<char>(op);
    s.resize(8);
    WriteBE32(reinterpret_cast<uint8_t *>(s.data() + 4), size);
    return s + "\r";
}

bool Printable(const std::string &s) {
    for (unsigned char c : s)
        if ((c < 0x20 && c != '\t' && c != '\r' && c != '\n') || c == 0x7F) return false;
    return true;
}

std::string Text(const std::string &data) {
    if (!Printable(data)) {
        const size_t shown = data.size() < 32 ? data.size() : 32;
        std::string t = "<";
        t += std::to_string(data.size());
        t += " bytes> " + Hex(data.substr(0, shown));
        if (shown < data.size()) t += " ...";
        return t;
    }
    std::string t = data;
    while (!t.empty() && (t.back() == '\r' || t.back() == '\n')) t.pop_back();
    return t;
}

int64_t NowMs() {
    using namespace std::chrono;
    return duration_cast<milliseconds>(steady_clock::now().time_since_epoch()).count();
}

}  // namespace

bool FdChannel::Send(const void *data, size_t size) {
    const char *p = static_cast<const char *>(data);
    while (size > 0) {
        ssize_t n = ::write(fd_, p, size);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) return false;
        p += n;
        size -= static_cast<size_t>(n);
    }
    return true;
}

ssize_t FdChannel::Receive(void *data, size_t size, int timeoutMs) {
    const int64_t deadline = NowMs() + timeoutMs;
    for (;;) {
        pollfd pfd{fd_, POLLIN, 0};
        int wait = static_cast<int>(deadline - NowMs());
        int r = ::poll(&pfd, 1, wait < 0 ? 0 : wait);
        if (r < 0 && errno == EINTR) continue;
        if (r < 0) return -1;
        if (r == 0) return 0;
        ssize_t n = ::read(fd_, data, size);
        if (n < 0 && errno == EINTR) continue;
        if (n < 0) return -1;
        // A printer class device may be readable with nothing to give yet.
        if (n > 0 || NowMs() >= deadline) return n;
    }
}

std::string CheckDownloadSize(uint64_t size) {
    if (size <= UINT32_MAX) return {};
    return std::to_string(size) + " bytes cannot be downloaded: the size field has 32 bits (at most " +
           std::to_string(UINT32_MAX) + " bytes, under 4 GiB)";
}

size_t DropBlankLines(std::vector<std::string> *lines) {
    const size_t before = lines->size();
    std::erase_if(*lines, [](const std::string &l) { return l.find_first_not_of(" \t") == std::string::npos; });
    return before - lines->size();
}

std::string Hex(const std::string &bytes) {
    std::string out;
    char b[4];
    for (unsigned char c : bytes) {
        std::snprintf(b, sizeof b, out.empty() ? "%02x" : " %02x", c);
        out += b;
    }
    return out;
}

std::string Describe(const Frame &f) {
    switch (f.kind) {
    case Frame::Kind::Result:
        if (f.status == kContinue)
            return "| " + Text(f.data) + (f.result ? "  (result " + std::to_string(f.result) + ")" : "");
        if (f.status == kEnd) return "= result " + std::to_string(f.result) + (f.data.empty() ? "" : ": " + Text(f.data));
        return "? record " + std::to_string(f.status) + " result " + std::to_string(f.result) +
               (f.data.empty() ? "" : ": " + Text(f.data));
    case Frame::Kind::File:
        if (f.headerOnly) return "<file header without data, after the end of files>";
        return "<file, " + std::to_string(f.data.size()) + " bytes>";
    case Frame::Kind::FileEnd: return "<end of files>";
    case Frame::Kind::Transfer:
        if (f.headerOnly)
            return "<transfer " + std::to_string(f.status) + " header without data, after the end of files>";
        return "<transfer " + std::to_string(f.status) + ", " + std::to_string(f.data.size()) + " bytes>";
    }
    return {};
}

bool Session::Fail(const std::string &message) {
    error_ = message;
    return false;
}

bool Session::ReadExact(std::string *out, size_t n, int timeoutMs) {
    const int64_t deadline = NowMs() + timeoutMs;
    char buf[1 << 16];
    while (rx_.size() < n) {
        int wait = static_cast<int>(deadline - NowMs());
        if (wait <= 0) return Fail("no answer within " + std::to_string(timeoutMs) + " ms");
        ssize_t r = ch_.Receive(buf, sizeof buf, wait);
        if (r < 0) return Fail("reading the channel failed");
        rx_.append(buf, static_cast<size_t>(r));
    }
    out->assign(rx_, 0, n);
    rx_.erase(0, n);
    return true;
}

int Session::ReadFrame(Frame *f, int waitMs) {
    if (rx_.empty()) {
        char buf[1 << 16];
        ssize_t r = ch_.Receive(buf, sizeof buf, waitMs);
        if (r < 0) return Fail("reading the channel failed"), -1;
        if (r == 0) return 0;
        rx_.append(buf, static_cast<size_t>(r));
    }
    std::string header;
    if (!ReadExact(&header, kHeaderSize, timeoutMs_)) return Fail("frame header cut off: " + Hex(rx_)), -1;
    *f = Frame{};
    uint32_t size = Word(header, 8);
    if (header.compare(0, 3, "#$%") == 0) {
        const uint8_t op = static_cast<uint8_t>(header[3]);
        f->status = op;
        f->kind = op == kOpFileEnd ? Frame::Kind::FileEnd : op == kOpT2H ? Frame::Kind::File : Frame::Kind::Transfer;
        // A forwarded buffer's transfer frames carry no data from its end of
        // files on. Where that buffer ends does not show on the wire; a record
        // that ends a statement does, and the next statement's files come with
        // their data. So the state holds from an end of files to the next
        // final record. (Transfer frames a forwarded buffer had behind its own
        // final record could not be told from a new statement's files.)
        if (op == kOpFileEnd) filesEnded_ = true;
        if (filesEnded_) {
            f->headerOnly = op != kOpFileEnd;
            size = 0;
        }
    } else {
        f->status = Word(header, 0);
        f->result = Word(header, 4);
        if (f->status != kContinue) filesEnded_ = false;
    }
    if (!ReadExact(&f->data, size, timeoutMs_))
        return Fail("frame of " + std::to_string(size) + " bytes cut off after " + std::to_string(rx_.size())), -1;
    rawLog += header + f->data;
    return 1;
}

bool Session::Start() {
    if (!ch_.Send(kStart.data(), kStart.size())) return Fail("sending the start command failed");
    std::string ack;
    if (!ReadExact(&ack, kAck.size(), timeoutMs_)) return Fail("no acknowledgement of the start command: " + error_);
    if (ack != kAck) return Fail("unexpected answer to the start command: " + Hex(ack));
    return true;
}

bool Session::Stop() {
    if (!ch_.Send(kStop.data(), kStop.size())) return Fail("sending the stop command failed");
    // Records of earlier lines may still be on their way: skip to the ESC.
    for (;;) {
        std::string first;
        if (!ReadExact(&first, 1, timeoutMs_)) return Fail("no acknowledgement of the stop command: " + error_);
        rx_.insert(0, first);
        if (first[0] == kAck[0]) break;
        Frame skipped;
        if (ReadFrame(&skipped, timeoutMs_) < 0) return false;
    }
    std::string ack;
    if (!ReadExact(&ack, kAck.size(), timeoutMs_) || ack != kAck)
        return Fail("unexpected answer to the stop command: " + Hex(ack));
    return true;
}

bool CallsFunction(const std::string &line) {
    enum { None, Name, Number } token = None;  // the word just before, blanks skipped
    for (size_t i = 0; i < line.size(); ++i) {
        const unsigned char c = static_cast<unsigned char>(line[i]);
        if (c == '"') {
            for (++i; i < line.size() && line[i] != '"'; ++i) {
                if (line[i] == '\\') ++i;
            }
            token = None;
        } else if (c == '#') {
            return false;  // the rest of the line is raw bytes
        } else if (std::isalnum(c) || c == '_') {
            if (token == None) token = std::isdigit(c) ? Number : Name;
        } else if (c == '(' && token == Name) {
            return true;
        } else if (c == ' ' || c == '\t') {
            if (token == Number) token = None;  // a name may still be followed by "("
        } else {
            token = None;
        }
    }
    return false;
}

int Session::Collect(const std::function<void(const Frame &)> &onFrame, int quietMs, int lingerMs) {
    int count = 0;
    int wait = quietMs;
    for (;;) {
        Frame f;
        int r = ReadFrame(&f, wait);
        if (r <= 0) return r < 0 ? -1 : count;
        ++count;
        onFrame(f);
        const bool last = (f.kind == Frame::Kind::Result && f.status != kContinue) || f.kind == Frame::Kind::FileEnd;
        wait = last ? lingerMs : quietMs;
    }
}

bool Session::SendLine(const std::string &line) {
    const std::string wire = line + "\r";
    return ch_.Send(wire.data(), wire.size()) || Fail("sending the line failed");
}

int Session::Command(const std::string &line, const std::function<void(const Frame &)> &onFrame, int quietMs,
                     int lingerMs) {
    if (!SendLine(line)) return -1;
    return Collect(onFrame, quietMs, lingerMs);
}

std::optional<uint32_t> Session::Download(const std::string &bytes) {
    if (std::string refused = CheckDownloadSize(bytes.size()); !refused.empty()) {
        Fail(refused);
        return std::nullopt;
    }
    const std::string command = Special(kOpH2T, static_cast<uint32_t>(bytes.size()));
    if (!ch_.Send(command.data(), command.size()) || !ch_.Send(bytes.data(), bytes.size())) {
        Fail("sending the file failed");
        return std::nullopt;
    }
    std::string address;
    if (!ReadExact(&address, 4, timeoutMs_)) {
        Fail("no buffer address for the download: " + error_);
        return std::nullopt;
    }
    return Word(address, 0);
}

bool Session::SendSpecial(uint8_t op, uint32_t size) {
    const std::string command = Special(op, size);
    return ch_.Send(command.data(), command.size()) || Fail("sending the special command failed");
}

}  // namespace maahost
