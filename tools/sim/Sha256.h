// SHA-256 (FIPS 180-4) for the simulator's reports: the host side's digest of
// what it sent, compared with the digest the Java side journals.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace sim {

class Sha256 {
public:
    Sha256();
    void Update(const void *data, size_t size);
    void Update(std::string_view bytes) { Update(bytes.data(), bytes.size()); }
    // Lowercase hex of the digest; the object is spent afterwards.
    std::string HexDigest();

private:
    void Block(const uint8_t *p);
    uint32_t h_[8];
    uint8_t buf_[64];
    size_t used_ = 0;
    uint64_t total_ = 0;
};

std::string Sha256Hex(std::string_view bytes);

}  // namespace sim
