#include "maa/functions/MAA_General.h"

#include <algorithm>
#include <cstdio>
#include <cstring>

#include "common/JniUtil.h"
#include "common/Log.h"
#include "maa/MAA_Address.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_Result.h"
#include "maa/functions/MAA_SysResult.h"
#include "platform/JNIHelp.h"
#include "print/USBPrint.h"

namespace {

constexpr const char kRunUsbFunctionCall[] = "runUsbFunctionCall";
constexpr const char kRunUsbFunctionCallSig[] = "(Ljava/lang/String;[Ljava/lang/String;)Ljava/lang/String;";
constexpr const char kIdptPrefix[] = "idpt:";
constexpr size_t kIdptPrefixLen = sizeof kIdptPrefix - 1;
// A SPIDER reply is known by "spider"; its text starts after "spider:".
constexpr const char kSpiderMark[] = "spider";
constexpr size_t kSpiderTextAt = 7;

enum class TCall { Reply, NoReply, BadArgs, NoArray };

// The array of argument texts: a String[] of argc elements in the calling
// thread's frame.
TCall fillArgs(JNIEnv *env, jobjectArray array, U32 argc, const U32 *args) {
    for (U32 i = 0; i < argc; ++i) {
        char aubText[MAA_GENERAL_ARG_SIZE];
        if (!MAA_UsbFunctionArgText(args[i], aubText)) return TCall::BadArgs;
        LocalRef<jstring> text(env, JNI_NewHostString(env, aubText));
        if (!text) {
            JNI_ExceptionSweep(env);
            return TCall::NoReply;
        }
        env->SetObjectArrayElement(array, static_cast<jsize>(i), text.get());
        if (JNI_ExceptionSweep(env)) return TCall::NoReply;
    }
    return TCall::Reply;
}

TCall invoke(JNIEnv *env, const char *id, jobjectArray array, std::string *reply) {
    jobject maa = globalMAAObj.load();
    if (maa == nullptr) {
        USBADP_LOG(ERROR, "[MAA] runUsbFunctionCall: globalMAAObj is null\n");
        return TCall::NoReply;
    }
    LocalRef<jclass> cls(env, env->GetObjectClass(maa));
    jmethodID mid = cls ? env->GetMethodID(cls.get(), kRunUsbFunctionCall, kRunUsbFunctionCallSig) : nullptr;
    if (mid == nullptr) {
        USBADP_LOG(ERROR, "[MAA] can't find %s()\n", kRunUsbFunctionCall);
        JNI_ExceptionSweep(env);
        return TCall::NoReply;
    }
    LocalRef<jstring> jid(env, JNI_NewHostString(env, id));
    if (!jid) {
        JNI_ExceptionSweep(env);
        return TCall::NoReply;
    }
    LocalRef<jstring> jreply(env, static_cast<jstring>(env->CallObjectMethod(maa, mid, jid.get(), array)));
    if (JNI_ExceptionSweep(env) || !jreply) return TCall::NoReply;
    UtfChars chars(env, jreply.get());
    if (!chars) {
        JNI_ExceptionSweep(env);
        return TCall::NoReply;
    }
    reply->assign(chars.get());
    return TCall::Reply;
}

TCall callUsbFunction(const char *id, U32 argc, const U32 *args, std::string *reply) {
    if (argc > MAX_FUNC_ARMAA || (argc != 0 && args == nullptr)) {
        USBADP_LOG(ERROR, "[MAA] runUsbFunctionCall: %u arguments refused\n", argc);
        return TCall::BadArgs;
    }
    JNIEnv *env = USBPrint_ThreadEnv();
    if (env == nullptr) {
        USBADP_LOG(ERROR, "[MAA] runUsbFunctionCall: no Java environment\n");
        return TCall::NoArray;
    }
    LocalRef<jclass> stringClass(env, env->FindClass("java/lang/String"));
    LocalRef<jobjectArray> array(
        env, stringClass ? env->NewObjectArray(static_cast<jsize>(argc), stringClass.get(), nullptr) : nullptr);
    if (!array) {
        // Nothing in Java waits for the shell thread's exception, so it is
        // raised, described and cleared here: the next JNI call stays legal.
        jniThrowRuntimeException(env, "Create New jobjectArray is Null");
        JNI_ExceptionSweep(env);
        return TCall::NoArray;
    }
    TCall result = fillArgs(env, array.get(), argc, args);
    if (result == TCall::Reply) result = invoke(env, id, array.get(), reply);
    if (result == TCall::NoReply) USBADP_LOG(ERROR, "Result string is NULL!\n");
    return result;
}

}  // namespace

bool MAA_UsbFunctionArgText(U32 ulWord, char (&aubText)[MAA_GENERAL_ARG_SIZE]) {
    if (ulWord <= MAA_GENERAL_NUMBER_LIMIT) {
        std::snprintf(aubText, sizeof aubText, "%d", static_cast<int>(ulWord));
        return true;
    }
    const char *text = MAA_AddrString(ulWord);  // logs a refused address
    if (text == nullptr) return false;
    if (strnlen(text, MAA_GENERAL_ARG_SIZE + 1) > MAA_GENERAL_ARG_SIZE) {
        USBADP_LOG(ERROR, "[MAA] argument text at 0x%x is longer than %u characters\n", ulWord,
                   MAA_GENERAL_ARG_SIZE);
        return false;
    }
    // The text was its own format: "%%" gave "%". Every other directive would
    // consume an argument that does not exist, so it is kept as it stands.
    size_t out = 0;
    for (const char *p = text; *p != 0 && out < sizeof aubText - 1; ++p) {
        aubText[out++] = *p;
        if (p[0] == '%' && p[1] == '%') ++p;
    }
    aubText[out] = 0;
    return true;
}

TMAAJavaCall MAA_CallUsbFunction(const char *id, U32 argc, const U32 *args, std::string *reply) {
    std::string ignored;
    switch (callUsbFunction(id != nullptr ? id : "", argc, args, reply != nullptr ? reply : &ignored)) {
        case TCall::Reply:
            return TMAAJavaCall::Reply;
        case TCall::BadArgs:
            return TMAAJavaCall::BadArgs;
        case TCall::NoReply:
        case TCall::NoArray:
            break;
    }
    return TMAAJavaCall::NoReply;
}

TMAAResult *MAA_GENERAL_FUNCTION(U32 argc, U32 *args) {
    if (argc > MAX_FUNC_ARMAA) {
        USBADP_LOG(ERROR, "[MAA_GENERAL_FUNCTION] %u arguments: no call\n", argc);
        return nullptr;
    }
    const char *command = pub_MaaCmdStr != nullptr ? reinterpret_cast<const char *>(pub_MaaCmdStr) : "";
    const std::string id(command, std::strcspn(command, "("));
    std::string reply;
    switch (callUsbFunction(id.c_str(), argc, args, &reply)) {
        case TCall::Reply:
            return MAA_ReportUsbFunctionReply(reply);
        case TCall::NoReply:
            // The host is not left waiting: the same end as a forwarded family's.
            return MAA_ReportF(1, "%s", "Failed");
        case TCall::BadArgs:
        case TCall::NoArray:
            break;
    }
    return nullptr;
}

TMAAResult *MAA_ReportUsbFunctionReply(const std::string &reply) {
    if (reply.compare(0, kIdptPrefixLen, kIdptPrefix) == 0) {
        USBADP_LOG(DEBUG, "[MAA] IDPT mode\n");
        return MAA_ReportLines(reply.c_str() + kIdptPrefixLen);
    }
    const char *text = reply.c_str();
    if (reply.compare(0, sizeof kSpiderMark - 1, kSpiderMark) == 0) {
        USBADP_LOG(DEBUG, "[MAA] SPIDER mode\n");
        text += std::min(reply.size(), kSpiderTextAt);
    }
    SysPBA_IF_PrintResult(reinterpret_cast<const U8 *>(text), 1, 0);
    return &stMAASysResult;
}

TMAAResult *MAA_ReportLines(const char *text) {
    if (text == nullptr) text = "";
    const char *lineFeed = std::strchr(text, '\n');
    if (lineFeed == nullptr) {
        SysPBA_IF_PrintResult(reinterpret_cast<const U8 *>(text), 1, 0);
        return &stMAASysResult;
    }
    char *line = reinterpret_cast<char *>(aubTempData);
    const char *p = text;
    while (lineFeed != nullptr) {
        // Bounded by the line's own length, so the character before the line
        // feed (a "\r\n" line's carriage return) stays behind.
        const size_t length = static_cast<size_t>(lineFeed - p);
        const size_t keep = std::min(length != 0 ? length - 1 : 0, sizeof aubTempData - 1);
        std::memcpy(line, p, keep);
        line[keep] = 0;
        p = lineFeed + 1;
        lineFeed = std::strchr(p, '\n');
        SysPBA_IF_PrintResult(aubTempData, lineFeed == nullptr && *p == 0 ? 1 : 0, 0);
    }
    if (*p != 0) {
        const size_t keep = std::min(std::strlen(p), sizeof aubTempData - 1);
        std::memcpy(line, p, keep);
        line[keep] = 0;
        SysPBA_IF_PrintResult(aubTempData, 1, 0);
    }
    return &stMAASysResult;
}
