// What a host sends: data items of the script language turned into bytes, and
// bytes cut into USB transfers.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace sim {

// The PJL Universal Exit Language.
inline constexpr std::string_view kUel = "\x1b%-12345X";

// A small print job framed by two UELs: PJL header, then PCL.
std::string SampleJob();

// "123", "4K" (KiB), "2M" (MiB).
bool ParseSize(const std::string &text, size_t *size);

// The bytes of data items, concatenated:
//   file:PATH        the file's bytes (relative paths from `baseDir`)
//   hex:1B252D...    bytes in hex (pairs; '_' and ':' may separate them)
//   text:WORD        the text; text:"..." may hold blanks and escapes
//   uel              the 9-byte UEL
//   sample           SampleJob()
//   pattern:N[:SEED] N pseudo-random bytes, never ESC (0x1B)
//   fill:N:HH        N bytes of value HH
//   slice:OFF:LEN:PATH  LEN bytes of the file from offset OFF
// Escapes inside double quotes are resolved by the script reader.
bool BuildData(const std::vector<std::string> &items, const std::string &baseDir, std::string *bytes,
               std::string *error);
// Syntax of one item (files are read when the command runs).
bool CheckDataItem(const std::string &item, std::string *error);

// Transfer sizes for `total` bytes: `sizes` in order, then the rest as one
// transfer; with `every` > 0, transfers of that size (the last one shorter).
// An empty message is one zero-length transfer.
std::vector<size_t> SplitTransfers(size_t total, const std::vector<size_t> &sizes, size_t every);

// Transfer sizes for `total` bytes drawn from [min, max] by a seeded
// generator (the last one shorter): the same cuts for the same seed.
std::vector<size_t> RandomTransfers(size_t total, size_t min, size_t max, uint32_t seed);

std::string Hex(std::string_view bytes);

}  // namespace sim
