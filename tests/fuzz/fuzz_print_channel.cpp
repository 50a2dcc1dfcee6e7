// Arbitrary host traffic on the print channel, sent the way a USB host sends
// it: the reader's turns, the data classifier, the application checkers and
// the test shell, over the emulated print node with instant time-outs. Java is
// replaced by a delivery that checks what Java would be handed.
//
// Input: byte 0 chooses Java's answers (bits 0-1: RegisterJob refusals, bits
// 2-4: which application call fails); the rest is the host's traffic, in which
//   FE FF  ends a host transfer (a read never returns bytes of two), and
//   FE FE  ends a phase: the host sends a phase's transfers back to back, then
//          waits until the device has taken them all and waits for more (any
//          poll times out) before it sends the next phase.
// When the last phase has been taken and the device still waits for the host
// inside a turn (a test-shell session, an application body), the host pulls
// the cable. A turn that still waits after that, or that runs for more than
// kTurnLimit, aborts as a hang, so libFuzzer keeps the input. With
// FUZZ_PRINT_CHANNEL_STRICT=1 in the environment, needing the cable pull at
// all aborts instead: that lists the inputs that hold the channel until the
// host goes away. FUZZ_PRINT_CHANNEL_VERBOSE=1 prints what each input did.
//
// The shell has a few functions of its own here (no device access) besides
// MAA_SymbolDump and Dump_File, whose files lie under a private
// USBADAPTER_ROOT ("/t" is a short text).
#include <fcntl.h>
#include <unistd.h>

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <mutex>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "ControllerMalloc.h"
#include "FuzzCheck.h"
#include "HostTraffic.h"
#include "adapter/Classifier.h"
#include "adapter/USB.h"
#include "adapter/prn_thread.h"
#include "common/Wait.h"
#include "maa/MAA_Hook.h"
#include "ShellProbes.h"
#include "print/USBPrint.h"
#include "vdev.h"

namespace {

using Clock = std::chrono::steady_clock;

constexpr auto kTurnLimit = std::chrono::seconds(5);
constexpr auto kHangAfterPull = std::chrono::seconds(1);
// Polls and reads in a row with nothing pending before the device counts as
// waiting for the host. Only the retry loops get there.
constexpr size_t kIdleCalls = 64;

// ---- Java's side ----------------------------------------------------------

struct Answers {
    U8 registerPolicy;  // 0 accept, 1 refuse the first, 2 refuse every second, 3 refuse all
    U8 appFailure;      // 0 none, 1 SendAppType, 2 header SendAppBuf, 3 body SendAppBuf, 4 NotifyAppEnd
};

struct Java {
    Answers answers{};
    bool acceptAll = false;  // the closing turns: no more refusals
    size_t registrations = 0, refusals = 0;
    bool jobOpen = false;
    std::string printed;  // every byte passed, in order
    bool appOpen = false;
    std::string appType;
    size_t appBufCalls = 0, appBytes = 0, appEvents = 0;
} java;

void touch(const U8 *p, S32 len, std::string *into) {
    // Reading every byte lets ASan check the range lies inside one buffer.
    if (into) into->append(reinterpret_cast<const char *>(p), static_cast<size_t>(len));
    else {
        volatile U8 sink = 0;
        for (S32 i = 0; i < len; ++i) sink = sink ^ p[i];
    }
}

S8 RegisterJob(const char *name) {
    CHECK(name != nullptr && std::strlen(name) < sizeof PrndataFileName, "RegisterJob without a file name");
    size_t n = java.registrations++;
    bool refuse = false;
    if (!java.acceptAll) {
        switch (java.answers.registerPolicy) {
        case 1: refuse = n == 0; break;
        case 2: refuse = n % 2 == 1; break;
        case 3: refuse = true; break;
        default: break;
        }
    }
    if (refuse) {
        ++java.refusals;
        return -1;
    }
    CHECK(!java.jobOpen, "a job was registered while another was open");
    java.jobOpen = true;
    return 1;
}

void PassData(U8 *data, S32 len) {
    CHECK(len >= 0, "PassData with a negative length");
    CHECK(len <= TEMP2_UEL_SEND_BUFFER_SIZE, "PassData longer than the reader's buffers");
    CHECK(data != nullptr || len == 0, "PassData without data");
    CHECK(java.jobOpen, "data passed with no job open");
    touch(data, len, &java.printed);
}

void NotifyEndOfData() {
    CHECK(java.jobOpen, "a job was ended that was not open");
    java.jobOpen = false;
}

bool appFails(U8 point) { return java.answers.appFailure == point; }

S32 SendAppType(const char *type) {
    CHECK(type != nullptr && *type != 0 && std::strlen(type) < 32, "SendAppType without a type");
    ++java.appEvents;
    java.appOpen = false;
    if (appFails(1)) return -1;
    java.appOpen = true;
    java.appType = type;
    java.appBufCalls = 0;
    return 0;
}

S32 SendAppBuf(const char *type, U8 *buf, S32 len) {
    ++java.appEvents;
    CHECK(java.appOpen, "SendAppBuf with no application stream");
    CHECK(type != nullptr && java.appType == type, "SendAppBuf for another application");
    CHECK(len >= 0 && (buf != nullptr || len == 0), "SendAppBuf with a bad buffer");
    touch(buf, len, nullptr);
    java.appBytes += static_cast<size_t>(len);
    size_t call = ++java.appBufCalls;
    if ((call == 1 && appFails(2)) || (call == 2 && appFails(3))) return -1;
    return 0;
}

S32 NotifyAppEnd(const char *type) {
    ++java.appEvents;
    CHECK(java.appOpen, "NotifyAppEnd with no application stream");
    CHECK(type != nullptr && java.appType == type, "NotifyAppEnd for another application");
    if (appFails(4)) return -1;
    java.appOpen = false;
    return 0;
}

const TPrintDelivery kJava = {RegisterJob, PassData, NotifyEndOfData, SendAppType, SendAppBuf, NotifyAppEnd};

// ---- the host --------------------------------------------------------------

// Shared with the watcher: the phases still to send and the turn in progress.
std::mutex hostMu;
std::vector<Phase> phases;
size_t nextPhase = 0;
bool pulled = false;
uint64_t turn = 0;  // odd while the reader is inside a turn
Clock::time_point turnStart;
bool strict = false;
bool verbose = false;

// The host's patience: it sends the next phase when the device waits for
// more, pulls the cable when it has nothing left to send, and reports a turn
// that never returns. The reader looks itself before each poll or read of the
// node (no scheduler between it and the host); the watcher catches the turns
// that stop polling and reading. With hostMu held, inside a turn.
uint64_t seen = 0;
size_t base = 0, pending = 0;
Clock::time_point pulledAt;

void hostLooks() {
    size_t calls = vdev::PollCalls(vdev::kPrn) + vdev::ReadCalls(vdev::kPrn);
    size_t p = vdev::PendingHostBytes(vdev::kPrn);
    Clock::time_point now = Clock::now();
    if (turn != seen) {
        seen = turn;
        base = calls;
        pending = p;
        return;
    }
    if (now - turnStart > kTurnLimit) fail("a reader turn did not return (hang)");
    if (p != 0 || p != pending) {
        pending = p;
        base = calls;
        return;
    }
    if (calls - base < kIdleCalls) return;
    base = calls;
    if (nextPhase < phases.size()) {
        SendNextPhase(phases, nextPhase);
        pending = vdev::PendingHostBytes(vdev::kPrn);
    } else if (!pulled) {
        if (strict) fail("the device waits for the host without bound (strict mode)");
        pulled = true;
        pulledAt = now;
        IsDisconnected = 1;
    } else if (now - pulledAt > kHangAfterPull) {
        fail("the device still waits for the host after the cable was pulled (hang)");
    }
}

void watcher() {
    for (;;) {
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
        std::lock_guard lk(hostMu);
        if (turn & 1) hostLooks();
    }
}

void readerTurn() {
    {
        std::lock_guard lk(hostMu);
        ++turn;
        turnStart = Clock::now();
    }
    USBAdapter_ReadPass();
    std::lock_guard lk(hostMu);
    ++turn;
}

// ---- per input ---------------------------------------------------------------

// Frees what an input left behind, so each input's allocations are its own
// (libFuzzer's leak check compares them) and the next input starts afresh.
void cleanUp() {
    if (fdPrn > 0) ::close(fdPrn);
    fdPrn = 0;
    vdev::Reset();
    IsDisconnected = 0;
    hibernation_flag = 0;
    probes::ForgetShell();
    java = Java{};
    std::lock_guard lk(hostMu);
    phases = {};
    nextPhase = 0;
    pulled = false;
}

void setUp() {
    fdPrn = ::open(vdev::kPrn, O_RDWR);
    CHECK(fdPrn > 0, "the print node does not open");
    vdev::SetInstantTimeouts(vdev::kPrn, true);
    IsConfigured = 1;  // the reader runs its turns only on a configured device

    InitializeVars();
    Wait_PutBack(-1, nullptr, 0, false);
    slPollTimeout = POLL_TIMEOUT_IDLE;
    splitPatternMarker = 0;
    UelPosition = 0;
    restData = 0;
    dataEnd = 0;

    probes::ResetSession();
    std::memset(aubBuf, 0, sizeof aubBuf);
    probes::Register(probes::AddFileFunctions);
}

size_t count(std::string_view hay, std::string_view needle) {
    size_t c = 0;
    for (size_t p = hay.find(needle); p != std::string_view::npos; p = hay.find(needle, p + 1)) ++c;
    return c;
}

bool isSubsequence(std::string_view part, std::string_view whole) {
    size_t j = 0;
    for (char c : part) {
        while (j < whole.size() && whole[j] != c) ++j;
        if (j == whole.size()) return false;
        ++j;
    }
    return true;
}

// Bytes the host sent that ask the device to answer on the print channel.
bool asksForAnswer(std::string_view host) {
    if (host.find(std::string_view("\x1bwMAASTART", 10)) != std::string_view::npos) return true;
    for (size_t p = host.find('\x1b'); p != std::string_view::npos && p + 1 < host.size(); p = host.find('\x1b', p + 1)) {
        switch (static_cast<U8>(host[p + 1])) {
        case 0x24: case 0x91: case 0x9A: case 0xA8: case 0xAA: return true;
        default: break;
        }
    }
    return false;
}

// The reader's waits on the node, seen by the host first (bytes put back in
// front of the node answer at once: no wait).
void readerWaits(int fd) {
    if (fd != fdPrn || Wait_PutBackLeft(fd) > 0) return;
    std::lock_guard lk(hostMu);
    if (turn & 1) hostLooks();
}

}  // namespace

extern "C" int __real__Z11Wait_PollIniiPsPFbvEi(int fd, int timeoutMs, short *revents, WaitGoneFn gone, int wakeFd);
extern "C" int __wrap__Z11Wait_PollIniiPsPFbvEi(int fd, int timeoutMs, short *revents, WaitGoneFn gone, int wakeFd) {
    readerWaits(fd);
    return __real__Z11Wait_PollIniiPsPFbvEi(fd, timeoutMs, revents, gone, wakeFd);
}
extern "C" ssize_t __real__Z9Wait_ReadiPvmPFbvE(int fd, void *buf, size_t size, WaitGoneFn gone);
extern "C" ssize_t __wrap__Z9Wait_ReadiPvmPFbvE(int fd, void *buf, size_t size, WaitGoneFn gone) {
    readerWaits(fd);
    return __real__Z9Wait_ReadiPvmPFbvE(fd, buf, size, gone);
}

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    setenv("USBADAPTER_LOG_LEVEL", "OFF", 0);
    const char *s = std::getenv("FUZZ_PRINT_CHANNEL_STRICT");
    strict = s != nullptr && *s == '1';
    const char *v = std::getenv("FUZZ_PRINT_CHANNEL_VERBOSE");
    verbose = v != nullptr && *v == '1';
    // The firmware type a header names goes to standard output: not the
    // fuzzer's business, and megabytes of it in a long run's log.
    if (!std::freopen("/dev/null", "w", stdout)) fail("no /dev/null");
    probes::MakeShellFiles();
    USBPrint_SetDelivery(&kJava);
    if (USBAdapter_AllocateReadBuffers() != 1) fail("the reader's buffers cannot be allocated");
    cleanUp();
    std::thread(watcher).detach();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    if (size == 0) return 0;
    setUp();
    java.answers = {static_cast<U8>(data[0] & 3), static_cast<U8>((data[0] >> 2) & 7)};

    std::string host;
    std::vector<Phase> parsed = SplitPhases({reinterpret_cast<const char *>(data) + 1, size - 1}, host);
    size_t transfers = 0;
    for (const Phase &p : parsed) transfers += p.size();
    {
        std::lock_guard lk(hostMu);
        phases = std::move(parsed);  // cleanUp() has rewound the host
        SendNextPhase(phases, nextPhase);
    }

    // Turns until the host has sent everything and the device has taken it.
    // Every turn with data pending takes at least one byte or one transfer.
    const size_t limit = host.size() + transfers + 2 * phases.size() + 16;
    for (size_t n = 0;; ++n) {
        CHECK(n <= limit, "the reader stopped taking host data");
        readerTurn();
        if (vdev::PendingHostBytes(vdev::kPrn) > 0 || Wait_PutBackLeft(fdPrn) > 0) continue;
        bool more;
        {
            std::lock_guard lk(hostMu);
            more = nextPhase < phases.size();
        }
        if (!more) break;
        // The host's pause: a turn with nothing to take, then the next phase.
        readerTurn();
        std::lock_guard lk(hostMu);
        if (nextPhase < phases.size()) SendNextPhase(phases, nextPhase);
    }

    // The host is gone or quiet for good: what is open must end.
    IsDisconnected = 0;
    java.acceptAll = true;
    readerTurn();
    for (int i = 0; i < 4 && (readFlag != 0 || startUELFlag != 0); ++i) readerTurn();
    CHECK(readFlag == 0 && startUELFlag == 0, "the reader is not idle after the host went quiet");
    CHECK(!java.jobOpen, "a job was never ended");
    CHECK(vdev::PendingHostBytes(vdev::kPrn) == 0 && Wait_PutBackLeft(fdPrn) == 0, "host bytes left unread");

    // Nothing is delivered that the host did not send, but a header read short
    // is passed on zero-padded: at most 14 bytes per ESC 0x91 header, 6 per
    // scan-to-application header, 2 per PC-scan or light operation code.
    const size_t idsHeaders = count(host, std::string_view("\x1b\x91", 2));
    const size_t scan2App = count(host, std::string_view("\x1b\x9a", 2));
    const size_t opCodes = count(host, std::string_view("\x1b\xa8", 2)) + count(host, std::string_view("\x1b\xaa", 2));
    const size_t padding = 14 * idsHeaders + 6 * scan2App + 2 * opCodes;
    CHECK(java.printed.size() + java.appBytes <= host.size() + padding, "more bytes delivered than the host sent");
    // Application transfers come only from an application header (ESC 0x91) or
    // a scan-protocol packet the print channel also serves.
    const bool appSelector = scan2App + opCodes > 0;
    if (idsHeaders == 0) {
        if (!appSelector) CHECK(java.appEvents == 0, "an application transfer without an application header");
        CHECK(isSubsequence(java.printed, host), "print data not in the order the host sent it");
    }
    // Without ESC no byte selects anything: all of it is print data, unchanged.
    if (java.refusals == 0 && host.find('\x1b') == std::string::npos)
        CHECK(java.printed == host, "print data lost or changed");

    std::vector<uint8_t> wire = vdev::HostRead(vdev::kPrn);
    if (!wire.empty()) CHECK(asksForAnswer(host), "the device wrote to the host unasked");
    if (verbose) {
        std::fprintf(stderr,
                     "host %zu bytes in %zu transfers, %zu phases; jobs %zu (refused %zu), printed %zu; "
                     "application calls %zu (%zu bytes); device wrote %zu; cable pulled %d\n",
                     host.size(), transfers, phases.size(), java.registrations, java.refusals, java.printed.size(),
                     java.appEvents, java.appBytes, wire.size(), pulled ? 1 : 0);
    }
    cleanUp();
    return 0;
}
