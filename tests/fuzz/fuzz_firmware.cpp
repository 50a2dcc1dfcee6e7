// Firmware headers and the update-manager dialogue: arbitrary host traffic
// handed to FirmWareDownload over the emulated print node (instant time-outs),
// against a manager on loopback whose answers the input chooses.
//
// Input: host traffic, then FD FD, then the manager's answers.
//   In the traffic, FE FF ends a host transfer; its first two bytes are the
//   ones the classifier has already taken.
//   The answers are split by FC FC, one piece per connection in order; each
//   is sent whole when the library connects, and nothing follows it.
// Checked: the call returns within a bound, with -1, 0 or a count of at most
// 80 bytes; it never leaves a connection or descriptor open.
#include <dirent.h>
#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <string_view>
#include <vector>

#include "FuzzCheck.h"
#include "HostTraffic.h"
#include "common/Wait.h"
#include "support/Loopback.h"
#include "firmware/FirmWareUpdate.h"
#include "firmware/UpdateManager.h"
#include "vdev.h"

namespace {

int g_listen = -1;
int g_node = -1;                                      // the print node while a download runs
const std::vector<std::string> *g_answers = nullptr;  // set while a download runs
std::vector<int> g_conns;  // in order of connection; -1 once the library has closed it

// The manager, played in the library's own thread whenever the library is
// about to wait for it: each new connection gets its answer whole, and
// whatever the library sent is read. Loopback delivers both before the
// calls return, so no thread has to be scheduled between the library and its
// manager.
void Serve() {
    for (int c; (c = ::accept4(g_listen, nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK)) >= 0;) {
        if (g_answers && g_conns.size() < g_answers->size()) {
            const std::string &a = (*g_answers)[g_conns.size()];
            ::send(c, a.data(), a.size(), MSG_NOSIGNAL);
        }
        g_conns.push_back(c);
    }
    char buf[4096];
    for (int &c : g_conns) {
        if (c < 0) continue;
        ssize_t n;
        while ((n = ::recv(c, buf, sizeof buf, 0)) > 0) {
        }
        if (n == 0) {
            ::close(c);
            c = -1;
        }
    }
}

// The end of a round: every connection, the unaccepted ones too, is closed.
void CloseAll() {
    g_answers = nullptr;
    Serve();
    for (int c : g_conns)
        if (c >= 0) ::close(c);
    g_conns.clear();
}

void Setup() {
    // fw.bin lands in the working directory; libFuzzer's paths are relative
    // to it, so it stays as it is.
    ::setenv("USBADAPTER_LOG_LEVEL", "OFF", 0);
    uint16_t port = 0;
    if ((g_listen = LoopbackSocket(64, &port)) < 0) fail("cannot listen");
    if (::fcntl(g_listen, F_SETFL, O_NONBLOCK) != 0) fail("cannot listen");
    ::setenv(UPDATE_PORT_ENV, std::to_string(port).c_str(), 1);
    UpdateManager_SetWaitMs(2);
    // The marks on standard output are not the fuzzer's business.
    if (!std::freopen("/dev/null", "w", stdout)) fail("no /dev/null");
}

// Counted without allocating: a directory_iterator's buffers cost ASan a
// tenth of the run.
int CountFds() {
    const int dir = ::open("/proc/self/fd", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (dir < 0) fail("no /proc/self/fd");
    alignas(dirent64) char buf[8192];
    int n = 0;
    for (ssize_t got; (got = ::getdents64(dir, buf, sizeof buf)) > 0;)
        for (ssize_t at = 0; at < got; at += reinterpret_cast<dirent64 *>(buf + at)->d_reclen)
            n += reinterpret_cast<dirent64 *>(buf + at)->d_name[0] != '.';
    ::close(dir);
    return n;
}

}  // namespace

// The library waits for its manager only here. Every answer went out whole
// when its connection came, so what is not readable now never comes: the
// wait ends at once instead of after its time-out, with the same outcome.
extern "C" int __real__Z11Wait_PollIniiPsPFbvEi(int fd, int timeoutMs, short *revents, WaitGoneFn gone, int wakeFd);
extern "C" int __wrap__Z11Wait_PollIniiPsPFbvEi(int fd, int timeoutMs, short *revents, WaitGoneFn gone, int wakeFd) {
    if (g_node >= 0 && fd != g_node) {
        Serve();
        timeoutMs = 0;
    }
    return __real__Z11Wait_PollIniiPsPFbvEi(fd, timeoutMs, revents, gone, wakeFd);
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    static bool ready = (Setup(), true);
    (void)ready;
    std::string_view in(reinterpret_cast<const char *>(data), size);
    std::vector<std::string> parts = Split(in, "\xFD\xFD");
    std::vector<std::string> transfers = Split(parts[0], "\xFE\xFF");
    std::vector<std::string> answers = parts.size() > 1 ? Split(parts[1], "\xFC\xFC") : std::vector<std::string>{};
    if (transfers[0].size() < 2) return 0;
    const std::string first2 = transfers[0].substr(0, 2);
    transfers[0].erase(0, 2);

    vdev::Reset();
    const int before = CountFds();
    int fd = ::open(vdev::kPrn, O_RDWR);
    vdev::SetInstantTimeouts(vdev::kPrn, true);
    for (const std::string &t : transfers)
        if (!t.empty()) vdev::HostWrite(vdev::kPrn, t);

    g_answers = &answers;
    g_node = fd;

    U8 cmd[2] = {static_cast<U8>(first2[0]), static_cast<U8>(first2[1])};
    U8 out[FW_PJL_HEADER_SIZE];
    S32 firmware = -5;
    const auto t0 = std::chrono::steady_clock::now();
    const S32 r = FirmWareDownload(fd, cmd, 2, out, &firmware);
    if (std::chrono::steady_clock::now() - t0 > std::chrono::seconds(10)) fail("download took more than 10 s");
    g_node = -1;
    CloseAll();
    ::close(fd);
    vdev::Reset();  // the host ends of the node
    if (r < -1 || r > FW_PJL_HEADER_SIZE) fail("result outside -1..80");
    if (firmware != 0 && firmware != 1) fail("firmware flag neither 0 nor 1");
    if (firmware == 0 && r == 0) fail("success without firmware");
    if (CountFds() != before) fail("a descriptor was left open");
    return 0;
}
