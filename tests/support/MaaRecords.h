// What the host receives from the test shell: result records caught from the
// shell's writer, commands caught by the runner, pauses caught by the sleeper,
// and the wire forms of frames.
#pragma once

#include <sys/socket.h>
#include <unistd.h>

#include <optional>
#include <ostream>
#include <string>
#include <vector>

#include "common/ByteOrder.h"
#include "maa/MAA_Types.h"
#include "support/Bytes.h"

namespace maarec {

// A record; an expected one without a result code matches any code.
struct Rec {
    U32 st;
    std::string data;
    std::optional<U32> res;
    bool operator==(const Rec &o) const { return st == o.st && data == o.data && (!res || !o.res || *res == *o.res); }
};
inline std::ostream &operator<<(std::ostream &os, const Rec &r) {
    os << (r.st == MAA_RESULT_END ? "END " : r.st == MAA_RESULT_CONTINUE ? "CONT " : "NONE ");
    if (r.res) os << *r.res << ' ';
    return os << '"' << r.data << '"';
}
using Recs = std::vector<Rec>;
inline Rec Cont(const std::string &t, std::optional<U32> res = {}) { return {MAA_RESULT_CONTINUE, t, res}; }
inline Rec End(const std::string &t, std::optional<U32> res = {}) { return {MAA_RESULT_END, t, res}; }

inline Rec Of(const TMAAResult *r) {
    return {r->enContinue, r->pubData ? std::string(reinterpret_cast<const char *>(r->pubData), r->ulDataSize) : "",
            r->ulResult};
}
inline Recs written;
inline void Capture(const TMAAResult *r) { written.push_back(Of(r)); }
// The records written at once, then the returned one.
inline Recs Seen(const TMAAResult *returned) {
    Recs all = written;
    if (returned) all.push_back(Of(returned));
    return all;
}

inline std::vector<std::string> commands;
inline int RecordCommand(const char *command, auto) {
    commands.emplace_back(command);
    return 0;
}
inline std::vector<U32> sleeps;
inline void RecordSleep(U32 ms) { sleeps.push_back(ms); }

inline std::string BE32(U32 v) {
    std::string s(4, '\0');
    WriteBE32(reinterpret_cast<U8 *>(s.data()), v);
    return s;
}
// A result frame as the host receives it; the size field may lie.
inline std::string Frame(U32 st, U32 res, const std::string &data, std::optional<U32> size = {}) {
    return BE32(st) + BE32(res) + BE32(size ? *size : static_cast<U32>(data.size())) + data;
}
// The device's acknowledgement of the start and stop commands.
inline const std::string kAck("\x1bwMAA-OK", 8);
// A special command line, host to device.
inline std::string Special(U8 code, U32 size) {
    return std::string("#$%") + static_cast<char>(code) + BE32(size) + "\r";
}
// A file-transfer frame, device to host.
inline std::string Transfer(U8 op, U32 size) { return std::string("#$%") + static_cast<char>(op) + BE32(size) + BE32(size); }
// Recognisable bytes.
inline std::string Pattern(size_t n) {
    std::string s(n, '\0');
    for (size_t i = 0; i < n; ++i) s[i] = static_cast<char>(i * 7 + 3);
    return s;
}
// The session's channel as a packet socket pair: the device writes on
// `device`, and each of its writes is read back apart, one string each.
struct PacketChannel {
    int device = -1, host = -1;
    PacketChannel() {
        int sp[2];
        if (::socketpair(AF_UNIX, SOCK_SEQPACKET, 0, sp) == 0) device = sp[0], host = sp[1];
    }
    ~PacketChannel() {
        ::close(device);
        ::close(host);
    }
    PacketChannel(const PacketChannel &) = delete;
    PacketChannel &operator=(const PacketChannel &) = delete;
    std::vector<std::string> Writes() const {
        std::vector<std::string> out;
        std::string buf(1 << 16, '\0');
        for (ssize_t n; (n = ::recv(host, buf.data(), buf.size(), MSG_DONTWAIT)) >= 0;) out.push_back(buf.substr(0, n));
        return out;
    }
};

}  // namespace maarec
