// Arbitrary host traffic on the scan channel: the scan reader's turns and the
// protocol handlers over the emulated scan node with instant time-outs. Java is
// replaced by a delivery that checks what Java would be handed.
//
// Input: byte 0 chooses Java's answers (bits 0-2: which application call
// fails: 0 none, 1 SendAppType, 2 the first SendAppBuf, 3 the second, 4
// NotifyAppEnd); the rest is the host's traffic, in which FE FF ends a host
// transfer (a read never returns bytes of two). Empty transfers are not sent.
// The host sends everything, then its cable is out: a handler still waiting
// for the rest of a packet ends it. Every host byte must be taken within
// kTurnLimit turns; every forwarded transfer must be a whole packet of its
// protocol, within the packet's own length rule.
#include <fcntl.h>
#include <unistd.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "FuzzCheck.h"
#include "HostTraffic.h"
#include "adapter/USB.h"
#include "common/ByteOrder.h"
#include "print/USBPrint.h"
#include "scan/USBScan.h"
#include "scan/scan_thread.h"
#include "vdev.h"
#include "vendor/VLX_Main.h"

namespace {

constexpr size_t kTurnLimit = 100000;

struct Java {
    U8 failAt = 0;       // which call of a transfer answers -1
    int call = 0;        // calls of the transfer in progress
    bool open = false;
    std::string type;
    std::string bytes;   // header and body as written
} java;

void closeTransfer() {
    const std::string &t = java.type;
    const std::string &b = java.bytes;
    const auto u = [&](size_t i) { return static_cast<U8>(b[i]); };
    if (t == "pcscan") {
        CHECK(b.size() >= 4 && u(0) == 0x1B && u(1) == 0xA8, "pcscan transfer without its selector");
        const size_t length = u(3) + (u(2) == 0x24 ? 2u : 0u);
        CHECK(b.size() == 4 + length && length <= 0xFF, "pcscan transfer of another length than its own");
    } else if (t == "taviklight") {
        CHECK(b.size() >= 2 && b.size() <= 259 && u(0) == 0x1B && u(1) == 0xAA, "taviklight transfer malformed");
    } else if (t == "scan2pc") {
        CHECK(b.size() >= 8 && u(0) == 0x1B && u(1) == 0x9A, "scan2pc transfer without its header");
        if (b.size() > 8) {
            CHECK(u(2) == 0 || u(2) == 3, "scan2pc XML for a kind without one");
            CHECK(ReadBE32(reinterpret_cast<const U8 *>(b.data()) + 4) == b.size() - 8 && b.size() - 8 > 8, "scan2pc XML of another length");
        }
    } else if (t == "ids") {
        CHECK(b.size() == IMAGE_HEADER_SIZE && std::memcmp(b.data(), imageHeader, IMAGE_HEADER_SIZE) == 0,
              "ids transfer is not the ID-scan header");
    } else {
        fail("unknown application type");
    }
}

S32 SendAppType(const char *type) {
    CHECK(type != nullptr, "SendAppType without a type");
    CHECK(!java.open, "a transfer began inside another");
    java.call = 1;
    if (java.failAt == 1) return -1;
    java.open = true;
    java.type = type;
    java.bytes.clear();
    return 0;
}

S32 SendAppBuf(const char *type, U8 *buf, S32 len) {
    CHECK(java.open && type != nullptr && java.type == type, "SendAppBuf outside its transfer");
    CHECK(len >= 0 && (buf != nullptr || len == 0), "SendAppBuf with a bad buffer");
    // Copying every byte lets ASan check the range lies inside one buffer.
    java.bytes.append(reinterpret_cast<const char *>(buf), static_cast<size_t>(len));
    if (++java.call == java.failAt) {
        java.open = false;
        return -1;
    }
    return 0;
}

S32 NotifyAppEnd(const char *type) {
    CHECK(java.open && type != nullptr && java.type == type, "NotifyAppEnd outside its transfer");
    java.open = false;
    if (++java.call == java.failAt) return -1;
    closeTransfer();
    return 0;
}

S8 RegisterJob(const char *) { fail("a print job from the scan channel"); }
void PassData(U8 *, S32) { fail("print data from the scan channel"); }
void NotifyEndOfData() { fail("end of print data from the scan channel"); }

const TPrintDelivery kJava = {RegisterJob, PassData, NotifyEndOfData, SendAppType, SendAppBuf, NotifyAppEnd};

}  // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    setenv("USBADAPTER_LOG_LEVEL", "OFF", 0);
    USBPrint_SetDelivery(&kJava);
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    if (size < 1) return 0;
    vdev::Reset();
    java = Java{};
    java.failAt = data[0] & 0x07;
    IsConfigured = 1;
    IsDisconnected = 0;
    g_IsScanCanClose = 0;
    fdScan = -1;
    CHECK(USBAdpScan_Openfd() == 1, "scan node not opened");
    vdev::SetInstantTimeouts(vdev::kScan, true);

    for (const std::string &t : Split({reinterpret_cast<const char *>(data) + 1, size - 1}, "\xfe\xff"))
        if (!t.empty()) vdev::HostWrite(vdev::kScan, t.data(), t.size());
    // Everything is sent; what waits for more waits for a host that is gone.
    IsDisconnected = 1;
    size_t turns = 0;
    while (vdev::PendingHostBytes(vdev::kScan) > 0) {
        CHECK(++turns < kTurnLimit, "the reader stopped taking host data");
        USBAdpScan_ReadTurn();
    }
    CHECK(!java.open, "a transfer was left open");
    ::close(fdScan.exchange(-1));
    return 0;
}
