// The scanner driver model behind /dev/scanner: the application lock, test
// command lines (answered into the caller's data block through the platform's
// kernel-address map) and the ADF mechanism reads.
#include <algorithm>
#include <cerrno>
#include <cstring>
#include <deque>

#include "Model.h"
#include "platform/Platform.h"
#include "vdev.h"

namespace vdev {

namespace {

struct Scanner {
    std::deque<int> lockAnswers;
    int lockDefault = SCAN_APP_LOCK_TAKEN;
    bool locked = false;
    ScanTestAnswer answer;
    std::vector<std::string> commands;
    TADFMechaType mecha{};
    uint32_t multiMecha = 0;
};

Scanner &S() {
    static Scanner *s = new Scanner;
    return *s;
}

void Keep(std::vector<uint8_t> &payload, const void *p, size_t size) {
    const uint8_t *b = static_cast<const uint8_t *>(p);
    payload.assign(b, b + size);
}

int Lock(detail::IoctlContext &ctx) {
    if (ctx.injectedError) return -ctx.injectedError;
    Scanner &s = S();
    int answer = s.lockDefault;
    if (!s.lockAnswers.empty()) {
        answer = s.lockAnswers.front();
        s.lockAnswers.pop_front();
    }
    if (answer == SCAN_APP_LOCK_TAKEN) s.locked = true;
    return answer;
}

int MaaTest(detail::IoctlContext &ctx, void *arg) {
    if (!detail::IsPointer(arg)) return -EFAULT;
    TMAAScanTest rec;
    std::memcpy(&rec, arg, sizeof rec);
    Keep(ctx.payload, &rec, sizeof rec);
    if (ctx.injectedError) return -ctx.injectedError;
    Scanner &s = S();
    s.commands.emplace_back(rec.string, strnlen(rec.string, sizeof rec.string));
    const ScanTestAnswer &a = s.answer;
    if (a.status < 0) return a.status;
    const uint32_t size = static_cast<uint32_t>(std::min<size_t>(a.response.size(), rec.bufsize));
    if (size != 0) {
        void *buf = DataBlock_HostFromKerVirt(rec.bufphys, size);
        if (buf == nullptr) return -EFAULT;
        std::memcpy(buf, a.response.data(), size);
    }
    rec.result = a.result ? *a.result : static_cast<uint32_t>(a.response.size());
    rec.success = a.success;
    std::memcpy(arg, &rec, sizeof rec);
    return a.status;
}

}  // namespace

namespace detail {

void ScannerReset() { S() = Scanner{}; }

int ScannerIoctl(IoctlContext &ctx, unsigned long request, void *arg) {
    Scanner &s = S();
    const int fail = ctx.injectedError;
    switch (request) {
    case IOCNR_SCAN_APP_LOCK: return Lock(ctx);
    case IOCNR_SCAN_APP_LOCK_RELEASE:
        if (fail) return -fail;
        s.locked = false;
        return 0;
    case IOC_MAA_TEST: return MaaTest(ctx, arg);
    case IOC_ADF_MECHA_TYPE:
        if (fail) return -fail;
        if (!IsPointer(arg)) return -EFAULT;
        std::memcpy(arg, &s.mecha, sizeof s.mecha);
        Keep(ctx.payload, &s.mecha, sizeof s.mecha);
        return 0;
    case IOC_ADF_MULTI_MECHA_TYPE:
        if (fail) return -fail;
        if (!IsPointer(arg)) return -EFAULT;
        std::memcpy(arg, &s.multiMecha, sizeof s.multiMecha);
        Keep(ctx.payload, &s.multiMecha, sizeof s.multiMecha);
        return 0;
    default: return fail ? -fail : -ENOTTY;
    }
}

}  // namespace detail

// ---- test-side API ------------------------------------------------------------------

void QueueScanLockAnswers(const std::vector<int> &answers) {
    std::lock_guard lk(detail::ModelMutex());
    S().lockAnswers.insert(S().lockAnswers.end(), answers.begin(), answers.end());
}

void SetScanLockDefault(int answer) {
    std::lock_guard lk(detail::ModelMutex());
    S().lockDefault = answer;
}

bool ScanLocked() {
    std::lock_guard lk(detail::ModelMutex());
    return S().locked;
}

void SetScanTestAnswer(const ScanTestAnswer &answer) {
    std::lock_guard lk(detail::ModelMutex());
    S().answer = answer;
}

std::vector<std::string> ScanCommands() {
    std::lock_guard lk(detail::ModelMutex());
    return S().commands;
}

void SetADFMecha(uint32_t type, uint32_t version, uint32_t multiType) {
    std::lock_guard lk(detail::ModelMutex());
    S().mecha = {type, version};
    S().multiMecha = multiType;
}

}  // namespace vdev
