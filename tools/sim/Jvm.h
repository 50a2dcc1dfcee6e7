// The JVM of a simulator process, with usbadapter.jar on its class path and
// libusbadapter.so's directory on its library path, so the library is loaded
// by Java itself and resolves the driver calls to the vdev linked into this
// executable.
#pragma once

#include <sys/types.h>

#include <atomic>

#include "JvmHost.h"

namespace sim {

using jvmhost::CreateJvm;
using jvmhost::JvmConfig;
using jvmhost::JvmOptions;
using jvmhost::TakeException;
using jvmhost::Vm;

// Where the build put the jar and the library (compile-time defaults).
JvmConfig DefaultJvmConfig();
inline JNIEnv *Env(const char *threadName = "usbadapter-sim") { return jvmhost::Env(threadName); }

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
