#include "JvmHarness.h"

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

// JNI_VERSION_10 is what JDK 17 offers at most.
constexpr jint kJniVersion = JNI_VERSION_10;

JavaVM *gVm = nullptr;
std::once_flag gCreate;
std::mutex gClassMutex;
std::map<std::string, jclass> gClasses;

std::vector<std::string> BuildOptions() {
    std::vector<std::string> opts = {
        "-Djava.class.path=" USBADAPTER_JAR ":" USBADAPTER_FIXTURES_JAR,
        "-Djava.library.path=" USBADAPTER_LIBDIR,
        "-Xcheck:jni",
        "-Xmx256m",
        "-Xshare:auto",
        // Start-up time dominates a one-test process.
        "-XX:+UseSerialGC",
        "-XX:TieredStopAtLevel=1",
    };
    // Extra options for a debugging session, separated by blanks.
    if (const char *extra = std::getenv("USBADAPTER_TEST_JVM_OPTS")) {
        std::istringstream words(extra);
        for (std::string w; words >> w;) opts.push_back(w);
    }
    return opts;
}

void Create() {
    std::vector<std::string> opts = BuildOptions();
    std::vector<JavaVMOption> jopts(opts.size());
    for (size_t i = 0; i < opts.size(); ++i) jopts[i].optionString = opts[i].data();
    JavaVMInitArgs args{};
    args.version = kJniVersion;
    args.nOptions = static_cast<jint>(jopts.size());
    args.options = jopts.data();
    args.ignoreUnrecognized = JNI_FALSE;
    JNIEnv *env = nullptr;
    jint rc = JNI_CreateJavaVM(&gVm, reinterpret_cast<void **>(&env), &args);
    if (rc != JNI_OK) {
        std::fprintf(stderr, "JNI_CreateJavaVM failed: %d\n", rc);
        std::fflush(nullptr);
        std::_Exit(2);
    }
}

JNIEnv *Attach(const char *threadName) {
    JavaVMAttachArgs args{};
    args.version = kJniVersion;
    args.name = const_cast<char *>(threadName);
    args.group = nullptr;
    JNIEnv *env = nullptr;
    if (Vm()->AttachCurrentThreadAsDaemon(reinterpret_cast<void **>(&env), &args) != JNI_OK) {
        std::fprintf(stderr, "AttachCurrentThreadAsDaemon failed\n");
        std::fflush(nullptr);
        std::_Exit(2);
    }
    return env;
}

// Fails the current test with the pending exception, if any; true when there was one.
bool FailOnException(JNIEnv *env, const char *what) {
    std::string ex = TakeException(env);
    if (ex.empty()) return false;
    ADD_FAILURE() << what << " threw " << ex;
    return true;
}

jmethodID InstanceMethod(JNIEnv *env, jobject obj, const char *name, const char *sig) {
    jclass cls = env->GetObjectClass(obj);
    jmethodID mid = env->GetMethodID(cls, name, sig);
    env->DeleteLocalRef(cls);
    if (!mid) {
        TakeException(env);
        ADD_FAILURE() << "no method " << name << sig;
    }
    return mid;
}

jmethodID StaticMethod(JNIEnv *env, jclass cls, const char *name, const char *sig) {
    if (!cls) return nullptr;
    jmethodID mid = env->GetStaticMethodID(cls, name, sig);
    if (!mid) {
        TakeException(env);
        ADD_FAILURE() << "no static method " << name << sig;
    }
    return mid;
}

}  // namespace

JavaVM *Vm() {
    std::call_once(gCreate, Create);
    return gVm;
}

JNIEnv *Env() {
    JNIEnv *env = nullptr;
    jint rc = Vm()->GetEnv(reinterpret_cast<void **>(&env), kJniVersion);
    if (rc == JNI_OK) return env;
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

jstring Str(JNIEnv *env, const char *text) {
    if (!text) return nullptr;
    jstring s = env->NewStringUTF(text);
    FailOnException(env, "NewStringUTF");
    return s;
}

std::string Text(JNIEnv *env, jstring s) {
    if (!s) return {};
    const char *chars = env->GetStringUTFChars(s, nullptr);
    if (!chars) {
        FailOnException(env, "GetStringUTFChars");
        return {};
    }
    std::string text(chars);
    env->ReleaseStringUTFChars(s, chars);
    return text;
}

std::string Bytes(JNIEnv *env, jbyteArray a) {
    if (!a) return {};
    std::string bytes(static_cast<size_t>(env->GetArrayLength(a)), '\0');
    env->GetByteArrayRegion(a, 0, static_cast<jsize>(bytes.size()), reinterpret_cast<jbyte *>(bytes.data()));
    return bytes;
}

jbyteArray ByteArray(JNIEnv *env, const std::string &bytes) {
    jbyteArray a = env->NewByteArray(static_cast<jsize>(bytes.size()));
    if (!a) {
        FailOnException(env, "NewByteArray");
        return nullptr;
    }
    env->SetByteArrayRegion(a, 0, static_cast<jsize>(bytes.size()), reinterpret_cast<const jbyte *>(bytes.data()));
    return a;
}

std::string TakeException(JNIEnv *env) {
    jthrowable ex = env->ExceptionOccurred();
    if (!ex) return {};
    env->ExceptionClear();
    std::string text = "(exception)";
    jclass cls = env->GetObjectClass(ex);
    jmethodID toString = env->GetMethodID(cls, "toString", "()Ljava/lang/String;");
    if (toString) {
        auto s = static_cast<jstring>(env->CallObjectMethod(ex, toString));
        if (env->ExceptionCheck()) {
            env->ExceptionClear();
        } else if (s) {
            text = Text(env, s);
            env->DeleteLocalRef(s);
        }
    } else {
        env->ExceptionClear();
    }
    env->DeleteLocalRef(cls);
    env->DeleteLocalRef(ex);
    return text;
}

void CallVoid(jobject obj, const char *name, const char *sig, ...) {
    JNIEnv *env = Env();
    jmethodID mid = InstanceMethod(env, obj, name, sig);
    if (!mid) return;
    va_list ap;
    va_start(ap, sig);
    env->CallVoidMethodV(obj, mid, ap);
    va_end(ap);
    FailOnException(env, name);
}

jint CallInt(jobject obj, const char *name, const char *sig, ...) {
    JNIEnv *env = Env();
    jmethodID mid = InstanceMethod(env, obj, name, sig);
    if (!mid) return 0;
    va_list ap;
    va_start(ap, sig);
    jint r = env->CallIntMethodV(obj, mid, ap);
    va_end(ap);
    return FailOnException(env, name) ? 0 : r;
}

jobject CallObject(jobject obj, const char *name, const char *sig, ...) {
    JNIEnv *env = Env();
    jmethodID mid = InstanceMethod(env, obj, name, sig);
    if (!mid) return nullptr;
    va_list ap;
    va_start(ap, sig);
    jobject r = env->CallObjectMethodV(obj, mid, ap);
    va_end(ap);
    return FailOnException(env, name) ? nullptr : r;
}

void CallStaticVoid(const char *cls, const char *name, const char *sig, ...) {
    JNIEnv *env = Env();
    jclass c = Class(cls);
    jmethodID mid = StaticMethod(env, c, name, sig);
    if (!mid) return;
    va_list ap;
    va_start(ap, sig);
    env->CallStaticVoidMethodV(c, mid, ap);
    va_end(ap);
    FailOnException(env, name);
}

jint CallStaticInt(const char *cls, const char *name, const char *sig, ...) {
    JNIEnv *env = Env();
    jclass c = Class(cls);
    jmethodID mid = StaticMethod(env, c, name, sig);
    if (!mid) return 0;
    va_list ap;
    va_start(ap, sig);
    jint r = env->CallStaticIntMethodV(c, mid, ap);
    va_end(ap);
    return FailOnException(env, name) ? 0 : r;
}

jlong CallStaticLong(const char *cls, const char *name, const char *sig, ...) {
    JNIEnv *env = Env();
    jclass c = Class(cls);
    jmethodID mid = StaticMethod(env, c, name, sig);
    if (!mid) return 0;
    va_list ap;
    va_start(ap, sig);
    jlong r = env->CallStaticLongMethodV(c, mid, ap);
    va_end(ap);
    return FailOnException(env, name) ? 0 : r;
}

jboolean CallStaticBoolean(const char *cls, const char *name, const char *sig, ...) {
    JNIEnv *env = Env();
    jclass c = Class(cls);
    jmethodID mid = StaticMethod(env, c, name, sig);
    if (!mid) return JNI_FALSE;
    va_list ap;
    va_start(ap, sig);
    jboolean r = env->CallStaticBooleanMethodV(c, mid, ap);
    va_end(ap);
    return FailOnException(env, name) ? JNI_FALSE : r;
}

jobject CallStaticObject(const char *cls, const char *name, const char *sig, ...) {
    JNIEnv *env = Env();
    jclass c = Class(cls);
    jmethodID mid = StaticMethod(env, c, name, sig);
    if (!mid) return nullptr;
    va_list ap;
    va_start(ap, sig);
    jobject r = env->CallStaticObjectMethodV(c, mid, ap);
    va_end(ap);
    return FailOnException(env, name) ? nullptr : r;
}

void StartDetached(std::function<void(JNIEnv *)> body, const char *threadName) {
    Vm();
    std::string name = threadName;
    std::thread([body = std::move(body), name] {
        JNIEnv *env = Attach(name.c_str());
        body(env);
        Vm()->DetachCurrentThread();
    }).detach();
}

void RunOnThread(std::function<void(JNIEnv *)> body, const char *threadName) {
    Vm();
    std::string name = threadName;
    std::thread([&body, name] {
        JNIEnv *env = Attach(name.c_str());
        body(env);
        Vm()->DetachCurrentThread();
    }).join();
}

std::vector<std::string> Options() { return BuildOptions(); }

}  // namespace jvm
