#include "maa/functions/MAA_Forwarded.h"

#include <string>

#include "common/Log.h"
#include "maa/MAA_IF.h"
#include "maa/functions/MAA_General.h"
#include "maa/functions/MAA_SysResult.h"

TMAAResult *MAA_ForwardCommand(const char *pubFunction, U32 ulArgc, const U32 *pulArgs) {
    MAA_ReportF(0, "[ %s ]", pubFunction);
    std::string reply;
    const char *id = reinterpret_cast<const char *>(pub_MaaCmdName);
    if (MAA_CallUsbFunction(id, ulArgc, pulArgs, &reply) == TMAAJavaCall::Reply) return MAA_ReportUsbFunctionReply(reply);
    USBADP_LOG(ERROR, "\r\n[MAA] %s: no answer from the Java service", pubFunction);
    return MAA_ReportF(1, "Failed");
}

TMAAResult *SysPBA_Delay_ms(U32 ulMs) {
    const U32 ms = ulMs < MAA_DELAY_MAX_MS ? ulMs : MAA_DELAY_MAX_MS;
    MAA_SleepMs(ms);
    return MAA_ReportF(1, "Delay %u ms DONE", ms);
}
