// Script commands of the firmware scenario: an update manager on loopback
// (tools/peers) that the library is pointed at, firmware files sent down the
// print channel, and what the manager received.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "Script.h"

namespace sim {

bool CheckFwManager(const Args &a, std::string *error);
bool FwManager(Session &s, const Args &a, std::string *error);
bool CheckFwSend(const Args &a, std::string *error);
bool FwSend(Session &s, const Args &a, std::string *error);
bool CheckFwExpectImages(const Args &a, std::string *error);
bool FwExpectImages(Session &s, const Args &a, std::string *error);
bool CheckFwExpectImage(const Args &a, std::string *error);
bool FwExpectImage(Session &s, const Args &a, std::string *error);

// The images the update manager has received so far (none without fw-manager).
struct FwImageSeen {
    uint32_t type = 0;
    uint64_t bytes = 0;
    bool complete = false, checksumOk = false;
    std::string file;
};
std::vector<FwImageSeen> FwImages();
// Stops the update manager's threads (the process ends with _exit, which
// runs no destructors).
void FwStopManager();

}  // namespace sim
