// Test-shell sessions as the print channel hands them over (ESC "w" taken,
// the rest on the emulated print node with instant time-outs): the start
// command, lines, the special commands (downloads, saved-command modes), the
// stop and the auto run behind it, and cable pulls at any point. The shell has
// the probe functions, the download echoed (T2H) or forwarded as frames, and
// Dump_File (a short text "/t").
//
// Input: the host's traffic, in which
//   FE FF  ends a host transfer,
//   FE FE  ends a phase: the next phase is sent when the device waits for more,
//   FE FD  pulls the cable once the device waits; what follows is the traffic
//          of the next session, after the cable is back.
// When a session waits with nothing left to send, the cable is pulled. The
// device's polls are counted through a wrapper of the shell's poll wait (see
// CMakeLists.txt): a session still polling long after the pull is a hang.
//
// Every session checks: what MAA_Hook returns and hands back, that a started
// session answers the start and ends only by the stop or the cable, that the
// stop is acknowledged, and that its downloads are gone afterwards.
#include <fcntl.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string>
#include <string_view>
#include <vector>

#include "ControllerMalloc.h"
#include "FuzzCheck.h"
#include "HostTraffic.h"
#include "adapter/USB.h"
#include "common/Wait.h"
#include "maa/MAA_Hook.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_MM.h"
#include "ShellProbes.h"
#include "vdev.h"

namespace {

// Polls in a row with nothing to read before the host counts the device as
// waiting, and polls after a pull before the session counts as hung.
constexpr int kIdlePolls = 2;
constexpr int kPollsAfterPull = 1000;

// The session under way: its phases still to send, and the host's patience.
std::vector<Phase> phases;
size_t nextPhase = 0;
int idle = 0;
bool pulled = false;
int pollsAfterPull = 0;
bool active = false;  // only the session's polls are the host's business

// The host's view of one wait of the device: it sends the next phase, or pulls
// the cable when it has nothing left.
void onPoll() {
    if (!active) return;
    if (pulled) {
        CHECK(++pollsAfterPull <= kPollsAfterPull, "the session still waits after the cable was pulled (hang)");
        return;
    }
    if (vdev::PendingHostBytes(vdev::kPrn) > 0) {
        idle = 0;
        return;
    }
    // Separators in a row make one pause, not a time-out per pair.
    while (nextPhase < phases.size() && phases[nextPhase].empty()) ++nextPhase;
    if (nextPhase < phases.size()) {
        SendNextPhase(phases, nextPhase);
        idle = 0;
        return;
    }
    if (++idle >= kIdlePolls) {
        pulled = true;
        IsDisconnected = 1;
    }
}

bool startsWith(const std::vector<uint8_t> &w, std::string_view p) {
    return w.size() >= p.size() && std::memcmp(w.data(), p.data(), p.size()) == 0;
}

const std::string_view kStart("MAASTART");
const std::string_view kOk("\x1bwMAA-OK", 8);

// A fresh print node: what the host had not sent is lost with the pull, and
// what a stop left unread is the classifier's.
void openNode() {
    if (fdPrn > 0) ::close(fdPrn);
    vdev::Reset();
    Wait_PutBack(-1, nullptr, 0, false);
    fdPrn = ::open(vdev::kPrn, O_RDWR);
    CHECK(fdPrn > 0, "the print node does not open");
    vdev::SetInstantTimeouts(vdev::kPrn, true);
}

void runSession(std::string_view traffic) {
    openNode();
    std::string host;
    phases = SplitPhases(traffic, host);
    // The start command is read up to the first empty transfer (a time-out).
    const std::string beforeEmpty = [] {
        std::string bytes;
        for (const Phase &p : phases) {
            for (const std::string &t : p) {
                if (t.empty()) return bytes;
                bytes += t;
            }
        }
        return bytes;
    }();
    nextPhase = 0;
    idle = 0;
    pulled = false;
    pollsAfterPull = 0;
    IsDisconnected = 0;
    maa_session::slPollTimeout = MAA_POLL_TIMEOUT_FIRST;
    enSpecialMode = MAA_NORMAL_CMD;
    MAA_SetResultWriter(nullptr);
    SendNextPhase(phases, nextPhase);

    // The classifier's command buffer, exactly as long as a hand-back may be.
    std::vector<U8> command(HDR_CMD_LEN, 0);
    command[0] = 0x1B;
    command[1] = 'w';
    active = true;
    const S32 r = MAA_Hook(static_cast<U32>(fdPrn.load()), command.data());
    active = false;
    const std::vector<uint8_t> wire = vdev::HostRead(vdev::kPrn);

    CHECK(r >= -1 && r <= static_cast<S32>(HDR_CMD_LEN - 2), "MAA_Hook returned out of range");
    const bool started = beforeEmpty.compare(0, kStart.size(), kStart) == 0;
    if (r != 0) {
        // Not a session: the bytes taken go back unchanged, and nothing is written.
        CHECK(!started, "the start command was not taken");
        CHECK(wire.empty(), "the device answered what was not a start command");
        CHECK(r == -1 || (std::memcmp(command.data(), "\x1bw", 2) == 0 &&
                          host.compare(0, static_cast<size_t>(r), reinterpret_cast<const char *>(command.data()) + 2,
                                       static_cast<size_t>(r)) == 0),
              "the bytes handed back are not the host's");
    } else if (started) {
        CHECK(startsWith(wire, kOk), "the start was not acknowledged");
        // Only the stop or the cable ends a session: the stop is acknowledged.
        if (!pulled) {
            CHECK(host.find("MAA-STOP") != std::string::npos, "the session ended without a stop or a pull");
            // Behind the start's answer; an auto run may write after it.
            const std::string_view w(reinterpret_cast<const char *>(wire.data()), wire.size());
            CHECK(w.find(kOk, kOk.size()) != std::string_view::npos, "the stop was not acknowledged");
        }
        // (Variables the lines defined keep their cells: they are the symbol table's.)
        U32 left = 0;
        CHECK(MAA_DownloadTotal() == 0 && MAA_DownloadBuffer(&left) == nullptr, "downloads outlive their session");
    }
    IsDisconnected = 0;
    phases.clear();
}

}  // namespace

// The shell's poll wait, seen by the host first (a poll that bytes put back
// in front of the node answer at once is no wait).
extern "C" int __real__Z11Wait_PollIniiPsPFbvEi(int fd, int timeoutMs, short *revents, WaitGoneFn gone, int wakeFd);
extern "C" int __wrap__Z11Wait_PollIniiPsPFbvEi(int fd, int timeoutMs, short *revents, WaitGoneFn gone, int wakeFd) {
    if (Wait_PutBackLeft(fd) == 0) onPoll();
    return __real__Z11Wait_PollIniiPsPFbvEi(fd, timeoutMs, revents, gone, wakeFd);
}

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    setenv("USBADAPTER_LOG_LEVEL", "OFF", 0);
    probes::MakeShellFiles();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    probes::Register(probes::AddFileFunctions);
    probes::ResetSession();
    // Sessions between cable pulls.
    for (const std::string &session : Split({reinterpret_cast<const char *>(data), size}, "\xFE\xFD"))
        runSession(session);

    ::close(fdPrn);
    fdPrn = 0;
    IsDisconnected = 0;
    probes::ForgetShell();
    return 0;
}
