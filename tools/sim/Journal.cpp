#include "Journal.h"

#include <cstdlib>
#include <fstream>
#include <iterator>

namespace sim {

std::string JsonEscape(std::string_view text) {
    std::string out;
    out.reserve(text.size() + 2);
    for (unsigned char c : text) {
        switch (c) {
        case '"': out += "\\\""; break;
        case '\\': out += "\\\\"; break;
        case '\n': out += "\\n"; break;
        case '\r': out += "\\r"; break;
        case '\t': out += "\\t"; break;
        default:
            if (c < 0x20 || c == 0x7F) {
                char u[8];
                std::snprintf(u, sizeof u, "\\u%04x", c);
                out += u;
            } else {
                out += static_cast<char>(c);
            }
        }
    }
    return out;
}

void JsonLine::Key(std::string_view key) {
    if (!body_.empty()) body_ += ',';
    body_ += '"';
    body_ += JsonEscape(key);
    body_ += "\":";
}

JsonLine &JsonLine::Str(std::string_view key, std::string_view value) {
    Key(key);
    body_ += '"';
    body_ += JsonEscape(value);
    body_ += '"';
    return *this;
}

JsonLine &JsonLine::Num(std::string_view key, long long value) {
    Key(key);
    body_ += std::to_string(value);
    return *this;
}

JsonLine &JsonLine::Bool(std::string_view key, bool value) {
    Key(key);
    body_ += value ? "true" : "false";
    return *this;
}

JsonLine &JsonLine::Raw(std::string_view key, std::string_view json) {
    Key(key);
    body_ += json;
    return *this;
}

namespace {

void SkipBlanks(const std::string &s, size_t &i) {
    while (i < s.size() && (s[i] == ' ' || s[i] == '\t')) ++i;
}

bool ParseString(const std::string &s, size_t &i, std::string *out) {
    if (i >= s.size() || s[i] != '"') return false;
    for (++i; i < s.size(); ++i) {
        char c = s[i];
        if (c == '"') {
            ++i;
            return true;
        }
        if (c != '\\') {
            *out += c;
            continue;
        }
        if (++i >= s.size()) return false;
        switch (s[i]) {
        case 'n': *out += '\n'; break;
        case 'r': *out += '\r'; break;
        case 't': *out += '\t'; break;
        case 'b': *out += '\b'; break;
        case 'f': *out += '\f'; break;
        case 'u': {
            if (i + 4 >= s.size()) return false;
            unsigned long cp = std::strtoul(s.substr(i + 1, 4).c_str(), nullptr, 16);
            i += 4;
            if (cp < 0x80) {
                *out += static_cast<char>(cp);
            } else if (cp < 0x800) {
                *out += static_cast<char>(0xC0 | (cp >> 6));
                *out += static_cast<char>(0x80 | (cp & 0x3F));
            } else {
                *out += static_cast<char>(0xE0 | (cp >> 12));
                *out += static_cast<char>(0x80 | ((cp >> 6) & 0x3F));
                *out += static_cast<char>(0x80 | (cp & 0x3F));
            }
            break;
        }
        default: *out += s[i];
        }
    }
    return false;
}

}  // namespace

bool ParseFlatJson(const std::string &line, std::map<std::string, std::string> *fields) {
    size_t i = 0;
    SkipBlanks(line, i);
    if (i >= line.size() || line[i++] != '{') return false;
    SkipBlanks(line, i);
    if (i < line.size() && line[i] == '}') return true;
    for (;;) {
        SkipBlanks(line, i);
        std::string key, value;
        if (!ParseString(line, i, &key)) return false;
        SkipBlanks(line, i);
        if (i >= line.size() || line[i++] != ':') return false;
        SkipBlanks(line, i);
        if (i < line.size() && line[i] == '"') {
            if (!ParseString(line, i, &value)) return false;
        } else {
            size_t start = i;
            while (i < line.size() && line[i] != ',' && line[i] != '}' && line[i] != ' ') ++i;
            value = line.substr(start, i - start);
            if (value.empty()) return false;
        }
        (*fields)[key] = value;
        SkipBlanks(line, i);
        if (i >= line.size()) return false;
        if (line[i] == '}') return true;
        if (line[i++] != ',') return false;
    }
}

Journal::~Journal() {
    if (file_) std::fclose(file_);
}

bool Journal::Open(const std::string &path, std::string *error) {
    file_ = std::fopen(path.c_str(), "w");
    if (!file_) {
        *error = "cannot write the journal " + path;
        return false;
    }
    path_ = path;
    return true;
}

long long Journal::ElapsedMs() const {
    return std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::steady_clock::now() - start_).count();
}

void Journal::Emit(const char *src, std::string_view body) {
    std::string line = "{\"seq\":" + std::to_string(++seq_) + ",\"ms\":" + std::to_string(ElapsedMs()) +
                       ",\"src\":\"" + src + "\"";
    if (!body.empty()) line += ',';
    line += body;
    line += "}\n";
    if (file_) {
        std::fwrite(line.data(), 1, line.size(), file_);
        std::fflush(file_);
    }
    if (echo_) std::fwrite(line.data(), 1, line.size(), stdout);
}

void Journal::Write(const char *src, const JsonLine &line) { Emit(src, line.Body()); }

void Journal::WriteJava(const std::string &javaLine) {
    size_t open = javaLine.find('{');
    size_t close = javaLine.rfind('}');
    if (open == std::string::npos || close == std::string::npos || close < open) {
        Emit("java", JsonLine("unparsed").Str("text", javaLine).Body());
        return;
    }
    Emit("java", std::string_view(javaLine).substr(open + 1, close - open - 1));
}

std::vector<std::string> FileTail::NewLines() {
    std::vector<std::string> lines;
    std::ifstream in(path_, std::ios::binary);
    if (!in) return lines;
    in.seekg(offset_);
    std::string chunk((std::istreambuf_iterator<char>(in)), {});
    size_t start = 0;
    for (size_t nl; (nl = chunk.find('\n', start)) != std::string::npos; start = nl + 1) {
        lines.push_back(chunk.substr(start, nl - start));
    }
    offset_ += static_cast<long long>(start);
    return lines;
}

}  // namespace sim
