#include "Jvm.h"

#include <unistd.h>

#include <cstdarg>
#include <thread>

namespace sim {
namespace {

constexpr jint kJniVersion = JNI_VERSION_10;
JavaVM *gVm = nullptr;

jmethodID Method(JNIEnv *env, jobject obj, const char *name, const char *sig, std::string *error) {
    jclass cls = env->GetObjectClass(obj);
    jmethodID mid = env->GetMethodID(cls, name, sig);
    env->DeleteLocalRef(cls);
    if (!mid) {
        TakeException(env);
        *error = std::string("no method ") + name + sig;
    }
    return mid;
}

}  // namespace

JvmConfig DefaultJvmConfig() {
    JvmConfig c;
#ifdef USBADAPTER_SIM_JAR
    c.jar = USBADAPTER_SIM_JAR;
#endif
#ifdef USBADAPTER_SIM_LIBDIR
    c.libDir = USBADAPTER_SIM_LIBDIR;
#endif
    return c;
}

std::vector<std::string> JvmOptions(const JvmConfig &config) {
    std::vector<std::string> opts = {
        "-Djava.class.path=" + config.jar,
        "-Djava.library.path=" + config.libDir,
        "-Xmx" + config.maxHeap,
        "-Xshare:auto",
        "-XX:+UseSerialGC",
    };
    if (config.checkJni) opts.push_back("-Xcheck:jni");
    for (const auto &p : config.properties) opts.push_back("-D" + p);
    opts.insert(opts.end(), config.extra.begin(), config.extra.end());
    return opts;
}

bool CreateJvm(const JvmConfig &config, std::string *error) {
    if (::access(config.jar.c_str(), R_OK) != 0) {
        *error = "jar not readable: " + config.jar;
        return false;
    }
    std::vector<std::string> opts = JvmOptions(config);
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
        *error = "JNI_CreateJavaVM failed: " + std::to_string(rc);
        gVm = nullptr;
        return false;
    }
    return true;
}

JavaVM *Vm() { return gVm; }

JNIEnv *Env(const char *threadName) {
    JNIEnv *env = nullptr;
    if (!gVm) return nullptr;
    if (gVm->GetEnv(reinterpret_cast<void **>(&env), kJniVersion) == JNI_OK) return env;
    JavaVMAttachArgs args{};
    args.version = kJniVersion;
    args.name = const_cast<char *>(threadName);
    if (gVm->AttachCurrentThreadAsDaemon(reinterpret_cast<void **>(&env), &args) != JNI_OK) return nullptr;
    return env;
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
            const char *chars = env->GetStringUTFChars(s, nullptr);
            if (chars) {
                text = chars;
                env->ReleaseStringUTFChars(s, chars);
            }
            env->DeleteLocalRef(s);
        }
    } else {
        env->ExceptionClear();
    }
    env->DeleteLocalRef(cls);
    env->DeleteLocalRef(ex);
    return text;
}

jobject NewObject(JNIEnv *env, const char *className, std::string *error) {
    jclass cls = env->FindClass(className);
    if (!cls) {
        *error = std::string("class ") + className + " not found: " + TakeException(env);
        return nullptr;
    }
    jobject global = nullptr;
    jmethodID ctor = env->GetMethodID(cls, "<init>", "()V");
    if (!ctor) {
        *error = std::string(className) + " has no no-argument constructor: " + TakeException(env);
    } else {
        jobject local = env->NewObject(cls, ctor);
        std::string ex = TakeException(env);
        if (!ex.empty() || !local) {
            *error = std::string("new ") + className + " failed: " + ex;
        } else {
            global = env->NewGlobalRef(local);
            env->DeleteLocalRef(local);
        }
    }
    env->DeleteLocalRef(cls);
    return global;
}

bool CallVoid(JNIEnv *env, jobject obj, const char *name, const char *sig, std::string *error, ...) {
    jmethodID mid = Method(env, obj, name, sig, error);
    if (!mid) return false;
    va_list ap;
    va_start(ap, error);
    env->CallVoidMethodV(obj, mid, ap);
    va_end(ap);
    std::string ex = TakeException(env);
    if (ex.empty()) return true;
    *error = std::string(name) + " threw " + ex;
    return false;
}

jobject CallObject(JNIEnv *env, jobject obj, const char *name, const char *sig, std::string *error, ...) {
    jmethodID mid = Method(env, obj, name, sig, error);
    if (!mid) return nullptr;
    va_list ap;
    va_start(ap, error);
    jobject local = env->CallObjectMethodV(obj, mid, ap);
    va_end(ap);
    std::string ex = TakeException(env);
    if (!ex.empty()) {
        *error = std::string(name) + " threw " + ex;
        return nullptr;
    }
    if (!local) {
        *error = std::string(name) + " returned null";
        return nullptr;
    }
    jobject global = env->NewGlobalRef(local);
    env->DeleteLocalRef(local);
    return global;
}

void StartServiceThread(ServiceThread &thread, const char *name, std::function<void(JNIEnv *)> body) {
    std::string threadName = name;
    std::thread([&thread, threadName, body = std::move(body)] {
        JNIEnv *env = Env(threadName.c_str());
        thread.tid = ::gettid();
        if (env) {
            body(env);
            thread.exception = TakeException(env);
            Vm()->DetachCurrentThread();
        } else {
            thread.exception = "cannot attach to the JVM";
        }
        thread.returned = true;
    }).detach();
}

}  // namespace sim
