// SetUIEnable of the loaded library against the recording print daemons: the
// panel is switched on through the print service, and every Java failure ends
// in "Failed" with no exception left pending.
#include <string>
#include <vector>

#include "print_Hidden.h"
#include "print_Support.h"

namespace {

// The library's result record, as its writer hands it over.
struct Result {
    U32 enContinue;
    U32 ulResult;
    U32 ulDataSize;
    U8 *pubData;
};

std::vector<std::pair<U32, std::string>> written;
void capture(const Result *r) {
    written.emplace_back(r->enContinue, std::string(reinterpret_cast<const char *>(r->pubData), r->ulDataSize));
}

class PanelSetUIEnable : public PrintJvmTest {
protected:
    void Start(const char *daemonClass = fixtures::kRecordingDaemon) {
        StartReader(daemonClass, false);
        setUIEnable_ = hidden::Function<Result *()>("SetUIEnable()");
        setWriter_ = hidden::Function<void(void (*)(const Result *))>("MAA_SetResultWriter(void (*)(TMAAResult const*))");
        ASSERT_TRUE(setUIEnable_ && setWriter_);
        setWriter_(&capture);
    }
    void TearDown() override {
        if (setWriter_) setWriter_(nullptr);
        PrintJvmTest::TearDown();
    }
    // The records the host receives: written at once, then the returned one.
    std::vector<std::pair<U32, std::string>> hostSees() {
        written.clear();
        capture(setUIEnable_());
        EXPECT_EQ(jvm::Env()->ExceptionCheck(), JNI_FALSE);
        return written;
    }

    Result *(*setUIEnable_)() = nullptr;
    void (*setWriter_)(void (*)(const Result *)) = nullptr;
};

using Records = std::vector<std::pair<U32, std::string>>;
const std::pair<U32, std::string> kHeader{0, "[ SetUIEnable ]"};

TEST_F(PanelSetUIEnable, TheServiceReplyIsTheVerdict) {
    Start();
    if (HasFatalFailure()) return;
    EXPECT_EQ(hostSees(), (Records{kHeader, {1, "SetUIEnable = OK"}}));
    fixtures::SetReply("maaSetUIEnable", "panel on");
    EXPECT_EQ(hostSees(), (Records{kHeader, {1, "panel on"}}));
    EXPECT_EQ(fixtures::Calls("maaSetUIEnable"), 2);
}

TEST_F(PanelSetUIEnable, JavaFailuresEndInFailed) {
    Start();
    if (HasFatalFailure()) return;
    fixtures::ReturnNull("maaSetUIEnable");
    EXPECT_EQ(hostSees(), (Records{kHeader, {1, "Failed"}}));
    fixtures::ReturnNull("maaSetUIEnable", false);
    fixtures::ThrowOn("maaSetUIEnable");
    EXPECT_EQ(hostSees(), (Records{kHeader, {1, "Failed"}}));
    EXPECT_EQ(fixtures::Calls("maaSetUIEnable"), 2);
}

TEST_F(PanelSetUIEnable, ADaemonWithoutTheMethodFails) {
    Start(fixtures::kDaemonWithoutUpcalls);
    if (HasFatalFailure()) return;
    EXPECT_EQ(hostSees(), (Records{kHeader, {1, "Failed"}}));
    EXPECT_TRUE(LoggerHost_Contains("can't find maaSetUIEnable()"));
}

}  // namespace
