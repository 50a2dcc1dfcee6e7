// SetUIEnable of the loaded library against the recording print daemons: the
// panel is switched on through the print service, and every Java failure ends
// in "Failed" with no exception left pending.
#include "maa/MAA_Types.h"
#include "print_Hidden.h"
#include "print_Support.h"
#include "support/MaaRecords.h"

namespace {

using namespace maarec;

class PanelSetUIEnable : public PrintJvmTest {
protected:
    void Start(const char *daemonClass = fixtures::kRecordingDaemon) {
        StartReader(daemonClass, false);
        setUIEnable_ = hidden::Function<TMAAResult *()>("SetUIEnable()");
        setWriter_ = hidden::Function<void(void (*)(const TMAAResult *))>(
            "MAA_SetResultWriter(void (*)(TMAAResult const*))");
        ASSERT_TRUE(setUIEnable_ && setWriter_);
        setWriter_(&Capture);
    }
    void TearDown() override {
        if (setWriter_) setWriter_(nullptr);
        PrintJvmTest::TearDown();
    }
    // The records the host receives: written at once, then the returned one.
    Recs hostSees() {
        written.clear();
        Recs all = Seen(setUIEnable_());
        EXPECT_EQ(jvm::Env()->ExceptionCheck(), JNI_FALSE);
        return all;
    }

    TMAAResult *(*setUIEnable_)() = nullptr;
    void (*setWriter_)(void (*)(const TMAAResult *)) = nullptr;
};

TEST_F(PanelSetUIEnable, TheServiceReplyIsTheVerdictAndJavaFailuresEndInFailed) {
    Start();
    if (HasFatalFailure()) return;
    const Rec header = Cont("[ SetUIEnable ]");
    EXPECT_EQ(hostSees(), (Recs{header, End("SetUIEnable = OK")}));
    fixtures::SetReply("maaSetUIEnable", "panel on");
    EXPECT_EQ(hostSees(), (Recs{header, End("panel on")}));
    fixtures::ReturnNull("maaSetUIEnable");
    EXPECT_EQ(hostSees(), (Recs{header, End("Failed")}));
    fixtures::ReturnNull("maaSetUIEnable", false);
    fixtures::ThrowOn("maaSetUIEnable");
    EXPECT_EQ(hostSees(), (Recs{header, End("Failed")}));
    EXPECT_EQ(fixtures::Calls("maaSetUIEnable"), 4);
}

TEST_F(PanelSetUIEnable, ADaemonWithoutTheMethodFails) {
    Start(fixtures::kDaemonWithoutUpcalls);
    if (HasFatalFailure()) return;
    EXPECT_EQ(hostSees(), (Recs{Cont("[ SetUIEnable ]"), End("Failed")}));
    EXPECT_TRUE(LoggerHost_Contains("can't find maaSetUIEnable()"));
}

}  // namespace
