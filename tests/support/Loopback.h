// TCP on 127.0.0.1 for the peers the tests, targets and benches play (a UI server,
// an update manager, a plain sink): nothing outside this machine is reached.
#pragma once

#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>

inline sockaddr_in LoopbackAddress(uint16_t port) {
    sockaddr_in sa{};
    sa.sin_family = AF_INET;
    sa.sin_port = htons(port);
    sa.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    return sa;
}

// A socket on a free port (*port), listening with `backlog`; with a backlog
// of 0 only bound, so connections to it are refused. -1 on failure.
inline int LoopbackSocket(int backlog, uint16_t *port) {
    const int fd = ::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_in sa = LoopbackAddress(0);
    socklen_t len = sizeof sa;
    if (fd < 0 || ::bind(fd, reinterpret_cast<sockaddr *>(&sa), sizeof sa) != 0 ||
        (backlog > 0 && ::listen(fd, backlog) != 0) ||
        ::getsockname(fd, reinterpret_cast<sockaddr *>(&sa), &len) != 0) {
        if (fd >= 0) ::close(fd);
        return -1;
    }
    *port = ntohs(sa.sin_port);
    return fd;
}

// A connection to `port`, or -1. A signal does not stop the handshake, so a
// connect it interrupts is waited out by connecting again: giving up would
// leave a connection the other side may already have accepted.
inline int LoopbackConnect(uint16_t port) {
    const int fd = ::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd < 0) return -1;
    const sockaddr_in sa = LoopbackAddress(port);
    int rc;
    while ((rc = ::connect(fd, reinterpret_cast<const sockaddr *>(&sa), sizeof sa)) != 0 && errno == EINTR) {
    }
    if (rc == 0 || errno == EISCONN) return fd;
    ::close(fd);
    return -1;
}
