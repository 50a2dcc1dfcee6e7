#include "common/FixedPath.h"

#include <cstdlib>

std::string FixedPath(const char *absolutePath) {
    const char *root = std::getenv("USBADAPTER_ROOT");
    if (!root || !*root) return absolutePath;
    std::string p(root);
    while (!p.empty() && p.back() == '/') p.pop_back();
    if (absolutePath[0] != '/') p += '/';
    return p + absolutePath;
}
