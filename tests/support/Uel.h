// The Universal Exit Language sequence that frames print jobs.
#pragma once

#include <string>

inline const std::string kUel = "\x1b%-12345X";

inline std::string Framed(const std::string &payload) { return kUel + payload + kUel; }
