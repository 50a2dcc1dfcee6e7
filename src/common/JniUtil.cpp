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

std::string JNI_HostTextToModifiedUtf8(const char *text) {
    std::string out;
    if (text == nullptr) return out;
    const auto *s = reinterpret_cast<const unsigned char *>(text);
    const auto put3 = [&out](unsigned u) {
        out += static_cast<char>(0xE0 | (u >> 12));
        out += static_cast<char>(0x80 | ((u >> 6) & 0x3F));
        out += static_cast<char>(0x80 | (u & 0x3F));
    };
    while (*s != 0) {
        const unsigned c = *s;
        if (c < 0x80) {
            out += static_cast<char>(c);
            ++s;
            continue;
        }
        int n = 0;  // continuation bytes
        unsigned cp = 0;
        if (c >= 0xC2 && c <= 0xDF) {
            n = 1, cp = c & 0x1F;
        } else if (c >= 0xE0 && c <= 0xEF) {
            n = 2, cp = c & 0x0F;
        } else if (c >= 0xF0 && c <= 0xF4) {
            n = 3, cp = c & 0x07;
        }
        int i = 1;
        // Stops at the terminating NUL too: it is no continuation byte.
        for (; n != 0 && i <= n && (s[i] & 0xC0) == 0x80; ++i) cp = cp << 6 | (s[i] & 0x3F);
        static constexpr unsigned kMin[] = {0, 0x80, 0x800, 0x10000};
        if (n == 0 || i <= n || cp < kMin[n] || cp > 0x10FFFF) {
            out += '?';
            ++s;
            continue;
        }
        if (cp < 0x10000) {
            out.append(reinterpret_cast<const char *>(s), static_cast<size_t>(n) + 1);
        } else {
            cp -= 0x10000;
            put3(0xD800 + (cp >> 10));
            put3(0xDC00 + (cp & 0x3FF));
        }
        s += n + 1;
    }
    return out;
}

jstring JNI_NewHostString(JNIEnv *env, const char *text) {
    if (text == nullptr) return nullptr;
    return env->NewStringUTF(JNI_HostTextToModifiedUtf8(text).c_str());
}
