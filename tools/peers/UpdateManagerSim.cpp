#include "UpdateManagerSim.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <bit>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <memory>

#include "common/ByteOrder.h"

namespace peers {
namespace {

constexpr int kSliceMs = 50;  // how often a wait looks at Stop()
constexpr uint16_t kVerify = 0xA5A5;

struct Name {
    UmMisbehaviour m;
    const char *name;
};
const Name kNames[] = {
    {UmMisbehaviour::None, "none"},
    {UmMisbehaviour::ChecksumError, "checksum-error"},
    {UmMisbehaviour::ProgressFail, "progress-fail"},
    {UmMisbehaviour::Silence, "silence"},
    {UmMisbehaviour::EarlyClose, "early-close"},
    {UmMisbehaviour::SlowProgress, "slow-progress"},
    {UmMisbehaviour::EndlessProgress, "endless-progress"},
};
// An endless report still ends: with the library gone, at Stop(), or after
// this many connection time-outs.
constexpr int kEndlessTimeouts = 10;


// 16-bit big-endian words of a byte stream fed in pieces; an odd last byte is
// the high byte of a word. The high and the low bytes are summed apart, eight
// at a time: bytes that share a 16-bit lane of a 64-bit word add up in that
// lane, emptied into the totals before it can overflow.
struct WordSum {
    uint64_t high = 0, low = 0;
    bool odd = false;  // the next byte is a low byte
    void add(const uint8_t *p, size_t n) {
        if (odd && n > 0) {
            low += *p++;
            --n;
            odd = false;
        }
        while (n >= 8) {
            const size_t chunk = std::min<size_t>(n / 8, 255) * 8;
            uint64_t lanesA = 0, lanesB = 0;
            for (size_t i = 0; i < chunk; i += 8) {
                uint64_t w;
                std::memcpy(&w, p + i, 8);
                lanesA += w & 0x00FF00FF00FF00FFull;
                lanesB += (w >> 8) & 0x00FF00FF00FF00FFull;
            }
            const bool little = std::endian::native == std::endian::little;
            high += lanes(little ? lanesA : lanesB);
            low += lanes(little ? lanesB : lanesA);
            p += chunk;
            n -= chunk;
        }
        for (; n > 0; --n, ++p, odd = !odd) (odd ? low : high) += *p;
    }
    static uint64_t lanes(uint64_t v) {
        uint64_t total = 0;
        for (; v; v >>= 16) total += v & 0xFFFF;
        return total;
    }
    uint16_t finish() const { return static_cast<uint16_t>((high << 8) + low); }
};

}  // namespace

bool ParseUmMisbehaviour(const std::string &name, UmMisbehaviour *out) {
    for (const Name &n : kNames)
        if (name == n.name) {
            *out = n.m;
            return true;
        }
    return false;
}

const char *UmMisbehaviourName(UmMisbehaviour m) {
    for (const Name &n : kNames)
        if (n.m == m) return n.name;
    return "?";
}

bool UpdateManagerSim::Start(const UmOptions &options, std::string *error) {
    Stop();
    opt_ = options;
    misbehaviour_ = options.misbehaviour;
    stop_ = false;
    listenFd_ = ::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    int one = 1;
    ::setsockopt(listenFd_, SOL_SOCKET, SO_REUSEADDR, &one, sizeof one);
    sockaddr_in addr{};
    addr.sin_family = AF_INET;
    addr.sin_port = htons(options.port);
    addr.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    socklen_t len = sizeof addr;
    if (listenFd_ < 0 || ::bind(listenFd_, reinterpret_cast<sockaddr *>(&addr), sizeof addr) != 0 ||
        ::listen(listenFd_, 16) != 0 || ::getsockname(listenFd_, reinterpret_cast<sockaddr *>(&addr), &len) != 0) {
        *error = std::string("update manager: cannot listen on 127.0.0.1:") + std::to_string(options.port) + ": " +
                 std::strerror(errno);
        if (listenFd_ >= 0) ::close(listenFd_);
        listenFd_ = -1;
        return false;
    }
    port_ = ntohs(addr.sin_port);
    acceptor_ = std::thread([this] { acceptLoop(); });
    return true;
}

void UpdateManagerSim::Stop() {
    stop_ = true;
    if (acceptor_.joinable()) acceptor_.join();
    for (Worker &w : workers_) w.thread.join();
    workers_.clear();
    if (listenFd_ >= 0) ::close(listenFd_);
    listenFd_ = -1;
}

void UpdateManagerSim::SetMisbehaviour(UmMisbehaviour m) { misbehaviour_ = m; }

std::vector<UmImage> UpdateManagerSim::Images() const {
    std::lock_guard<std::mutex> lock(mu_);
    return images_;
}
std::vector<std::string> UpdateManagerSim::Errors() const {
    std::lock_guard<std::mutex> lock(mu_);
    return errors_;
}
int UpdateManagerSim::Connections() const {
    std::lock_guard<std::mutex> lock(mu_);
    return connections_;
}
int UpdateManagerSim::Active() const {
    std::lock_guard<std::mutex> lock(mu_);
    return active_;
}
int UpdateManagerSim::Ends() const {
    std::lock_guard<std::mutex> lock(mu_);
    return ends_;
}

bool UpdateManagerSim::WaitFor(const std::function<bool()> &pred, int timeoutMs) const {
    // pred may call the observers, which take the lock: it runs outside it,
    // and the wait wakes at least every slice.
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(timeoutMs);
    for (;;) {
        if (pred()) return true;
        if (std::chrono::steady_clock::now() >= deadline) return false;
        std::unique_lock<std::mutex> lock(mu_);
        changed_.wait_for(lock, std::chrono::milliseconds(kSliceMs));
    }
}

void UpdateManagerSim::error(const std::string &what) {
    std::lock_guard<std::mutex> lock(mu_);
    errors_.push_back(what);
    changed_.notify_all();
}

void UpdateManagerSim::acceptLoop() {
    while (!stop_) {
        pollfd p{listenFd_, POLLIN, 0};
        if (::poll(&p, 1, kSliceMs) <= 0) continue;
        int fd = ::accept4(listenFd_, nullptr, nullptr, SOCK_CLOEXEC);
        if (fd < 0) continue;
        // Each answer goes out when written, not behind the previous one's
        // acknowledgement.
        int one = 1;
        ::setsockopt(fd, IPPROTO_TCP, TCP_NODELAY, &one, sizeof one);
        {
            std::lock_guard<std::mutex> lock(mu_);
            ++connections_;
            ++active_;
            changed_.notify_all();
        }
        for (auto it = workers_.begin(); it != workers_.end();) {
            if (!it->done->load()) {
                ++it;
                continue;
            }
            it->thread.join();
            it = workers_.erase(it);
        }
        auto done = std::make_shared<std::atomic<bool>>(false);
        workers_.push_back({std::thread([this, fd, done] {
                                serve(fd);
                                ::close(fd);
                                std::lock_guard<std::mutex> lock(mu_);
                                --active_;
                                *done = true;
                                changed_.notify_all();
                            }),
                            done});
    }
}

// Waits in slices so that Stop() is seen; false on time-out, close or stop.
bool UpdateManagerSim::readFull(int fd, void *buf, size_t size) {
    auto *p = static_cast<uint8_t *>(buf);
    size_t got = 0;
    int idle = 0;
    while (got < size) {
        if (stop_ || idle >= opt_.ioTimeoutMs) return false;
        pollfd pfd{fd, POLLIN, 0};
        int r = ::poll(&pfd, 1, kSliceMs);
        if (r < 0 && errno != EINTR) return false;
        if (r <= 0) {
            idle += kSliceMs;
            continue;
        }
        ssize_t n = ::recv(fd, p + got, size - got, 0);
        if (n == 0 || (n < 0 && errno != EINTR)) return false;
        if (n > 0) {
            got += static_cast<size_t>(n);
            idle = 0;
        }
    }
    return true;
}

bool UpdateManagerSim::writeAll(int fd, const void *buf, size_t size) {
    return ::send(fd, buf, size, MSG_NOSIGNAL) == static_cast<ssize_t>(size);
}

void UpdateManagerSim::serve(int fd) {
    for (;;) {
        uint8_t sig[4];
        if (!readFull(fd, sig, 4)) return;  // the library closed (or went silent): done
        if (std::memcmp(sig, "$IMG", 4) == 0) {
            if (!serveImage(fd)) return;
        } else if (std::memcmp(sig, "$END", 4) == 0) {
            serveEnd(fd);
            return;
        } else {
            char text[64];
            std::snprintf(text, sizeof text, "request %02x %02x %02x %02x where $IMG or $END belongs", sig[0], sig[1],
                          sig[2], sig[3]);
            error(text);
            return;
        }
    }
}

bool UpdateManagerSim::serveImage(int fd) {
    uint8_t words[8];
    if (!readFull(fd, words, 8)) {
        error("connection ended inside the image type and size");
        return false;
    }
    UmImage img;
    img.type = ReadBE32(words);
    img.size = ReadBE32(words + 4);
    size_t index;
    {
        std::lock_guard<std::mutex> lock(mu_);
        index = images_.size();
        if (!opt_.dir.empty()) {
            char name[64];
            std::snprintf(name, sizeof name, "/image-%03zu-type%u.bin", index + 1, img.type);
            img.file = opt_.dir + name;
        }
        images_.push_back(img);
        changed_.notify_all();
    }
    std::unique_ptr<FILE, int (*)(FILE *)> out(img.file.empty() ? nullptr : std::fopen(img.file.c_str(), "wb"),
                                               std::fclose);
    // What the library's image header adds: "$IMG", size, type.
    WordSum sum;
    uint8_t header[12] = {'$', 'I', 'M', 'G'};
    WriteBE32(header + 4, img.size);
    WriteBE32(header + 8, img.type);
    sum.add(header, sizeof header);
    WordSum body;
    std::vector<uint8_t> buf(1 << 18);
    uint64_t left = img.size;
    bool whole = true;
    while (left > 0) {
        const size_t want = left < buf.size() ? static_cast<size_t>(left) : buf.size();
        // Whatever there is, at least one byte; the wait only when nothing is.
        ssize_t n = ::recv(fd, buf.data(), want, MSG_DONTWAIT);
        if (n < 0 && (errno == EAGAIN || errno == EWOULDBLOCK)) {
            pollfd pfd{fd, POLLIN, 0};
            int waited = 0;
            while (!stop_ && waited < opt_.ioTimeoutMs && ::poll(&pfd, 1, kSliceMs) == 0) waited += kSliceMs;
            if (stop_ || waited >= opt_.ioTimeoutMs) {
                whole = false;
                break;
            }
            continue;
        }
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) {
            whole = false;
            break;
        }
        body.add(buf.data(), static_cast<size_t>(n));
        if (out) std::fwrite(buf.data(), 1, static_cast<size_t>(n), out.get());
        left -= static_cast<uint64_t>(n);
        std::lock_guard<std::mutex> lock(mu_);
        images_[index].received += static_cast<uint64_t>(n);
    }
    out.reset();
    uint8_t ck[2];
    if (!whole || !readFull(fd, ck, 2)) {
        error("image " + std::to_string(index + 1) + ": connection ended before the body and checksum were whole");
        return false;
    }
    const uint16_t checksum = static_cast<uint16_t>((ck[0] << 8) | ck[1]);
    const uint16_t unseeded = static_cast<uint16_t>(sum.finish() + body.finish() + checksum);
    bool ok, chained;
    {
        std::lock_guard<std::mutex> lock(mu_);
        // Within one file the previous image's checksum seeds the next; a
        // file's first image starts from 0.
        chained = haveSeed_ && static_cast<uint16_t>(unseeded + seed_) == kVerify;
        ok = chained || unseeded == kVerify;
        UmImage &rec = images_[index];
        rec.checksum = checksum;
        rec.complete = true;
        rec.checksumOk = ok;
        rec.chained = chained;
        if (ok) {
            haveSeed_ = true;
            seed_ = checksum;
            lastType_ = img.type;
        } else {
            haveSeed_ = false;
        }
        changed_.notify_all();
    }
    const UmMisbehaviour m = misbehaviour_;
    if (m == UmMisbehaviour::EarlyClose) return false;
    if (m == UmMisbehaviour::Silence) {
        uint8_t drain[256];
        while (readFull(fd, drain, 1)) {
        }
        return false;
    }
    uint8_t verdict[4];
    WriteBE32(verdict, ok && m != UmMisbehaviour::ChecksumError ? 1 : 2);
    return writeAll(fd, verdict, sizeof verdict);
}

bool UpdateManagerSim::serveEnd(int fd) {
    uint32_t type;
    {
        std::lock_guard<std::mutex> lock(mu_);
        type = lastType_;
        haveSeed_ = false;  // the next image starts a new file
    }
    const UmMisbehaviour m = misbehaviour_;
    if (m == UmMisbehaviour::Silence) return false;
    if (!writeAll(fd, "$PRO", 4)) return false;
    std::vector<int8_t> steps = opt_.progress;
    if (steps.empty()) steps = {10, 40, 70, 100};
    if (m == UmMisbehaviour::ProgressFail) steps = {30, -1};
    if (m == UmMisbehaviour::EndlessProgress) {
        const auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(opt_.ioTimeoutMs) * kEndlessTimeouts;
        for (int i = 0; std::chrono::steady_clock::now() < end && !stop_; ++i) {
            std::this_thread::sleep_for(std::chrono::milliseconds(opt_.slowProgressMs));
            uint8_t pair[5];
            std::memcpy(pair, &type, 4);
            pair[4] = static_cast<uint8_t>(1 + i % 99);
            // A library that stopped reading must not hold this thread.
            if (::send(fd, pair, sizeof pair, MSG_NOSIGNAL | MSG_DONTWAIT) != sizeof pair) return false;
        }
        return false;
    }
    for (int8_t p : steps) {
        if (m == UmMisbehaviour::SlowProgress) {
            for (int waited = 0; waited < opt_.slowProgressMs && !stop_; waited += 10)
                std::this_thread::sleep_for(std::chrono::milliseconds(10));
        }
        uint8_t pair[5];
        std::memcpy(pair, &type, 4);  // the manager's own byte order
        pair[4] = static_cast<uint8_t>(p);
        if (stop_ || !writeAll(fd, pair, sizeof pair)) return false;
        if (p < 0) return false;
    }
    if (!writeAll(fd, "$END", 4)) return false;
    std::lock_guard<std::mutex> lock(mu_);
    ++ends_;
    changed_.notify_all();
    return true;
}

}  // namespace peers
