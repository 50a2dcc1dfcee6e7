#include "maa/functions/MAA_FaxJbig.h"

#include <fcntl.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <optional>

#include "common/Log.h"
#include "common/UniqueFd.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_Result.h"
#include "maa/functions/MAA_ScanDriver.h"
#include "maa/functions/MAA_SysResult.h"
#include "usbadapter/maadrivers.h"

S32 fdFaxDrv = -1;

namespace {

// A driver node opened into one of the shared descriptor globals for one call.
class DriverFd {
public:
    DriverFd(S32 &global, const char *path) : global_(global) { global_ = ::open(path, O_RDWR | O_CLOEXEC); }
    ~DriverFd() {
        if (global_ >= 0) ::close(global_);
        global_ = -1;
    }
    DriverFd(const DriverFd &) = delete;
    DriverFd &operator=(const DriverFd &) = delete;
    bool open() const { return global_ >= 0; }

private:
    S32 &global_;
};

// The command on the fax driver, under the scanner lock when asked; nullptr or
// the failure text.
const char *runOnFax(TFaxMAATest &rec, bool scannerLock) {
    std::optional<DriverFd> scanner;
    if (scannerLock) {
        scanner.emplace(fdScnDrv, SCAN_DEVICE_NAME);
        if (!scanner->open()) return "critical error! failed to open scan device";
        if (!MAA_ScanAppLock(fdScnDrv)) return "scanner is busy or in sleep";
    }
    const char *failure = nullptr;
    {
        DriverFd fax(fdFaxDrv, FAX_DEVICE_NAME);
        if (!fax.open()) {
            failure = "critical error! failed to open fax device";
        } else if (::ioctl(fdFaxDrv, IOCNR_FAX_MAA_TEST, &rec) != 0) {
            failure = "critical error! failed to control fax device";
        }
    }
    if (scannerLock) MAA_ScanAppRelease(fdScnDrv);
    return failure;
}

template <typename... W>
TMAAResult *faxCommand(bool scannerLock, const char *name, W... words) {
    MAA_ReportF(0, "[ %s ]", name);
    TFaxMAATest rec;
    std::memset(&rec, 0, sizeof rec);
    const U32 list[] = {static_cast<U32>(words)..., 0};
    MAA_FormatCommand(rec.string, sizeof rec.string, name, list, sizeof...(W));
    USBADP_LOG(INFO, "[MAA] %s : start\n", rec.string);

    if (const char *failure = runOnFax(rec, scannerLock)) {
        USBADP_LOG(ERROR, "[MAA] %s\n", failure);
        SysPBA_IF_PrintResult(reinterpret_cast<const U8 *>(failure), 0, 2);
        return &stMAASysResult;
    }
    // The response is the driver's: bounded by its count, the record and a NUL.
    char text[FAX_MAA_RESPONSE_LENGTH + 1] = {};
    const size_t bound = rec.result < FAX_MAA_RESPONSE_LENGTH ? rec.result : FAX_MAA_RESPONSE_LENGTH;
    std::memcpy(text, rec.response, strnlen(rec.response, bound));
    const bool passed = rec.success == 1;
    if (text[0] == 0) std::snprintf(text, sizeof text, "%s %s", name, passed ? "DONE" : "FAIL");
    if (!passed) {
        SysPBA_IF_PrintResult(reinterpret_cast<const U8 *>(text), 0, 2);
        return &stMAASysResult;
    }
    SysPBA_IF_PrintResult(reinterpret_cast<const U8 *>(text), 1, 0);
    MAA_IF_WriteResult(&stMAASysResult);
    return &stMAASysResult;
}

constexpr bool kScannerLock = true;
constexpr bool kFaxOnly = false;

// One codec engine's self test; nullptr or the failure text (in `failure`).
const char *selfTest(const char *path, const char *engine, U32 pattern, char *failure, size_t size) {
    UniqueFd fd(::open(path, O_RDWR | O_CLOEXEC));
    if (!fd) {
        std::snprintf(failure, size, "Open %s Fails", path);
    } else if (::ioctl(fd.get(), JBIG_IOC_RESET) != 0) {
        std::snprintf(failure, size, "%s Reset Fails", engine);
    } else {
        TJBIGSelfTest rec{pattern, 0};
        if (::ioctl(fd.get(), JBIG_IOC_SELFTEST, &rec) != 0) {
            std::snprintf(failure, size, "%s Self Test Fails", engine);
        } else if (rec.ulStatus != 0) {
            USBADP_LOG(ERROR, "[MAA] %s self test status %lu\n", engine, static_cast<unsigned long>(rec.ulStatus));
            std::snprintf(failure, size, "%s = NG", engine);
        } else {
            return nullptr;
        }
    }
    return failure;
}

}  // namespace

TMAAResult *SetSpeakerTest(U32 a) { return faxCommand(kFaxOnly, __func__, a); }
TMAAResult *SysPBA_IO_Fax_GPITest(U32 a, U32 b, U32 c) { return faxCommand(kScannerLock, __func__, a, b, c); }
TMAAResult *SysPBA_IO_Fax_GPOTest(U32 a, U32 b, U32 c, U32 d) {
    return faxCommand(kScannerLock, __func__, a, b, c, d);
}
TMAAResult *PhoneTest_OHD(U32 a, U32 b, U32 c) { return faxCommand(kScannerLock, __func__, a, b, c); }
TMAAResult *PhoneTest_Dial(U32 a, U32 b, U32 c) { return faxCommand(kScannerLock, __func__, a, b, c); }
TMAAResult *PhoneTest_Ring(U32 a, U32 b) { return faxCommand(kScannerLock, __func__, a, b); }
TMAAResult *UART_Test_FAX(U32 a, U32 b, U32 c, U32 d) { return faxCommand(kScannerLock, __func__, a, b, c, d); }
TMAAResult *FaxModuleDetect_To_SCB() { return faxCommand(kFaxOnly, __func__); }

TMAAResult *HWJBIGTest(U32 pattern) {
    MAA_ReportF(0, "[ HWJBIGTest : Argument=%d ]", static_cast<int>(pattern));
    char failure[MAA_TEMP_DATA_SIZE];
    const char *f = selfTest(JBIG_ENC_DEVICE_NAME, "JBIG Encoder", pattern, failure, sizeof failure);
    if (f == nullptr) f = selfTest(JBIG_DEC_DEVICE_NAME, "JBIG Decoder", pattern, failure, sizeof failure);
    if (f != nullptr) return MAA_ReportF(1, "%s", f);
    return MAA_ReportF(1, "HWJBIG TEST DONE");
}
