#include "Fixtures.h"

#include <sstream>

#include "JvmHarness.h"
#include "common/JniUtil.h"

namespace fixtures {
namespace {

using Local = LocalRef<jobject>;

constexpr const char *kSetReply = "(Ljava/lang/String;Ljava/lang/Object;)V";

LocalRef<jstring> JStr(const std::string &text) { return jvm::Str(text.c_str()); }

std::string StaticString(const char *name, const char *sig, jint arg = 0) {
    Local s{jvm::Env(), jvm::CallStaticObject(kJournal, name, sig, arg)};
    return jvm::Text(jvm::Env(), static_cast<jstring>(s.get()));
}

std::string StaticBytes(const char *name, jint arg) {
    Local a{jvm::Env(), jvm::CallStaticObject(kJournal, name, "(I)[B", arg)};
    return jvm::Bytes(jvm::Env(), static_cast<jbyteArray>(a.get()));
}

}  // namespace

void Reset() { jvm::CallStaticVoid(kJournal, "reset", "()V"); }

std::vector<std::string> EventLines() {
    std::vector<std::string> lines;
    std::istringstream in(StaticString("events", "()Ljava/lang/String;"));
    for (std::string line; std::getline(in, line);) lines.push_back(line);
    return lines;
}

int Calls(const std::string &method) {
    return jvm::CallStaticInt(kJournal, "calls", "(Ljava/lang/String;)I", JStr(method).get());
}

bool AwaitCalls(const std::string &method, int count, int timeoutMs) {
    return jvm::CallStaticBoolean(kJournal, "awaitCalls", "(Ljava/lang/String;IJ)Z", JStr(method).get(), jint{count},
                                  jlong{timeoutMs});
}

int JobCount() { return jvm::CallStaticInt(kJournal, "jobCount", "()I"); }

std::string JobBytes(int job) { return StaticBytes("jobBytes", job); }

bool JobEnded(int job) { return jvm::CallStaticBoolean(kJournal, "jobEnded", "(I)Z", jint{job}); }

bool AwaitJobEnded(int job, int timeoutMs) {
    return jvm::CallStaticBoolean(kJournal, "awaitJobEnded", "(IJ)Z", jint{job}, jlong{timeoutMs});
}

int AppCount() { return jvm::CallStaticInt(kJournal, "appCount", "()I"); }

std::string AppType(int app) { return StaticString("appType", "(I)Ljava/lang/String;", app); }

std::string AppBytes(int app) { return StaticBytes("appBytes", app); }

std::string AppThread(int app) { return StaticString("appThread", "(I)Ljava/lang/String;", app); }

bool AppClosed(int app) { return jvm::CallStaticBoolean(kJournal, "appClosed", "(I)Z", jint{app}); }

void ThrowOn(const std::string &method, int times) {
    jvm::CallStaticVoid(kJournal, "throwOn", "(Ljava/lang/String;I)V", JStr(method).get(), jint{times});
}

void ReturnNull(const std::string &method, bool on) {
    jvm::CallStaticVoid(kJournal, "returnNull", "(Ljava/lang/String;Z)V", JStr(method).get(), jboolean{on});
}

void SetInterpreters(const std::vector<int> &ids) {
    JNIEnv *env = jvm::Env();
    std::vector<jint> raw(ids.begin(), ids.end());
    LocalRef<jintArray> arr{env, env->NewIntArray(static_cast<jsize>(raw.size()))};
    if (!arr) return;
    env->SetIntArrayRegion(arr.get(), 0, static_cast<jsize>(raw.size()), raw.data());
    jvm::CallStaticVoid(kJournal, "setReply", kSetReply, JStr("getInstalledInterpreter").get(), arr.get());
}

void SetReply(const std::string &method, const std::string &reply) {
    jvm::CallStaticVoid(kJournal, "setReply", kSetReply, JStr(method).get(), JStr(reply).get());
}

void SetIntReply(const std::string &method, int reply) {
    jvm::CallStaticVoid(kJournal, "setIntReply", "(Ljava/lang/String;I)V", JStr(method).get(), jint{reply});
}

void SetBytesReply(const std::string &method, const std::string &bytes) {
    jvm::CallStaticVoid(kJournal, "setReply", kSetReply, JStr(method).get(), jvm::ByteArray(bytes).get());
}

}  // namespace fixtures
