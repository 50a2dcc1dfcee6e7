// Firmware image hand-off: print channel → fw.bin → update manager, against
// two baselines in the same run: the same bytes sent over loopback TCP to a
// plain sink, and a bare relay of them off the channel through fw.bin to that
// sink (what the hand-off cannot do without). The
// host's header and body are one transfer each; every piece is written to
// fw.bin and sent on; the manager is the update-manager simulator, which
// reads and checksums every byte and keeps nothing on disk. A run whose images
// did not all arrive whole and verified reports an error, not a rate.
#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <benchmark/benchmark.h>

#include <cstdlib>
#include <filesystem>
#include <string>
#include <thread>

#include "FwPack.h"
#include "RatioReporter.h"
#include "UpdateManagerSim.h"
#include "firmware/FirmWareUpdate.h"
#include "support/Loopback.h"
#include "support/RandomBytes.h"
#include "vdev.h"

namespace {

// Standard output is where the library marks each block sent.
class MutedStdout {
public:
    MutedStdout() {
        std::fflush(stdout);
        saved_ = ::dup(1);
        int null = ::open("/dev/null", O_WRONLY);
        ::dup2(null, 1);
        ::close(null);
    }
    ~MutedStdout() {
        std::fflush(stdout);
        ::dup2(saved_, 1);
        ::close(saved_);
    }

private:
    int saved_;
};

void BM_FirmwareHandoff(benchmark::State &state) {
    const size_t size = static_cast<size_t>(state.range(0));
    const std::string body = RandomBytes(size, 7), header = fwpack::Header("E7", static_cast<uint32_t>(size));
    peers::UpdateManagerSim manager;
    std::string error;
    if (!manager.Start({}, &error)) {
        state.SkipWithError(error.c_str());
        return;
    }
    ::setenv("USBADAPTER_UPDATE_PORT", std::to_string(manager.Port()).c_str(), 1);
    vdev::Reset();
    int fd = ::open(vdev::kPrn, O_RDWR);
    vdev::SetInstantTimeouts(vdev::kPrn, true);
    MutedStdout muted;
    for (auto _ : state) {
        vdev::HostWrite(vdev::kPrn, header.substr(2));
        vdev::HostWrite(vdev::kPrn, body);
        U8 cmd[2] = {0x1B, '%'}, out[FW_PJL_HEADER_SIZE];
        S32 firmware = 0;
        if (FirmWareDownload(fd, cmd, 2, out, &firmware) != 0) {
            state.SkipWithError("download failed");
            break;
        }
    }
    ::close(fd);
    manager.WaitFor([&] { return manager.Active() == 0; }, 3000);
    for (const peers::UmImage &im : manager.Images())
        if (!im.complete || !im.checksumOk || im.received != size) {
            state.SkipWithError("an image did not reach the manager whole");
            break;
        }
    if (!manager.Errors().empty()) state.SkipWithError(manager.Errors().front().c_str());
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations()) * static_cast<int64_t>(size));
}
BENCHMARK(BM_FirmwareHandoff)->Arg(1 << 20)->Arg(16 << 20)->Unit(benchmark::kMillisecond)->UseRealTime();

// A loopback TCP peer for the baselines: reads `size` bytes per connection
// and answers one byte; an empty connection ends it.
class TcpSink {
public:
    explicit TcpSink(size_t size) {
        listen_ = LoopbackSocket(4, &port_);
        thread_ = std::thread([this, size] {
            std::string buf(1 << 16, '\0');
            for (;;) {
                int c = ::accept(listen_, nullptr, nullptr);
                if (c < 0) return;
                size_t got = 0;
                while (got < size) {
                    ssize_t n = ::recv(c, buf.data(), buf.size(), 0);
                    if (n <= 0) break;
                    got += static_cast<size_t>(n);
                }
                ::send(c, "1", 1, MSG_NOSIGNAL);
                ::close(c);
                if (got == 0) return;
            }
        });
    }
    ~TcpSink() {
        ::close(Connect());
        thread_.join();
        ::close(listen_);
    }
    int Connect() const { return LoopbackConnect(port_); }
    static void Ack(int s) {
        char ack;
        ::recv(s, &ack, 1, 0);
        ::close(s);
    }

private:
    int listen_;
    uint16_t port_ = 0;
    std::thread thread_;
};

// Baseline: the same bytes over loopback TCP in 64 KiB writes.
void BM_LoopbackTcp(benchmark::State &state) {
    const size_t size = static_cast<size_t>(state.range(0));
    const std::string body = RandomBytes(size, 7);
    TcpSink sink(size);
    for (auto _ : state) {
        int s = sink.Connect();
        for (size_t at = 0; at < size; at += 1 << 16) ::send(s, body.data() + at, std::min<size_t>(1 << 16, size - at), 0);
        TcpSink::Ack(s);
    }
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations()) * static_cast<int64_t>(size));
}
BENCHMARK(BM_LoopbackTcp)->Arg(1 << 20)->Arg(16 << 20)->Unit(benchmark::kMillisecond)->UseRealTime();

// The floor of the hand-off itself: the same transfers written by the host
// and read off the emulated print channel in 64 KiB pieces, each written to
// fw.bin and sent over loopback TCP. No header check, checksum or manager
// dialogue: what is left between this and the hand-off is the library's own.
void BM_ChannelFileTcp(benchmark::State &state) {
    const size_t size = static_cast<size_t>(state.range(0));
    const std::string body = RandomBytes(size, 7);
    TcpSink sink(size);
    vdev::Reset();
    int fd = ::open(vdev::kPrn, O_RDWR);
    std::string buf(1 << 16, '\0');
    for (auto _ : state) {
        vdev::HostWrite(vdev::kPrn, body);
        int file = ::open(TEMP_FW_IMAGE, O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0666);
        int s = sink.Connect();
        for (size_t left = size; left > 0;) {
            const ssize_t n = ::read(fd, buf.data(), std::min(left, buf.size()));
            if (n <= 0 || ::write(file, buf.data(), static_cast<size_t>(n)) != n) {
                state.SkipWithError("the relay lost bytes");
                break;
            }
            ::send(s, buf.data(), static_cast<size_t>(n), 0);
            left -= static_cast<size_t>(n);
        }
        ::close(file);
        TcpSink::Ack(s);
    }
    ::close(fd);
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations()) * static_cast<int64_t>(size));
}
BENCHMARK(BM_ChannelFileTcp)->Arg(1 << 20)->Arg(16 << 20)->Unit(benchmark::kMillisecond)->UseRealTime();

}  // namespace

int main(int argc, char **argv) {
    // fw.bin goes to the working directory.
    char tmpl[] = "/tmp/usbadapter-bench-fw-XXXXXX";
    const char *dir = ::mkdtemp(tmpl);
    if (dir) std::filesystem::current_path(dir);
    if (!RatioReporter::Initialize(&argc, argv, 9)) return 1;
    RatioReporter reporter;
    for (const char *baseline : {"BM_LoopbackTcp/", "BM_ChannelFileTcp/"})
        for (int size : {1 << 20, 16 << 20})
            reporter.Compare("BM_FirmwareHandoff/" + std::to_string(size), baseline + std::to_string(size));
    reporter.RunAll();
    if (dir) std::filesystem::remove_all(dir);
    return 0;
}
