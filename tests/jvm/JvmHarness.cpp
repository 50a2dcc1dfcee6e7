#include "JvmHarness.h"

#include "JvmHost.h"
#include "common/JniUtil.h"

#include <gtest/gtest.h>

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <map>
#include <mutex>
#include <sstream>
#include <thread>

namespace jvm {
namespace {

using jvmhost::TakeException;

std::once_flag gCreate;
std::mutex gClassMutex;
std::map<std::string, jclass> gClasses;

jvmhost::JvmConfig Config() {
    jvmhost::JvmConfig config;
    config.classPath = USBADAPTER_JAR ":" USBADAPTER_FIXTURES_JAR;
    config.libDir = USBADAPTER_LIBDIR;
    // Start-up time dominates a one-test process.
    config.extra = {"-XX:TieredStopAtLevel=1"};
    // Extra options for a debugging session, separated by blanks.
    if (const char *extra = std::getenv("USBADAPTER_TEST_JVM_OPTS")) {
        std::istringstream words(extra);
        for (std::string w; words >> w;) config.extra.push_back(w);
    }
    return config;
}

// No test can run without the JVM or with a thread that cannot attach.
[[noreturn]] void Die(const std::string &why) {
    std::fprintf(stderr, "%s\n", why.c_str());
    std::fflush(nullptr);
    std::_Exit(2);
}

void Create() {
    std::string error;
    if (!jvmhost::CreateJvm(Config(), &error)) Die(error);
}

JNIEnv *Attach(const char *threadName) {
    JNIEnv *env = jvmhost::Env(threadName);
    if (!env) Die(std::string("cannot attach ") + threadName + " to the JVM");
    return env;
}

// Fails the current test with the pending exception, if any; true when there was one.
bool FailOnException(JNIEnv *env, const char *what) {
    std::string ex = TakeException(env);
    if (ex.empty()) return false;
    ADD_FAILURE() << what << " threw " << ex;
    return true;
}

// Calls the method through `call` (env, method id); a missing method or a Java
// exception becomes a test failure and the answer `failed`.
template <typename R, typename Call>
R CallChecked(JNIEnv *env, jmethodID mid, const char *name, const char *sig, R failed, Call call) {
    if (!mid) {
        TakeException(env);
        ADD_FAILURE() << "no method " << name << sig;
        return failed;
    }
    R r = call(mid);
    return FailOnException(env, name) ? failed : r;
}

template <typename R, typename Call>
R Instance(jobject obj, const char *name, const char *sig, R failed, Call call) {
    JNIEnv *env = Env();
    jclass cls = env->GetObjectClass(obj);
    jmethodID mid = env->GetMethodID(cls, name, sig);
    env->DeleteLocalRef(cls);
    return CallChecked(env, mid, name, sig, failed, [&](jmethodID m) { return call(env, m); });
}

template <typename R, typename Call>
R Static(const char *cls, const char *name, const char *sig, R failed, Call call) {
    JNIEnv *env = Env();
    jclass c = Class(cls);
    if (!c) return failed;
    jmethodID mid = env->GetStaticMethodID(c, name, sig);
    return CallChecked(env, mid, name, sig, failed, [&](jmethodID m) { return call(env, c, m); });
}

}  // namespace

JavaVM *Vm() {
    std::call_once(gCreate, Create);
    return jvmhost::Vm();
}

JNIEnv *Env() {
    Vm();
    return Attach("native-test");
}

jclass Class(const char *name) {
    std::lock_guard<std::mutex> lock(gClassMutex);
    auto it = gClasses.find(name);
    if (it != gClasses.end()) return it->second;
    JNIEnv *env = Env();
    jclass local = env->FindClass(name);
    if (!local) {
        ADD_FAILURE() << "class " << name << " not found: " << TakeException(env);
        return nullptr;
    }
    auto global = static_cast<jclass>(env->NewGlobalRef(local));
    env->DeleteLocalRef(local);
    gClasses.emplace(name, global);
    return global;
}

jobject New(const char *className) {
    JNIEnv *env = Env();
    jclass cls = Class(className);
    if (!cls) return nullptr;
    jmethodID ctor = env->GetMethodID(cls, "<init>", "()V");
    if (!ctor) {
        ADD_FAILURE() << className << " has no no-argument constructor: " << TakeException(env);
        return nullptr;
    }
    jobject local = env->NewObject(cls, ctor);
    if (FailOnException(env, className) || !local) return nullptr;
    jobject global = env->NewGlobalRef(local);
    env->DeleteLocalRef(local);
    return global;
}

LocalRef<jstring> Str(const char *text) {
    JNIEnv *env = Env();
    if (!text) return {env, nullptr};
    LocalRef<jstring> s{env, env->NewStringUTF(text)};
    FailOnException(env, "NewStringUTF");
    return s;
}

std::string Text(JNIEnv *env, jstring s) {
    UtfChars chars(env, s);
    if (s && !chars) FailOnException(env, "GetStringUTFChars");
    return chars ? chars.get() : "";
}

std::string Bytes(JNIEnv *env, jbyteArray a) {
    if (!a) return {};
    std::string bytes(static_cast<size_t>(env->GetArrayLength(a)), '\0');
    env->GetByteArrayRegion(a, 0, static_cast<jsize>(bytes.size()), reinterpret_cast<jbyte *>(bytes.data()));
    return bytes;
}

LocalRef<jbyteArray> ByteArray(const std::string &bytes) {
    JNIEnv *env = Env();
    LocalRef<jbyteArray> a{env, env->NewByteArray(static_cast<jsize>(bytes.size()))};
    if (!a) {
        FailOnException(env, "NewByteArray");
        return a;
    }
    env->SetByteArrayRegion(a.get(), 0, static_cast<jsize>(bytes.size()),
                            reinterpret_cast<const jbyte *>(bytes.data()));
    return a;
}

// The Call* entries: varargs taken here, the call made through Instance/Static.
#define JVM_STATIC_CALL(R, Name, Jni, Failed)                                                                   \
    R Name(const char *cls, const char *name, const char *sig, ...) {                                           \
        va_list ap;                                                                                             \
        va_start(ap, sig);                                                                                      \
        R r = Static(cls, name, sig, Failed, [&](JNIEnv *e, jclass c, jmethodID m) { return e->Jni(c, m, ap); }); \
        va_end(ap);                                                                                             \
        return r;                                                                                               \
    }
JVM_STATIC_CALL(jint, CallStaticInt, CallStaticIntMethodV, jint{0})
JVM_STATIC_CALL(jboolean, CallStaticBoolean, CallStaticBooleanMethodV, jboolean{JNI_FALSE})
JVM_STATIC_CALL(jobject, CallStaticObject, CallStaticObjectMethodV, jobject{})

jint CallInt(jobject obj, const char *name, const char *sig, ...) {
    va_list ap;
    va_start(ap, sig);
    jint r = Instance(obj, name, sig, jint{0}, [&](JNIEnv *e, jmethodID m) { return e->CallIntMethodV(obj, m, ap); });
    va_end(ap);
    return r;
}

void CallVoid(jobject obj, const char *name, const char *sig, ...) {
    va_list ap;
    va_start(ap, sig);
    Instance(obj, name, sig, 0, [&](JNIEnv *e, jmethodID m) { return e->CallVoidMethodV(obj, m, ap), 0; });
    va_end(ap);
}

void CallStaticVoid(const char *cls, const char *name, const char *sig, ...) {
    va_list ap;
    va_start(ap, sig);
    Static(cls, name, sig, 0, [&](JNIEnv *e, jclass c, jmethodID m) { return e->CallStaticVoidMethodV(c, m, ap), 0; });
    va_end(ap);
}

void StartDetached(std::function<void(JNIEnv *)> body, const char *threadName) {
    Vm();
    std::string name = threadName;
    jvmhost::StartDetached(threadName, [body = std::move(body), name](JNIEnv *env) {
        if (!env) Die("cannot attach " + name + " to the JVM");
        body(env);
    });
}

void RunOnThread(std::function<void(JNIEnv *)> body, const char *threadName) {
    Vm();
    std::string name = threadName;
    std::thread([&body, name] {
        body(Attach(name.c_str()));
        jvmhost::Vm()->DetachCurrentThread();
    }).join();
}

}  // namespace jvm
