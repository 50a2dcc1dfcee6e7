/* The platform's JNI helper library. On a PC the host stand-in provides it. */
#ifndef PLATFORM_JNIHELP_H
#define PLATFORM_JNIHELP_H

#include <jni.h>

#ifdef __cplusplus
extern "C" {
#endif

/* Raises java.lang.RuntimeException with `msg` on the calling thread, replacing
 * any exception already pending. 0 when the new exception is pending, -1 when it
 * could not be made. */
int jniThrowRuntimeException(JNIEnv *env, const char *msg);

#ifdef __cplusplus
}
#endif

#endif
