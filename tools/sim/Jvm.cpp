#include "Jvm.h"

#include <unistd.h>

#include <cstdarg>

namespace sim {
namespace {

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
    c.classPath = USBADAPTER_SIM_JAR;
#endif
#ifdef USBADAPTER_SIM_LIBDIR
    c.libDir = USBADAPTER_SIM_LIBDIR;
#endif
    return c;
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
    jvmhost::StartDetached(name, [&thread, body = std::move(body)](JNIEnv *env) {
        thread.tid = ::gettid();
        if (env) {
            body(env);
            thread.exception = TakeException(env);
        } else {
            thread.exception = "cannot attach to the JVM";
        }
        thread.returned = true;
    });
}

}  // namespace sim
