// The readPrintMsg entry: the objects it keeps, the ones it lets go, the
// strings it cannot do without, and the one reader it lets run at a time.
#include <algorithm>
#include <atomic>
#include <memory>

#include "print_Hidden.h"
#include "print_Support.h"

namespace {

using printjvm::ReadPrintMsg;

const std::string kAlreadyRunning = "[USBAdp] readPrintMsg: the print reader is already running\n";

// A new object of `cls` held only through a global reference the test drops
// itself, and a weak reference that tells whether anything still holds it.
struct Tracked {
    jobject global = nullptr;
    jweak weak = nullptr;
};

Tracked Make(const char *cls) {
    jobject global = jvm::New(cls);
    return {global, jvm::Env()->NewWeakGlobalRef(global)};
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

// Each failed call lets its daemon go at once (a later one finds none to
// delete) and keeps its MAA object for the shell.
TEST_F(PrintEntry, MissingStringReleasesTheDaemonAndReturns) {
    const struct {
        const char *manufacturer, *model, *deviceClass, *named;
    } rows[] = {
        {nullptr, "TW", "printer", "p_manufacturingString"},
        {"Tarnwel", nullptr, "printer", "p_modelName"},
        {"Tarnwel", "TW-4020", nullptr, "p_deviceClassName"},
    };
    for (const auto &r : rows) {
        SCOPED_TRACE(r.named);
        Tracked daemon = Make(fixtures::kRecordingDaemon), maa = Make(fixtures::kRecordingDaemon);
        jvm::RunOnThread(
            [&](JNIEnv *) { ReadPrintMsg(daemon.global, maa.global, r.manufacturer, r.model, r.deviceClass); },
            "print-entry");
        EXPECT_EQ(LoggerHost_Count("[USBAdp] GetStringUTFChars[" + std::string(r.named) + "] returns NULL\n"), 1);
        Drop(daemon);
        Drop(maa);
        EXPECT_TRUE(Collected(daemon)) << "the daemon is still held after a failed entry";
        EXPECT_FALSE(Collected(maa)) << "the MAA object is kept for the shell";
    }
    EXPECT_FALSE(LoggerHost_Contains("[USBAdp]Inside USBAdapter_IF_PrintFunction"));
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Deleting Global reference of print\n"), 0);
    // Without a daemon the queries answer from the library alone.
    auto fetch = hidden::Function<U32()>("fetchPrinterStatus()");
    ASSERT_NE(fetch, nullptr);
    EXPECT_EQ(fetch(), 0u);
    EXPECT_EQ(LoggerHost_Count("[USBAdp][USBPrint]Error: globalPrintObj is null.\n"), 1);
}

TEST_F(PrintEntry, CallAfterAFailedOneReleasesItsMaaObjectAndStartsTheReader) {
    Tracked daemon1 = Make(fixtures::kRecordingDaemon), maa1 = Make(fixtures::kRecordingDaemon);
    CreateQueues(daemon1.global);
    if (HasFatalFailure()) return;
    jvm::RunOnThread(
        [&](JNIEnv *) { ReadPrintMsg(daemon1.global, maa1.global, "Tarnwel", "TW-4020", nullptr); },
        "entry-1");
    Drop(maa1);
    LoggerHost_StartCapture();

    Tracked daemon2 = Make(jvm::kPrintAndScanService), maa2 = Make(fixtures::kRecordingDaemon);
    jobject d2 = daemon2.global, m2 = maa2.global;
    jvm::StartDetached([d2, m2](JNIEnv *) { ReadPrintMsg(d2, m2, "Tarnwel", "TW-4020", "printer"); },
                       "entry-2");
    ASSERT_TRUE(WaitUntil([] { return LoggerHost_Contains("[USBAdp]Inside USBAdapter_IF_PrintFunction"); }));
    EXPECT_EQ(LoggerHost_Count(kAlreadyRunning), 0);
    EXPECT_EQ(LoggerHost_Count("[USBAdp-MAA] Deleting Global reference of print\n"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Deleting Global reference of print\n"), 0);
    EXPECT_TRUE(Collected(maa1)) << "the first MAA object is still held";
}

// Another Java thread entering while the reader runs must not take the
// reader's objects from under it, nor start a second reader on them.
TEST_F(PrintEntry, CallWhileTheReaderRunsIsRefusedAndTheReaderKeepsItsObjects) {
    StartReader();
    if (HasFatalFailure()) return;
    auto *readerEnv = hidden::Variable<std::atomic<JNIEnv *>>("globalPrintEnv");
    auto fetch = hidden::Function<U32()>("fetchPrinterStatus()");
    ASSERT_TRUE(readerEnv && fetch);
    JNIEnv *envBefore = readerEnv->load();
    LoggerHost_StartCapture();

    // Objects without call-backs: a job or query that reached them would fail.
    jobject daemon2 = jvm::New(jvm::kPrintAndScanService), maa2 = jvm::New(jvm::kPrintAndScanService);
    auto returned = std::make_shared<std::atomic<bool>>(false);
    jvm::StartDetached(
        [daemon2, maa2, returned](JNIEnv *) {
            ReadPrintMsg(daemon2, maa2, "Other", "TW-9999", "printer");
            *returned = true;
        },
        "entry-2");
    ASSERT_TRUE(WaitUntil([&] { return returned->load(); }, 5000)) << "the second call did not return";
    EXPECT_EQ(LoggerHost_Count(kAlreadyRunning), 1);
    const std::vector<LoggedLine> lines = LoggerHost_Captured();
    EXPECT_TRUE(std::any_of(lines.begin(), lines.end(), [](const LoggedLine &l) {
        return l.text == kAlreadyRunning && l.levelName == "ERROR";
    })) << "the refusal is not logged as an error";
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Deleting Global reference of print\n"), 0);
    EXPECT_EQ(LoggerHost_Count("[USBAdp-MAA] Deleting Global reference of print\n"), 0);
    EXPECT_FALSE(LoggerHost_Contains("[USBAdp]Inside USBAdapter_IF_PrintFunction"));
    EXPECT_EQ(readerEnv->load(), envBefore);

    const std::string job = kUel + "for the first daemon" + kUel;
    vdev::HostWrite(vdev::kPrn, job);
    ASSERT_TRUE(fixtures::AwaitJobEnded(0, 10000));
    EXPECT_EQ(fixtures::JobBytes(0), job);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Error in RegisterJob()::can't find processPrintCommand().\n"), 0);
    fixtures::SetIntReply("getPrinterStatus", 2);
    // The set-up asked once already, for the Device ID.
    const int asked = fixtures::Calls("getPrinterStatus");
    EXPECT_EQ(fetch(), 2u);
    EXPECT_EQ(fixtures::Calls("getPrinterStatus"), asked + 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp][USBPrint]Exit fetchPrinterStatus, printerStatus[2]\n"), 1);
}

}  // namespace
