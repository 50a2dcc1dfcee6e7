// The session when the channel misbehaves: signals landing in its waits (the
// bridge's SIGIO reaches whatever thread the kernel picks), a channel that
// reports readiness and gives nothing, and a cable pulled in the middle of a
// start command. (The signal cases pin a departure: signals are not time-outs.)
#include <thread>

#include "maa_session/SessionFixture.h"
#include "support/CpuTime.h"
#include "support/SignalStorm.h"
#include "support/WaitUntil.h"

namespace maasession {
namespace {

class SessionSignals : public SessionTest {
protected:
    // The session under a SIGIO storm while `host` plays the host; the cable
    // is pulled if it is still running 10 s later.
    Outcome SessionUnderSignals(const std::function<void()> &host) {
        U8 cmd[COMMAND_SIZE] = {0x1B, 'w'};
        S32 ret = 0;
        UnderSignals([&] { ret = MAA_Hook(static_cast<U32>(fd), cmd); }, host, 10000, [] {
            IsDisconnected = 1;
            vdev::ExpirePoll(vdev::kPrn, 100);
        });
        return {ret, std::string(reinterpret_cast<char *>(cmd), sizeof cmd), Str(vdev::HostRead(vdev::kPrn))};
    }

    // The host sends `bytes` once the device has taken everything before them
    // and waited a little (so the device is inside its wait).
    static void SendLate(const std::string &bytes) {
        WaitUntil([] { return vdev::PendingHostBytes(vdev::kPrn) == 0; }, 5000);
        std::this_thread::sleep_for(std::chrono::milliseconds(60));
        vdev::HostWrite(vdev::kPrn, bytes);
    }
};

// A start command or a download arriving in pieces under signals: a signal
// taken for the end of the start command would refuse the session, a download
// cut short would run its rest as command lines.
TEST_F(SessionSignals, PiecesArrivingLateAreNotCutShort) {
    const std::string file = "probe(9)\rprobe(9)\rprobe(9)\r";
    const std::string announce = Special(MAA_FILE_TRANS_H2T, static_cast<U32>(file.size()));
    struct Row { const char *name; std::vector<std::string> pieces; U32 probe; size_t address; } rows[] = {
        {"start command", {"MAAST", "ART", "probe(2)\r", "MAA-STOP\r"}, 2, 0},
        {"download",
         {"MAASTART", announce + file.substr(0, 4), file.substr(4, 10), file.substr(14), "probe(5)\rMAA-STOP\r"}, 5, 4},
    };
    for (const Row &r : rows) {
        SCOPED_TRACE(r.name);
        Reopen();
        probes.clear();
        Outcome o = SessionUnderSignals([&] {
            for (const std::string &p : r.pieces) SendLate(p);
        });
        EXPECT_EQ(o.ret, 0);
        EXPECT_EQ(probes, std::vector<U32>{r.probe});
        const std::string tail = Frame(1, r.probe, "probe " + std::to_string(r.probe)) + kAck;
        ASSERT_EQ(o.wire.size(), kAck.size() + r.address + tail.size());
        EXPECT_EQ(o.wire.substr(0, kAck.size()), kAck);
        EXPECT_EQ(o.wire.substr(kAck.size() + r.address), tail);
    }
    EXPECT_GT(SignalStorm::Delivered(), 0);
}

// A channel that says it is ready and gives nothing: hung up (the node's
// descriptor is dead) or closed. The line reader waits out each poll period
// instead of asking again at once, and the pulled cable still ends it.
TEST_F(SessionTest, LineReaderDoesNotSpinOnAChannelThatGivesNothing) {
    const int closed = ::dup(fd);
    ::close(closed);
    const struct { const char *name; int handle; } rows[] = {{"hung up", fd}, {"closed", closed}};
    vdev::Reset();
    for (const auto &r : rows) {
        SCOPED_TRACE(r.name);
        IsDisconnected = 0;
        maa_session::slPollTimeout = MAA_POLL_TIMEOUT;
        U8 buf[MAA_LINE_BUFFER_SIZE];
        const WorkTime t = TimeUntilStopped([&] { MAA_ReadLine(static_cast<U32>(r.handle), buf); },
                                            [] { IsDisconnected = 1; }, 600);
        EXPECT_EQ(buf[0], 0);
        EXPECT_GE(t.wallMs, 500);
        EXPECT_LT(t.wallMs, 3000) << "the pulled cable is noticed while waiting";
        EXPECT_LT(t.cpuMs, t.wallMs / 5) << "the line reader spun";
    }
    IsDisconnected = 0;
}

// ---- through the reader: a cable pulled in the middle of a start command -------

// The bridge loses what the host had in flight when the cable goes, so no rest
// of the start command is read as the beginning of the next job.
TEST_F(SessionRoad, StartCommandPulledMidwayLeavesTheNextPrintJobByteExact) {
    const std::string start = "\x1bwMAASTART";
    const std::string job = kUel + "@PJL JOB\r\npage" + kUel;
    LoggerHost_StopCapture();
    for (size_t k = 1; k < start.size(); ++k) {
        SCOPED_TRACE(testing::Message() << "pulled after " << k << " bytes");
        rec::Clear();
        ResetReader();
        IsConfigured = 1;
        IsDisconnected = 0;
        maa_session::slPollTimeout = MAA_POLL_TIMEOUT;
        vdev::SetInstantTimeouts(vdev::kPrn, false);
        vdev::HostWrite(vdev::kPrn, start.substr(0, k));
        std::thread puller([&, k] {
            // The reader has taken the first k bytes and waits for the rest;
            // the rest is in flight when the cable goes.
            WaitUntil([] { return vdev::PendingHostBytes(vdev::kPrn) == 0; }, 5000);
            std::this_thread::sleep_for(std::chrono::milliseconds(20));
            vdev::HostWrite(vdev::kPrn, start.substr(k));
            mfp_notif_t pull{};
            pull.ub_notif = MFP_DEV_DISCONNECT;
            pull.ub_intf = eMfp_Notif_Both;
            vdev::QueueNotification(vdev::kPrn, pull);
            IsConfigured = 0;
            IsDisconnected = 1;
            vdev::ExpirePoll(vdev::kPrn, 10);
        });
        USBAdapter_ReadPass();
        puller.join();
        USBAdapter_EndJobOnPark();
        const size_t before = rec::Jobs().size();

        // Plugged in again; the host sends a print job.
        IsDisconnected = 0;
        IsConfigured = 1;
        vdev::SetInstantTimeouts(vdev::kPrn, true);
        Send({job});
        auto jobs = rec::Jobs();
        ASSERT_EQ(jobs.size(), before + 1);
        EXPECT_EQ(jobs.back().bytes, job);
        EXPECT_TRUE(jobs.back().ended);
        EXPECT_EQ(vdev::PendingHostBytes(vdev::kPrn), 0u);
        vdev::Reset();
        fdPrn = ::open(vdev::kPrn, O_RDWR);
        if (HasFailure()) return;
    }
}

}  // namespace
}  // namespace maasession
