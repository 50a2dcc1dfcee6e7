// The operator-panel tests against a UI server whose every move the input
// chooses: the answers it sends (garbage, short, long, in pieces), whether it
// closes or holds the connection, refuses it, or (for the two listening tests)
// finds the port taken. The server is a thread of this process on loopback; the
// panel's port comes from USBADAPTER_UI_PORT.
//
// Input: byte 0 the test function, byte 1 flags (bit 0: nobody at the port,
// bit 1: the cable is pulled during the call), bytes 2-5 the host's argument
// (little-endian), then the server's script, one step per byte (mod 5):
//   0 n b...  send the n bytes behind (one write)
//   1 b k     send (k + 1) * 64 bytes of b (one write)
//   2         pause 0.2 ms (the next send is likely a read of its own); only
//             the first kMaxPauses count, or sleeping would be most of a run
//   3         close (the server's writing end; it then waits for the test to close)
//   4         hold: send nothing more and wait for the test to close
// A script that runs out closes. Every input checks: the records the host gets
// are well-formed (one header, then at most one verdict), no connection is left
// open, no descriptor is left behind, a server that answers gets a verdict, and
// a listening test acknowledges exactly the answer it passes.
#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <future>
#include <mutex>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "FuzzCheck.h"
#include "support/Loopback.h"
#include "adapter/USB.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_Result.h"
#include "maa/functions/MAA_Panel.h"
#include "UiPeer.h"
#include "support/MaaRecords.h"
#include "support/TempRoot.h"

namespace {

constexpr int kLongWaitMs = 3000;  // the panel's waits when an answer is due
constexpr int kShortWaitMs = 1;    // when the server holds: the wait itself is the outcome
constexpr int kPeerWaitMs = 3000;  // any one step of the server thread

// ---- the panel tests -----------------------------------------------------------

enum class Kind { Client, KeySound, Listening };
struct Fn {
    Kind kind;
    TMAAResult *(*call)(U32);
    char command;  // the listening tests' command byte
};

template <TMAAResult *(*F)()>
TMAAResult *noArg(U32) {
    return F();
}

const Fn kFns[] = {
    {Kind::Client, UISSM_IF_KeyInTest_And_Cli, 0},
    {Kind::Client, UISSM_IF_LED_Test_And_Cli, 0},
    {Kind::Client, noArg<UISSM_IF_Key_WaitTest_And_Cli>, 0},
    {Kind::Client, noArg<UISSM_IF_Key_LCD_Test_And_Cli>, 0},
    {Kind::Client, noArg<UISSM_MAA_CountrySkip_And_Cli>, 0},
    {Kind::Client, noArg<UISSM_MAA_TrayConfirmSkip_And_Cli>, 0},
    {Kind::Client, SPI_Set_UI_Power_Save_And_Cli, 0},
    {Kind::Client, UISSM_MAA_TSPCalibration_Result_And_Cli, 0},
    {Kind::Client, noArg<PbaMode_UI_Data_clear>, 0},
    {Kind::Client, noArg<SPI_Get_UI>, 0},
    {Kind::Client, noArg<SPI_Set_UI_Reboot>, 0},
    {Kind::KeySound, UISSM_MAA_Set_KeySound_And_Cli, 0},
    {Kind::Client, noArg<UISSM_MAA_MIC_Test_And_Cli>, 0},
    {Kind::Client, UISSM_MAA_HAPTIC_And_Cli, 0},
    {Kind::Client, UISSM_MAA_SpeakerTest_And_Cli, 0},
    {Kind::Client, noArg<UISSM_MAA_USB_Test_And_Cli>, 0},
    {Kind::Listening, noArg<UISSM_IF_KeyInTest>, '1'},
    {Kind::Listening, noArg<UISSM_IF_LED_Test>, '2'},
};
constexpr size_t kFnCount = sizeof kFns / sizeof kFns[0];

// ---- the server's script ----------------------------------------------------------

struct Step {
    enum Op { Send, Pause, Close, Hold } op;
    std::string bytes;
};
struct Script {
    std::vector<Step> steps;
    bool holds = false;    // ends holding the connection open
    bool answers = false;  // sends at least one byte
};

constexpr int kMaxPauses = 4;

Script parseScript(const uint8_t *d, size_t n) {
    Script s;
    int pauses = 0;
    for (size_t i = 0; i < n && !s.holds;) {
        const int op = d[i++] % 5;
        if (op == 0) {
            const size_t len = i < n ? d[i++] : 0;
            const size_t take = std::min(len, n - i);
            if (take > 0) s.steps.push_back({Step::Send, std::string(reinterpret_cast<const char *>(d + i), take)});
            i += take;
        } else if (op == 1) {
            const char b = i < n ? static_cast<char>(d[i++]) : 'x';
            const size_t k = i < n ? d[i++] : 0;
            s.steps.push_back({Step::Send, std::string((k + 1) * 64, b)});
        } else if (op == 2) {
            if (++pauses <= kMaxPauses) s.steps.push_back({Step::Pause, {}});
        } else if (op == 3) {
            s.steps.push_back({Step::Close, {}});
            break;
        } else {
            s.steps.push_back({Step::Hold, {}});
            s.holds = true;
        }
    }
    for (const Step &st : s.steps) s.answers = s.answers || st.op == Step::Send;
    return s;
}

// ---- the server thread --------------------------------------------------------------

int64_t nowMs() {
    return std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::steady_clock::now().time_since_epoch())
        .count();
}

uint16_t serverPort, listenPort, deadPort;
int listenFd = -1;
int wakePipe[2] = {-1, -1};  // readable once the call under test has returned

struct Outcome {
    bool connected = false;
    bool closedByTest = false;  // the test's end was seen closed
    std::string request;        // what arrived before the first answer
    std::string after;          // what arrived after it
};

// 1: readable within the bound; 0: not, or the call has returned and nothing is there.
int waitIn(int fd, int timeoutMs) {
    const int64_t deadline = nowMs() + timeoutMs;
    for (;;) {
        const int64_t left = deadline - nowMs();
        pollfd p[2] = {{fd, POLLIN, 0}, {wakePipe[0], POLLIN, 0}};
        const int rc = ::poll(p, 2, static_cast<int>(std::max<int64_t>(left, 0)));
        if (rc < 0 && errno == EINTR) continue;
        if (rc <= 0) return 0;
        if (p[0].revents != 0) return 1;
        // The call is over: whatever it left is already here.
        pollfd q{fd, POLLIN, 0};
        return ::poll(&q, 1, 0) > 0 ? 1 : 0;
    }
}

// Connects to a listening test, retrying until it listens or has returned.
int connectPeer() {
    for (const int64_t deadline = nowMs() + kPeerWaitMs; nowMs() < deadline;) {
        if (const int fd = LoopbackConnect(listenPort); fd >= 0) return fd;
        pollfd p{wakePipe[0], POLLIN, 0};
        if (::poll(&p, 1, 0) > 0) return -1;
        std::this_thread::sleep_for(std::chrono::microseconds(100));
    }
    return -1;
}

// One call's server: accepts the test's connection, or with `peer` connects to
// a listening test; follows the script and watches the test close its end.
Outcome serve(bool peer, const Script &script) {
    Outcome o;
    int fd = -1;
    if (peer) {
        fd = connectPeer();
    } else if (waitIn(listenFd, kPeerWaitMs) == 1) {
        fd = ::accept4(listenFd, nullptr, nullptr, SOCK_CLOEXEC);
    }
    if (fd < 0) return o;
    o.connected = true;
    // The request: a client test's one or two bytes, a listening test's command.
    if (waitIn(fd, kPeerWaitMs) == 1) uipeer::ReadSome(fd, o.request);
    bool sent = false;
    for (const Step &st : script.steps) {
        if (st.op == Step::Send) {
            uipeer::SendAll(fd, st.bytes);
            sent = true;
        } else if (st.op == Step::Pause) {
            std::this_thread::sleep_for(std::chrono::microseconds(200));
        } else {
            break;
        }
    }
    if (!script.holds) ::shutdown(fd, SHUT_WR);
    // Until the test closes its end: it must, once the call has returned.
    const int64_t deadline = nowMs() + kPeerWaitMs;
    for (;;) {
        pollfd p{fd, POLLIN, 0};
        const int64_t left = deadline - nowMs();
        if (left <= 0 || ::poll(&p, 1, static_cast<int>(left)) <= 0) break;
        std::string got;
        if (!uipeer::ReadSome(fd, got)) {
            o.closedByTest = true;
            break;
        }
        (sent ? o.after : o.request) += got;
    }
    ::close(fd);
    return o;
}

// The server runs on one thread for the whole run: a thread per input costs
// more than the input under ASan. Never destroyed: the thread still waits on
// them when the process exits.
std::mutex &jobMu = *new std::mutex;
std::condition_variable &jobCv = *new std::condition_variable;
std::function<void()> job;
bool busy = false;  // from a job's hand-over until it has returned

void serverThread() {
    for (;;) {
        std::function<void()> next;
        {
            std::unique_lock lk(jobMu);
            jobCv.wait(lk, [] { return static_cast<bool>(job); });
            next = std::exchange(job, nullptr);
        }
        next();
        next = nullptr;
        {
            std::lock_guard lk(jobMu);
            busy = false;
        }
        jobCv.notify_all();
    }
}

void runOnServerThread(std::function<void()> f) {
    static bool started = (std::thread(serverThread).detach(), true);
    (void)started;
    {
        std::lock_guard lk(jobMu);
        job = std::move(f);
        busy = true;
    }
    jobCv.notify_all();
}

// As a join would: the job may still be inside set_value after its outcome
// is ready, and the promise lives on the caller's stack.
void waitServerIdle() {
    std::unique_lock lk(jobMu);
    jobCv.wait(lk, [] { return !busy; });
}

int lowestFreeFd() {
    const int fd = ::dup(0);
    ::close(fd);
    return fd;
}

bool startsWith(const std::string &s, const char *prefix) { return s.rfind(prefix, 0) == 0; }

}  // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    setenv("USBADAPTER_LOG_LEVEL", "OFF", 0);
    // The UI server's address file names loopback, so nothing else is ever reached.
    static TempRoot root;
    std::filesystem::create_directories(root / "/root/Halvard/osgi");
    std::ofstream(root / "/root/Halvard/osgi/socketAddress.prop") << "127.0.0.1";
    listenFd = LoopbackSocket(8, &serverPort);
    if (listenFd < 0 || LoopbackSocket(0, &deadPort) < 0) fail("no loopback socket");
    listenPort = uipeer::FreePort();  // for the listening tests: free now, and only they bind it
    if (::pipe2(wakePipe, O_CLOEXEC) != 0) fail("no pipe");
    MAA_SetResultWriter(&maarec::Capture);
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    if (size < 6) return 0;
    const Fn &fn = kFns[data[0] % kFnCount];
    const bool nobody = data[1] & 1;
    const bool pulled = data[1] & 2;
    U32 arg = 0;
    std::memcpy(&arg, data + 2, 4);
    const Script script = parseScript(data + 6, size - 6);
    const bool listening = fn.kind == Kind::Listening;

    // Nobody: the client tests find the port refusing, the listening tests
    // find it taken (by the server's own listener).
    const uint16_t port = listening ? (nobody ? serverPort : listenPort) : (nobody ? deadPort : serverPort);
    setenv("USBADAPTER_UI_PORT", std::to_string(port).c_str(), 1);
    // Only a wait that is itself the outcome is short; one that an answer ends is long.
    MAA_PanelSetWaits(kLongWaitMs, kLongWaitMs, script.holds ? kShortWaitMs : kLongWaitMs);

    const int fdBefore = lowestFreeFd();
    std::promise<Outcome> served;
    std::future<Outcome> outcome = served.get_future();
    if (!nobody) runOnServerThread([&] { served.set_value(serve(listening, script)); });
    IsDisconnected = pulled ? 1 : 0;
    maarec::written.clear();
    stMAASysResult = {};
    TMAAResult *r = fn.call(arg);
    IsDisconnected = 0;
    Outcome o;
    if (!nobody) {
        char c = 'r';
        if (::write(wakePipe[1], &c, 1) != 1) fail("wake pipe");
        if (outcome.wait_for(std::chrono::milliseconds(3 * kPeerWaitMs)) != std::future_status::ready)
            fail("the server thread did not finish (hang)");
        o = outcome.get();
        waitServerIdle();
        while (::read(wakePipe[0], &c, 1) != 1) {
        }
    }

    // Records: the header, written at once; then the returned record: the
    // header again (no verdict) or the verdict, which ends the test.
    CHECK(r == &stMAASysResult, "the record returned is not the shell's result record");
    CHECK(maarec::written.size() == 1, "not exactly one record written during the call");
    const maarec::Rec &header = maarec::written[0];
    CHECK(header.st == MAA_RESULT_CONTINUE && startsWith(header.data, "[ ") && header.data.back() == ']',
          "the first record is not the test's header");
    const maarec::Rec last = maarec::Of(r);
    const bool verdict = last.st == MAA_RESULT_END;
    CHECK(verdict || (last.st == MAA_RESULT_CONTINUE && last.data == header.data),
          "no verdict, yet the header was replaced");
    CHECK(!verdict || (!last.data.empty() && last.data.find('\0') == std::string::npos), "an empty or binary verdict");

    // Nothing left open: the test closed its end, and no descriptor remains.
    if (o.connected) CHECK(o.closedByTest, "the connection was left open");
    CHECK(lowestFreeFd() == fdBefore, "a descriptor was left open");

    if (!listening && o.connected && !pulled) {
        CHECK(!o.request.empty() && o.request.size() <= 2, "a request of neither one nor two bytes");
        // An answered test gives its verdict, unless the key sound test was
        // asked for neither on nor off.
        const bool keySoundSilent = fn.kind == Kind::KeySound && arg > 1;
        if (!script.holds && script.answers && !keySoundSilent) CHECK(verdict, "answered, yet no verdict");
    }
    if (listening && o.connected && !pulled) {
        // The command first; an acknowledgement exactly when the test passed,
        // which takes an answer that holds the command byte.
        CHECK(!o.request.empty() && o.request[0] == fn.command, "the listening test sent no command");
        CHECK(verdict == startsWith(o.after, "3"), "a pass and its acknowledgement disagree");
        bool echoable = false;
        for (const Step &st : script.steps)
            echoable = echoable || (st.op == Step::Send && st.bytes.find(fn.command) != std::string::npos);
        if (!echoable) CHECK(!verdict, "a pass without the command's answer");
    }
    return 0;
}
