// The print reader's resident memory while one long job streams through: a
// UEL-framed job of 1 GiB (PRINT_MEMORY_MIB overrides) sent in 1 MiB host
// transfers on the emulated print node, taken by the reader's passes and
// delivered to a native consumer that only counts and sums (Java would keep
// or spool the bytes; what is measured here is the library's side). VmRSS is
// taken after the first 64 MiB and then every 128 MiB; the figure is how far
// it moved after the first sample. Not a ratio benchmark: a figure with its
// check (exit status 1 when the job does not arrive whole or memory grew by
// more than 4 MiB), run by ctest too.
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <string>

#include "adapter/USB.h"
#include "adapter/prn_thread.h"
#include "common/Wait.h"
#include "print/USBPrint.h"
#include "support/RandomBytes.h"
#include "support/Uel.h"
#include "vdev.h"

namespace {

constexpr size_t kTransfer = 1 << 20;
struct Seen {
    int jobs = 0, ended = 0;
    uint64_t bytes = 0, sum = 0;
} gSeen;

S8 RegisterJob(const char *) {
    ++gSeen.jobs;
    return 1;
}
void PassData(U8 *data, S32 len) {
    for (S32 i = 0; i < len; ++i) gSeen.sum = gSeen.sum * 31 + data[i];
    gSeen.bytes += static_cast<uint64_t>(len);
}
void NotifyEndOfData() { ++gSeen.ended; }
S32 SendAppType(const char *) { return -1; }
S32 SendAppBuf(const char *, U8 *, S32) { return -1; }
S32 NotifyAppEnd(const char *) { return -1; }
const TPrintDelivery kCounter = {RegisterJob, PassData, NotifyEndOfData, SendAppType, SendAppBuf, NotifyAppEnd};

long RssKiB() {
    std::ifstream status("/proc/self/status");
    for (std::string line; std::getline(status, line);)
        if (line.rfind("VmRSS:", 0) == 0) return std::strtol(line.c_str() + 6, nullptr, 10);
    return -1;
}

// Turns of the reader until the host's bytes are all taken.
void Drain() {
    while (vdev::PendingHostBytes(vdev::kPrn) > 0 || Wait_PutBackLeft(fdPrn) > 0) USBAdapter_ReadPass();
}

}  // namespace

int main() {
    setenv("USBADAPTER_LOG_LEVEL", "OFF", 0);
    const char *mibText = std::getenv("PRINT_MEMORY_MIB");
    const uint64_t mib = mibText ? std::strtoull(mibText, nullptr, 10) : 1024;
    if (mib < 128) {
        std::fprintf(stderr, "print_memory: PRINT_MEMORY_MIB must be at least 128\n");
        return 2;
    }
    USBPrint_SetDelivery(&kCounter);
    if (USBAdapter_AllocateReadBuffers() != 1) return 1;
    InitializeVars();
    IsConfigured = 1;
    fdPrn = ::open(vdev::kPrn, O_RDWR);
    if (fdPrn.load() <= 0) return 1;
    vdev::SetInstantTimeouts(vdev::kPrn, true);

    // The body: bytes without ESC, so the job ends only at its closing UEL.
    std::string body = RandomBytes(kTransfer, 1);
    std::replace(body.begin(), body.end(), '\x1b', 'E');
    uint64_t want = 0;
    auto sum = [&want](const char *p, size_t n) {
        for (size_t i = 0; i < n; ++i) want = want * 31 + static_cast<unsigned char>(p[i]);
    };

    const std::string head = kUel + "@PJL ENTER LANGUAGE=PCL\r\n";
    vdev::HostWrite(vdev::kPrn, head);
    sum(head.data(), head.size());
    Drain();
    long first = -1, low = 0, high = 0;
    for (uint64_t i = 1; i <= mib; ++i) {
        vdev::HostWrite(vdev::kPrn, body);
        sum(body.data(), body.size());
        Drain();
        if (i == 64 || (i > 64 && i % 128 == 0) || i == mib) {
            const long rss = RssKiB();
            if (first < 0) first = low = high = rss;
            low = std::min(low, rss);
            high = std::max(high, rss);
            std::printf("after %4llu MiB: VmRSS %ld KiB\n", static_cast<unsigned long long>(i), rss);
        }
    }
    vdev::HostWrite(vdev::kPrn, kUel);
    sum(kUel.data(), kUel.size());
    Drain();
    USBAdapter_ReadPass();  // silence after the job

    const bool whole = gSeen.jobs == 1 && gSeen.ended == 1 && gSeen.sum == want &&
                       gSeen.bytes == head.size() + mib * kTransfer + kUel.size();
    std::printf("print_memory: %llu bytes in one job (%s); VmRSS %ld KiB after 64 MiB, %ld..%ld KiB after, "
                "growth %ld KiB\n",
                static_cast<unsigned long long>(gSeen.bytes), whole ? "whole" : "NOT WHOLE", first, low, high,
                high - first);
    const bool flat = high - first <= 4 * 1024;
    if (!flat) std::printf("print_memory: resident memory grew with the job\n");
    std::fflush(nullptr);
    _exit(whole && flat ? 0 : 1);
}
