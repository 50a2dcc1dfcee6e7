// Host stand-in of the platform's JNI helper library (one function of it).
#include "platform/JNIHelp.h"

extern "C" int jniThrowRuntimeException(JNIEnv *env, const char *msg) {
    if (env == nullptr) return -1;
    // A pending exception would make every call below illegal; the new one wins.
    if (env->ExceptionCheck()) env->ExceptionClear();
    jclass cls = env->FindClass("java/lang/RuntimeException");
    if (cls == nullptr) return -1;  // FindClass left its own error pending
    const int rc = env->ThrowNew(cls, msg) == 0 ? 0 : -1;
    env->DeleteLocalRef(cls);
    return rc;
}
