// The simulator's script language: one command per line, words separated by
// blanks, '#' starts a comment. Double quotes group blanks into a word and
// resolve \\ \" \n \r \t \f \e (ESC) \0 and \xHH. Each command is a row of
// the table in Commands.cpp; a new scenario adds rows there.
#pragma once

#include <istream>
#include <string>
#include <vector>

#include "Session.h"

namespace sim {

using Args = std::vector<std::string>;  // the words after the command name

struct Command {
    const char *name;
    const char *synopsis;  // arguments, for the usage text
    const char *help;
    int minArgs, maxArgs;  // maxArgs -1: no limit
    // Checks the arguments before the session starts (optional).
    bool (*check)(const Args &args, std::string *error);
    // Runs the command; false with `error` set when it failed.
    bool (*run)(Session &session, const Args &args, std::string *error);
};

const std::vector<Command> &Commands();
const Command *FindCommand(const std::string &name);

struct ScriptLine {
    std::string where;    // "file:line"
    std::string text;     // as written
    std::string baseDir;  // relative file: paths start here
    const Command *command = nullptr;
    Args args;
};

bool Tokenize(const std::string &line, std::vector<std::string> *words, std::string *error);
// Parses and checks a whole script; false with "file:line: message".
bool ParseScript(std::istream &in, const std::string &name, const std::string &baseDir,
                 std::vector<ScriptLine> *lines, std::string *error);
bool ParseScriptLine(const std::string &text, const std::string &where, const std::string &baseDir,
                     std::vector<ScriptLine> *lines, std::string *error);

// Runs the lines in order and stops at the first failure, which is reported
// on stderr and in the journal; after "set expect continue" a failed
// expectation is reported and the script goes on. True when every command
// passed.
bool RunScript(Session &session, const std::vector<ScriptLine> &lines);

// The commands and data items, for --help.
std::string ScriptHelp();

}  // namespace sim
