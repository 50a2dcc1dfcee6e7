#include "maa/functions/MAA_EngineIF.h"

#include <cstring>

#include "common/JniUtil.h"
#include "common/Log.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_Result.h"
#include "maa/functions/MAA_General.h"
#include "maa/functions/MAA_SysResult.h"
#include "print/USBPrint.h"

namespace {

constexpr U32 kEngReplySize = 4608;
constexpr const char kEngMethodSig[] = "(Ljava/lang/String;)Ljava/lang/String;";

// One Java method of the print daemon and how its log lines name things.
struct TEngineMethod {
    const char *pubFunction;  // the native side, in every log line
    const char *pubMethod;    // the daemon's method
    const char *pubMissing;   // what the missing-method line says cannot be found
};
constexpr TEngineMethod kStrNormal{"Eng_MaaStrNormalTest", "maaEngMaaStrNormalTest", "Eng_MaaStrNormalTest()"};
constexpr TEngineMethod kImgStb{"Eng_MaaImgStbStart", "maaEngMaaImageStabilization",
                                "maaEngMaaImageStabilization()."};
constexpr TEngineMethod kFtca{"Eng_MaaStrFTCATest", "maaEngMaaOpcodeFTCATest", "maaEngMaaOpcodeFTCATest()."};

enum class TReplyForm { Whole, Lines };

TMAAResult *failed() { return MAA_ReportF(1, "%s", "Failed"); }

// The reply of `m` to the whole command text, copied into `reply`. Null when
// done, else the failure's final record.
TMAAResult *askJava(JNIEnv *env, const TEngineMethod &m, char (&reply)[kEngReplySize]) {
    const char *name = reinterpret_cast<const char *>(pub_MaaCmdName);
    jobject daemon = globalPrintObj.load();
    LocalRef<jclass> cls(env, env != nullptr && daemon != nullptr ? env->GetObjectClass(daemon) : nullptr);
    if (!cls) {
        USBADP_LOG(ERROR, "Error in %s()::can't find class PrintDaemon\n", m.pubFunction);
        return failed();
    }
    jmethodID mid = env->GetMethodID(cls.get(), m.pubMethod, kEngMethodSig);
    if (mid == nullptr) {
        JNI_ExceptionSweep(env);
        USBADP_LOG(ERROR, "Error in %s()::can't find %s\n", m.pubFunction, m.pubMissing);
        return failed();
    }
    LocalRef<jstring> command(env, JNI_NewHostString(env, reinterpret_cast<const char *>(pub_MaaCmdStr)));
    if (!command) {
        JNI_ExceptionSweep(env);
        USBADP_LOG(ERROR, "Error in %s()::can't get MAA Command String\n", m.pubFunction);
        return failed();
    }
    LocalRef<jstring> answer(env, static_cast<jstring>(env->CallObjectMethod(daemon, mid, command.get())));
    JNI_ExceptionSweep(env);
    UtfChars chars(env, answer.get());
    if (!chars) {
        JNI_ExceptionSweep(env);
        USBADP_LOG(ERROR, "Error in %s()::Return Data(%s)\n", m.pubFunction, name);
        return MAA_ReportF(1, "%s=NG", name);
    }
    const size_t length = strnlen(chars.get(), kEngReplySize - 1);
    std::memcpy(reply, chars.get(), length);
    reply[length] = 0;
    return nullptr;
}

// The one body behind every engine string function.
TMAAResult *engineCall(const TEngineMethod &m, TReplyForm form) {
    const char *name = reinterpret_cast<const char *>(pub_MaaCmdName);
    USBADP_LOG(INFO, "[%s] Start===>(%s)(%s)\n", m.pubFunction,
               pub_MaaCmdStr != nullptr ? reinterpret_cast<const char *>(pub_MaaCmdStr) : "", name);
    MAA_ReportF(0, "[ %s ]", name);
    static char reply[kEngReplySize];
    if (TMAAResult *failure = askJava(USBPrint_ThreadEnv(), m, reply)) return failure;
    if (form == TReplyForm::Lines) return MAA_ReportLines(reply);
    SysPBA_IF_PrintResult(reinterpret_cast<const U8 *>(reply), 1, 0);
    return &stMAASysResult;
}

// The reply as one final record.
TMAAResult *Eng_MaaStrNormalTest() { return engineCall(kStrNormal, TReplyForm::Whole); }
// The reply line by line.
TMAAResult *Eng_MaaStrNormalTmpTest() { return engineCall(kStrNormal, TReplyForm::Lines); }

}  // namespace

TMAAResult *Eng_MaaStrIFOpt0() { return Eng_MaaStrNormalTest(); }
TMAAResult *Eng_MaaStrIFOpt1(U32) { return Eng_MaaStrNormalTest(); }
TMAAResult *Eng_MaaStrIFOpt2(U32, U32) { return Eng_MaaStrNormalTest(); }
TMAAResult *Eng_MaaStrIFOpt3(U32, U32, U32) { return Eng_MaaStrNormalTest(); }
TMAAResult *Eng_MaaStrIFOpt4(U32, U32, U32, U32) { return Eng_MaaStrNormalTest(); }
TMAAResult *Eng_MaaStrIFOpt5(U32, U32, U32, U32, U32) { return Eng_MaaStrNormalTest(); }
TMAAResult *Eng_MaaStrIFOpt1_Str(U32) { return Eng_MaaStrNormalTest(); }
TMAAResult *Eng_MaaPBAStrIFOpt0() { return Eng_MaaStrNormalTmpTest(); }
TMAAResult *Eng_MaaPBAStrIFOpt1(U32) { return Eng_MaaStrNormalTmpTest(); }
TMAAResult *Eng_MaaPBAStrIFOpt2(U32, U32) { return Eng_MaaStrNormalTmpTest(); }
TMAAResult *Eng_MaaPBAStrIFOpt3(U32, U32, U32) { return Eng_MaaStrNormalTmpTest(); }
TMAAResult *Eng_MaaPBAStrIFOpt4(U32, U32, U32, U32) { return Eng_MaaStrNormalTmpTest(); }
TMAAResult *Eng_MaaPBAStrIFOpt5(U32, U32, U32, U32, U32) { return Eng_MaaStrNormalTmpTest(); }
TMAAResult *Eng_MaaPBAStrIFOpt6(U32, U32, U32, U32, U32, U32) { return Eng_MaaStrNormalTmpTest(); }
TMAAResult *Eng_MaaPBAStrIFOpt7(U32, U32, U32, U32, U32, U32, U32) { return Eng_MaaStrNormalTmpTest(); }
TMAAResult *Eng_MaaImgStbStart(U32) { return engineCall(kImgStb, TReplyForm::Whole); }
TMAAResult *Eng_MaaStrFTCATest(U32) { return engineCall(kFtca, TReplyForm::Whole); }
