#include "Serve.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <termios.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <deque>
#include <fstream>
#include <memory>
#include <mutex>
#include <thread>
#include <utility>

#include "FirmwareCommands.h"
#include "Host.h"
#include "Sha256.h"
#include "vdev.h"

namespace sim {
namespace {

int gStopPipe[2] = {-1, -1};
volatile sig_atomic_t gStopSignal = 0;

void OnStop(int sig) {
    gStopSignal = sig;
    if (gStopPipe[1] >= 0) {
        const char c = 1;
        [[maybe_unused]] ssize_t n = ::write(gStopPipe[1], &c, 1);
    }
}

using Clock = std::chrono::steady_clock;

// One host session's pseudo-terminal. The simulator holds its slave open
// itself, so it never hangs up: the host's opens and closes are seen through
// inotify.
struct Pty {
    int master = -1, keep = -1, watch = -1;
    std::string slave;
    int hosts = 0;            // host descriptors open on it now
    long long session = 0;
    long long sent = 0, readBack = 0, dropped = 0;
    Sha256 sha;               // of what the host sent
};

// A channel at a fixed path: a symbolic link to a pseudo-terminal nobody has
// opened yet. When a host opens it, the link is moved (atomically) to a fresh
// one, so the next host gets a terminal of its own and the bytes of two
// sessions never mix. Sessions are served in the order they opened; a later one
// waits (its writes block once the terminal's buffer is full) until the earlier
// one has closed and its job has ended.
struct Port {
    std::string chan;
    const char *node = nullptr;
    std::string link;
    std::deque<std::unique_ptr<Pty>> ptys;  // opened sessions in order
    long long sessions = 0;
    long long idleDropped = 0;  // device bytes while no session was open
    Clock::time_point progressAt{};
    // Owned by the watcher while it runs: the terminal the link points to and
    // the next one, with its link made beside the path, ready to be renamed.
    std::unique_ptr<Pty> current, spare;
};

void MakeRaw(int fd) {
    termios t{};
    if (::tcgetattr(fd, &t) != 0) return;
    ::cfmakeraw(&t);
    ::tcsetattr(fd, TCSANOW, &t);
}

void ClosePty(Pty &t, int inotifyFd) {
    if (t.watch >= 0) ::inotify_rm_watch(inotifyFd, t.watch);
    if (t.keep >= 0) ::close(t.keep);
    if (t.master >= 0) ::close(t.master);
    t.watch = t.keep = t.master = -1;
}

std::string NextLink(const Port &p) { return p.link + ".new"; }

// The port's next spare: a watched terminal and a link to it beside the path.
bool MakeSpare(Port &p, int inotifyFd, std::string *error) {
    auto t = std::make_unique<Pty>();
    t->master = ::posix_openpt(O_RDWR | O_NOCTTY | O_CLOEXEC);
    bool ok = t->master >= 0 && ::grantpt(t->master) == 0 && ::unlockpt(t->master) == 0;
    if (ok) {
        t->slave = ::ptsname(t->master);
        t->keep = ::open(t->slave.c_str(), O_RDWR | O_NOCTTY | O_CLOEXEC);
        ok = t->keep >= 0;
    }
    if (ok) {
        MakeRaw(t->keep);
        ::fchmod(t->keep, 0666);  // a spooler's backend runs as a user of its own
        ::fcntl(t->master, F_SETFL, ::fcntl(t->master, F_GETFL) | O_NONBLOCK);
        t->watch = ::inotify_add_watch(inotifyFd, t->slave.c_str(), IN_OPEN | IN_CLOSE);
        ok = t->watch >= 0;
    }
    const std::string next = NextLink(p);
    if (ok) {
        ::unlink(next.c_str());
        ok = ::symlink(t->slave.c_str(), next.c_str()) == 0;
    }
    if (!ok) {
        *error = "serve: cannot set up a pseudo-terminal at " + p.link + ": " + std::strerror(errno);
        ClosePty(*t, inotifyFd);
        return false;
    }
    p.spare = std::move(t);
    return true;
}

// Points the path at the spare, which becomes current.
bool Advance(Port &p, std::string *error) {
    if (!p.spare || ::rename(NextLink(p).c_str(), p.link.c_str()) != 0) {
        *error = "serve: cannot move " + p.link + ": " + (p.spare ? std::strerror(errno) : "no spare terminal");
        return false;
    }
    p.current = std::move(p.spare);
    return true;
}

// What the watcher hands to the main loop, in the order inotify reported it.
struct HostEvent {
    enum Kind { kOpen, kClose, kError } kind = kOpen;
    int watch = -1;
    size_t port = 0;
    std::unique_ptr<Pty> session;  // on the first open of a terminal
    std::string error;
};

// Moves each port's path on as soon as a host opens its terminal, on a thread
// of its own: the main loop may be busy ending the last job for a while, and a
// spooler starts its next backend, which opens the path again, as soon as the
// last one has exited. The window left is between the host's open and the
// rename here.
class Watcher {
public:
    Watcher(int inotifyFd, Port *ports, size_t count) : ino_(inotifyFd), ports_(ports), count_(count) {}
    ~Watcher() { Stop(); }

    bool Start(std::string *error) {
        if (::pipe2(quit_, O_CLOEXEC | O_NONBLOCK) != 0 || ::pipe2(wake_, O_CLOEXEC | O_NONBLOCK) != 0) {
            *error = std::string("serve: pipe: ") + std::strerror(errno);
            return false;
        }
        // The stop signals are the main loop's to see.
        sigset_t block, old;
        sigemptyset(&block);
        sigaddset(&block, SIGINT);
        sigaddset(&block, SIGTERM);
        ::pthread_sigmask(SIG_BLOCK, &block, &old);
        thread_ = std::thread([this] { Run(); });
        ::pthread_sigmask(SIG_SETMASK, &old, nullptr);
        return true;
    }

    void Stop() {
        if (thread_.joinable()) {
            const char c = 1;
            [[maybe_unused]] ssize_t n = ::write(quit_[1], &c, 1);
            thread_.join();
        }
        for (int *fds : {quit_, wake_}) {
            for (int i = 0; i < 2; ++i) {
                if (fds[i] >= 0) ::close(fds[i]);
                fds[i] = -1;
            }
        }
    }

    int WakeFd() const { return wake_[0]; }

    std::deque<HostEvent> Take() {
        char buf[64];
        while (wake_[0] >= 0 && ::read(wake_[0], buf, sizeof buf) > 0) {
        }
        std::lock_guard<std::mutex> lock(mutex_);
        return std::exchange(events_, {});
    }

private:
    void Post(HostEvent ev) {
        {
            std::lock_guard<std::mutex> lock(mutex_);
            events_.push_back(std::move(ev));
        }
        const char c = 1;
        [[maybe_unused]] ssize_t n = ::write(wake_[1], &c, 1);
    }

    void Run() {
        bool failed = false;
        while (!failed) {
            pollfd fds[2] = {{quit_[0], POLLIN, 0}, {ino_, POLLIN, 0}};
            if (::poll(fds, 2, -1) < 0 && errno != EINTR) return;
            if (fds[0].revents != 0) return;
            alignas(inotify_event) char buf[4096];
            const ssize_t n = ::read(ino_, buf, sizeof buf);
            for (ssize_t off = 0; n > 0 && off + static_cast<ssize_t>(sizeof(inotify_event)) <= n && !failed;) {
                const auto *ev = reinterpret_cast<const inotify_event *>(buf + off);
                off += static_cast<ssize_t>(sizeof(inotify_event) + ev->len);
                failed = !Dispatch(*ev);
            }
        }
    }

    bool Dispatch(const inotify_event &ev) {
        if (ev.mask & IN_OPEN) {
            for (size_t i = 0; i < count_; ++i) {
                Port &p = ports_[i];
                if (!p.current || ev.wd != p.current->watch) continue;
                HostEvent open{HostEvent::kOpen, ev.wd, i, std::move(p.current), {}};
                std::string error;
                const bool ok = Advance(p, &error) && MakeSpare(p, ino_, &error);
                Post(std::move(open));
                if (!ok) Post({HostEvent::kError, -1, i, nullptr, error});
                return ok;
            }
            Post({HostEvent::kOpen, ev.wd, 0, nullptr, {}});
        } else if (ev.mask & IN_CLOSE) {
            Post({HostEvent::kClose, ev.wd, 0, nullptr, {}});
        }
        return true;
    }

    int ino_;
    Port *ports_;
    size_t count_;
    int quit_[2] = {-1, -1}, wake_[2] = {-1, -1};
    std::thread thread_;
    std::mutex mutex_;
    std::deque<HostEvent> events_;
};

void EndProgress(Port &p) {
    if (p.progressAt == Clock::time_point{}) return;
    std::printf("\n");
    p.progressAt = {};
}

// Host bytes to the device, each read one transfer.
void Pump(Session &s, Port &p, Pty &t, bool progress) {
    char buf[1 << 16];
    for (;;) {
        ssize_t n = ::read(t.master, buf, sizeof buf);
        if (n <= 0) break;
        vdev::HostWrite(p.node, buf, static_cast<size_t>(n));
        t.sha.Update(buf, static_cast<size_t>(n));
        t.sent += n;
        s.bytesSent += static_cast<uint64_t>(n);
        ++s.transfersSent;
    }
    if (progress && t.sent >= (1 << 20) && Clock::now() - p.progressAt > std::chrono::milliseconds(250)) {
        std::printf("\r  %s session %lld: %lld bytes from the host", p.chan.c_str(), t.session, t.sent);
        std::fflush(stdout);
        p.progressAt = Clock::now();
    }
}

// Device bytes to the session being served while its host holds the channel;
// nobody reads them otherwise, as nobody reads a printer's back channel with
// its node closed.
void BackChannel(Session &s, Port &p, Pty *t) {
    std::vector<uint8_t> got = vdev::HostRead(p.node);
    if (got.empty()) return;
    if (!t || t->hosts == 0) {
        (t ? t->dropped : p.idleDropped) += static_cast<long long>(got.size());
        return;
    }
    size_t off = 0;
    while (off < got.size()) {
        ssize_t n = ::write(t->master, got.data() + off, got.size() - off);
        if (n > 0) {
            off += static_cast<size_t>(n);
            continue;
        }
        if (n < 0 && errno != EAGAIN) break;
        pollfd w{t->master, POLLOUT, 0};
        if (::poll(&w, 1, 100) <= 0) break;  // the host does not read: drop the rest
    }
    t->readBack += static_cast<long long>(off);
    t->dropped += static_cast<long long>(got.size() - off);
    s.bytesReadBack += off;
}

struct Reported {
    size_t jobs = 0, apps = 0, images = 0;
};

std::string FileSha(const std::string &path) {
    std::ifstream in(path, std::ios::binary);
    if (!in) return "-";
    Sha256 sha;
    char buf[1 << 16];
    while (in.read(buf, sizeof buf) || in.gcount() > 0) sha.Update(buf, static_cast<size_t>(in.gcount()));
    return sha.HexDigest();
}

// One line per job, application transfer and firmware image as it ends.
void Report(Session &s, Reported &r) {
    s.SyncJava();
    for (; r.jobs < s.jobs.size() && s.jobs[r.jobs].ended; ++r.jobs) {
        const JobRecord &j = s.jobs[r.jobs];
        std::printf("job %d: %lld bytes  sha256 %s  %s/%s\n", j.number, j.bytes, j.sha256.c_str(), s.outDir.c_str(),
                    j.file.c_str());
    }
    for (; r.apps < s.apps.size() && s.apps[r.apps].ended; ++r.apps) {
        const AppRecord &a = s.apps[r.apps];
        std::printf("app %d (%s): %lld bytes  sha256 %s  %s/%s\n", a.number, a.type.c_str(), a.bytes,
                    a.sha256.c_str(), s.outDir.c_str(), a.file.c_str());
    }
    const std::vector<FwImageSeen> images = FwImages();
    for (; r.images < images.size() && images[r.images].complete; ++r.images) {
        const FwImageSeen &im = images[r.images];
        std::printf("firmware image %zu (type %u): %llu bytes  checksum %s  sha256 %s  %s\n", r.images + 1, im.type,
                    static_cast<unsigned long long>(im.bytes), im.checksumOk ? "ok" : "BAD",
                    im.file.empty() ? "-" : FileSha(im.file).c_str(), im.file.empty() ? "-" : im.file.c_str());
    }
    std::fflush(stdout);
}

// The host has closed the session: what it wrote before is in the terminal's
// buffer (a read until EAGAIN flushes it), and the print job it carried ends,
// as it would after a poll period of silence: with no host on the channel,
// virtual time passes at once.
void EndSession(Session &s, Port &p, Pty &t, Reported &r) {
    Pump(s, p, t, false);
    EndProgress(p);
    std::string error;
    if (p.chan == "prn" && t.sent > 0 && s.plugged && !FindCommand("end-job")->run(s, {}, &error))
        s.Sim(JsonLine("error").Str("where", "serve").Str("message", error));
    BackChannel(s, p, &t);
    const std::string sha = t.sha.HexDigest();
    s.Host(JsonLine("host-close")
               .Str("chan", p.chan)
               .Num("session", t.session)
               .Num("bytes", t.sent)
               .Str("sha256", sha)
               .Num("read-back", t.readBack)
               .Num("dropped", t.dropped));
    std::printf("%s session %lld: %lld bytes from the host  sha256 %s, %lld read back\n", p.chan.c_str(), t.session,
                t.sent, sha.c_str(), t.readBack);
    Report(s, r);
}

// Serves the sessions at the front that their hosts have closed.
void Retire(Session &s, Port &p, int inotifyFd, Reported &r) {
    while (!p.ptys.empty() && p.ptys.front()->hosts == 0) {
        EndSession(s, p, *p.ptys.front(), r);
        ClosePty(*p.ptys.front(), inotifyFd);
        p.ptys.pop_front();
    }
}

bool HostEvents(Session &s, Watcher &w, Port *ports, size_t count, std::string *error) {
    for (HostEvent &ev : w.Take()) {
        if (ev.kind == HostEvent::kError) {
            *error = ev.error;
            return false;
        }
        if (ev.session) {
            Port &p = ports[ev.port];
            Pty &t = *ev.session;
            t.hosts = 1;
            t.session = ++p.sessions;
            t.dropped = std::exchange(p.idleDropped, 0);
            s.Host(JsonLine("host-open").Str("chan", p.chan).Num("session", t.session));
            p.ptys.push_back(std::move(ev.session));
            continue;
        }
        for (size_t i = 0; i < count; ++i) {
            for (auto &t : ports[i].ptys) {
                if (ev.watch != t->watch) continue;
                if (ev.kind == HostEvent::kOpen) ++t->hosts;
                else if (t->hosts > 0) --t->hosts;
            }
        }
    }
    return true;
}

}  // namespace

void CatchStopSignals() {
    if (gStopPipe[0] < 0 && ::pipe2(gStopPipe, O_CLOEXEC | O_NONBLOCK) != 0) gStopPipe[0] = gStopPipe[1] = -1;
    struct sigaction sa {};
    sa.sa_handler = OnStop;
    sa.sa_flags = SA_RESTART;
    sigemptyset(&sa.sa_mask);
    ::sigaction(SIGINT, &sa, nullptr);
    ::sigaction(SIGTERM, &sa, nullptr);
}

// serve [prn LINK] [scan LINK]
bool CheckServe(const Args &a, std::string *error) {
    if (a.size() % 2 != 0) {
        *error = "serve: CHAN LINK pairs expected";
        return false;
    }
    for (size_t i = 0; i < a.size(); i += 2) {
        if (a[i] != "prn" && a[i] != "scan") {
            *error = "serve: unknown channel '" + a[i] + "' (prn or scan)";
            return false;
        }
    }
    return true;
}

bool Serve(Session &s, const Args &a, std::string *error) {
    CatchStopSignals();
    Port ports[2];
    size_t count = 0;
    for (size_t i = 0; i + 1 < a.size() && count < 2; i += 2) {
        ports[count].chan = a[i];
        ports[count].node = a[i] == "prn" ? vdev::kPrn : vdev::kScan;
        ports[count].link = a[i + 1];
        ++count;
    }
    if (count == 0) {
        ports[0].chan = "prn";
        ports[0].node = vdev::kPrn;
        ports[0].link = s.outDir + "/prn";
        count = 1;
    }
    const int ino = ::inotify_init1(IN_NONBLOCK | IN_CLOEXEC);
    bool ok = ino >= 0;
    if (!ok) *error = std::string("serve: inotify: ") + std::strerror(errno);
    for (size_t i = 0; ok && i < count; ++i)
        ok = MakeSpare(ports[i], ino, error) && Advance(ports[i], error) && MakeSpare(ports[i], ino, error);
    if (ok && gStopPipe[0] < 0) {
        ok = false;
        *error = "serve: no pipe for the stop signals";
    }
    Watcher watcher(ino, ports, count);
    ok = ok && watcher.Start(error);
    auto cleanUp = [&] {
        watcher.Stop();
        for (size_t i = 0; i < count; ++i) {
            Port &p = ports[i];
            for (auto &t : p.ptys) ClosePty(*t, ino);
            for (Pty *t : {p.current.get(), p.spare.get()})
                if (t) ClosePty(*t, ino);
            ::unlink(p.link.c_str());
            ::unlink(NextLink(p).c_str());
        }
        if (ino >= 0) ::close(ino);
    };
    if (!ok) {
        cleanUp();
        return false;
    }
    for (size_t i = 0; i < count; ++i) {
        s.Host(JsonLine("serve").Str("chan", ports[i].chan).Str("path", ports[i].link));
        std::printf("serving the %s channel at %s\n", ports[i].chan == "prn" ? "print" : "scan",
                    ports[i].link.c_str());
    }
    std::printf("(SIGINT or SIGTERM ends the session)\n");
    std::fflush(stdout);

    const bool progress = ::isatty(STDOUT_FILENO) == 1;
    Reported reported;
    auto lastReport = Clock::now();
    while (gStopSignal == 0 && ok) {
        pollfd fds[4] = {{gStopPipe[0], POLLIN, 0}, {watcher.WakeFd(), POLLIN, 0}};
        nfds_t n = 2;
        for (size_t i = 0; i < count; ++i)
            if (!ports[i].ptys.empty()) fds[n++] = {ports[i].ptys.front()->master, POLLIN, 0};
        ::poll(fds, n, 10);
        ok = HostEvents(s, watcher, ports, count, error);
        for (size_t i = 0; ok && i < count; ++i) {
            Retire(s, ports[i], ino, reported);
            Pty *front = ports[i].ptys.empty() ? nullptr : ports[i].ptys.front().get();
            if (front) Pump(s, ports[i], *front, progress);
            BackChannel(s, ports[i], front);
        }
        if (Clock::now() - lastReport > std::chrono::milliseconds(200)) {
            Report(s, reported);
            lastReport = Clock::now();
        }
    }
    s.Sim(JsonLine("serve-stop").Num("signal", gStopSignal));
    // Hosts still on the channel: what they sent so far are whole jobs.
    watcher.Stop();
    std::string late;
    HostEvents(s, watcher, ports, count, &late);
    for (size_t i = 0; i < count; ++i) {
        for (auto &t : ports[i].ptys) {
            t->hosts = 0;
            EndSession(s, ports[i], *t, reported);
        }
    }
    cleanUp();
    Report(s, reported);
    return ok;
}

}  // namespace sim
