// How the fuzz targets read a host's traffic out of an input: pieces between
// separators, and phases of transfers.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "vdev.h"

// The pieces of `s` between the separators `sep` (always at least one).
inline std::vector<std::string> Split(std::string_view s, std::string_view sep) {
    std::vector<std::string> out;
    for (;;) {
        size_t at = s.find(sep);
        out.emplace_back(s.substr(0, at));
        if (at == std::string_view::npos) return out;
        s.remove_prefix(at + sep.size());
    }
}

using Phase = std::vector<std::string>;

// FE FE ends a phase, FE FF a transfer. A transfer separator always ends a
// transfer (two in a row send an empty one); a phase's end ends one only if it
// holds bytes. `all` gets every host byte in order.
inline std::vector<Phase> SplitPhases(std::string_view d, std::string &all) {
    std::vector<Phase> out;
    for (const std::string &p : Split(d, "\xFE\xFE")) {
        Phase transfers = Split(p, "\xFE\xFF");
        if (transfers.back().empty()) transfers.pop_back();
        for (const std::string &t : transfers) all += t;
        out.push_back(std::move(transfers));
    }
    return out;
}

// The host sends phases[next] on the print node, a host write per transfer.
inline void SendNextPhase(const std::vector<Phase> &phases, size_t &next) {
    for (const std::string &t : phases[next]) vdev::HostWrite(vdev::kPrn, t.data(), t.size());
    ++next;
}
