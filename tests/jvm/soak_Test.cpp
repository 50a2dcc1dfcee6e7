// A long run of the print channel through the JVM: UEL-framed jobs in random
// transfers, cable pulls and hibernation in the middle of jobs and between
// them, and test-shell sessions between jobs. Every byte of every finished job
// reaches Java once and in order; a cut job ends holding what the reader had
// taken; memory, threads and descriptors stay flat.
//
// USBADAPTER_SOAK_JOBS sets the number of jobs (default 1000) and
// USBADAPTER_SOAK_SEED the host's random choices (a failure names its seed).
#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "MaaClient.h"
#include "print_Support.h"

namespace {

using printjvm::kUel;
using Clock = std::chrono::steady_clock;

long EnvNumber(const char *name, long fallback) {
    const char *text = std::getenv(name);
    return text && *text ? std::strtol(text, nullptr, 10) : fallback;
}

struct ProcessUse {
    long rssKiB = 0;
    long threads = 0;
    long fds = 0;
};

ProcessUse Use() {
    ProcessUse u;
    std::ifstream status("/proc/self/status");
    for (std::string line; std::getline(status, line);) {
        if (line.rfind("VmRSS:", 0) == 0) u.rssKiB = std::strtol(line.c_str() + 6, nullptr, 10);
        if (line.rfind("Threads:", 0) == 0) u.threads = std::strtol(line.c_str() + 8, nullptr, 10);
    }
    // Less the listing's own descriptor.
    u.fds = std::distance(std::filesystem::directory_iterator("/proc/self/fd"), {}) - 1;
    return u;
}

// The print channel's host end as the shell client's channel.
class HostChannel : public maahost::Channel {
public:
    bool Send(const void *data, size_t size) override {
        vdev::HostWrite(vdev::kPrn, data, size);
        return true;
    }
    ssize_t Receive(void *data, size_t size, int timeoutMs) override {
        if (pending_.empty()) {
            std::vector<uint8_t> got =
                timeoutMs > 0 ? vdev::HostReadAtLeast(vdev::kPrn, 1, timeoutMs) : vdev::HostRead(vdev::kPrn);
            pending_.assign(got.begin(), got.end());
        }
        const size_t n = std::min(pending_.size(), size);
        pending_.copy(static_cast<char *>(data), n);
        pending_.erase(0, n);
        return static_cast<ssize_t>(n);
    }

private:
    std::string pending_;
};

// One job as the host sends it: the stream and where its transfers start.
struct Job {
    std::string stream;
    std::vector<size_t> cuts;  // transfer i is [cuts[i], cuts[i+1]); cuts[0] == 0
    std::string Transfer(size_t i) const {
        const size_t end = i + 1 < cuts.size() ? cuts[i + 1] : stream.size();
        return stream.substr(cuts[i], end - cuts[i]);
    }
    size_t End(size_t transfers) const { return transfers < cuts.size() ? cuts[transfers] : stream.size(); }
};

enum class Cut { None, PullAfterRead, PullInFlight, Hibernate };

class Soak : public PrintJvmTest {
protected:
    void SetUp() override {
        // The whole heap resident from the start: what grows later is the
        // native side's.
        std::string opts = "-Xms256m -XX:+AlwaysPreTouch -XX:-UseDynamicNumberOfCompilerThreads";
        if (const char *more = std::getenv("USBADAPTER_TEST_JVM_OPTS")) opts = std::string(more) + " " + opts;
        ::setenv("USBADAPTER_TEST_JVM_OPTS", opts.c_str(), 1);
        PrintJvmTest::SetUp();
    }

    // Body bytes hold no UEL, yet ESCs and UEL look-alikes cut at any read
    // boundary; no transfer but a job's first or its closing UEL's starts with
    // ESC (a burst's first bytes select a host application).
    Job MakeJob() {
        // Mostly small jobs (many job ends), now and then one of several reads.
        const size_t sizes[] = {16, 300, 4096, 65536, 600000, 2500000};
        const size_t top = sizes[Pick(100) < 97 ? Pick(4) : 4 + Pick(2)];
        std::string body = "@PJL ENTER LANGUAGE=PCL\r\n";
        const size_t size = Pick(top) + 1;
        body.reserve(size + 32);
        while (body.size() < size) {
            const unsigned r = static_cast<unsigned>(rng_());
            if (r % 997 == 0) {
                body += std::string("\x1b%-12345Y", 9).substr(0, 2 + (r >> 10) % 7) + 'Z';
            } else if (r % 211 == 0) {
                body += "\x1b*";
            } else {
                char c = static_cast<char>(r >> 8);
                body += c == '\x1b' ? 'e' : c;
            }
        }
        Job job{kUel + body + kUel, {0}};
        const size_t n = job.stream.size();
        std::vector<size_t> at;
        for (int k = static_cast<int>(Pick(6)); k > 0; --k) at.push_back(1 + Pick(n - 1));
        if (Pick(3) == 0) at.push_back(1 + Pick(8));              // inside the opening UEL
        if (Pick(3) == 0) at.push_back(n - kUel.size() + Pick(9));  // inside or at the closing one
        std::sort(at.begin(), at.end());
        for (size_t c : at) {
            // A body ESC never starts a transfer: move the cut behind it.
            while (c < n - kUel.size() && job.stream[c] == '\x1b') ++c;
            if (c > job.cuts.back() && c < n && c - job.cuts.back() <= (1u << 20)) job.cuts.push_back(c);
        }
        // No transfer longer than one read of the reader.
        for (size_t i = 0; i + 1 <= job.cuts.size(); ++i) {
            while (job.End(i + 1) - job.cuts[i] > (1u << 20)) {
                size_t c = job.cuts[i] + (1u << 20) - Pick(4096);
                while (job.stream[c] == '\x1b') --c;
                job.cuts.insert(job.cuts.begin() + static_cast<long>(i) + 1, c);
                ++i;
            }
        }
        return job;
    }

    size_t Pick(size_t bound) { return bound ? static_cast<size_t>(rng_() % bound) : 0; }

    void Send(const Job &job, size_t from, size_t to) {
        for (size_t i = from; i < to; ++i) vdev::HostWrite(vdev::kPrn, job.Transfer(i));
    }

    // The reader waits for host data in real time. Once a pull or a close has
    // made the wait pointless it is cut short; a cut that comes after the wait
    // ended is kept by the model for a later one, so each is counted and all
    // are used up (by waits with nothing pending) before the host sends again.
    template <typename Done>
    bool NudgeUntil(Done done, int ms = 20000) {
        const auto end = Clock::now() + std::chrono::milliseconds(ms);
        while (!done()) {
            if (Clock::now() > end) return false;
            if (vdev::PollsInProgress(vdev::kPrn) > 0 && vdev::PendingHostBytes(vdev::kPrn) == 0 &&
                vdev::ExpiredPolls(vdev::kPrn) >= expiredBase_ + cuts_) {
                vdev::ExpirePoll(vdev::kPrn);
                ++cuts_;
            }
            std::this_thread::sleep_for(std::chrono::microseconds(200));
        }
        return true;
    }
    bool CutsUsedUp() {
        return WaitUntil([&] { return vdev::ExpiredPolls(vdev::kPrn) >= expiredBase_ + cuts_; }, 20000);
    }

    bool Notify(U8 code) {
        vdev::QueueNotification(vdev::kPrn, printjvm::Notification(code));
        return WaitUntil([] { return vdev::PendingNotifications(vdev::kPrn) == 0; });
    }

    // A Java service entry on a thread of its own; with `nudge` the reader's
    // wait is cut short (a close waits for the reader to park).
    jint CallService(const char *method, bool nudge) {
        std::atomic<jint> r{-1};
        std::atomic<bool> done{false};
        std::thread call([&] {
            jvm::RunOnThread([&](JNIEnv *) { r = jvm::CallInt(daemon_, method, "()I"); }, method);
            done = true;
        });
        const bool returned = nudge ? NudgeUntil([&] { return done.load(); })
                                    : WaitUntil([&] { return done.load(); }, 20000);
        if (!returned) {
            call.detach();
            ADD_FAILURE() << method << " did not return";
            return -1;
        }
        call.join();
        return r;
    }

    void Hibernate() {
        ++hibernations_;
        ASSERT_EQ(CallService("USBPrintDrvClose", true), 1);
        // Parked: the reader polls again only once the channel is open.
        const size_t polls = vdev::PollCalls(vdev::kPrn);
        ASSERT_EQ(CallService("USBPrintDrvOpen", false), 1);
        ASSERT_EQ(CallService("USBPrintDrvOpenChk", false), 1);
        ASSERT_TRUE(WaitUntil([&] { return vdev::PollCalls(vdev::kPrn) > polls; }))
            << "the reader does not wait for data after the wake";
        ASSERT_TRUE(CutsUsedUp());
    }

    void Pull() {
        ++pulls_;
        ASSERT_TRUE(Notify(MFP_DEV_DISCONNECT));
    }
    void Plug() {
        ASSERT_TRUE(Notify(MFP_DEV_CONFIGURED));
        ASSERT_TRUE(CutsUsedUp()) << "the reader does not wait for data after the plug";
    }

    // Java's job `job_` ends holding exactly `want` (or, after a pull in
    // flight, a non-empty beginning of it). Only a cut job may need the
    // reader's wait cut short: a whole one ends at its closing UEL.
    void ExpectJob(const std::string &want, Cut cut, const char *how) {
        const bool ended = cut == Cut::None ? fixtures::AwaitJobEnded(job_, 20000)
                                            : NudgeUntil([&] { return fixtures::AwaitJobEnded(job_, 0); });
        ASSERT_TRUE(ended)
            << how << ": job " << total_ << " did not end (" << fixtures::JobBytes(job_).size() << " of " << want.size()
            << " bytes)";
        const std::string got = fixtures::JobBytes(job_);
        const bool ok = cut == Cut::PullInFlight ? !got.empty() && want.compare(0, got.size(), got) == 0 : got == want;
        ASSERT_TRUE(ok) << how << ": job " << total_ << " holds " << got.size() << " bytes, " << want.size()
                        << " sent; first difference at "
                        << std::mismatch(got.begin(), got.end(), want.begin(), want.end()).first - got.begin()
                        << " (seed " << seed_ << ")";
        ++job_;
        ++total_;
        bytes_ += got.size();
    }

    void RunJob() {
        const Job job = MakeJob();
        const size_t n = job.cuts.size();
        Cut cut = Cut::None;
        size_t sent = n;
        if (n >= 2) {
            const size_t r = Pick(1000);
            cut = r < 15 ? Cut::PullAfterRead : r < 30 ? Cut::PullInFlight : r < 40 ? Cut::Hibernate : Cut::None;
        }
        if (cut != Cut::None) {
            // A first transfer of two bytes leaves the reader reading on for
            // the rest of the header: send one more.
            sent = 1 + Pick(n - 1);
            if (sent == 1 && job.End(1) == 2) ++sent;
            // A job is open once a byte behind its opening UEL has been read.
            while (cut == Cut::PullInFlight && job.End(sent) <= kUel.size()) ++sent;
        }
        if (sent >= n) {
            Send(job, 0, n);
            ExpectJob(job.stream, Cut::None, "whole job");
            return;
        }
        Send(job, 0, sent);
        if (cut == Cut::PullInFlight) {
            // Once the job is open, the rest goes out and the cable is pulled
            // at once: what was not read yet is lost with it.
            ASSERT_TRUE(WaitUntil([&] { return fixtures::JobCount() > job_; }));
            Send(job, sent, n);
            Pull();
            ExpectJob(job.stream, cut, "job cut by a pull in flight");
            Plug();
            return;
        }
        ASSERT_TRUE(WaitUntil([] { return vdev::PendingHostBytes(vdev::kPrn) == 0; }));
        const std::string taken = job.stream.substr(0, job.End(sent));
        if (cut == Cut::PullAfterRead) {
            Pull();
            ExpectJob(taken, cut, "job cut by a pull");
            Plug();
        } else {
            Hibernate();
            ExpectJob(taken, cut, "job cut by hibernation");
        }
    }

    // A test-shell session between jobs: a download read back through a file
    // function, and a call the shell forwards to Java with evaluated arguments.
    void RunShellSession() {
        ++sessions_;
        HostChannel channel;
        maahost::Session shell(channel, 10000);
        ASSERT_TRUE(shell.Start()) << shell.Error();
        const std::string reply = "R" + std::to_string(Pick(1000000));
        fixtures::SetReply("runUsbFunctionCall", reply);
        const std::string path = "/halvard/sys/statusinfo/usb_speed.txt";
        std::optional<uint32_t> addr = shell.Download(path + std::string(1 + Pick(20000), '\0'));
        ASSERT_TRUE(addr) << shell.Error();
        char word[16];
        std::snprintf(word, sizeof word, "0x%08X", *addr);
        const long a = static_cast<long>(Pick(100000)), b = static_cast<long>(Pick(1000));
        const int calls = fixtures::Calls("runUsbFunctionCall");
        const struct {
            std::string line;
            std::vector<std::string> records;
        } lines[] = {
            {std::string("Dump_File(") + word + ")", {"| HIGH", "= result 1: File Read Complete : " + path}},
            {"SoakEcho(" + std::to_string(a) + " * 3 + " + std::to_string(b) + ", \"w" + std::to_string(b) + "\")",
             {"= result 1: " + reply}},
        };
        for (const auto &l : lines) {
            std::vector<std::string> got;
            const int frames = shell.Command(
                l.line, [&](const maahost::Frame &f) { got.push_back(maahost::Describe(f)); }, 10000, 0);
            ASSERT_GE(frames, 0) << l.line << ": " << shell.Error();
            EXPECT_EQ(got, l.records) << l.line;
        }
        ASSERT_TRUE(fixtures::AwaitCalls("runUsbFunctionCall", calls + 1, 10000));
        const std::vector<std::string> events = fixtures::EventLines();
        EXPECT_EQ(events.empty() ? "" : events.back(),
                  "runUsbFunctionCall:SoakEcho:" + std::to_string(a * 3 + b) + ",w" + std::to_string(b));
        ASSERT_TRUE(shell.Stop()) << shell.Error();
    }

    // Between jobs: every job Java has is one the host sent, no stream went to
    // a host application, nothing went back on the print channel; the journal
    // starts afresh so that Java's memory stays bounded too.
    void Settle() {
        ASSERT_EQ(fixtures::JobCount(), job_) << "jobs Java got that the host did not send (seed " << seed_ << ")";
        ASSERT_EQ(fixtures::AppCount(), 0);
        ASSERT_TRUE(vdev::HostRead(vdev::kPrn).empty()) << "the device answered on the print channel";
        fixtures::Reset();
        job_ = 0;
    }

    std::mt19937_64 rng_;
    long seed_ = 0;
    int job_ = 0;        // Java's number of the next job, since the last Settle
    long total_ = 0;     // jobs checked
    long long bytes_ = 0;
    long pulls_ = 0, hibernations_ = 0, sessions_ = 0;
    size_t expiredBase_ = 0, cuts_ = 0;
};

TEST_F(Soak, EveryJobArrivesWholeThroughPullsHibernationAndShellSessionsWithFlatResources) {
    const long jobs = EnvNumber("USBADAPTER_SOAK_JOBS", 1000);
    seed_ = EnvNumber("USBADAPTER_SOAK_SEED", 20240601);
    rng_.seed(static_cast<uint64_t>(seed_));
    StartReader();
    if (HasFatalFailure()) return;
    // Nothing below reads log lines: a capture would grow with every job.
    LoggerHost_StopCapture();
    expiredBase_ = vdev::ExpiredPolls(vdev::kPrn);

    const long warmUp = std::max(1L, std::min(jobs / 10, 2000L));
    ProcessUse warm;
    const auto start = Clock::now();
    for (long i = 0; i < jobs; ++i) {
        if (i == warmUp) warm = Use();
        const size_t r = Pick(1000);
        if (r < 20) RunShellSession();
        else if (r < 25) Hibernate();
        else if (r < 30) {
            Pull();
            if (!HasFatalFailure()) Plug();
        }
        if (!HasFatalFailure()) RunJob();
        if (!HasFatalFailure() && i % 50 == 49) Settle();
        if (HasFatalFailure()) return;
    }
    Settle();
    const double seconds = std::chrono::duration<double>(Clock::now() - start).count();
    const ProcessUse end = Use();
    std::printf(
        "soak: seed %ld, %ld jobs, %lld bytes, %ld pulls, %ld hibernations, %ld shell sessions, %.1f s; "
        "VmRSS %ld KiB after %ld jobs, %ld KiB at the end; threads %ld -> %ld; descriptors %ld -> %ld\n",
        seed_, total_, bytes_, pulls_, hibernations_, sessions_, seconds, warm.rssKiB, warmUp, end.rssKiB,
        warm.threads, end.threads, warm.fds, end.fds);
    std::fflush(stdout);
    EXPECT_EQ(total_, jobs);
#if !defined(__SANITIZE_ADDRESS__) && !defined(__SANITIZE_THREAD__)
    // A sanitizer's quarantine and shadow memory grow on their own.
    EXPECT_LE(end.rssKiB - warm.rssKiB, 16 * 1024) << "resident memory grew";
#endif
    EXPECT_EQ(end.threads, warm.threads);
    EXPECT_EQ(end.fds, warm.fds);
}

}  // namespace
