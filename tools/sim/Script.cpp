#include "Script.h"

#include <cstdio>
#include <sstream>

namespace sim {
namespace {

bool Escape(const std::string &line, size_t &i, std::string *word, std::string *error) {
    if (++i >= line.size()) {
        *error = "a backslash ends the line";
        return false;
    }
    switch (line[i]) {
    case '\\': *word += '\\'; return true;
    case '"': *word += '"'; return true;
    case 'n': *word += '\n'; return true;
    case 'r': *word += '\r'; return true;
    case 't': *word += '\t'; return true;
    case 'f': *word += '\f'; return true;
    case 'e': *word += '\x1b'; return true;
    case '0': *word += '\0'; return true;
    case 'x': {
        auto hex = [](char c) {
            return c >= '0' && c <= '9'   ? c - '0'
                   : c >= 'a' && c <= 'f' ? c - 'a' + 10
                   : c >= 'A' && c <= 'F' ? c - 'A' + 10
                                          : -1;
        };
        if (i + 2 >= line.size() || hex(line[i + 1]) < 0 || hex(line[i + 2]) < 0) {
            *error = "\\x needs two hex digits";
            return false;
        }
        *word += static_cast<char>(hex(line[i + 1]) << 4 | hex(line[i + 2]));
        i += 2;
        return true;
    }
    default: *error = std::string("unknown escape \\") + line[i]; return false;
    }
}

}  // namespace

bool Tokenize(const std::string &line, std::vector<std::string> *words, std::string *error) {
    size_t i = 0;
    for (;;) {
        while (i < line.size() && (line[i] == ' ' || line[i] == '\t' || line[i] == '\r')) ++i;
        if (i >= line.size() || line[i] == '#') return true;
        std::string word;
        bool quoted = false;
        for (; i < line.size(); ++i) {
            char c = line[i];
            if (quoted) {
                if (c == '"') {
                    quoted = false;
                } else if (c == '\\') {
                    if (!Escape(line, i, &word, error)) return false;
                } else {
                    word += c;
                }
            } else if (c == '"') {
                quoted = true;
            } else if (c == ' ' || c == '\t' || c == '\r') {
                break;
            } else {
                word += c;
            }
        }
        if (quoted) {
            *error = "unterminated quote";
            return false;
        }
        words->push_back(std::move(word));
    }
}

bool ParseScriptLine(const std::string &text, const std::string &where, const std::string &baseDir,
                     std::vector<ScriptLine> *lines, std::string *error) {
    std::vector<std::string> words;
    if (!Tokenize(text, &words, error)) {
        *error = where + ": " + *error;
        return false;
    }
    if (words.empty()) return true;
    ScriptLine line;
    line.where = where;
    line.text = text;
    line.baseDir = baseDir;
    line.command = FindCommand(words[0]);
    if (!line.command) {
        *error = where + ": unknown command '" + words[0] + "'";
        return false;
    }
    line.args.assign(words.begin() + 1, words.end());
    const Command &c = *line.command;
    const int n = static_cast<int>(line.args.size());
    if (n < c.minArgs || (c.maxArgs >= 0 && n > c.maxArgs)) {
        *error = where + ": usage: " + c.name + (c.synopsis[0] ? " " : "") + c.synopsis;
        return false;
    }
    if (c.check && !c.check(line.args, error)) {
        *error = where + ": " + c.name + ": " + *error;
        return false;
    }
    lines->push_back(std::move(line));
    return true;
}

bool ParseScript(std::istream &in, const std::string &name, const std::string &baseDir,
                 std::vector<ScriptLine> *lines, std::string *error) {
    int number = 0;
    for (std::string text; std::getline(in, text);) {
        ++number;
        if (!ParseScriptLine(text, name + ":" + std::to_string(number), baseDir, lines, error)) return false;
    }
    return true;
}

bool RunScript(Session &session, const std::vector<ScriptLine> &lines) {
    for (const ScriptLine &line : lines) {
        std::string error;
        bool ok = false;
        session.baseDir = line.baseDir;
        try {
            ok = line.command->run(session, line.args, &error);
        } catch (const std::exception &e) {
            error = e.what();
        }
        if (ok) continue;
        session.Sim(JsonLine("error").Str("where", line.where).Str("command", line.text).Str("message", error));
        std::fprintf(stderr, "usbadapter-sim: %s: %s: %s\n", line.where.c_str(), line.command->name, error.c_str());
        const std::string name = line.command->name;
        const bool expectation = name.rfind("expect", 0) == 0 || name.find("-expect") != std::string::npos;
        if (!expectation || !session.expectContinue) return false;
        ++session.expectFailures;
    }
    return session.expectFailures == 0;
}

std::string ScriptHelp() {
    std::ostringstream out;
    out << "Script commands (one per line; '#' starts a comment; \"...\" groups blanks and resolves\n"
           "\\\\ \\\" \\n \\r \\t \\f \\e \\0 \\xHH):\n";
    for (const Command &c : Commands()) {
        std::string head = std::string(c.name) + (c.synopsis[0] ? " " : "") + c.synopsis;
        out << "  " << head << "\n      " << c.help << "\n";
    }
    out << "DATA items (concatenated):\n"
           "  file:PATH          the file's bytes (relative to the script's directory)\n"
           "  hex:1b252d...      bytes in hex\n"
           "  text:WORD          text; text:\"...\" with blanks and escapes\n"
           "  uel                the PJL Universal Exit Language, ESC %-12345X\n"
           "  sample             the built-in print job (UEL, PJL header, PCL, UEL)\n"
           "  pattern:N[:SEED]   N pseudo-random bytes without ESC (sizes take K and M)\n"
           "  fill:N:HH          N bytes of value HH\n"
           "  slice:OFF:LEN:PATH LEN bytes of the file from offset OFF\n";
    return out.str();
}

}  // namespace sim
