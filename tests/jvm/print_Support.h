// The print side started as the Java service starts it: queues, readPrintMsg
// on a thread of its own that never returns, initDevice, and the bridge's
// "configured" notification on the emulated print node.
#pragma once

#include <sys/msg.h>

#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <fstream>
#include <thread>
#include <string>
#include <vector>

#include "Fixtures.h"
#include "JvmHarness.h"
#include "LoggerHost.h"
#include "support/MsgQueue.h"
#include "support/TempRoot.h"
#include "support/Uel.h"
#include "support/WaitUntil.h"
#include "usbadapter/mfpbridge.h"
#include "vdev.h"

namespace printjvm {

using ::kUel;
inline constexpr const char *kReadPrintMsgSig =
    "(Ljava/lang/Object;Ljava/lang/String;Ljava/lang/String;Ljava/lang/String;I)V";

// Calls readPrintMsg on `daemon` on the calling thread; null texts pass null.
inline void ReadPrintMsg(jobject daemon, jobject maa, const char *manufacturer, const char *model,
                         const char *deviceClass) {
    jvm::CallVoid(daemon, "readPrintMsg", kReadPrintMsgSig, maa, jvm::Str(manufacturer).get(), jvm::Str(model).get(),
                  jvm::Str(deviceClass).get(), jint{1});
}

inline mfp_notif_t Notification(U8 code, S32 intf = eMfp_Notif_Prn) {
    mfp_notif_t n{};
    n.ub_notif = code;
    n.ub_intf = intf;
    return n;
}

// USBPrintDrvClose on a thread of its own, as the Java service calls it. The
// reader's idle poll is cut short once the close has asked it to park.
inline jint Hibernate(jobject service) {
    std::atomic<jint> r{-1};
    std::atomic<bool> done{false};
    const auto closeRequests = [] {
        int n = 0;
        for (const auto &l : LoggerHost_Captured()) n += l.text.find("[USBAdp] USBAdapter_IF_PrintClose start") == 0;
        return n;
    };
    const int closes = closeRequests();
    std::thread nudge([&] {
        if (!WaitUntil([&] { return done || closeRequests() > closes; })) return;
        // Only a poll under way is cut: a time-out left over would end the
        // wait of a later poll.
        while (!done) {
            if (vdev::PollsInProgress(vdev::kPrn) > 0) vdev::ExpirePoll(vdev::kPrn);
            std::this_thread::sleep_for(std::chrono::milliseconds(100));
        }
    });
    jvm::RunOnThread([&](JNIEnv *) { r = jvm::CallInt(service, "USBPrintDrvClose", "()I"); }, "hibernate");
    done = true;
    nudge.join();
    return r;
}

// USBPrintDrvOpen on a thread of its own.
inline jint Wake(jobject service) {
    std::atomic<jint> r{-1};
    jvm::RunOnThread([&](JNIEnv *) { r = jvm::CallInt(service, "USBPrintDrvOpen", "()I"); }, "wake");
    return r;
}

}  // namespace printjvm

class PrintJvmTest : public ::testing::Test {
protected:
    void SetUp() override {
        vdev::Reset();
        LoggerHost_StartCapture();
        fixtures::Reset();
        std::ofstream(root_ / kQueueKeyFile).flush();
        RemoveQueues(root_);
    }
    void TearDown() override { RemoveQueues(root_); }

    // Queues created through the daemon (it is a service object), then the
    // reader started on its own thread, the daemon its MAA object too. With
    // `configure` the print node is set up and the host configures the device,
    // so the reader is polling on return.
    void StartReader(const char *daemonClass = fixtures::kRecordingDaemon, bool configure = true) {
        daemon_ = jvm::New(daemonClass);
        ASSERT_NE(daemon_, nullptr);
        CreateQueues(daemon_);
        if (HasFatalFailure()) return;
        jobject daemon = daemon_;
        jvm::StartDetached(
            [daemon](JNIEnv *) { printjvm::ReadPrintMsg(daemon, daemon, "Tarnwel", "TW-4020 MFP", "printer"); },
            "print-reader");
        if (!configure) {
            ASSERT_TRUE(WaitUntil([] { return LoggerHost_Contains("[USBAdp]Inside USBAdapter_IF_PrintFunction"); }));
            return;
        }
        jvm::CallVoid(daemon_, "initDevice", "()V");
        ASSERT_TRUE(WaitUntil([] { return LoggerHost_Contains("[USBAdp]Exited Initialization(), fdPrn:"); }));
        ASSERT_TRUE(vdev::AsyncEnabled(vdev::kPrn));
        vdev::QueueNotification(vdev::kPrn, printjvm::Notification(MFP_DEV_CONFIGURED));
        ASSERT_TRUE(WaitUntil([] { return vdev::PollTimeouts(vdev::kPrn).size() >= 1; }));
    }

    // The service queues, made through `service`: a reader that gets in then
    // waits on its queue.
    void CreateQueues(jobject service) {
        jvm::CallVoid(service, "creatPrnScanMsgQs", "(Ljava/lang/String;)V", jvm::Str("TW-4020 MFP").get());
        ASSERT_GE(QueueOf(root_, 5), 0);
    }

    // The host's silence: the reader's waiting poll times out now. Call it when
    // the reader has delivered everything it was sent.
    static void Silence() { vdev::ExpirePoll(vdev::kPrn); }

    TempRoot root_;
    jobject daemon_ = nullptr;
};
