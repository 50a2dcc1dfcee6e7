#include "ShellCommands.h"

#include <fcntl.h>
#include <poll.h>
#include <termios.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "Data.h"
#include "Host.h"
#include "MaaClient.h"
#include "Sha256.h"
#include "vdev.h"

namespace sim {
namespace {

// The print channel's host side as the shell client's channel. Every write is
// one host transfer.
class VdevChannel : public maahost::Channel {
public:
    Session *session = nullptr;

    bool Send(const void *data, size_t size) override {
        vdev::HostWrite(vdev::kPrn, data, size);
        session->bytesSent += size;
        ++session->transfersSent;
        return true;
    }
    ssize_t Receive(void *data, size_t size, int timeoutMs) override {
        if (pending_.empty()) {
            std::vector<uint8_t> got =
                timeoutMs > 0 ? vdev::HostReadAtLeast(vdev::kPrn, 1, timeoutMs) : vdev::HostRead(vdev::kPrn);
            session->bytesReadBack += got.size();
            pending_.assign(got.begin(), got.end());
        }
        const size_t n = pending_.size() < size ? pending_.size() : size;
        std::memcpy(data, pending_.data(), n);
        pending_.erase(0, n);
        return static_cast<ssize_t>(n);
    }

private:
    std::string pending_;
};

struct ShellState {
    VdevChannel channel;
    std::string addr;                    // of the last shell-put, for $addr
    std::vector<std::string> lastLines;  // decoded records of the last shell line
};

ShellState &State(Session &s) {
    static ShellState state;
    state.channel.session = &s;
    return state;
}

std::string Substitute(std::string line, const std::string &addr) {
    for (size_t at; !addr.empty() && (at = line.find("$addr")) != std::string::npos;) line.replace(at, 5, addr);
    return line;
}

bool Printable(const std::string &s) {
    for (unsigned char c : s)
        if (c >= 0x7F || (c < 0x20 && c != '\t' && c != '\r' && c != '\n')) return false;
    return true;
}

void JournalFrame(Session &s, const maahost::Frame &f) {
    using Kind = maahost::Frame::Kind;
    if (f.kind == Kind::Result) {
        s.Host(JsonLine("shell-record")
                   .Num("continue", f.status)
                   .Num("result", f.result)
                   .Num("bytes", static_cast<long long>(f.data.size()))
                   .Str(Printable(f.data) ? "text" : "hex", Printable(f.data) ? f.data : Hex(f.data)));
    } else if (f.kind == Kind::FileEnd) {
        s.Host(JsonLine("shell-file-end"));
    } else {
        s.Host(JsonLine("shell-file")
                   .Num("op", f.status)
                   .Num("bytes", static_cast<long long>(f.data.size()))
                   .Str("sha256", Sha256Hex(f.data)));
    }
}

std::string Join(const std::vector<std::string> &lines) {
    std::string all;
    for (const std::string &l : lines) all += (all.empty() ? "" : "\n") + l;
    return all;
}

}  // namespace

bool ShellStart(Session &s, const Args &, std::string *error) {
    maahost::Session client(State(s).channel, s.timeoutMs);
    const bool ok = client.Start();
    s.Host(JsonLine("shell-start").Bool("acknowledged", ok));
    if (ok) std::printf("<session open>\n");
    if (!ok) {
        *error = "test shell: " + client.Error();
        return false;
    }
    return s.WaitIdle(error);
}

bool ShellLine(Session &s, const Args &a, std::string *error) {
    ShellState &st = State(s);
    const std::string line = Substitute(a[0], st.addr);
    maahost::Session client(st.channel, s.timeoutMs);
    s.Host(JsonLine("shell").Str("line", line));
    std::printf("maa> %s\n", line.c_str());
    // When the reader waits for the host again, the shell has run the line.
    if (!client.SendLine(line) || !s.WaitIdle(error)) return false;
    st.lastLines.clear();
    int n = client.Collect(
        [&](const maahost::Frame &f) {
            JournalFrame(s, f);
            st.lastLines.push_back(maahost::Describe(f));
            std::printf("%s\n", st.lastLines.back().c_str());
        },
        0, 0);
    std::fflush(stdout);
    if (n >= 0) return true;
    *error = "test shell: " + client.Error();
    return false;
}

bool ShellExpect(Session &s, const Args &a, std::string *error) {
    const std::vector<std::string> &got = State(s).lastLines;
    const bool ok = got == a;
    s.Sim(JsonLine("expect").Str("what", "shell").Str("want", Join(a)).Str("got", Join(got)).Bool("ok", ok));
    if (!ok) *error = "the shell answered\n" + Join(got) + "\nexpected\n" + Join(a);
    return ok;
}

bool CheckShellPut(const Args &a, std::string *error) {
    for (const std::string &item : a)
        if (!CheckDataItem(item, error)) return false;
    return true;
}

bool ShellPut(Session &s, const Args &a, std::string *error) {
    std::string bytes;
    if (!BuildData(a, s.baseDir, &bytes, error)) return false;
    ShellState &st = State(s);
    maahost::Session client(st.channel, s.timeoutMs);
    std::optional<uint32_t> address = client.Download(bytes);
    if (!address) {
        *error = "test shell: " + client.Error();
        return false;
    }
    char text[16];
    std::snprintf(text, sizeof text, "0x%08X", *address);
    st.addr = text;
    s.Host(JsonLine("shell-put")
               .Num("bytes", static_cast<long long>(bytes.size()))
               .Str("sha256", Sha256Hex(bytes))
               .Str("address", st.addr));
    std::printf("<put %zu bytes at %s>\n", bytes.size(), text);
    std::fflush(stdout);
    return s.WaitIdle(error);
}

bool ShellStop(Session &s, const Args &, std::string *error) {
    maahost::Session client(State(s).channel, s.timeoutMs);
    const bool ok = client.Stop();
    s.Host(JsonLine("shell-stop").Bool("acknowledged", ok));
    if (ok) std::printf("<session stopped>\n");
    std::fflush(stdout);
    if (!ok) {
        *error = "test shell: " + client.Error();
        return false;
    }
    return s.WaitIdle(error);
}

bool CheckPty(const Args &a, std::string *error) {
    if (a[0] == "prn") return true;
    *error = "pty: only the print channel (prn)";
    return false;
}

bool Pty(Session &s, const Args &a, std::string *error) {
    const std::string &link = a[1];
    const int master = ::posix_openpt(O_RDWR | O_NOCTTY);
    if (master < 0 || ::grantpt(master) != 0 || ::unlockpt(master) != 0) {
        *error = std::string("pty: ") + std::strerror(errno);
        if (master >= 0) ::close(master);
        return false;
    }
    const std::string slave = ::ptsname(master);
    // Raw both ways: the tool sees the bytes of the print channel unchanged.
    if (int fd = ::open(slave.c_str(), O_RDWR | O_NOCTTY); fd >= 0) {
        termios t{};
        ::tcgetattr(fd, &t);
        ::cfmakeraw(&t);
        ::tcsetattr(fd, TCSANOW, &t);
        ::close(fd);
    }
    ::unlink(link.c_str());
    if (::symlink(slave.c_str(), link.c_str()) != 0) {
        *error = "pty: cannot make " + link + ": " + std::strerror(errno);
        ::close(master);
        return false;
    }
    ::fcntl(master, F_SETFL, ::fcntl(master, F_GETFL) | O_NONBLOCK);
    s.Host(JsonLine("pty").Str("chan", a[0]).Str("path", slave).Str("link", link));
    std::printf("pty: %s -> %s (the print channel; waiting for a host tool)\n", link.c_str(), slave.c_str());
    std::fflush(stdout);

    auto hungUp = [&] {
        pollfd p{master, POLLIN, 0};
        return ::poll(&p, 1, 0) == 1 && (p.revents & POLLHUP) && !(p.revents & POLLIN);
    };
    bool opened = WaitUntil([&] { return !hungUp(); }, s.timeoutMs);
    long long toDevice = 0, fromDevice = 0;
    std::string out;  // device bytes the tool has not taken yet
    char buf[1 << 16];
    while (opened) {
        pollfd p{master, POLLIN, 0};
        int r = ::poll(&p, 1, 5);
        if (r > 0 && (p.revents & POLLIN)) {
            ssize_t n = ::read(master, buf, sizeof buf);
            if (n > 0) {
                vdev::HostWrite(vdev::kPrn, buf, static_cast<size_t>(n));
                toDevice += n;
                s.bytesSent += static_cast<uint64_t>(n);
                ++s.transfersSent;
            }
        }
        std::vector<uint8_t> got = vdev::HostRead(vdev::kPrn);
        out.append(got.begin(), got.end());
        fromDevice += static_cast<long long>(got.size());
        if (!out.empty()) {
            ssize_t n = ::write(master, out.data(), out.size());
            if (n > 0) out.erase(0, static_cast<size_t>(n));
        }
        if (r > 0 && (p.revents & POLLHUP) && !(p.revents & POLLIN)) break;  // the tool has closed it
    }
    ::unlink(link.c_str());
    ::close(master);
    s.bytesReadBack += static_cast<uint64_t>(fromDevice);
    s.Host(JsonLine("pty-end").Num("to-device", toDevice).Num("from-device", fromDevice));
    if (!opened) {
        *error = "pty: no host tool opened " + link;
        return false;
    }
    return s.WaitIdle(error);
}

}  // namespace sim
