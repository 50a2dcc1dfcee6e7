// The operator-panel tests against a UI server whose every move the input
// chooses: the answers it sends (garbage, short, long, in pieces), whether it
// closes or holds the connection, refuses it, or (for the two listening tests)
// finds the port taken. The server is played on loopback in the test's own
// thread; the panel's port comes from USBADAPTER_UI_PORT.
//
// Input: byte 0 the test function, byte 1 flags (bit 0: nobody at the port,
// bit 1: the cable is pulled during the call), bytes 2-5 the host's argument
// (little-endian), then the server's script, one step per byte (mod 5):
//   0 n b...  send the n bytes behind (one write)
//   1 b k     send (k + 1) * 64 bytes of b (one write)
//   2         pause: what follows is sent at the test's next wait (a read of
//             its own) once something has been sent
//   3         close (the server's writing end; it then waits for the test to close)
//   4         hold: send nothing more and wait for the test to close
// A script that runs out closes. Every input checks: the records the host gets
// are well-formed (one header, then at most one verdict), no connection is left
// open, no descriptor is left behind, a server that answers gets a verdict, and
// a listening test acknowledges exactly the answer it passes.
#include <fcntl.h>
#include <poll.h>
#include <linux/sockios.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <string>
#include <thread>
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

Script parseScript(const uint8_t *d, size_t n) {
    Script s;
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
            s.steps.push_back({Step::Pause, {}});
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

// ---- the server ------------------------------------------------------------------

// The UI server is played in the test's own thread: whenever the test is about
// to wait (every wait of the panel is a poll), the server first takes its next
// steps. The wait then finds what the server sent, or finds that nothing will
// come: a wait that would only run out ends at once and moves the panel's
// clock on by its length instead. Loopback usually delivers before send and
// connect return, but a loaded machine leaves some of it to ksoftirqd, so
// while anything may still be on its way (a connection, the request, bytes or
// the close not yet acknowledged) the wait first lets real time pass.

uint16_t serverPort, listenPort, deadPort;
int listenFd = -1;

struct Outcome {
    bool connected = false;
    bool closedByTest = false;  // the test's end was seen closed
    std::string request;        // what arrived before the first answer
    std::string after;          // what arrived after it
};

class Server {
public:
    Server(bool peer, const Script &script) : peer_(peer), steps_(script.steps) {}

    // The server's moves before one wait of the test.
    void advance() {
        if (fd_ < 0 && !connect()) return;
        take();
        if (o_.request.empty()) return;  // the script answers a request
        flush();
        bool burst = false;  // a pause splits sends, so it ends a burst only once something went
        while (out_.empty() && step_ < steps_.size()) {
            const Step &st = steps_[step_];
            if (st.op == Step::Send) {
                out_ = st.bytes;
                sent_ = burst = true;
                flush();
            } else if (st.op == Step::Pause) {
                if (burst) break;
            } else {
                break;  // close, or hold for good
            }
            ++step_;
        }
        const bool closes = step_ == steps_.size() || steps_[step_].op == Step::Close;
        if (out_.empty() && closes && !shut_) {
            ::shutdown(fd_, SHUT_WR);
            shut_ = true;
        }
        take();
    }

    // After the call: what the test left behind. Its end must be closed by now.
    Outcome finish() {
        if (fd_ < 0) connect();  // a client test may have connected and never waited
        if (fd_ >= 0) {
            take();
            closeAtOnce(fd_);
        }
        for (int extra; (extra = ::accept4(listenFd, nullptr, nullptr, SOCK_CLOEXEC)) >= 0;) closeAtOnce(extra);
        return o_;
    }

    // Something the test or the server waits for may still be on its way.
    bool inFlight(const pollfd *fds, nfds_t n) const {
        if (fd_ < 0) return !peer_;             // a client test's connection, not yet in the listener
        if (o_.request.empty()) return true;    // the test's request or command (or its accept)
        if (unacknowledged(fd_) > 0) return true;
        for (nfds_t i = 0; i < n; ++i)
            if ((fds[i].events & POLLOUT) || unacknowledged(fds[i].fd) > 0) return true;
        return false;
    }

private:
    // The test is done with the connection. A reset leaves no TIME_WAIT behind:
    // thousands of them a second would fill loopback's port range and slow
    // every later connect.
    static void closeAtOnce(int fd) {
        const linger reset{1, 0};
        ::setsockopt(fd, SOL_SOCKET, SO_LINGER, &reset, sizeof reset);
        ::close(fd);
    }
    static int unacknowledged(int fd) {
        int n = 0;
        return ::ioctl(fd, SIOCOUTQ, &n) == 0 ? n : 0;
    }
    bool connect() {
        // A listening test is connected to (refused at once until it listens);
        // a client test's connection is taken from the listener.
        fd_ = peer_ ? LoopbackConnect(listenPort) : ::accept4(listenFd, nullptr, nullptr, SOCK_CLOEXEC);
        if (fd_ < 0) return false;
        ::fcntl(fd_, F_SETFL, O_NONBLOCK);
        o_.connected = true;
        return true;
    }
    void take() {
        char buf[4096];
        for (;;) {
            const ssize_t n = ::recv(fd_, buf, sizeof buf, 0);
            if (n > 0) {
                (sent_ ? o_.after : o_.request).append(buf, static_cast<size_t>(n));
            } else if (n < 0 && errno == EINTR) {
                continue;
            } else {
                if (n == 0 || errno != EAGAIN) o_.closedByTest = true;
                return;
            }
        }
    }
    void flush() {
        while (!out_.empty()) {
            const ssize_t n = ::send(fd_, out_.data(), out_.size(), MSG_NOSIGNAL);
            if (n < 0 && errno == EINTR) continue;
            if (n <= 0) {
                if (errno != EAGAIN) out_.clear();  // the test is gone
                return;
            }
            out_.erase(0, static_cast<size_t>(n));
        }
    }

    const bool peer_;
    const std::vector<Step> &steps_;
    size_t step_ = 0;
    int fd_ = -1;
    std::string out_;  // sent by the script, not yet taken by the socket
    bool sent_ = false, shut_ = false;
    Outcome o_;
};

Server *server = nullptr;  // while a call under test runs
constexpr int kSettleMs = 2000;  // real time for what is on its way
bool inCall = false;
int64_t clockSkewMs = 0;   // the waits that ran out, added to the panel's clock

int lowestFreeFd() {
    const int fd = ::dup(0);
    ::close(fd);
    return fd;
}

bool startsWith(const std::string &s, const char *prefix) { return s.rfind(prefix, 0) == 0; }

}  // namespace

extern "C" int64_t __real__Z10Wait_NowMsv();
extern "C" int __real_poll(pollfd *fds, nfds_t n, int timeoutMs);
extern "C" int __wrap_poll(pollfd *fds, nfds_t n, int timeoutMs) {
    if (!inCall) return __real_poll(fds, n, timeoutMs);
    int rc;
    for (const int64_t settleEnd = __real__Z10Wait_NowMsv() + kSettleMs;;) {
        if (server) server->advance();
        rc = __real_poll(fds, n, 0);
        if (rc != 0 || !server || !server->inFlight(fds, n) || __real__Z10Wait_NowMsv() >= settleEnd) break;
        std::this_thread::sleep_for(std::chrono::microseconds(50));
    }
    if (rc == 0 && timeoutMs > 0) clockSkewMs += timeoutMs;
    return rc;
}
extern "C" int64_t __wrap__Z10Wait_NowMsv() { return __real__Z10Wait_NowMsv() + clockSkewMs; }

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    setenv("USBADAPTER_LOG_LEVEL", "OFF", 0);
    // The UI server's address file names loopback, so nothing else is ever reached.
    static TempRoot root;
    std::filesystem::create_directories(root / "/root/Halvard/osgi");
    std::ofstream(root / "/root/Halvard/osgi/socketAddress.prop") << "127.0.0.1";
    listenFd = LoopbackSocket(8, &serverPort);
    if (listenFd < 0 || LoopbackSocket(0, &deadPort) < 0) fail("no loopback socket");
    ::fcntl(listenFd, F_SETFL, O_NONBLOCK);  // the server takes only what has come
    listenPort = uipeer::FreePort();  // for the listening tests: free now, and only they bind it
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

    const int fdBefore = lowestFreeFd();
    Server peerServer(listening, script);
    server = nobody ? nullptr : &peerServer;
    IsDisconnected = pulled ? 1 : 0;
    maarec::written.clear();
    stMAASysResult = {};
    inCall = true;
    TMAAResult *r = fn.call(arg);
    inCall = false;
    server = nullptr;
    IsDisconnected = 0;
    const Outcome o = nobody ? Outcome{} : peerServer.finish();

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
