#include "UiPeer.h"

#include <arpa/inet.h>
#include <fcntl.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>

namespace uipeer {
namespace {

constexpr size_t kBufSize = 1024;
constexpr int kWaitMs = 5000;  // for any one step of a peer

int64_t nowMs() {
    return std::chrono::duration_cast<std::chrono::milliseconds>(
               std::chrono::steady_clock::now().time_since_epoch())
        .count();
}

bool loopback(const char *address, in_addr *out) {
    return inet_pton(AF_INET, address, out) == 1 && (ntohl(out->s_addr) >> 24) == 127;
}

// Input on `fd` (or the stop pipe) within timeoutMs: 1 fd readable, 0 timed out
// or stopped.
int waitIn(int fd, int stopFd, int timeoutMs) {
    const int64_t deadline = nowMs() + timeoutMs;
    for (;;) {
        const int64_t left = deadline - nowMs();
        if (left <= 0) return 0;
        pollfd p[2] = {{fd, POLLIN, 0}, {stopFd, POLLIN, 0}};
        const int rc = ::poll(p, stopFd >= 0 ? 2 : 1, static_cast<int>(left));
        if (rc < 0 && errno == EINTR) continue;
        if (rc <= 0) return 0;
        if (stopFd >= 0 && p[1].revents != 0) return 0;
        return 1;
    }
}

}  // namespace

bool ReadSome(int fd, std::string &into) {
    char buf[kBufSize];
    ssize_t n;
    do {
        n = ::recv(fd, buf, sizeof buf, 0);
    } while (n < 0 && errno == EINTR);
    if (n <= 0) return false;
    into.append(buf, static_cast<size_t>(n));
    return true;
}

void SendAll(int fd, const std::string &bytes) {
    size_t done = 0;
    while (done < bytes.size()) {
        const ssize_t n = ::send(fd, bytes.data() + done, bytes.size() - done, MSG_NOSIGNAL);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) return;
        done += static_cast<size_t>(n);
    }
}

Responder Scripted(std::vector<Step> steps, Step after) {
    return [steps = std::move(steps), after = std::move(after)](size_t connection, const std::string &) {
        return connection < steps.size() ? steps[connection] : after;
    };
}

Responder AnswerAll(std::string answer) {
    return [answer = std::move(answer)](size_t, const std::string &) { return Step{answer}; };
}

uint16_t FreePort() {
    const int fd = ::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd < 0) return 0;
    sockaddr_in sa{};
    sa.sin_family = AF_INET;
    sa.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    socklen_t len = sizeof sa;
    uint16_t port = 0;
    if (::bind(fd, reinterpret_cast<sockaddr *>(&sa), sizeof sa) == 0 &&
        ::getsockname(fd, reinterpret_cast<sockaddr *>(&sa), &len) == 0) {
        port = ntohs(sa.sin_port);
    }
    ::close(fd);
    return port;
}

// ---- server

Server::Server(Responder responder, const char *address, uint16_t port) : responder_(std::move(responder)) {
    sockaddr_in sa{};
    sa.sin_family = AF_INET;
    sa.sin_port = htons(port);
    if (!loopback(address, &sa.sin_addr) || ::pipe2(stopPipe_, O_CLOEXEC) != 0) return;
    listenFd_ = ::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    const int on = 1;
    socklen_t len = sizeof sa;
    if (listenFd_ < 0 || ::setsockopt(listenFd_, SOL_SOCKET, SO_REUSEADDR, &on, sizeof on) != 0 ||
        ::bind(listenFd_, reinterpret_cast<sockaddr *>(&sa), sizeof sa) != 0 || ::listen(listenFd_, 5) != 0 ||
        ::getsockname(listenFd_, reinterpret_cast<sockaddr *>(&sa), &len) != 0) {
        if (listenFd_ >= 0) ::close(listenFd_);
        listenFd_ = -1;
        return;
    }
    port_ = ntohs(sa.sin_port);
    thread_ = std::thread(&Server::run, this);
}

Server::~Server() {
    stop();
    for (int &fd : stopPipe_) {
        if (fd >= 0) ::close(fd);
        fd = -1;
    }
}

void Server::stop() {
    if (thread_.joinable()) {
        const char c = 's';
        while (::write(stopPipe_[1], &c, 1) < 0 && errno == EINTR) {
        }
        thread_.join();
    }
    if (listenFd_ >= 0) ::close(listenFd_);
    listenFd_ = -1;
}

void Server::run() {
    for (size_t connection = 0;; ++connection) {
        // Wait for a connection until stopped; the stop pipe bounds the loop.
        pollfd p[2] = {{listenFd_, POLLIN, 0}, {stopPipe_[0], POLLIN, 0}};
        while (::poll(p, 2, -1) < 0) {
            if (errno != EINTR) return;
        }
        if (p[1].revents != 0) return;
        const int fd = ::accept4(listenFd_, nullptr, nullptr, SOCK_CLOEXEC);
        if (fd < 0) continue;
        serve(fd, connection);
        ::close(fd);
    }
}

void Server::serve(int fd, size_t connection) {
    std::string request;
    if (waitIn(fd, stopPipe_[0], kWaitMs) == 1 && ReadSome(fd, request)) {
        // A request is one write of one or two bytes; take a straggler too.
        while (request.size() < 2 && waitIn(fd, stopPipe_[0], 20) == 1 && ReadSome(fd, request)) {
        }
    }
    const Step step = responder_(connection, request);
    if (!step.answer.empty()) SendAll(fd, step.answer);
    {
        std::lock_guard<std::mutex> lock(mutex_);
        requests_.push_back(request);
    }
    served_.notify_all();
    if (step.hold) {
        // Until the test closes its end (or the server stops).
        std::string ignored;
        while (waitIn(fd, stopPipe_[0], 60000) == 1 && ReadSome(fd, ignored)) {
        }
    }
}

std::vector<std::string> Server::requests() const {
    std::lock_guard<std::mutex> lock(mutex_);
    return requests_;
}

bool Server::awaitServed(size_t count, int timeoutMs) const {
    std::unique_lock<std::mutex> lock(mutex_);
    return served_.wait_for(lock, std::chrono::milliseconds(timeoutMs), [&] { return requests_.size() >= count; });
}

// ---- client

Client::Client(std::vector<std::string> answers, uint16_t port, const char *address, int gapMs)
    : answers_(std::move(answers)), gapMs_(gapMs) {
    thread_ = std::thread(&Client::run, this, std::string(address), port);
}

Client::~Client() { join(); }

void Client::join() {
    if (thread_.joinable()) thread_.join();
}

bool Client::connected() const {
    std::lock_guard<std::mutex> lock(mutex_);
    return connected_;
}

std::string Client::received() const {
    std::lock_guard<std::mutex> lock(mutex_);
    return received_;
}

void Client::run(std::string address, uint16_t port) {
    sockaddr_in sa{};
    sa.sin_family = AF_INET;
    sa.sin_port = htons(port);
    if (!loopback(address.c_str(), &sa.sin_addr)) return;
    int fd = -1;
    for (const int64_t deadline = nowMs() + kWaitMs; nowMs() < deadline;) {
        fd = ::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
        if (fd < 0) return;
        if (::connect(fd, reinterpret_cast<sockaddr *>(&sa), sizeof sa) == 0) break;
        ::close(fd);
        fd = -1;
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    if (fd < 0) return;
    {
        std::lock_guard<std::mutex> lock(mutex_);
        connected_ = true;
    }
    auto take = [&](int timeoutMs) {
        std::string got;
        const bool open = (timeoutMs == 0 || waitIn(fd, -1, timeoutMs) == 1) && ReadSome(fd, got);
        std::lock_guard<std::mutex> lock(mutex_);
        received_ += got;
        return open;
    };
    bool open = take(kWaitMs);  // the command
    for (const std::string &answer : answers_) {
        if (!open) break;
        SendAll(fd, answer);
        // Whatever comes back within the pause; the pause also keeps this
        // answer from merging with the next one in a single read.
        const int64_t until = nowMs() + gapMs_;
        while (open && nowMs() < until) {
            if (waitIn(fd, -1, static_cast<int>(until - nowMs())) == 1) open = take(0);
        }
    }
    if (!answers_.empty()) {
        while (open) open = take(kWaitMs);  // until the test closes
    }
    ::close(fd);
}

}  // namespace uipeer
