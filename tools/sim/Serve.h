// The serve command: the simulated printer for real host software. The print
// and scan channels stay at fixed paths (pseudo-terminals the simulator keeps
// open itself, so a path never disappears between a host's close and its next
// open) until SIGINT or SIGTERM.
#pragma once

#include <string>

#include "Script.h"

namespace sim {

bool CheckServe(const Args &a, std::string *error);
bool Serve(Session &s, const Args &a, std::string *error);

// Sets SIGINT and SIGTERM to end a serve command (and nothing else) from now
// on. The JVM must run with -Xrs, or its own handlers would end the process.
void CatchStopSignals();

}  // namespace sim
