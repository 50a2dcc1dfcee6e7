// Test families whose behaviour lives in the Java service (DRAM, HDD, RTC,
// power, GPIO, print patterns, margins, adjustments, fax line, dates ...).
// Each reports its header and forwards the command through runUsbFunctionCall
// on the MAA object, the same call the general function makes; without an
// answer it ends with "Failed".
//
// One body serves them all. MAA_Forwarded<"Name", N> is a function of N U32
// parameters of its own (its own entry, so the shell tells the names apart)
// that hands its words to that body.
#pragma once

#include <algorithm>
#include <cstddef>
#include <utility>

#include "maa/MAA_Types.h"

// Header "[ pubFunction ]", then the Java call under the called name.
TMAAResult *MAA_ForwardCommand(const char *pubFunction, U32 ulArgc, const U32 *pulArgs);

// Delay_ms: pauses the script. Longer requests are cut to a minute so a typo
// cannot stall the shell for days; a cable pull ends the pause at once.
constexpr U32 MAA_DELAY_MAX_MS = 60000;
TMAAResult *SysPBA_Delay_ms(U32 ulMs);

template <std::size_t N>
struct MAA_FunctionName {
    char text[N];
    constexpr MAA_FunctionName(const char (&name)[N]) { std::copy_n(name, N, text); }
};

namespace maa_detail {
template <std::size_t>
using Word = U32;
template <MAA_FunctionName Name, typename Seq>
struct Forwarded;
template <MAA_FunctionName Name, std::size_t... I>
struct Forwarded<Name, std::index_sequence<I...>> {
    static TMAAResult *call(Word<I>... words) {
        const U32 args[] = {words..., 0};
        return MAA_ForwardCommand(Name.text, sizeof...(I), args);
    }
};
}  // namespace maa_detail

template <MAA_FunctionName Name, std::size_t N>
inline constexpr auto MAA_Forwarded = &maa_detail::Forwarded<Name, std::make_index_sequence<N>>::call;
