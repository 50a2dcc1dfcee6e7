// The print up-calls and queries of the loaded library, called directly while
// its reader waits for the initialisation message, against the recording
// daemons: what Java sees, what comes back, and that no Java failure leaves an
// exception pending.
#include <numeric>
#include <optional>
#include <thread>

#include "print_Hidden.h"
#include "print_Support.h"

namespace {

// Looked up on construction, once the library is loaded (Java loads it with
// the first service class); a missing one fails the test.
struct Upcalls {
    S8 (*RegisterJob)(const char *) = hidden::Function<S8(const char *)>("RegisterJob(char const*)");
    void (*PassData)(U8 *, S32) = hidden::Function<void(U8 *, S32)>("PassData(unsigned char*, int)");
    void (*NotifyEndOfData)() = hidden::Function<void()>("NotifyEndOfData()");
    S32 (*SendAppType)(const char *) = hidden::Function<S32(const char *)>("SendAppType(char const*)");
    S32 (*SendAppBuf)(const char *, U8 *, S32) =
        hidden::Function<S32(const char *, U8 *, S32)>("SendAppBuf(char const*, unsigned char*, int)");
    S32 (*NotifyAppEnd)(const char *) = hidden::Function<S32(const char *)>("NotifyAppEnd(char const*)");
    U32 (*fetchPrinterStatus)() = hidden::Function<U32()>("fetchPrinterStatus()");
    void (*getInterpreters)(U32 *) = hidden::Function<void(U32 *)>("getInterpreters(unsigned int*)");

    void Pass(std::string bytes) const {
        PassData(reinterpret_cast<U8 *>(bytes.data()), static_cast<S32>(bytes.size()));
    }
    S32 AppBuf(const char *type, std::string bytes) const {
        return SendAppBuf(type, reinterpret_cast<U8 *>(bytes.data()), static_cast<S32>(bytes.size()));
    }
    // What getInterpreters writes into 17 words with Java answering `given`.
    std::vector<U32> Interpreters(const std::vector<int> &given) const {
        fixtures::SetInterpreters(given);
        std::vector<U32> ids(17, 0xABABABABu);
        getInterpreters(ids.data());
        return ids;
    }
};

class PrintUpcalls : public PrintJvmTest {
protected:
    // The reader is started but never configured: it waits on its queue and
    // leaves the library to the test thread.
    void Start(const char *daemonClass = fixtures::kRecordingDaemon) {
        StartReader(daemonClass, false);
        if (HasFatalFailure()) return;
        up.emplace();
        ASSERT_FALSE(HasFailure()) << "a function is missing";
        LoggerHost_StartCapture();
    }
    static bool ExceptionPending() { return jvm::Env()->ExceptionCheck() == JNI_TRUE; }

    std::optional<Upcalls> up;
};

TEST_F(PrintUpcalls, JobUpcallsReachTheHandlerInOrder) {
    Start();
    if (HasFatalFailure()) return;
    // Before any job, data and end are logged and dropped.
    up->Pass("orphan");
    up->NotifyEndOfData();
    EXPECT_TRUE(fixtures::EventLines().empty());
    EXPECT_EQ(up->RegisterJob("job.prn"), 1);
    up->Pass("hello");
    up->Pass("");
    fixtures::ThrowOn("addBufferToList", 1);  // swept; the job goes on without the chunk
    up->Pass("lost");
    EXPECT_FALSE(ExceptionPending());
    up->Pass("!");
    up->NotifyEndOfData();
    EXPECT_EQ(fixtures::EventLines(),
              (std::vector<std::string>{"processPrintCommand:job.prn", "addBufferToList:0:5", "addBufferToList:0:0",
                                        "addBufferToList:0:4!throw", "addBufferToList:0:1", "endOfData:0"}));
    EXPECT_EQ(fixtures::JobBytes(0), "hello!");
    // The handler is gone with the end of the job.
    up->NotifyEndOfData();
    up->Pass("late");
    EXPECT_EQ(LoggerHost_Count("[USBAdp] globalUSBPrintFileStreamObj == NULL\n"), 4);
    EXPECT_EQ(fixtures::Calls("addBufferToList"), 4);
    // A new job replaces a handler left open.
    up->RegisterJob("a");
    up->RegisterJob("b");
    up->Pass("data");
    up->NotifyEndOfData();
    ASSERT_EQ(fixtures::JobCount(), 3);
    EXPECT_EQ(fixtures::JobBytes(1), "");
    EXPECT_FALSE(fixtures::JobEnded(1));
    EXPECT_EQ(fixtures::JobBytes(2), "data");
    EXPECT_TRUE(fixtures::JobEnded(2));
}

TEST_F(PrintUpcalls, NullHandlerAnswersMinusOne) {
    Start();
    if (HasFatalFailure()) return;
    fixtures::ReturnNull("processPrintCommand");
    EXPECT_EQ(up->RegisterJob(""), -1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Error in RegisterJob()::globalUSBPrintFileStreamObj object is null.\n"), 1);
    fixtures::ReturnNull("processPrintCommand", false);
    fixtures::ThrowOn("processPrintCommand", 1);
    EXPECT_EQ(up->RegisterJob(""), -1);
    EXPECT_FALSE(ExceptionPending());
}

TEST_F(PrintUpcalls, ApplicationTransferIsTypeBuffersAndCloseAndFailuresAnswerMinusOne) {
    Start();
    if (HasFatalFailure()) return;
    EXPECT_EQ(up->SendAppType("faxd"), 0);
    EXPECT_EQ(up->AppBuf("faxd", std::string("\x1b\x91\0\x01", 4)), 0);
    EXPECT_EQ(up->AppBuf("faxd", "body"), 0);
    EXPECT_EQ(up->NotifyAppEnd("faxd"), 0);
    EXPECT_EQ(fixtures::EventLines(), (std::vector<std::string>{"processData:faxd", "write:0:4", "write:0:4", "close:0"}));
    EXPECT_EQ(fixtures::AppBytes(0), std::string("\x1b\x91\0\x01", 4) + "body");
    EXPECT_TRUE(fixtures::AppClosed(0));
    // The stream is gone after the close.
    EXPECT_EQ(up->AppBuf("faxd", "more"), -1);
    EXPECT_EQ(up->NotifyAppEnd("faxd"), -1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] can't find clsUSBAppStream\n"), 2);

    fixtures::ReturnNull("processData");
    EXPECT_EQ(up->SendAppType("dcu"), -1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] globalUSBAppStreamobj is NULL\n"), 1);
    fixtures::ReturnNull("processData", false);
    ASSERT_EQ(up->SendAppType("dcu"), 0);
    fixtures::ThrowOn("write", 1);
    EXPECT_EQ(up->AppBuf("dcu", "lost"), 0);  // a throwing write is swept, not a failure
    EXPECT_FALSE(ExceptionPending());
    EXPECT_EQ(up->AppBuf("dcu", "kept"), 0);
    EXPECT_EQ(up->NotifyAppEnd("dcu"), 0);
    EXPECT_EQ(fixtures::AppBytes(1), "kept");
}

TEST_F(PrintUpcalls, DaemonWithoutCallBacksFailsCleanly) {
    Start(jvm::kPrintAndScanService);
    if (HasFatalFailure()) return;
    // A job without its handler method still counts as registered: the
    // reader goes on and its data is dropped.
    EXPECT_EQ(up->RegisterJob("x"), 1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] Error in RegisterJob()::can't find processPrintCommand().\n"), 1);
    EXPECT_EQ(up->SendAppType("ampv"), -1);
    EXPECT_EQ(LoggerHost_Count("[USBAdp] can't find processData method\n"), 1);
    EXPECT_EQ(up->fetchPrinterStatus(), 0u);
    EXPECT_EQ(LoggerHost_Count("[USBAdp][USBPrint] GetMethodID returned NULL in fetchPrinterStatus()\n"), 1);
    EXPECT_EQ(up->Interpreters({1, 2}), std::vector<U32>(17, 0xABABABABu));
    EXPECT_FALSE(ExceptionPending());
}

TEST_F(PrintUpcalls, InterpretersAreAlwaysFifteenEntries) {
    Start();
    if (HasFatalFailure()) return;
    const U32 untouched = 0xABABABABu;
    std::vector<int> twenty(20);
    std::iota(twenty.begin(), twenty.end(), 101);
    std::vector<U32> first15(twenty.begin(), twenty.begin() + 15);
    first15.resize(17, untouched);
    EXPECT_EQ(up->Interpreters(twenty), first15);
    // A short Java array still gives 15 entries, the missing ones 0.
    EXPECT_EQ(up->Interpreters({7, 8, 9}), (std::vector<U32>{7, 8, 9, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, untouched,
                                                              untouched}));
    EXPECT_FALSE(ExceptionPending());
}

TEST_F(PrintUpcalls, NativeThreadOfItsOwnAttachesForItsUpcalls) {
    Start();
    if (HasFatalFailure()) return;
    std::thread native([this] {
        up->RegisterJob("from a native thread");
        up->Pass("bytes");
        up->NotifyEndOfData();
        jvm::Vm()->DetachCurrentThread();
    });
    native.join();
    EXPECT_EQ(fixtures::EventLines(), (std::vector<std::string>{"processPrintCommand:from a native thread",
                                                                "addBufferToList:0:5", "endOfData:0"}));
    EXPECT_EQ(fixtures::JobBytes(0), "bytes");
}

}  // namespace
