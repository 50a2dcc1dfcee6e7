#include "maa/functions/MAA_CpuTemp.h"

#include <sys/stat.h>
#include <sys/utsname.h>

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <memory>
#include <new>
#include <string>

#include "common/FixedPath.h"
#include "common/JniUtil.h"
#include "common/Log.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_Result.h"
#include "maa/functions/MAA_SysResult.h"
#include "print/USBPrint.h"

namespace {

constexpr char kFanStatus[] = "/proc/fanstatus";
constexpr char kFanTest[] = "/proc/cpufantest";
constexpr char kTempScript[] = "/etc/halvard/config/system/cpu_temp.sh";
constexpr char kTempData[] = "/halvard/sys/statusinfo/cpu_temp_data.txt";
constexpr char kTempMethodSig[] = "()Ljava/lang/String;";

constexpr size_t kStatusBytes = 8;      // what is read of a status file
constexpr size_t kLineSize = 1024;      // line buffer of the recorded data
constexpr size_t kJavaTextSize = 5000;  // reply buffer of the Java recording
// The script appends a few bytes a second; anything near this is not a
// recording and is refused like a failed allocation.
constexpr long kMaxDataFile = 16L * 1024 * 1024;

constexpr U32 kModeStart = 0, kModeEnd = 1, kModeFanStart = 2, kModeFanStop = 3;

std::string machineOverride;
bool machineOverridden = false;

U8 aubTempText[kJavaTextSize];
U8 aubLine[kLineSize];

using File = std::unique_ptr<FILE, int (*)(FILE *)>;
File openFile(const std::string &path, const char *mode) { return File(std::fopen(path.c_str(), mode), &std::fclose); }

TMAAResult *report(const char *text, U32 mode) {
    SysPBA_IF_PrintResult(reinterpret_cast<const U8 *>(text), mode, 0);
    return &stMAASysResult;
}

// The first bytes of a status file as text; false (after the intermediate
// failure line) when it cannot be opened.
bool readStatus(const char *fixed, char (&text)[kStatusBytes + 1]) {
    std::memset(text, 0, sizeof text);
    File f = openFile(FixedPath(fixed), "r");
    if (!f) {
        MAA_ReportF(0, "fail to open %s", fixed);
        return false;
    }
    const size_t n = std::fread(text, 1, kStatusBytes, f.get());
    text[n] = 0;
    return true;
}

bool startsWith(const char *text, const char *prefix) { return std::strncmp(text, prefix, std::strlen(prefix)) == 0; }

int runCommand(const std::string &command) { return MAA_System(command.c_str()); }

// Sends the lines of the first `len` bytes, each without its line feed. The
// byte after them (the file's last) is the line feed of the last line; without
// it that last line is not sent.
void sendLines(const U8 *data, size_t len, bool lastLineEnded) {
    size_t start = 0;
    while (start < len) {
        const U8 *lf = static_cast<const U8 *>(std::memchr(data + start, '\n', len - start));
        const size_t end = lf ? static_cast<size_t>(lf - data) : len;
        if (!lf && !lastLineEnded) break;
        const size_t n = std::min(end - start, kLineSize - 1);
        std::memcpy(aubLine, data + start, n);
        aubLine[n] = 0;
        SysPBA_IF_PrintResult(aubLine, 0, 0);
        start = end + 1;
    }
}

TMAAResult *fanTempStart() {
    char status[kStatusBytes + 1];
    if (!readStatus(kFanStatus, status) || startsWith(status, "FALSE")) return report("CPU Fan  = FALSE", 1);
    report("CPU Fan  = TRUE", 0);
    runCommand(FixedPath(kTempScript) + " &");
    return report("CPU_TEMP_START = OK", 1);
}

TMAAResult *fanTempEnd() {
    runCommand("killall cpu_temp.sh");
    const std::string path = FixedPath(kTempData);
    File f = openFile(path, "rb");
    struct stat st {};
    if (!f || ::fstat(::fileno(f.get()), &st) != 0 || !S_ISREG(st.st_mode))
        return report("Error Opening cpu_temp_data.txt File", 1);
    if (st.st_size > kMaxDataFile) return report("Allocation failed", 1);
    const size_t size = static_cast<size_t>(st.st_size);
    std::unique_ptr<U8[]> buffer(new (std::nothrow) U8[size + 1]());
    if (!buffer) return report("Allocation failed", 1);
    if (size > 0) {
        const size_t want = size - 1;
        if (std::fread(buffer.get(), 1, want, f.get()) == want) {
            const int last = std::fgetc(f.get());
            sendLines(buffer.get(), want, last == '\n');
        } else {
            // Replaced at once by the final verdict below: the host never sees it.
            USBADP_LOG(ERROR, "[MAA] %s: short read\n", kTempData);
            report("Error Reading cpu_temp_data.txt File", 1);
        }
    }
    buffer.reset();
    f.reset();
    runCommand(std::string("rm -rf ") + path);
    return report("CPU_TEMP_END = OK", 1);
}

TMAAResult *fanTest(U32 mode) {
    runCommand(std::string(mode == kModeFanStart ? "echo start > " : "echo stop > ") + FixedPath(kFanTest));
    char status[kStatusBytes + 1];
    if (!readStatus(kFanTest, status)) return report("CPU Fan  = UNKOWN", 1);
    if (startsWith(status, "running")) return report("CPU Fan  = Running", 1);
    if (startsWith(status, "Stop")) return report("CPU Fan  = Stop", 1);
    return report("CPU Fan  = UNKOWN", 1);
}

// The Java recording call of CheckCPUTemperature; returns the final record.
TMAAResult *javaTemperature(JNIEnv *env, jobject daemon, bool start) {
    LocalRef<jclass> cls(env, env->GetObjectClass(daemon));
    if (!cls) return report("Failed", 1);
    report(start ? "[ CPU_TEMP_START ]" : "[ CPU_TEMP_END ]", 0);
    const char *method = start ? "maaCheckCPUTemperatureStart" : "maaCheckCPUTemperatureEnd";
    jmethodID mid = env->GetMethodID(cls.get(), method, kTempMethodSig);
    if (!mid) {
        JNI_ExceptionSweep(env);
        return report("Failed midCheckCPUTemperature NULL", 1);
    }
    report(start ? "CPU_TEMP_START = OK" : "CPU_TEMP_END = OK", 0);
    LocalRef<jstring> text(env, static_cast<jstring>(env->CallObjectMethod(daemon, mid)));
    // A Java failure answers null; it must not stay pending for the calls below.
    JNI_ExceptionSweep(env);
    if (!text) return report("Failed jcheckCPUTemperature NULL", 1);
    UtfChars chars(env, text.get());
    if (!chars) {
        JNI_ExceptionSweep(env);
        return report("Failed", 1);
    }
    std::memset(aubTempText, 0, sizeof aubTempText);
    std::memcpy(aubTempText, chars.get(), strnlen(chars.get(), sizeof aubTempText - 1));
    return report(reinterpret_cast<const char *>(aubTempText), 1);
}

}  // namespace

void MAA_SetMachineName(const char *machine) {
    machineOverridden = machine != nullptr;
    machineOverride = machine ? machine : "";
}

S32 currentmcmodel(void) {
    std::string machine = machineOverride;
    if (!machineOverridden) {
        struct utsname u {};
        if (::uname(&u) != 0) return -1;
        machine = u.machine;
    }
    if (machine.find("86") != std::string::npos) return 0;
    if (machine.find("ppc") != std::string::npos || machine.find("powerpc") != std::string::npos) return 1;
    if (machine.find("armv5tel") != std::string::npos) return 2;
    return -1;
}

TMAAResult *CheckCPUTemperature(U32 mode) {
    USBADP_LOG(INFO, "[MAA] CheckCPUTemperature(%u) as %s\n", mode, reinterpret_cast<const char *>(pub_MaaCmdName));
    if (currentmcmodel() == 2) return report("Do not support Mono Model", 1);
    if (mode != kModeStart && mode != kModeEnd) return report("Failed", 1);
    // The shell runs on the print reader's thread: this is globalPrintEnv there.
    JNIEnv *env = USBPrint_ThreadEnv();
    jobject daemon = globalPrintObj.load();
    if (!env || !daemon) return report("Failed", 1);
    TMAAResult *result = javaTemperature(env, daemon, mode == kModeStart);
    JNI_ExceptionSweep(env);
    return result;
}

TMAAResult *CPU_FAN_TEMP_CHK(U32 mode) {
    USBADP_LOG(INFO, "[MAA] CPU_FAN_TEMP_CHK(%u) as %s\n", mode, reinterpret_cast<const char *>(pub_MaaCmdName));
    report("[CPU FAN Temp Test]", 0);
    switch (mode) {
        case kModeStart: return fanTempStart();
        case kModeEnd: return fanTempEnd();
        case kModeFanStart:
        case kModeFanStop: return fanTest(mode);
        default: return report("Argument 1 is wrong option.", 1);
    }
}
