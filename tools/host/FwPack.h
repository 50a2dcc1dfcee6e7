// A firmware file as a host sends it down the print channel: per image an
// 80-byte PJL header (fixed text, 4-character subsystem id, body size
// big-endian at offset 74) and the body. The checksum is not in the file: the
// printer computes it for its update manager.
#pragma once

#include <cstdint>
#include <string>

#include "common/ByteOrder.h"

namespace fwpack {

inline constexpr size_t kHeaderSize = 80;
inline constexpr char kHeaderText[] = "\x1b%-12345X@PJL\r\n@PJL FIRMWARE = ";  // 31 bytes

// `id`: the subsystem id, e.g. "E7" or "EC2" (blank-padded to 4 characters).
inline std::string Header(const std::string &id, uint32_t bodySize) {
    std::string h(kHeaderText, sizeof kHeaderText - 1);
    h += (id + "    ").substr(0, 4);
    h += std::string(74 - h.size(), ' ') + std::string(4, '\0') + "\r\n";
    WriteBE32(reinterpret_cast<uint8_t *>(h.data()) + 74, bodySize);
    return h;
}

// Ids are one to four printable characters.
inline bool ValidId(const std::string &id) {
    if (id.empty() || id.size() > 4) return false;
    for (char c : id)
        if (c < '!' || c > '~') return false;
    return true;
}

}  // namespace fwpack
