#include "common/JniUtil.h"

bool JNI_ExceptionSweep(JNIEnv *env) {
    if (!env->ExceptionCheck()) return false;
    env->ExceptionDescribe();
    env->ExceptionClear();
    return true;
}

void JNI_ReplaceGlobalRef(JNIEnv *env, jobject &slot, jobject obj) {
    if (slot) env->DeleteGlobalRef(slot);
    slot = obj ? env->NewGlobalRef(obj) : nullptr;
}

void JNI_ReplaceGlobalRef(JNIEnv *env, std::atomic<jobject> &slot, jobject obj) {
    jobject old = slot.exchange(obj ? env->NewGlobalRef(obj) : nullptr);
    if (old) env->DeleteGlobalRef(old);
}
