#include "Data.h"

#include <cctype>
#include <cstdint>
#include <cstdlib>
#include <fstream>
#include <sstream>

namespace sim {
namespace {

bool StartsWith(const std::string &s, std::string_view prefix) { return s.compare(0, prefix.size(), prefix) == 0; }

int HexDigit(char c) {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    return -1;
}

bool ParseHex(const std::string &text, std::string *out, std::string *error) {
    int high = -1;
    for (char c : text) {
        if (c == '_' || c == ':') {
            if (high < 0) continue;
            *error = "separator inside a byte in hex:" + text;
            return false;
        }
        int d = HexDigit(c);
        if (d < 0) {
            *error = "not a hex digit: '" + std::string(1, c) + "'";
            return false;
        }
        if (high < 0) {
            high = d;
        } else {
            out->push_back(static_cast<char>(high << 4 | d));
            high = -1;
        }
    }
    if (high >= 0) {
        *error = "odd number of hex digits in hex:" + text;
        return false;
    }
    return true;
}

bool ReadFile(const std::string &path, std::string *out, std::string *error) {
    std::ifstream in(path, std::ios::binary);
    if (!in) {
        *error = "cannot read " + path;
        return false;
    }
    std::ostringstream all;
    all << in.rdbuf();
    *out += all.str();
    return true;
}

// xorshift32: the same bytes for the same seed on every host.
void Pattern(size_t n, uint32_t seed, std::string *out) {
    uint32_t x = seed ? seed : 0x9E3779B9u;
    out->reserve(out->size() + n);
    for (size_t i = 0; i < n; ++i) {
        x ^= x << 13;
        x ^= x >> 17;
        x ^= x << 5;
        char c = static_cast<char>(x >> 24);
        out->push_back(c == '\x1b' ? '\x1a' : c);
    }
}

// slice:OFFSET:LENGTH:PATH (the path last: it may hold colons).
bool ParseSlice(const std::string &item, size_t *offset, size_t *length, std::string *path) {
    const size_t a = item.find(':', 6);
    const size_t b = a == std::string::npos ? a : item.find(':', a + 1);
    if (b == std::string::npos || b + 1 >= item.size()) return false;
    *path = item.substr(b + 1);
    return ParseSize(item.substr(6, a - 6), offset) && ParseSize(item.substr(a + 1, b - a - 1), length);
}

}  // namespace

std::string SampleJob() {
    std::string job(kUel);
    job += "@PJL JOB NAME=\"usbadapter-sim sample\"\r\n"
           "@PJL SET RESOLUTION=600\r\n"
           "@PJL ENTER LANGUAGE=PCL\r\n"
           "\x1b" "E\x1b&l0O\x1b(s0p12h10v0s0b3T"
           "Hello from usbadapter-sim: one page, one job.\r\n\f"
           "\x1b" "E";
    job += kUel;
    return job;
}

bool ParseSize(const std::string &text, size_t *size) {
    if (text.empty() || !std::isdigit(static_cast<unsigned char>(text[0]))) return false;
    char *end = nullptr;
    unsigned long long v = std::strtoull(text.c_str(), &end, 10);
    std::string suffix(end);
    if (suffix == "K" || suffix == "k") v <<= 10;
    else if (suffix == "M" || suffix == "m") v <<= 20;
    else if (!suffix.empty()) return false;
    *size = static_cast<size_t>(v);
    return true;
}

bool CheckDataItem(const std::string &item, std::string *error) {
    if (item == "uel" || item == "sample" || StartsWith(item, "text:")) return true;
    if (StartsWith(item, "file:")) {
        if (item.size() > 5) return true;
        *error = "file: needs a path";
        return false;
    }
    if (StartsWith(item, "hex:")) {
        std::string bytes;
        return ParseHex(item.substr(4), &bytes, error);
    }
    if (StartsWith(item, "slice:")) {
        size_t offset = 0, length = 0;
        std::string path;
        if (ParseSlice(item, &offset, &length, &path)) return true;
        *error = "bad " + item + " (slice:OFFSET:LENGTH:PATH)";
        return false;
    }
    if (StartsWith(item, "pattern:") || StartsWith(item, "fill:")) {
        // The size here; the rest by making zero bytes of the same item.
        const size_t colon = item.find(':');
        const std::string arg = item.substr(colon + 1);
        const size_t second = arg.find(':');
        size_t n = 0;
        if (!ParseSize(arg.substr(0, second), &n)) {
            *error = "bad size in " + item;
            return false;
        }
        std::string bytes;
        const std::string rest = second == std::string::npos ? "" : arg.substr(second);
        if (BuildData({item.substr(0, colon + 1) + "0" + rest}, "", &bytes, error)) return true;
        *error = "bad " + item + (item[0] == 'p' ? " (pattern:N[:SEED])" : " (fill:N:HH)");
        return false;
    }
    *error = "not a data item: '" + item + "'";
    return false;
}

bool BuildData(const std::vector<std::string> &items, const std::string &baseDir, std::string *bytes,
               std::string *error) {
    for (const std::string &item : items) {
        if (item == "uel") {
            *bytes += kUel;
        } else if (item == "sample") {
            *bytes += SampleJob();
        } else if (StartsWith(item, "slice:")) {
            size_t offset = 0, length = 0;
            std::string path, whole;
            if (!ParseSlice(item, &offset, &length, &path)) {
                *error = "bad " + item + " (slice:OFFSET:LENGTH:PATH)";
                return false;
            }
            if (path[0] != '/' && !baseDir.empty()) path = baseDir + "/" + path;
            if (!ReadFile(path, &whole, error)) return false;
            if (offset > whole.size() || length > whole.size() - offset) {
                *error = item + ": the file has " + std::to_string(whole.size()) + " bytes";
                return false;
            }
            bytes->append(whole, offset, length);
        } else if (StartsWith(item, "file:")) {
            std::string path = item.substr(5);
            if (!path.empty() && path[0] != '/' && !baseDir.empty()) path = baseDir + "/" + path;
            if (!ReadFile(path, bytes, error)) return false;
        } else if (StartsWith(item, "hex:")) {
            if (!ParseHex(item.substr(4), bytes, error)) return false;
        } else if (StartsWith(item, "text:")) {
            *bytes += item.substr(5);
        } else if (StartsWith(item, "pattern:")) {
            std::string arg = item.substr(8);
            size_t colon = arg.find(':');
            size_t n = 0;
            char *end = nullptr;
            unsigned long seed = colon == std::string::npos ? 1 : std::strtoul(arg.c_str() + colon + 1, &end, 0);
            if (!ParseSize(arg.substr(0, colon), &n) || (end && *end)) {
                *error = "bad pattern: " + item + " (pattern:N[:SEED])";
                return false;
            }
            Pattern(n, static_cast<uint32_t>(seed), bytes);
        } else if (StartsWith(item, "fill:")) {
            std::string arg = item.substr(5);
            size_t colon = arg.find(':');
            size_t n = 0;
            std::string value;
            if (colon == std::string::npos || !ParseSize(arg.substr(0, colon), &n) ||
                !ParseHex(arg.substr(colon + 1), &value, error) || value.size() != 1) {
                *error = "bad fill: " + item + " (fill:N:HH)";
                return false;
            }
            bytes->append(n, value[0]);
        } else {
            *error = "not a data item: " + item;
            return false;
        }
    }
    return true;
}

std::vector<size_t> SplitTransfers(size_t total, const std::vector<size_t> &sizes, size_t every) {
    std::vector<size_t> out;
    size_t left = total;
    if (every > 0) {
        while (left > 0) {
            size_t n = std::min(left, every);
            out.push_back(n);
            left -= n;
        }
    } else {
        for (size_t s : sizes) {
            if (left == 0 && s > 0) break;
            size_t n = std::min(left, s);
            out.push_back(n);
            left -= n;
        }
        if (left > 0) out.push_back(left);
    }
    if (out.empty()) out.push_back(0);
    return out;
}

std::vector<size_t> RandomTransfers(size_t total, size_t min, size_t max, uint32_t seed) {
    std::vector<size_t> out;
    uint32_t x = seed ? seed : 0x9E3779B9u;
    const size_t span = max - min + 1;
    for (size_t left = total; left > 0;) {
        x ^= x << 13;
        x ^= x >> 17;
        x ^= x << 5;
        const size_t n = std::min(left, min + x % span);
        if (n == 0) continue;  // min 0 draws an empty size now and then: skip it
        out.push_back(n);
        left -= n;
    }
    if (out.empty()) out.push_back(0);
    return out;
}

std::string Hex(std::string_view bytes) {
    static const char kDigits[] = "0123456789abcdef";
    std::string out;
    out.reserve(bytes.size() * 2);
    for (unsigned char c : bytes) {
        out += kDigits[c >> 4];
        out += kDigits[c & 0xF];
    }
    return out;
}

}  // namespace sim
