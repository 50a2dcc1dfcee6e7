#include "maa/functions/MAA_ScanDriver.h"

#include <fcntl.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <cstdarg>
#include <cstdio>
#include <cstring>

#include "common/Log.h"
#include "maa/MAA_Address.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_Result.h"
#include "maa/functions/MAA_SysResult.h"
#include "platform/Platform.h"
#include "usbadapter/maadrivers.h"

S32 fdScnDrv = -1;

namespace {

// A host must not be able to stop the process: every failure, the platform's
// data blocks included, ends the command with a final text instead.
TMAAResult *reportFailure(const char *message) {
    USBADP_LOG(ERROR, "[MAA] %s\n", message);
    SysPBA_IF_PrintResult(reinterpret_cast<const U8 *>(message), 0, 2);
    return &stMAASysResult;
}

// The response buffer handed to the driver by its kernel address.
class ResponseBlock {
public:
    ResponseBlock() {
        ticket_ = DataBlock_CreateFromPool(DBPool_GetSystemPoolID(), SCAN_MAA_RESPONSE_LENGTH);
        if (ticket_ == nullptr) {
            failure_ = "critical error! failed to create data block";
            return;
        }
        memory_ = static_cast<U8 *>(DataBlock_Access(ticket_));
        if (memory_ == nullptr) {
            failure_ = "critical error! failed to access data block";
            return;
        }
        std::memset(memory_, 0, SCAN_MAA_RESPONSE_LENGTH);
        kerAddr_ = DataBlock_GetKerVirtAddress(ticket_);
        if (kerAddr_ == 0) failure_ = "critical error! failed to get data block address";
    }
    ~ResponseBlock() {
        if (ticket_ == nullptr) return;
        if (memory_ != nullptr) DataBlock_Deaccess(ticket_);
        DataBlock_ReleaseTicket(ticket_);
    }
    ResponseBlock(const ResponseBlock &) = delete;
    ResponseBlock &operator=(const ResponseBlock &) = delete;

    const char *failure() const { return failure_; }
    U8 *memory() const { return memory_; }
    U32 kerAddr() const { return kerAddr_; }

private:
    DataBlockTicket ticket_ = nullptr;
    U8 *memory_ = nullptr;
    U32 kerAddr_ = 0;
    const char *failure_ = nullptr;
};

// The scanner driver opened into fdScnDrv for one command.
class ScannerDevice {
public:
    ScannerDevice() { fdScnDrv = ::open(SCAN_DEVICE_NAME, O_RDWR | O_CLOEXEC); }
    ~ScannerDevice() {
        if (fdScnDrv >= 0) ::close(fdScnDrv);
        fdScnDrv = -1;
    }
    ScannerDevice(const ScannerDevice &) = delete;
    ScannerDevice &operator=(const ScannerDevice &) = delete;
    bool open() const { return fdScnDrv >= 0; }
};

// The command line on the driver; nullptr, with `result` the response bytes
// (clamped to the buffer), or the failure text.
const char *runOnDriver(TMAAScanTest &rec, U32 &result) {
    ScannerDevice dev;
    if (!dev.open()) return "critical error! failed to open scan device";
    if (!MAA_ScanAppLock(fdScnDrv)) return "scanner is busy or in sleep";
    if (::ioctl(fdScnDrv, IOC_MAA_TEST, &rec) != 0) {
        MAA_ScanAppRelease(fdScnDrv);
        return "critical error! failed to control device";
    }
    result = rec.result;
    if (result > SCAN_MAA_RESPONSE_LENGTH) {
        USBADP_LOG(WARN, "[MAA] result is larger than allocation (%lu)\n", static_cast<unsigned long>(result));
        result = SCAN_MAA_RESPONSE_LENGTH;
    }
    MAA_ScanAppRelease(fdScnDrv);
    return nullptr;
}

template <typename... W>
TMAAResult *scanCommand(const char *name, W... words) {
    const U32 list[] = {static_cast<U32>(words)..., 0};
    char line[SCAN_MAA_COMMAND_LENGTH];
    MAA_FormatCommand(line, sizeof line, name, list, sizeof...(W));
    return MAA_ScanFunction("%s", line);
}

}  // namespace

void MAA_FormatCommand(char *line, size_t size, const char *name, const U32 *words, size_t count) {
    if (size == 0) return;
    int n = std::snprintf(line, size, "%s(", name);
    for (size_t i = 0; i < count && n >= 0 && static_cast<size_t>(n) < size; ++i) {
        n += std::snprintf(line + n, size - static_cast<size_t>(n), i == 0 ? "%lu" : ",%lu",
                           static_cast<unsigned long>(words[i]));
    }
    if (n >= 0 && static_cast<size_t>(n) < size) std::snprintf(line + n, size - static_cast<size_t>(n), ")");
}

bool MAA_ScanAppLock(S32 fd) {
    for (U32 attempt = 0;; ++attempt) {
        if (::ioctl(fd, IOCNR_SCAN_APP_LOCK) == SCAN_APP_LOCK_TAKEN) return true;
        if (attempt == SCAN_MAA_RETRY_COUNT) return false;
        USBADP_LOG(DEBUG, "[MAA] scanner lock: retry %u\n", static_cast<unsigned>(attempt + 1));
        MAA_SleepMs(1000);
    }
}

void MAA_ScanAppRelease(S32 fd) {
    if (::ioctl(fd, IOCNR_SCAN_APP_LOCK_RELEASE) != 0) USBADP_LOG(ERROR, "[MAA] scanner lock: release failed\n");
}

TMAAResult *MAA_ScanFunction(const char *format, ...) {
    TMAAScanTest rec;
    std::memset(&rec, 0, sizeof rec);
    va_list ap;
    va_start(ap, format);
    std::vsnprintf(rec.string, sizeof rec.string, format, ap);
    va_end(ap);
    USBADP_LOG(INFO, "[MAA] %s : start\n", rec.string);

    ResponseBlock block;
    if (block.failure() != nullptr) return reportFailure(block.failure());
    rec.bufphys = block.kerAddr();
    rec.bufsize = SCAN_MAA_RESPONSE_LENGTH;
    rec.jobid = SCAN_MAA_TEST_ID;

    U32 result = 0;
    if (const char *failure = runOnDriver(rec, result)) return reportFailure(failure);

    // Straight from the block: the response is ready frames and far larger than
    // the shared data area.
    stMAASysResult = {MAA_RESULT_CONTINUE, 1, result, block.memory()};
    MAA_WriteResultForward(&stMAASysResult);
    // The block goes away with this function; nothing is left to send.
    stMAASysResult = {MAA_RESULT_NONE, 1, 0, aubSysData};
    return &stMAASysResult;
}

// ---- the scanner-side names: each passes its own call on as the command line

TMAAResult *ADFMotorTest(U32 a, U32 b, U32 c, U32 d) { return scanCommand(__func__, a, b, c, d); }
TMAAResult *CompensateScanPositionValue(U32 a, U32 b) { return scanCommand(__func__, a, b); }
TMAAResult *DADFFeedTest(U32 a, U32 b) { return scanCommand(__func__, a, b); }
TMAAResult *DADFPaperPathTimeTest(U32 a) { return scanCommand(__func__, a); }
TMAAResult *DADFSensorTest() { return scanCommand(__func__); }
TMAAResult *GetScanFanTest(U32 a) { return scanCommand(__func__, a); }
TMAAResult *GetScanSensorTest(U32 a) { return scanCommand(__func__, a); }
TMAAResult *ManualCompensateScanDeSkew(U32 a, U32 b, U32 c) { return scanCommand(__func__, a, b, c); }
TMAAResult *ManualCompensateScanPosition(U32 a, U32 b, U32 c, U32 d, U32 e, U32 f) {
    return scanCommand(__func__, a, b, c, d, e, f);
}
TMAAResult *ManualWidthAdjust(U32 a, U32 b, U32 c) { return scanCommand(__func__, a, b, c); }
TMAAResult *PBA_IP_IfPathTest(U32 a, U32 b, U32 c, U32 d) { return scanCommand(__func__, a, b, c, d); }
TMAAResult *PlatenMotorNoiseTest(U32 a) { return scanCommand(__func__, a); }
TMAAResult *PWM_Scan_Test(U32 a, U32 b, U32 c, U32 d, U32 e, U32 f, U32 g) {
    return scanCommand(__func__, a, b, c, d, e, f, g);
}
TMAAResult *ScanMotorTest(U32 a) { return scanCommand(__func__, a); }
TMAAResult *ScanPatchDetect_Test() { return scanCommand(__func__); }
TMAAResult *ScanToInspectionDust() { return scanCommand(__func__); }
TMAAResult *Step_Mot_Test_Scan(U32 a, U32 b, U32 c, U32 d) { return scanCommand(__func__, a, b, c, d); }
TMAAResult *SysPBA_IO_Scn_GPITest(U32 a, U32 b, U32 c) { return scanCommand(__func__, a, b, c); }
TMAAResult *SysPBA_IO_Scn_GPOTest(U32 a, U32 b, U32 c, U32 d) { return scanCommand(__func__, a, b, c, d); }
TMAAResult *UART_Test_SCN(U32 a, U32 b, U32 c, U32 d) { return scanCommand(__func__, a, b, c, d); }
TMAAResult *GetShadingData(U32 a) { return scanCommand(__func__, a); }
TMAAResult *ScanJobTest1(U32 a) { return scanCommand(__func__, a); }
TMAAResult *ScanJobTest2(U32 a, U32 b) { return scanCommand(__func__, a, b); }
TMAAResult *ScanJobTest3(U32 a, U32 b, U32 c) { return scanCommand(__func__, a, b, c); }
TMAAResult *ScanJobTest4(U32 a, U32 b, U32 c, U32 d) { return scanCommand(__func__, a, b, c, d); }
TMAAResult *ScanBalanceCorrection(U32 a) { return scanCommand(__func__, a); }

// The text argument is read through the shell's address map only; a refused
// address ends the command before the driver is asked anything.
TMAAResult *SFRReadWrite(U32 a, U32 text, U32 c) {
    const char *s = MAA_AddrString(text);
    if (s == nullptr) return reportFailure("critical error! invalid text argument");
    return MAA_ScanFunction("SFRReadWrite(%lu,\"%s\",%lu)", static_cast<unsigned long>(a), s,
                            static_cast<unsigned long>(c));
}

TMAAResult *GetADFInfo() {
    MAA_ReportF(0, "[ %s ]", "GetADFInfo");
    ScannerDevice dev;
    if (!dev.open()) return MAA_ReportF(1, "critical error! failed to open scan device");
    TADFMechaType mecha{};
    if (::ioctl(fdScnDrv, IOC_ADF_MECHA_TYPE, &mecha) != 0) return MAA_ReportF(1, "Read ADF Type Fails");
    U32 multi = 0;
    if (::ioctl(fdScnDrv, IOC_ADF_MULTI_MECHA_TYPE, &multi) != 0) return MAA_ReportF(1, "Read ADF Multi Type Fails");
    return MAA_ReportF(1, "ADFType=%lu MultiType=%lu Version=%lu", static_cast<unsigned long>(mecha.ulType),
                       static_cast<unsigned long>(multi), static_cast<unsigned long>(mecha.ulVersion));
}
