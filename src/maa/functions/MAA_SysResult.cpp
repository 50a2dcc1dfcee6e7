#include "maa/functions/MAA_SysResult.h"

#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "common/Log.h"
#include "common/Wait.h"
#include "adapter/USB.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_Result.h"

U8 aubSysData[MAA_SYS_DATA_SIZE];
U8 aubTempData[MAA_TEMP_DATA_SIZE];
U32 ulCIP6MaaResultSize = 0;

namespace {

TMAACommandRunner pfnCommandRunner = nullptr;
TMAASleeper pfnSleeper = nullptr;

bool cableGone() { return MAA_IsUSBDisconnected() != 0; }

// Text into the data area, cut so a terminating NUL always fits.
U32 copyText(const U8 *message) {
    if (message == nullptr) return 0;
    const size_t len = strnlen(reinterpret_cast<const char *>(message), MAA_SYS_DATA_SIZE - 1);
    std::memcpy(aubSysData, message, len);
    return static_cast<U32>(len);
}

int runExecbin(const char *command) {
    const pid_t pid = ::fork();
    if (pid < 0) return -1;
    if (pid == 0) {
        ::execl("/bin/sh", "sh", "-c", command, static_cast<char *>(nullptr));
        ::_exit(127);
    }
    int status = 0;
    while (::waitpid(pid, &status, 0) < 0) {
        if (errno != EINTR) return -1;
    }
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

int defaultRunner(const char *command, TMAARunVia via) {
    if (const char *log = std::getenv("USBADAPTER_COMMAND_LOG"); log != nullptr && *log != 0) {
        if (FILE *f = std::fopen(log, "a")) {
            std::fprintf(f, "%s\n", command);
            std::fclose(f);
        }
        return 0;
    }
    return via == TMAARunVia::System ? std::system(command) : runExecbin(command);
}

int run(const char *command, TMAARunVia via) {
    if (command == nullptr) return -1;
    USBADP_LOG(DEBUG, "\r\n[MAA] run: %s", command);
    return (pfnCommandRunner ? pfnCommandRunner : defaultRunner)(command, via);
}

}  // namespace

void SysPBA_IF_PrintResult(const U8 *paubMessage, U32 ulMode, U32 scanner) {
    stMAASysResult = {MAA_RESULT_CONTINUE, 0, 0, nullptr};
    std::memset(aubSysData, 0, sizeof aubSysData);
    stMAASysResult.pubData = aubSysData;
    switch (scanner & 0xFF) {
        case 1: {
            const U32 size = ulCIP6MaaResultSize < MAA_SYS_DATA_SIZE ? ulCIP6MaaResultSize : MAA_SYS_DATA_SIZE;
            if (paubMessage != nullptr) std::memcpy(aubSysData, paubMessage, size);
            stMAASysResult.ulDataSize = paubMessage != nullptr ? size : 0;
            stMAASysResult.ulResult = 1;
            USBADP_LOG(INFO, "<SCN>SysPBA_IF_PrintResult : ulDataSize(%d) \n",
                       static_cast<int>(stMAASysResult.ulDataSize));
            MAA_WriteResultForward(&stMAASysResult);
            return;
        }
        case 2:
            stMAASysResult.ulDataSize = copyText(paubMessage);
            stMAASysResult.ulResult = 0;
            stMAASysResult.enContinue = MAA_RESULT_END;
            MAA_IF_WriteResult(&stMAASysResult);
            return;
        default:
            if (ulMode == 0) {
                stMAASysResult.ulDataSize = copyText(paubMessage);
                stMAASysResult.ulResult = 1;
                MAA_IF_WriteResult(&stMAASysResult);
            } else if (ulMode == 1) {
                stMAASysResult.ulDataSize = copyText(paubMessage);
                stMAASysResult.ulResult = 1;
                stMAASysResult.enContinue = MAA_RESULT_END;
            } else {
                stMAASysResult.enContinue = MAA_RESULT_END;
            }
            return;
    }
}

TMAAResult *MAA_ReportF(U32 ulMode, const char *format, ...) {
    va_list ap;
    va_start(ap, format);
    std::vsnprintf(reinterpret_cast<char *>(aubTempData), sizeof aubTempData, format, ap);
    va_end(ap);
    SysPBA_IF_PrintResult(aubTempData, ulMode, 0);
    return &stMAASysResult;
}

void MAA_SetCommandRunner(TMAACommandRunner pfnRunner) { pfnCommandRunner = pfnRunner; }

int MAA_System(const char *command) { return run(command, TMAARunVia::System); }

int execbin(const char *command) { return run(command, TMAARunVia::Execbin); }

void MAA_SetSleeper(TMAASleeper pfn) { pfnSleeper = pfn; }

void MAA_SleepMs(U32 ulMs) {
    if (pfnSleeper != nullptr) {
        pfnSleeper(ulMs);
        return;
    }
    Wait_IdleRest(Wait_NowMs(), static_cast<int>(ulMs > 0x7FFFFFFFu ? 0x7FFFFFFFu : ulMs), &cableGone);
}
