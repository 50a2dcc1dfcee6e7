// The readPrintMsg entry: the objects it keeps, the ones it lets go, and the
// strings it cannot do without.
#include "print_Hidden.h"
#include "print_Support.h"

namespace {

using printjvm::ReadPrintMsg;

// A new object of `cls` held only through a global reference the test drops
// itself, and a weak reference that tells whether anything still holds it.
struct Tracked {
    jobject global = nullptr;
    jweak weak = nullptr;
};

Tracked Make(const char *cls) {
    JNIEnv *env = jvm::Env();
    jclass c = jvm::Class(cls);
    jmethodID init = env->GetMethodID(c, "<init>", "()V");
    jobject local = env->NewObject(c, init);
    Tracked t{env->NewGlobalRef(local), env->NewWeakGlobalRef(local)};
    env->DeleteLocalRef(local);
    return t;
}

void Drop(Tracked &t) {
    jvm::Env()->DeleteGlobalRef(t.global);
    t.global = nullptr;
}

// True when the object was collected: nothing held it any more.
bool Collected(const Tracked &t) {
    JNIEnv *env = jvm::Env();
    for (int i = 0; i < 20; ++i) {
        jvm::CallStaticVoid("java/lang/System", "gc", "()V");
        if (env->IsSameObject(t.weak, nullptr)) return true;
    }
    return false;
}

using PrintEntry = PrintJvmTest;

TEST_F(PrintEntry, MissingStringReleasesTheDaemonAndReturns) {
    Tracked daemon = Make(fixtures::kRecordingDaemon), maa = Make(fixtures::kRecordingMaa);
    jvm::RunOnThread([&](JNIEnv *env) { ReadPrintMsg(env, daemon.global, maa.global, "Tarnwel", "TW-4020", nullptr); },
                     "print-entry");
    EXPECT_EQ(LoggerHost_Count("[USBAdp] GetStringUTFChars[p_deviceClassName] returns NULL\n"), 1);
    EXPECT_FALSE(LoggerHost_Contains("[USBAdp]Inside USBAdapter_IF_PrintFunction"));
    Drop(daemon);
    Drop(maa);
    EXPECT_TRUE(Collected(daemon)) << "the daemon is still held after a failed entry";
    EXPECT_FALSE(Collected(maa)) << "the MAA object is kept for the shell";
    // Without a daemon the queries answer from the library alone.
    auto fetch = hidden::Function<U32()>("fetchPrinterStatus()");
    ASSERT_NE(fetch, nullptr);
    EXPECT_EQ(fetch(), 0u);
    EXPECT_EQ(LoggerHost_Count("[USBAdp][USBPrint]Error: globalPrintObj is null.\n"), 1);
}

TEST_F(PrintEntry, EachNullStringIsNamed) {
    Tracked d = Make(fixtures::kRecordingDaemon);
    jvm::RunOnThread([&](JNIEnv *env) { ReadPrintMsg(env, d.global, nullptr, nullptr, "TW", "printer"); }, "e1");
    jvm::RunOnThread([&](JNIEnv *env) { ReadPrintMsg(env, d.global, nullptr, "Tarnwel", nullptr, "printer"); }, "e2");
    EXPECT_EQ(LoggerHost_Count("[USBAdp] GetStringUTFChars[p_manufacturingString] returns NULL\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] GetStringUTFChars[p_modelName] returns NULL\n"), 1);
    // The first call's daemon was released, so the second finds none to delete.
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Deleting Global reference of print\n"), 0);
}

TEST_F(PrintEntry, SecondCallReleasesTheObjectsOfTheFirst) {
    // The service queues exist, so a reader that gets in waits on its queue for good.
    StartReader(fixtures::kRecordingDaemon, false);
    if (HasFatalFailure()) return;
    Tracked maa1 = Make(fixtures::kRecordingMaa);
    jvm::RunOnThread(
        [&](JNIEnv *env) { ReadPrintMsg(env, daemon_, maa1.global, "Tarnwel", "TW-4020", nullptr); }, "entry-1");
    Drop(maa1);
    LoggerHost_StartCapture();

    // A full entry on a thread of its own: it releases the kept MAA object.
    Tracked daemon2 = Make(fixtures::kDaemonWithoutUpcalls), maa2 = Make(fixtures::kRecordingMaa);
    jobject d2 = daemon2.global, m2 = maa2.global;
    jvm::StartDetached([d2, m2](JNIEnv *env) { ReadPrintMsg(env, d2, m2, "Tarnwel", "TW-4020", "printer"); },
                       "entry-2");
    ASSERT_TRUE(WaitUntil([] { return LoggerHost_Contains("[USBAdp]Inside USBAdapter_IF_PrintFunction"); }));
    EXPECT_EQ(LoggerHost_Count("[USBAdp-MAA] Deleting Global reference of print\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Deleting Global reference of print\n"), 0);
    EXPECT_TRUE(Collected(maa1)) << "the first MAA object is still held";

    // And a third entry replaces the daemon of the second.
    LoggerHost_StartCapture();
    jvm::RunOnThread([&](JNIEnv *env) { ReadPrintMsg(env, daemon_, maa_, "Tarnwel", "TW-4020", nullptr); },
                     "entry-3");
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Deleting Global reference of print\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Global reference of print deleted successfully\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp-MAA] Deleting Global reference of print\n"), 1);
}

TEST_F(PrintEntry, QueriesGoToTheDaemonOfTheLatestCall) {
    StartReader(fixtures::kDaemonWithoutUpcalls, false);
    if (HasFatalFailure()) return;
    auto fetch = hidden::Function<U32()>("fetchPrinterStatus()");
    ASSERT_NE(fetch, nullptr);
    EXPECT_EQ(fetch(), 0u);
    EXPECT_EQ(LoggerHost_Count("[USBAdp][USBPrint] GetMethodID returned NULL in fetchPrinterStatus()\n"), 1);

    jobject recording = jvm::New(fixtures::kRecordingDaemon);
    jobject maa = maa_;
    jvm::StartDetached([recording, maa](JNIEnv *env) { ReadPrintMsg(env, recording, maa, "T", "M", "C"); },
                       "entry-2");
    ASSERT_TRUE(WaitUntil([] { return LoggerHost_Count("[USBAdp] Global reference of print deleted successfully\n") == 1; }));
    fixtures::SetPrinterStatus(2);
    EXPECT_EQ(fetch(), 2u);
    EXPECT_EQ(fixtures::Calls("getPrinterStatus"), 1);
}

}  // namespace
