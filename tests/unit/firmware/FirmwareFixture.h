// Firmware download over the emulated print node and a real update manager on
// loopback (the update-manager simulator, or a scripted peer whose answers a
// test chooses byte by byte). Every test runs in its own working directory,
// where "fw.bin" lands.
#pragma once

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <cstring>
#include <filesystem>
#include <string>
#include <thread>
#include <vector>

#include "FwPack.h"
#include "LoggerHost.h"
#include "UpdateManagerSim.h"
#include "adapter/USB.h"
#include "common/ByteOrder.h"
#include "firmware/FirmWareUpdate.h"
#include "firmware/UpdateManager.h"
#include "support/Bytes.h"
#include "support/Loopback.h"
#include "support/RandomBytes.h"
#include "vdev.h"

namespace fwtest {

// The 80-byte header a host puts in front of an image.
using fwpack::Header;

inline int OpenDescriptors() {
    int n = 0;
    for ([[maybe_unused]] auto &e : std::filesystem::directory_iterator("/proc/self/fd")) ++n;
    return n;
}

// A manager that answers with bytes fixed in advance, all at once, and keeps
// everything the library sends. The answers go out once `answerAfter` bytes
// have come, as a manager answers what it has read.
class ScriptedPeer {
public:
    ScriptedPeer(std::string answers, size_t answerAfter) {
        fd_ = LoopbackSocket(4, &port_);
        thread_ = std::thread([this, answers = std::move(answers), answerAfter] { run(answers, answerAfter); });
    }
    ~ScriptedPeer() {
        finish();
        ::close(fd_);
    }
    uint16_t port() const { return port_; }
    // Everything the library sent, once it has closed the connection.
    std::string finish() {
        if (thread_.joinable()) thread_.join();
        return received_;
    }

private:
    void run(const std::string &answers, size_t answerAfter) {
        pollfd p{fd_, POLLIN, 0};
        if (::poll(&p, 1, 4000) != 1) return;
        const int conn = ::accept(fd_, nullptr, nullptr);
        // A library that never closes ends the exchange after 4 s of silence.
        const timeval idle{4, 0};
        ::setsockopt(conn, SOL_SOCKET, SO_RCVTIMEO, &idle, sizeof idle);
        char buf[4096];
        bool answered = false;
        for (ssize_t n; (n = ::recv(conn, buf, sizeof buf, 0)) > 0;) {
            received_.append(buf, static_cast<size_t>(n));
            if (!answered && received_.size() >= answerAfter) {
                ::send(conn, answers.data(), answers.size(), MSG_NOSIGNAL);
                answered = true;
            }
        }
        ::close(conn);
    }

    int fd_ = -1;
    uint16_t port_ = 0;
    std::thread thread_;
    std::string received_;
};

struct Outcome {
    S32 result;
    S32 firmware;
    std::string handedBack;  // the bytes of firmware_command the result counts
    std::string out;         // standard output: the '#' marks, the subsystem words
};

class FirmwareTest : public ::testing::Test {
protected:
    void SetUp() override {
        char tmpl[] = "/tmp/usbadapter-fw-XXXXXX";
        ASSERT_NE(::mkdtemp(tmpl), nullptr);
        dir_ = tmpl;
        std::filesystem::create_directories(dir_ + "/manager");
        oldCwd_ = std::filesystem::current_path();
        std::filesystem::current_path(dir_);
        LoggerHost_StartCapture();
        IsDisconnected = 0;
        hibernation_flag = 0;
        ReopenNode();
        ASSERT_GT(fd_, 0);
        // A silent manager costs this much per receive, not 5.5 s.
        UpdateManager_SetWaitMs(kShortWaitMs);
    }
    void TearDown() override {
        manager_.Stop();
        UpdateManager_SetWaitMs(-1);
        UpdateManager_SetProgressLimitMs(-1);
        ::unsetenv(UPDATE_PORT_ENV);
        if (fd_ > 0) ::close(fd_);
        vdev::Reset();
        IsDisconnected = 0;
        std::filesystem::current_path(oldCwd_);
        std::error_code ec;
        std::filesystem::remove_all(dir_, ec);
    }

    static constexpr int kShortWaitMs = 400;

    // A new emulated print node, nothing pending, its time-outs instant.
    void ReopenNode() {
        vdev::Reset();
        fd_ = ::open(vdev::kPrn, O_RDWR);
        vdev::SetInstantTimeouts(vdev::kPrn, true);
    }

    // What the host sent and nobody has read yet (the print reader's).
    std::string TakePending() {
        std::string all;
        char buf[4096];
        while (vdev::PendingHostBytes(vdev::kPrn) > 0) {
            ssize_t n = ::read(fd_, buf, sizeof buf);
            if (n <= 0) break;
            all.append(buf, static_cast<size_t>(n));
        }
        return all;
    }

    void UsePort(uint16_t port) { ::setenv(UPDATE_PORT_ENV, std::to_string(port).c_str(), 1); }

    void StartManager(peers::UmMisbehaviour m = peers::UmMisbehaviour::None) {
        peers::UmOptions o;
        o.dir = dir_ + "/manager";
        o.misbehaviour = m;
        o.ioTimeoutMs = 500;
        o.slowProgressMs = 50;
        std::string error;
        ASSERT_TRUE(manager_.Start(o, &error)) << error;
        UsePort(manager_.Port());
    }

    // The classifier has taken the first two bytes of `stream`; the host sends
    // the rest in `cuts` (sizes of transfers, the remainder in one).
    Outcome Download(const std::string &stream, std::vector<size_t> cuts = {}, U32 commandlen = 2) {
        size_t at = commandlen;
        for (size_t c : cuts) {
            vdev::HostWrite(vdev::kPrn, stream.substr(at, c));
            at += c;
        }
        if (at < stream.size()) vdev::HostWrite(vdev::kPrn, stream.substr(at));
        U8 command[FW_PJL_HEADER_SIZE + 8] = {};
        std::memcpy(command, stream.data(), std::min<size_t>(commandlen, stream.size()));
        U8 out[FW_PJL_HEADER_SIZE];
        std::memset(out, 0xEE, sizeof out);
        Outcome o{};
        o.firmware = -7;
        testing::internal::CaptureStdout();
        o.result = FirmWareDownload(fd_, command, commandlen, out, &o.firmware);
        o.out = testing::internal::GetCapturedStdout();
        if (o.result > 0 && o.result <= FW_PJL_HEADER_SIZE)
            o.handedBack.assign(reinterpret_cast<char *>(out), static_cast<size_t>(o.result));
        return o;
    }

    // A firmware file sent the way a host's driver cuts it: each header and
    // each body its own transfer.
    struct Image {
        std::string id, body;
    };
    Outcome DownloadImages(const std::vector<Image> &images) {
        std::string file;
        std::vector<size_t> cuts;
        for (const Image &im : images) {
            cuts.push_back(file.empty() ? 78 : 80);
            if (!im.body.empty()) cuts.push_back(im.body.size());
            file += Header(im.id, static_cast<uint32_t>(im.body.size())) + im.body;
        }
        cuts.pop_back();
        return Download(file, cuts);
    }

    std::string dir_;
    std::filesystem::path oldCwd_;
    int fd_ = -1;
    peers::UpdateManagerSim manager_;
};

}  // namespace fwtest
