// Firmware headers and the update-manager dialogue: arbitrary host traffic
// handed to FirmWareDownload over the emulated print node (instant time-outs),
// against a manager on loopback whose answers the input chooses.
//
// Input: host traffic, then FD FD, then the manager's answers.
//   In the traffic, FE FF ends a host transfer; its first two bytes are the
//   ones the classifier has already taken.
//   The answers are split by FC FC, one piece per connection in order; each
//   is sent when the library connects and waits until it reads it.
// Checked: the call returns within a bound, with -1, 0 or a count of at most
// 80 bytes; it never leaves a connection or descriptor open.
#include <dirent.h>
#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <mutex>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "FuzzCheck.h"
#include "HostTraffic.h"
#include "support/Loopback.h"
#include "firmware/FirmWareUpdate.h"
#include "firmware/UpdateManager.h"
#include "vdev.h"

namespace {

int g_listen = -1;
int g_wake[2] = {-1, -1};  // readable once the download has returned
// Never destroyed: the manager still waits on them when the process exits.
std::mutex &g_mu = *new std::mutex;
std::condition_variable &g_cv = *new std::condition_variable;
const std::vector<std::string> *g_answers = nullptr;  // set while a download runs

// The manager, one thread for the whole run (a thread per input costs more
// than the input). While a download runs it accepts each connection, sends it
// its answer, and reads whatever the library sends; the wake pipe ends the
// round, and every connection of the round, the unaccepted ones too, is closed.
void Manager() {
    char buf[4096];
    for (;;) {
        const std::vector<std::string> *answers;
        {
            std::unique_lock lk(g_mu);
            g_cv.wait(lk, [] { return g_answers != nullptr; });
            answers = g_answers;
        }
        std::vector<int> conns;  // in order of connection; -1 once the library has closed it
        for (bool woken = false; !woken;) {
            std::vector<pollfd> p = {{g_listen, POLLIN, 0}, {g_wake[0], POLLIN, 0}};
            for (int c : conns) p.push_back({c, POLLIN, 0});
            if (::poll(p.data(), p.size(), 1000) <= 0) continue;
            woken = p[1].revents != 0;
            for (int c; (c = ::accept4(g_listen, nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK)) >= 0;) {
                if (!woken && conns.size() < answers->size())
                    ::send(c, (*answers)[conns.size()].data(), (*answers)[conns.size()].size(), MSG_NOSIGNAL);
                conns.push_back(c);
            }
            for (int &c : conns) {
                ssize_t n;
                while ((n = ::recv(c, buf, sizeof buf, 0)) > 0) {
                }
                if (n == 0) {
                    ::close(c);
                    c = -1;
                }
            }
        }
        char c;
        if (::read(g_wake[0], &c, 1) != 1) fail("wake pipe");
        for (int fd : conns)
            if (fd >= 0) ::close(fd);
        {
            std::lock_guard lk(g_mu);
            g_answers = nullptr;
        }
        g_cv.notify_one();
    }
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
    if (::pipe2(g_wake, O_CLOEXEC) != 0) fail("no pipe");
    // The marks on standard output are not the fuzzer's business.
    if (!std::freopen("/dev/null", "w", stdout)) fail("no /dev/null");
    std::thread(Manager).detach();
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

    {
        std::lock_guard lk(g_mu);
        g_answers = &answers;
    }
    g_cv.notify_one();

    U8 cmd[2] = {static_cast<U8>(first2[0]), static_cast<U8>(first2[1])};
    U8 out[FW_PJL_HEADER_SIZE];
    S32 firmware = -5;
    const auto t0 = std::chrono::steady_clock::now();
    const S32 r = FirmWareDownload(fd, cmd, 2, out, &firmware);
    if (std::chrono::steady_clock::now() - t0 > std::chrono::seconds(10)) fail("download took more than 10 s");
    char c = 'w';
    if (::write(g_wake[1], &c, 1) != 1) fail("wake pipe");
    {
        std::unique_lock lk(g_mu);
        g_cv.wait(lk, [] { return g_answers == nullptr; });
    }
    ::close(fd);
    vdev::Reset();  // the host ends of the node
    if (r < -1 || r > FW_PJL_HEADER_SIZE) fail("result outside -1..80");
    if (firmware != 0 && firmware != 1) fail("firmware flag neither 0 nor 1");
    if (firmware == 0 && r == 0) fail("success without firmware");
    if (CountFds() != before) fail("a descriptor was left open");
    return 0;
}
