// A JVM inside a native host process (the simulator, the JVM tests, the JVM
// benchmarks), made through the invocation API: its options, its creation,
// the environments of native threads, and Java exceptions as text.
#pragma once

#include <jni.h>

#include <functional>
#include <string>
#include <vector>

namespace jvmhost {

struct JvmConfig {
    std::string classPath;  // jars, ':'-separated; each must be readable
    std::string libDir;     // directory of libusbadapter.so (java.library.path)
    bool checkJni = true;   // -Xcheck:jni
    std::string maxHeap = "256m";
    std::vector<std::string> properties;  // "name=value", passed as -D
    std::vector<std::string> extra;       // further options, as given
};

std::vector<std::string> JvmOptions(const JvmConfig &config);

// Creates the process's JVM on the calling thread, which stays attached.
// False with a reason when it cannot be created.
bool CreateJvm(const JvmConfig &config, std::string *error);
JavaVM *Vm();  // null before CreateJvm succeeded
// The calling thread's environment; attaches it as a daemon thread named
// `threadName` if needed. Null without a JVM or when the attach fails.
JNIEnv *Env(const char *threadName);

// Clears a pending Java exception and returns its toString() ("" when none).
std::string TakeException(JNIEnv *env);

// Runs `body` on a new native thread attached as a daemon under `threadName`
// and never joins it: for entries that do not return while the process lives.
// `body` gets null when the thread cannot attach; the thread detaches itself
// when `body` returns.
void StartDetached(const char *threadName, std::function<void(JNIEnv *)> body);

}  // namespace jvmhost
