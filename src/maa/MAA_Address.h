// The shell's 32-bit address space.
//
// The command language passes addresses as U32 words (string literals,
// variable cells, download buffers, registered data, function entries). A host
// pointer does not fit in 32 bits on a 64-bit build, and a stray address typed
// by a host must never touch arbitrary memory, so every buffer the language
// may reach is mapped here to a 32-bit base with a size, and every access made
// through the language is translated and bounds-checked. An address outside
// every region is refused with the log line "invalid address 0x%x".
//
// Bases start above 1,000,000: the general test function takes argument words
// above that bound as text addresses and smaller ones as numbers.
//
// Function entries are handles into a table of uniform entries that take ten
// U32 words; MAA_FuncEntry<fn>() makes such an entry for a test function of
// any arity (0 to 10 U32/S32 parameters).
#pragma once

#include <cstddef>
#include <utility>

#include "maa/MAA_Types.h"

constexpr U32 MAA_ADDR_BASE = 0x01000000;          // first data address (16 MiB)
constexpr U32 MAA_ADDR_LIMIT = 0xF0000000;         // data addresses stay below
constexpr U32 MAA_FUNC_HANDLE_BASE = 0xF0000000;   // function handles from here
constexpr U32 MAA_ADDR_MAX_REGIONS = 1024;
constexpr U32 MAA_FUNC_MAX_ENTRIES = 512;

// Maps ulSize bytes at pvHost; returns the 32-bit base, or 0 when the map is
// full or the size is 0 (logged).
U32 MAA_AddrMap(void *pvHost, U32 ulSize);
// Removes the region whose base is ulAddress (no effect for other addresses).
void MAA_AddrUnmap(U32 ulAddress);
// The 32-bit address of a byte inside a mapped region, 0 if it is in none.
U32 MAA_AddrOf(const void *pvHost);
// The host pointer behind [ulAddress, ulAddress + ulSize), which must lie in one
// region; otherwise logs "invalid address 0x%x" and returns nullptr.
void *MAA_AddrTranslate(U32 ulAddress, U32 ulSize);
// A NUL-terminated text that starts at ulAddress and ends inside its region;
// nullptr (logged) otherwise. For test functions given a text argument.
const char *MAA_AddrString(U32 ulAddress);
// Reads or writes a 1-, 2- or 4-byte cell; a refused address reads as 0 and
// ignores the write. False when the address was refused.
bool MAA_AddrRead(U32 ulAddress, U32 ulSize, U32 *pulValue);
bool MAA_AddrWrite(U32 ulAddress, U32 ulSize, U32 ulValue);
// Number of mapped regions (diagnostics, tests).
U32 MAA_AddrRegionCount();
// Drops every region (the buffers themselves belong to their owners).
void MAA_AddrReset();

// ---- function entries

using TMAAEntry = TMAAResult *(*)(const U32 *aulArgs);               // ten words
using TMAAGeneralEntry = TMAAResult *(*)(U32 ulArgc, U32 *pulArgs);  // the general function

// Handles are stable: the same entry always gets the same handle. 0 when the
// table is full (logged).
U32 MAA_AddrFuncHandle(TMAAEntry pfnEntry);
U32 MAA_AddrGeneralHandle(TMAAGeneralEntry pfnEntry);
// The entry behind a handle, nullptr when the handle is not of that kind.
TMAAEntry MAA_AddrFunc(U32 ulHandle);
TMAAGeneralEntry MAA_AddrGeneral(U32 ulHandle);

namespace maa_detail {
template <typename R, typename... P>
constexpr std::size_t arity(R (*)(P...)) {
    return sizeof...(P);
}
template <auto Fn, typename R, typename... P, std::size_t... I>
TMAAResult *callWords(R (*)(P...), const U32 *aulArgs, std::index_sequence<I...>) {
    return Fn(static_cast<P>(aulArgs[I])...);
}
template <auto Fn>
TMAAResult *entry(const U32 *aulArgs) {
    constexpr std::size_t n = arity(Fn);
    static_assert(n <= MAX_FUNC_ARMAA, "a test function takes at most ten words");
    return callWords<Fn>(Fn, aulArgs, std::make_index_sequence<n>{});
}
}  // namespace maa_detail

// The handle of a test function `TMAAResult *fn(U32, ...)`: what MAA_SymbolAdd
// takes as the entry of a function symbol.
template <auto Fn>
U32 MAA_FuncEntry() {
    return MAA_AddrFuncHandle(&maa_detail::entry<Fn>);
}
