// JNI helpers shared by every module that talks to Java.
#pragma once

#include <jni.h>

#include <atomic>
#include <string>
#include <utility>

// Describes and clears a pending Java exception so a failing Java method never
// stops a native loop. Returns true when there was one.
bool JNI_ExceptionSweep(JNIEnv *env);

// Bytes from a USB host as the modified UTF-8 that NewStringUTF requires:
// well-formed UTF-8 is kept (characters above U+FFFF become surrogate pairs),
// every byte that is not part of a well-formed sequence becomes '?'.
std::string JNI_HostTextToModifiedUtf8(const char *text);
// A Java string of host bytes (see above) as a new local reference; null
// (with the JVM's error pending) when it cannot be made.
jstring JNI_NewHostString(JNIEnv *env, const char *text);

// A local reference deleted when it goes out of scope.
template <typename T>
class LocalRef {
public:
    LocalRef(JNIEnv *env, T ref) : env_(env), ref_(ref) {}
    LocalRef(LocalRef &&o) noexcept : env_(o.env_), ref_(std::exchange(o.ref_, nullptr)) {}
    LocalRef(const LocalRef &) = delete;
    LocalRef &operator=(const LocalRef &) = delete;
    LocalRef &operator=(LocalRef &&) = delete;
    ~LocalRef() {
        if (ref_) env_->DeleteLocalRef(ref_);
    }
    T get() const { return ref_; }
    explicit operator bool() const { return ref_ != nullptr; }

private:
    JNIEnv *env_;
    T ref_;
};

// The modified-UTF-8 text of a Java string, released when it goes out of scope.
class UtfChars {
public:
    UtfChars(JNIEnv *env, jstring s) : env_(env), s_(s), chars_(s ? env->GetStringUTFChars(s, nullptr) : nullptr) {}
    UtfChars(const UtfChars &) = delete;
    UtfChars &operator=(const UtfChars &) = delete;
    ~UtfChars() {
        if (chars_) env_->ReleaseStringUTFChars(s_, chars_);
    }
    const char *get() const { return chars_; }
    explicit operator bool() const { return chars_ != nullptr; }

private:
    JNIEnv *env_;
    jstring s_;
    const char *chars_;
};

// Replaces a long-lived global reference: deletes the old one, stores a new
// global reference to `obj` (or null).
void JNI_ReplaceGlobalRef(JNIEnv *env, jobject &slot, jobject obj);
// The same for a slot that other threads read.
void JNI_ReplaceGlobalRef(JNIEnv *env, std::atomic<jobject> &slot, jobject obj);
