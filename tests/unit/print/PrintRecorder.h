// What the print reader and the classifier deliver, recorded instead of going
// to Java, and a fixture that runs the reader turn by turn over the emulated
// print node.
#pragma once

#include <fcntl.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "LoggerHost.h"
#include "adapter/Classifier.h"
#include "adapter/USB.h"
#include "adapter/prn_thread.h"
#include "common/Wait.h"
#include "print/USBPrint.h"
#include "support/Uel.h"
#include "vdev.h"

namespace rec {

enum class Kind { Register, Pass, End, AppType, AppBuf, AppEnd };

struct Event {
    Kind kind;
    std::string data;  // bytes passed, or the application type
};

// A print job as Java would see it.
struct Job {
    std::string bytes;
    std::vector<size_t> chunks;
    bool ended = false;
};

// An application transfer as Java would see it.
struct App {
    std::string type;
    std::vector<std::string> writes;
    bool closed = false;
};

inline std::vector<Event> &Events() {
    static std::vector<Event> events;
    return events;
}
// Answers of RegisterJob and of the three application calls.
inline S8 registerAnswer = 1;
inline S32 appAnswer = 0;

// A refused registration is recorded with data "refused" and opens no job.
inline S8 RegisterJob(const char *) {
    Events().push_back({Kind::Register, registerAnswer < 0 ? "refused" : ""});
    return registerAnswer;
}
inline void PassData(U8 *data, S32 len) {
    Events().push_back({Kind::Pass, std::string(reinterpret_cast<const char *>(data), static_cast<size_t>(len))});
}
inline void NotifyEndOfData() { Events().push_back({Kind::End, {}}); }
inline S32 SendAppType(const char *type) {
    Events().push_back({Kind::AppType, type});
    return appAnswer;
}
inline S32 SendAppBuf(const char *, U8 *buf, S32 len) {
    Events().push_back({Kind::AppBuf, std::string(reinterpret_cast<const char *>(buf), static_cast<size_t>(len))});
    return appAnswer;
}
inline S32 NotifyAppEnd(const char *type) {
    Events().push_back({Kind::AppEnd, type});
    return appAnswer;
}

inline const TPrintDelivery kRecorder = {RegisterJob, PassData, NotifyEndOfData, SendAppType, SendAppBuf, NotifyAppEnd};

inline void Clear() {
    Events().clear();
    registerAnswer = 1;
    appAnswer = 0;
}

// Jobs in order. Data passed outside a registered job fails the test: the
// reader must never hand bytes to a job that does not exist.
inline std::vector<Job> Jobs() {
    std::vector<Job> jobs;
    bool open = false;
    for (const Event &e : Events()) {
        if (e.kind == Kind::Register && e.data != "refused") {
            EXPECT_FALSE(open) << "a job was registered while another was open";
            jobs.push_back({});
            open = true;
        } else if (e.kind == Kind::Pass) {
            EXPECT_TRUE(open) << "data passed with no job open";
            if (open) {
                jobs.back().bytes += e.data;
                jobs.back().chunks.push_back(e.data.size());
            }
        } else if (e.kind == Kind::End) {
            EXPECT_TRUE(open) << "a job was ended that was not open";
            if (open) jobs.back().ended = true;
            open = false;
        }
    }
    return jobs;
}

inline std::vector<App> Apps() {
    std::vector<App> apps;
    for (const Event &e : Events()) {
        if (e.kind == Kind::AppType) apps.push_back({e.data, {}, false});
        else if (e.kind == Kind::AppBuf && !apps.empty()) apps.back().writes.push_back(e.data);
        else if (e.kind == Kind::AppEnd && !apps.empty()) apps.back().closed = true;
    }
    return apps;
}

// Every byte passed, in order.
inline std::string Delivered() {
    std::string all;
    for (const Event &e : Events())
        if (e.kind == Kind::Pass) all += e.data;
    return all;
}

}  // namespace rec

// `line` logged once; nullptr for a table row that expects none.
inline void ExpectLoggedOnce(const char *line) {
    if (!line) return;
    EXPECT_EQ(LoggerHost_Count(line), 1) << line;
}

// The reader over the emulated print node, turn by turn, delivering to the
// recorder. Time-outs on the node are instant, so a turn with nothing pending
// is the reader's silence.
class ReaderTest : public ::testing::Test {
protected:
    void SetUp() override {
        LoggerHost_StartCapture();
        USBPrint_SetDelivery(&rec::kRecorder);
        ASSERT_EQ(USBAdapter_AllocateReadBuffers(), 1);
        // The reader runs its passes only while the host has configured the device.
        IsConfigured = 1;
        IsDisconnected = 0;
        hibernation_flag = 0;
        Restart(true);
        ASSERT_GT(fdPrn.load(), 0);
    }
    void TearDown() override {
        if (fdPrn > 0) ::close(fdPrn);
        fdPrn = 0;
        IsConfigured = 0;
        IsDisconnected = 0;
        USBPrint_SetDelivery(nullptr);
        vdev::Reset();
    }

    static void ResetReader() {
        InitializeVars();
        Wait_PutBack(-1, nullptr, 0, false);
        slPollTimeout = POLL_TIMEOUT_IDLE;
        splitPatternMarker = 0;
        UelPosition = 0;
    }
    // A new case in a loop: nothing recorded, the reader fresh; with `node`
    // also a new emulated node.
    static void Restart(bool node = false) {
        rec::Clear();
        ResetReader();
        if (!node) return;
        vdev::Reset();
        fdPrn = ::open(vdev::kPrn, O_RDWR);
        vdev::SetInstantTimeouts(vdev::kPrn, true);
    }

    // Turns of the reader until every host byte has been taken (bounded).
    static void Drain() {
        for (int turns = 0; vdev::PendingHostBytes(vdev::kPrn) > 0 || Wait_PutBackLeft(fdPrn) > 0; ++turns) {
            ASSERT_LT(turns, 100000) << "the reader stopped taking host data";
            USBAdapter_ReadPass();
        }
    }
    // One turn with nothing pending.
    static void Silence() { USBAdapter_ReadPass(); }

    // The host sends each transfer; the reader takes them all, then is silent.
    static void Send(const std::vector<std::string> &transfers, bool thenSilence = true) {
        for (const std::string &t : transfers) vdev::HostWrite(vdev::kPrn, t);
        Drain();
        if (thenSilence) Silence();
    }
};
