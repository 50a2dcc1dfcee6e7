// One real JVM per test process, created on first use with the project's jars
// on its class path, libusbadapter.so's directory on its library path,
// -Xcheck:jni and a small heap. The library is loaded by Java itself
// (System.loadLibrary in the service classes), so it calls the test binary's
// vdev and shares its logger stand-in.
//
// Reader entries (readPrintMsg, readScanMsg) never return: run them with
// jvm::StartDetached and never join. The harness's main() ends the process with
// _exit(<gtest result>) after flushing, so a thread stuck in native code neither
// keeps the process alive nor runs into destructed statics.
#pragma once

#include <jni.h>

#include <functional>
#include <string>

#include "common/JniUtil.h"

namespace jvm {

// Java classes, by JNI name.
inline constexpr const char *kPrintAndScanService =
    "com/tarnwel/vbk/common/qz/services/usbadapter/USBAdapterPrintAndScanJNIService";
inline constexpr const char *kKivoropnlAndDacService =
    "com/tarnwel/vbk/common/qz/services/usbadapter/USBAdapterKivoropnlAndDACJNIService";
inline constexpr const char *kPluginAdapter = "com/tarnwel/vbk/ca/plugin/usbadapter/USBAdapter";
inline constexpr const char *kReferenceService =
    "com/tarnwel/vbk/ca/plugin/usbadapter/print/ReferencePrintService";

// The process's JVM; created on the first call. A JVM that cannot be created
// ends the process with a message (no test can run without it).
JavaVM *Vm();
// The calling thread's environment; attaches the thread (as a daemon thread)
// when it is not attached yet. Threads started by StartDetached/RunOnThread are
// attached already.
JNIEnv *Env();

// A class by JNI name ("a/b/C"), as a global reference kept for the process.
// Adds a test failure and returns null when it cannot be found.
jclass Class(const char *name);
// A new object of `className` made with its public no-argument constructor,
// as a global reference (never released: objects handed to the reader must
// outlive the test anyway). Adds a test failure and returns null on failure.
jobject New(const char *className);
// A Java string of the calling thread, released at scope end (null for null;
// a temporary lives to the end of the call it is passed to).
LocalRef<jstring> Str(const char *text);
// The modified-UTF-8 text of a Java string ("" for null).
std::string Text(JNIEnv *env, jstring s);
// The bytes of a Java byte array ("" for null).
std::string Bytes(JNIEnv *env, jbyteArray a);
// A new byte array with `bytes`, released at scope end.
LocalRef<jbyteArray> ByteArray(const std::string &bytes);

// Calls an instance method found by name and signature on the object's runtime
// class, with JNI varargs. A missing method or a Java exception becomes a test
// failure (the exception is cleared, so no JNI warning follows).
void CallVoid(jobject obj, const char *name, const char *sig, ...);
jint CallInt(jobject obj, const char *name, const char *sig, ...);
// The same for static methods of a class (JNI name); object results are local
// references of the calling thread.
void CallStaticVoid(const char *cls, const char *name, const char *sig, ...);
jint CallStaticInt(const char *cls, const char *name, const char *sig, ...);
jboolean CallStaticBoolean(const char *cls, const char *name, const char *sig, ...);
jobject CallStaticObject(const char *cls, const char *name, const char *sig, ...);

// Runs `body` on a new native thread attached to the JVM under `threadName`
// and never joins it: for entries that do not return. The thread detaches
// itself if `body` ever returns.
void StartDetached(std::function<void(JNIEnv *)> body, const char *threadName);
// Runs `body` on a new attached thread and waits for it: for entries that
// the Java service calls from a thread other than the reader's.
void RunOnThread(std::function<void(JNIEnv *)> body, const char *threadName);

}  // namespace jvm
