// The test shell on the emulated print node: round trips of one command line
// with one result record, and download (H2T) throughput; each next to the raw
// emulated channel doing the same exchange in the same run (a device thread
// that reads the host's bytes with plain read() and answers as many bytes).
#include <fcntl.h>
#include <poll.h>
#include <unistd.h>

#include <atomic>
#include <string>
#include <thread>

#include "RatioReporter.h"
#include "adapter/USB.h"
#include "common/Wait.h"
#include "maa/MAA_Address.h"
#include "maa/MAA_Hook.h"
#include "maa/MAA_Symbol.h"
#include "support/MaaRecords.h"
#include "vdev.h"
#include "vendor/VLX_Main.h"

namespace {

const std::string kLine = "probe(1)\r";
const std::string kStart = "MAASTART";
const std::string kStop = "MAA-STOP\r";
constexpr size_t kAckBytes = 8;
constexpr size_t kRecordBytes = 12 + 16;  // header + "probe result 16b"
U8 aubText[] = "probe result 16b";
TMAAResult stResult;

TMAAResult *probe(U32) {
    stResult = {MAA_RESULT_END, 1, 16, aubText};
    return &stResult;
}

void Expect(size_t bytes, benchmark::State &state) {
    if (vdev::HostReadAtLeast(vdev::kPrn, bytes, 10000).size() != bytes) state.SkipWithError("device answer missing");
}

// The device side: either the shell's session or a plain reader that answers
// `answer` bytes whenever it has taken `take` bytes from the host.
class Device {
public:
    explicit Device(bool shell, size_t take = 0, size_t answer = 0) : shell_(shell) {
        vdev::Reset();
        // Bytes a former device's session read ahead are not this one's (the
        // library's park step forgets them when its channel closes).
        Wait_PutBack(-1, nullptr, 0, false);
        IsDisconnected = 0;
        fd_ = ::open(vdev::kPrn, O_RDWR);
        ulDrvHandle = static_cast<U32>(fd_);
        if (shell_) {
            MAA_SymbolClear();
            MAA_SymbolAdd(ftarget_ppc, "probe", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<probe>(), 1);
            // Session after session, as the reader runs them (downloads live
            // as long as their session).
            thread_ = std::thread([this] {
                while (!stop_) {
                    U8 cmd[10] = {0x1B, 'w'};
                    MAA_Hook(static_cast<U32>(fd_), cmd);
                }
            });
        } else {
            thread_ = std::thread([this, take, answer] { Echo(take, answer); });
        }
    }
    ~Device() {
        stop_ = true;
        // Ends an open session, or is a wrong start command for the next one.
        vdev::HostWrite(vdev::kPrn, shell_ ? kStop : "x");
        thread_.join();
        ::close(fd_);
    }

private:
    void Echo(size_t take, size_t answer) {
        std::string buf(1 << 16, '\0'), reply(answer, 'r');
        for (size_t got = 0; !stop_;) {
            pollfd p{fd_, POLLIN, 0};
            if (::poll(&p, 1, 5000) < 1) continue;
            ssize_t n = ::read(fd_, buf.data(), buf.size());
            if (n <= 0) continue;
            got += static_cast<size_t>(n);
            if (got < take) continue;
            got = 0;
            if (::write(fd_, reply.data(), reply.size()) != static_cast<ssize_t>(reply.size())) return;
        }
    }

    bool shell_;
    int fd_ = -1;
    std::atomic<bool> stop_{false};
    std::thread thread_;
};

void RoundTrip(benchmark::State &state, bool shell) {
    Device device(shell, kLine.size(), kRecordBytes);
    if (shell) {
        vdev::HostWrite(vdev::kPrn, kStart);
        Expect(kAckBytes, state);
    }
    for (auto _ : state) {
        vdev::HostWrite(vdev::kPrn, kLine);
        Expect(kRecordBytes, state);
    }
    state.SetItemsProcessed(state.iterations());
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * kLine.size()));
}
void BM_RoundTrip_Raw(benchmark::State &state) { RoundTrip(state, false); }
void BM_RoundTrip_Shell(benchmark::State &state) { RoundTrip(state, true); }
BENCHMARK(BM_RoundTrip_Raw)->UseRealTime();
BENCHMARK(BM_RoundTrip_Shell)->UseRealTime();

// A session with one download of range(0) bytes, then a command line (its
// record proves the device has taken the whole file), then the stop.
void Download(benchmark::State &state, bool shell) {
    const size_t size = static_cast<size_t>(state.range(0));
    const std::string head = maarec::Special(MAA_FILE_TRANS_H2T, static_cast<U32>(size));
    const std::string transfer = kStart + head + maarec::Pattern(size) + kLine + kStop;
    const size_t answer = kAckBytes + 4 + kRecordBytes + kAckBytes;
    Device device(shell, transfer.size(), answer);
    for (auto _ : state) {
        vdev::HostWrite(vdev::kPrn, transfer);
        Expect(answer, state);
    }
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * size));
}
void BM_Download_Raw(benchmark::State &state) { Download(state, false); }
void BM_Download_Shell(benchmark::State &state) { Download(state, true); }
BENCHMARK(BM_Download_Raw)->Arg(64 << 10)->Arg(1 << 20)->UseRealTime();
BENCHMARK(BM_Download_Shell)->Arg(64 << 10)->Arg(1 << 20)->UseRealTime();

}  // namespace

int main(int argc, char **argv) {
    if (!RatioReporter::Initialize(&argc, argv, 9)) return 1;
    RatioReporter reporter;
    reporter.Compare("BM_RoundTrip_Shell", "BM_RoundTrip_Raw");
    reporter.Compare("BM_Download_Shell/65536", "BM_Download_Raw/65536");
    reporter.Compare("BM_Download_Shell/1048576", "BM_Download_Raw/1048576");
    reporter.RunAll();
    return 0;
}
