// Fixed absolute paths of the controller (/halvard/..., /proc/...), placed under
// $USBADAPTER_ROOT when it is set so a PC run never touches the real ones.
// Device nodes are not resolved through here.
#pragma once

#include <string>

std::string FixedPath(const char *absolutePath);
