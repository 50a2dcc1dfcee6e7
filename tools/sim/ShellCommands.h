// Script commands of the test-shell scenario: the host opens a session on the
// print channel, sends command lines and reads the decoded records back, with
// the host tool's client (tools/host/MaaClient); and "pty", which hands the
// print channel to an outside host tool as a pseudo-terminal.
#pragma once

#include <string>

#include "Script.h"

namespace sim {

bool ShellStart(Session &s, const Args &a, std::string *error);
bool ShellLine(Session &s, const Args &a, std::string *error);
bool ShellExpect(Session &s, const Args &a, std::string *error);
bool CheckShellPut(const Args &a, std::string *error);
bool ShellPut(Session &s, const Args &a, std::string *error);
bool ShellStop(Session &s, const Args &a, std::string *error);
bool CheckPty(const Args &a, std::string *error);
bool Pty(Session &s, const Args &a, std::string *error);

}  // namespace sim
