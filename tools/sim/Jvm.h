// The JVM of a simulator process: created through the invocation API with the
// project's jar on its class path and libusbadapter.so's directory on its
// library path, so the library is loaded by Java itself and resolves the
// driver calls to the vdev linked into this executable.
#pragma once

#include <jni.h>
#include <sys/types.h>

#include <atomic>
#include <functional>
#include <string>
#include <vector>

namespace sim {

struct JvmConfig {
    std::string jar;        // usbadapter.jar
    std::string libDir;     // directory of libusbadapter.so
    bool checkJni = true;   // -Xcheck:jni
    std::string maxHeap = "256m";
    std::vector<std::string> properties;  // "name=value", passed as -D
    std::vector<std::string> extra;       // further options, as given
};

// Where the build put the jar and the library (compile-time defaults).
JvmConfig DefaultJvmConfig();
std::vector<std::string> JvmOptions(const JvmConfig &config);

// Creates the JVM on the calling thread, which stays attached. False with a
// reason when it cannot be created.
bool CreateJvm(const JvmConfig &config, std::string *error);
JavaVM *Vm();
// The calling thread's environment; attaches it as a daemon thread if needed.
JNIEnv *Env(const char *threadName = "usbadapter-sim");

// Clears a pending Java exception and returns its toString() ("" when none).
std::string TakeException(JNIEnv *env);

// A global reference to a new object made with the class's no-argument
// constructor; null with a reason on failure.
jobject NewObject(JNIEnv *env, const char *className, std::string *error);
// Calls a void instance method; false with a reason when the method is missing
// or threw.
bool CallVoid(JNIEnv *env, jobject obj, const char *name, const char *sig, std::string *error, ...);
// A global reference to the object an instance method returns (null on failure).
jobject CallObject(JNIEnv *env, jobject obj, const char *name, const char *sig, std::string *error, ...);

// A thread running an entry that does not return while the service lives (the
// print reader): attached to the JVM as a daemon, never joined.
struct ServiceThread {
    std::atomic<pid_t> tid{0};
    std::atomic<bool> returned{false};
    std::string exception;  // set before `returned`
};
void StartServiceThread(ServiceThread &thread, const char *name, std::function<void(JNIEnv *)> body);

}  // namespace sim
