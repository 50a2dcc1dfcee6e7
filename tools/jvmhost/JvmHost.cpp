#include "JvmHost.h"

#include <unistd.h>

#include <sstream>
#include <thread>

#include "common/JniUtil.h"

namespace jvmhost {
namespace {

// The highest version JDK 17 offers.
constexpr jint kJniVersion = JNI_VERSION_10;
JavaVM *gVm = nullptr;

}  // namespace

std::vector<std::string> JvmOptions(const JvmConfig &config) {
    std::vector<std::string> opts = {
        "-Djava.class.path=" + config.classPath,
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
    std::istringstream jars(config.classPath);
    for (std::string jar; std::getline(jars, jar, ':');) {
        if (::access(jar.c_str(), R_OK) != 0) {
            *error = "jar not readable: " + jar;
            return false;
        }
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
    LocalRef<jthrowable> ex(env, env->ExceptionOccurred());
    if (!ex) return {};
    env->ExceptionClear();
    std::string text = "(exception)";
    LocalRef<jclass> cls(env, env->GetObjectClass(ex.get()));
    jmethodID toString = env->GetMethodID(cls.get(), "toString", "()Ljava/lang/String;");
    if (!toString) {
        env->ExceptionClear();
        return text;
    }
    LocalRef<jstring> s(env, static_cast<jstring>(env->CallObjectMethod(ex.get(), toString)));
    if (env->ExceptionCheck()) {
        env->ExceptionClear();
        return text;
    }
    UtfChars chars(env, s.get());
    return chars ? chars.get() : text;
}

void StartDetached(const char *threadName, std::function<void(JNIEnv *)> body) {
    std::thread([name = std::string(threadName), body = std::move(body)] {
        JNIEnv *env = Env(name.c_str());
        body(env);
        if (env) gVm->DetachCurrentThread();
    }).detach();
}

}  // namespace jvmhost
