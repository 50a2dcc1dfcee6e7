// The script commands. Every wait is bounded by the session's time-out and
// watches the library's own progress: vdev's records of host transfers and
// polls, the reader thread's blocking call, the Java side's journal.
#include <atomic>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <memory>
#include <fstream>
#include <sstream>
#include <thread>

#include "Data.h"
#include "FirmwareCommands.h"
#include "Host.h"
#include "Script.h"
#include "Serve.h"
#include "Sha256.h"
#include "ShellCommands.h"
#include "UiPeer.h"
#include "common/ByteOrder.h"
#include "usbadapter/mfpbridge.h"
#include "vdev.h"

namespace sim {
namespace {

// ---- helpers ------------------------------------------------------------------

const char *ChannelPath(const std::string &name) {
    if (name == "prn") return vdev::kPrn;
    if (name == "scan") return vdev::kScan;
    return nullptr;
}

bool CheckChannel(const std::string &name, std::string *error) {
    if (ChannelPath(name)) return true;
    *error = "unknown channel '" + name + "' (prn or scan)";
    return false;
}

// The channel a reader of this session serves; others have nobody to wait for.
bool CheckReaderChannel(const std::string &name, std::string *error) {
    if (!CheckChannel(name, error)) return false;
    if (name == "prn") return true;
    *error = "no reader runs on the " + name + " channel in this session";
    return false;
}

bool ParseCount(const std::string &text, long long *value, std::string *error) {
    size_t v = 0;
    if (!ParseSize(text, &v)) {
        *error = "not a number: '" + text + "'";
        return false;
    }
    *value = static_cast<long long>(v);
    return true;
}

bool CheckDataItems(Args::const_iterator first, Args::const_iterator last, std::string *error) {
    if (first == last) {
        *error = "data expected (file:, hex:, text:, uel, sample, pattern:, fill:)";
        return false;
    }
    for (auto it = first; it != last; ++it)
        if (!CheckDataItem(*it, error)) return false;
    return true;
}

bool Data(Session &s, Args::const_iterator first, Args::const_iterator last, std::string *bytes,
          std::string *error) {
    return BuildData(Args(first, last), s.baseDir, bytes, error);
}

bool ReadFileBytes(const std::string &path, std::string *out) {
    std::ifstream in(path, std::ios::binary);
    if (!in) return false;
    std::ostringstream all;
    all << in.rdbuf();
    *out = all.str();
    return true;
}

void JournalRead(Session &s, const std::string &chan, const std::vector<uint8_t> &got) {
    std::string bytes(got.begin(), got.end());
    s.bytesReadBack += bytes.size();
    s.Host(
        JsonLine("read").Str("chan", chan).Num("bytes", static_cast<long long>(bytes.size())).Str("hex", Hex(bytes)));
}

bool Expect(Session &s, JsonLine line, bool ok, const std::string &failure, std::string *error) {
    s.Sim(line.Bool("ok", ok));
    if (!ok) *error = failure;
    return ok;
}

// One poll period without host data, delivered when the reader waits for the
// host; done when it waits again (or has parked).
bool SilenceOnce(Session &s, const char *path, std::string *error) {
    if (!s.plugged) {
        *error = "the device is not plugged in: the reader does not poll";
        return false;
    }
    if (!s.WaitIdle(error)) return false;
    const pid_t reader = s.printReader.tid;
    const size_t polls = PollCount(path);
    vdev::ExpirePoll(path, 1);
    bool back = WaitUntil(
        [&] {
            if (s.ReaderGone()) return true;
            if (PollCount(path) <= polls) return false;
            return ReaderWaiting(reader, path) || ProbeThread(reader) == ThreadWait::Sleep;
        },
        s.timeoutMs);
    if (!back) {
        *error = "the print reader did not come back to wait for the host after a poll time-out";
        return false;
    }
    return s.WaitIdle(error);
}

// ---- checks ----------------------------------------------------------------------

bool CheckNumberArgs(const Args &a, std::string *error) {
    long long v;
    for (const auto &w : a)
        if (!ParseCount(w, &v, error)) return false;
    return true;
}

bool CheckChannelArg(const Args &a, std::string *error) {
    if (!CheckChannel(a[0], error)) return false;
    return a.size() < 2 || CheckNumberArgs(Args(a.begin() + 1, a.end()), error);
}

bool CheckSilence(const Args &a, std::string *error) {
    if (!CheckReaderChannel(a[0], error)) return false;
    return a.size() < 2 || CheckNumberArgs(Args(a.begin() + 1, a.end()), error);
}

// send CHAN DATA... [chunks N,M,...] [every N]
struct SendArgs {
    Args::const_iterator dataEnd;
    std::vector<size_t> chunks;
    size_t every = 0;
    size_t randomMin = 0, randomMax = 0;  // chunks random:MIN-MAX:SEED
    uint32_t seed = 0;
};

bool ParseRandomChunks(const std::string &value, SendArgs *out) {
    const size_t dash = value.find('-', 7), colon = value.find(':', 7);
    size_t seed = 0;
    if (dash == std::string::npos || colon == std::string::npos || colon < dash ||
        !ParseSize(value.substr(7, dash - 7), &out->randomMin) ||
        !ParseSize(value.substr(dash + 1, colon - dash - 1), &out->randomMax) ||
        !ParseSize(value.substr(colon + 1), &seed) || out->randomMax == 0 || out->randomMax < out->randomMin)
        return false;
    out->seed = static_cast<uint32_t>(seed);
    return true;
}

bool ParseSend(const Args &a, SendArgs *out, std::string *error) {
    auto it = a.begin() + 1;
    while (it != a.end() && *it != "chunks" && *it != "every") ++it;
    out->dataEnd = it;
    if (!CheckDataItems(a.begin() + 1, it, error)) return false;
    while (it != a.end()) {
        const std::string &key = *it++;
        if (it == a.end()) {
            *error = key + " needs a value";
            return false;
        }
        const std::string &value = *it++;
        if (key == "every") {
            if (!ParseSize(value, &out->every) || out->every == 0) {
                *error = "every: a size above 0 expected, not '" + value + "'";
                return false;
            }
        } else if (key == "chunks" && value.rfind("random:", 0) == 0) {
            if (!ParseRandomChunks(value, out)) {
                *error = "chunks random:MIN-MAX:SEED with 0 < MAX, MIN <= MAX expected, not '" + value + "'";
                return false;
            }
        } else if (key == "chunks") {
            std::stringstream list(value);
            for (std::string item; std::getline(list, item, ',');) {
                size_t n = 0;
                if (!ParseSize(item, &n)) {
                    *error = "chunks: sizes separated by commas expected, not '" + value + "'";
                    return false;
                }
                out->chunks.push_back(n);
            }
        } else {
            *error = "unexpected '" + key + "' (chunks or every)";
            return false;
        }
    }
    return true;
}

bool CheckSend(const Args &a, std::string *error) {
    if (!CheckChannel(a[0], error)) return false;
    SendArgs parsed;
    return ParseSend(a, &parsed, error);
}

bool CheckExpectRead(const Args &a, std::string *error) {
    return CheckChannel(a[0], error) && CheckDataItems(a.begin() + 1, a.end(), error);
}

// expect-job K [bytes N] [sha256 HEX] [equals DATA...]
bool CheckExpectJob(const Args &a, std::string *error) {
    long long v;
    if (!ParseCount(a[0], &v, error)) return false;
    for (size_t i = 1; i < a.size(); i += 2) {
        if (a[i] == "equals") return CheckDataItems(a.begin() + static_cast<long>(i) + 1, a.end(), error);
        if (i + 1 >= a.size()) {
            *error = a[i] + " needs a value";
            return false;
        }
        if (a[i] == "bytes") {
            if (!ParseCount(a[i + 1], &v, error)) return false;
        } else if (a[i] != "sha256") {
            *error = "unexpected '" + a[i] + "' (bytes, sha256 or equals)";
            return false;
        }
    }
    return true;
}

bool CheckNotify(const Args &a, std::string *error) {
    static const char *const names[] = {"configured", "disconnect", "reset", "scan-command"};
    bool known = false;
    for (const char *n : names) known |= a[0] == n;
    long long v;
    if (!known && !ParseCount(a[0], &v, error)) {
        *error = "notification: configured, disconnect, reset, scan-command or a number";
        return false;
    }
    if (a.size() > 1 && a[1] != "prn" && a[1] != "scan" && a[1] != "both") {
        *error = "for whom: prn, scan or both";
        return false;
    }
    return true;
}

bool CheckSet(const Args &a, std::string *error) {
    if (a[0] == "expect") {
        if (a[1] == "continue" || a[1] == "stop") return true;
        *error = "set expect: continue or stop";
        return false;
    }
    if (a[0] != "timeout") {
        *error = "unknown setting '" + a[0] + "' (timeout or expect)";
        return false;
    }
    long long v;
    return ParseCount(a[1], &v, error);
}

// ---- commands --------------------------------------------------------------------

bool Plug(Session &s, const Args &, std::string *error) {
    const bool was = s.plugged;
    const size_t polls = PollCount(vdev::kPrn);
    s.Host(JsonLine("plug"));
    if (!NotifyAndWait(vdev::kPrn, MFP_DEV_CONFIGURED, eMfp_Notif_Both, s.timeoutMs)) {
        *error = "the configured notification was not taken (is the print node set up for SIGIO?)";
        return false;
    }
    s.plugged = s.everPlugged = true;
    if (was) return true;
    bool reading = WaitUntil([&] { return s.ReaderGone() || PollCount(vdev::kPrn) > polls; }, s.timeoutMs);
    if (!reading || s.ReaderGone()) {
        *error = s.ReaderGone() ? "the print reader returned" : "the print reader did not start reading";
        return false;
    }
    return true;
}

bool Unplug(Session &s, const Args &, std::string *error) {
    const bool wasReading = s.plugged;
    s.Host(JsonLine("unplug"));
    if (!NotifyAndWait(vdev::kPrn, MFP_DEV_DISCONNECT, eMfp_Notif_Both, s.timeoutMs)) {
        *error = "the disconnect notification was not taken";
        return false;
    }
    s.plugged = false;
    if (!wasReading) return true;
    // The reader parks when it next looks at the bridge state: at once if the
    // signal interrupted its poll, otherwise when the poll ends, which a pulled
    // cable makes happen now.
    const pid_t reader = s.printReader.tid;
    int expired = 0;
    bool parked = WaitUntil(
        [&] {
            if (s.ReaderGone() || ProbeThread(reader) == ThreadWait::Sleep) return true;
            if (expired < 2 && ReaderWaiting(reader, vdev::kPrn)) {
                const size_t polls = PollCount(vdev::kPrn);
                vdev::ExpirePoll(vdev::kPrn, 1);
                ++expired;
                WaitUntil([&] { return PollCount(vdev::kPrn) > polls || ProbeThread(reader) != ThreadWait::Poll; },
                          s.timeoutMs);
            }
            return false;
        },
        s.timeoutMs);
    if (!parked) {
        *error = "the print reader did not stop reading after the cable was pulled";
        return false;
    }
    s.SyncJava();
    return true;
}

bool Notify(Session &s, const Args &a, std::string *error) {
    int code;
    if (a[0] == "configured") code = MFP_DEV_CONFIGURED;
    else if (a[0] == "disconnect") code = MFP_DEV_DISCONNECT;
    else if (a[0] == "reset") code = MFP_DEV_RESET;
    else if (a[0] == "scan-command") code = SCAN_COMMAND;
    else code = std::atoi(a[0].c_str());
    int forWhom = eMfp_Notif_Both;
    if (a.size() > 1) forWhom = a[1] == "prn" ? eMfp_Notif_Prn : a[1] == "scan" ? eMfp_Notif_Scan : eMfp_Notif_Both;
    s.Host(JsonLine("notify").Num("code", code).Num("for", forWhom));
    if (!NotifyAndWait(vdev::kPrn, static_cast<uint8_t>(code), forWhom, s.timeoutMs)) {
        *error = "the notification was not taken";
        return false;
    }
    return true;
}

bool Send(Session &s, const Args &a, std::string *error) {
    SendArgs parsed;
    if (!ParseSend(a, &parsed, error)) return false;
    std::string bytes;
    if (!Data(s, a.begin() + 1, parsed.dataEnd, &bytes, error)) return false;
    std::vector<size_t> sizes =
        parsed.randomMax > 0 ? RandomTransfers(bytes.size(), parsed.randomMin, parsed.randomMax, parsed.seed)
                             : SplitTransfers(bytes.size(), parsed.chunks, parsed.every);
    const char *path = ChannelPath(a[0]);
    size_t offset = 0;
    for (size_t n : sizes) {
        vdev::HostWrite(path, bytes.data() + offset, n);
        offset += n;
    }
    s.bytesSent += bytes.size();
    s.transfersSent += sizes.size();
    JsonLine line("send");
    line.Str("chan", a[0]).Num("bytes", static_cast<long long>(bytes.size())).Num("transfers",
                                                                                static_cast<long long>(sizes.size()));
    if (sizes.size() <= 64) {
        std::string list = "[";
        for (size_t i = 0; i < sizes.size(); ++i) {
            if (i) list += ',';
            list += std::to_string(sizes[i]);
        }
        line.Raw("sizes", list + "]");
    }
    s.Host(line.Str("sha256", Sha256Hex(bytes)));
    return true;
}

bool Silence(Session &s, const Args &a, std::string *error) {
    long long count = 1;
    if (a.size() > 1 && !ParseCount(a[1], &count, error)) return false;
    const char *path = ChannelPath(a[0]);
    for (long long i = 0; i < count; ++i) {
        s.Host(JsonLine("silence").Str("chan", a[0]));
        if (!SilenceOnce(s, path, error)) return false;
    }
    s.SyncJava();
    return true;
}

bool EndJob(Session &s, const Args &, std::string *error) {
    if (!s.WaitIdle(error)) return false;
    s.SyncJava();
    for (int i = 0; i < 3 && s.OpenJobs() > 0; ++i) {
        s.Host(JsonLine("silence").Str("chan", "prn"));
        if (!SilenceOnce(s, vdev::kPrn, error)) return false;
        s.SyncJava();
    }
    if (s.OpenJobs() == 0) return true;
    *error = "print job " + std::to_string(s.jobs.back().number) + " still open after 3 poll periods of silence";
    return false;
}

bool WaitIdleCmd(Session &s, const Args &, std::string *error) {
    if (!s.WaitIdle(error)) return false;
    s.SyncJava();
    return true;
}

bool Read(Session &s, const Args &a, std::string *error) {
    const char *path = ChannelPath(a[0]);
    long long min = 0;
    if (a.size() > 1 && !ParseCount(a[1], &min, error)) return false;
    std::vector<uint8_t> got;
    if (min > 0) {
        got = vdev::HostReadAtLeast(path, static_cast<size_t>(min), s.timeoutMs);
    } else {
        if (!s.WaitIdle(error)) return false;
        got = vdev::HostRead(path);
    }
    JournalRead(s, a[0], got);
    if (static_cast<long long>(got.size()) >= min) return true;
    *error = "read " + std::to_string(got.size()) + " of at least " + std::to_string(min) + " bytes";
    return false;
}

bool ExpectRead(Session &s, const Args &a, std::string *error) {
    std::string want;
    if (!Data(s, a.begin() + 1, a.end(), &want, error)) return false;
    const char *path = ChannelPath(a[0]);
    std::vector<uint8_t> raw;
    if (want.empty()) {
        if (!s.WaitIdle(error)) return false;
        raw = vdev::HostRead(path);
    } else {
        raw = vdev::HostReadAtLeast(path, want.size(), s.timeoutMs);
    }
    JournalRead(s, a[0], raw);
    std::string got(raw.begin(), raw.end());
    return Expect(s,
                  JsonLine("expect").Str("what", "read").Str("chan", a[0]).Str("want", Hex(want)).Str("got", Hex(got)),
                  got == want, "read back " + Hex(got) + ", expected " + Hex(want), error);
}

bool ExpectJobs(Session &s, const Args &a, std::string *error) {
    long long want = 0;
    if (!ParseCount(a[0], &want, error) || !s.WaitIdle(error)) return false;
    s.SyncJava();
    int got = s.EndedJobs();
    return Expect(s, JsonLine("expect").Str("what", "jobs").Num("want", want).Num("got", got).Num("open", s.OpenJobs()),
                  got == want,
                  std::to_string(got) + " print job(s) ended (" + std::to_string(s.OpenJobs()) + " open), expected " +
                      std::to_string(want),
                  error);
}

bool ExpectApps(Session &s, const Args &a, std::string *error) {
    long long want = 0;
    if (!ParseCount(a[0], &want, error) || !s.WaitIdle(error)) return false;
    s.SyncJava();
    int got = s.EndedApps();
    return Expect(s, JsonLine("expect").Str("what", "apps").Num("want", want).Num("got", got), got == want,
                  std::to_string(got) + " application transfer(s) ended, expected " + std::to_string(want), error);
}

bool ExpectJob(Session &s, const Args &a, std::string *error) {
    long long number = 0;
    if (!ParseCount(a[0], &number, error) || !s.WaitIdle(error)) return false;
    s.SyncJava();
    JsonLine line("expect");
    line.Str("what", "job").Num("job", number);
    if (number < 1 || number > static_cast<long long>(s.jobs.size()) || !s.jobs[number - 1].ended) {
        return Expect(s, line, false, "print job " + a[0] + " has not ended", error);
    }
    const JobRecord &job = s.jobs[number - 1];
    std::string failure;
    for (size_t i = 1; i < a.size() && failure.empty(); i += 2) {
        if (a[i] == "bytes") {
            long long want = 0;
            if (!ParseCount(a[i + 1], &want, error)) return false;
            line.Num("want-bytes", want);
            if (job.bytes != want)
                failure = "job " + a[0] + " has " + std::to_string(job.bytes) + " bytes, expected " + a[i + 1];
        } else if (a[i] == "sha256") {
            line.Str("want-sha256", a[i + 1]);
            if (job.sha256 != a[i + 1]) failure = "job " + a[0] + " has SHA-256 " + job.sha256;
        } else if (a[i] == "equals") {
            std::string want, file;
            if (!Data(s, a.begin() + static_cast<long>(i) + 1, a.end(), &want, error)) return false;
            const std::string wantSha = Sha256Hex(want);
            line.Num("want-bytes", static_cast<long long>(want.size())).Str("want-sha256", wantSha);
            if (job.bytes != static_cast<long long>(want.size()) || job.sha256 != wantSha) {
                failure = "job " + a[0] + " (" + std::to_string(job.bytes) + " bytes, SHA-256 " + job.sha256 +
                          ") differs from the expected " + std::to_string(want.size()) + " bytes (SHA-256 " +
                          wantSha + ")";
            } else if (!ReadFileBytes(s.outDir + "/" + job.file, &file) || file != want) {
                failure = "job file " + job.file + " differs from the expected bytes";
            }
            break;
        }
    }
    line.Num("bytes", job.bytes).Str("sha256", job.sha256);
    return Expect(s, line, failure.empty(), failure, error);
}

bool Sleep(Session &s, const Args &a, std::string *error) {
    long long ms = 0;
    if (!ParseCount(a[0], &ms, error)) return false;
    s.Host(JsonLine("sleep").Num("ms", ms));
    std::this_thread::sleep_for(std::chrono::milliseconds(ms));
    return true;
}

bool Set(Session &s, const Args &a, std::string *error) {
    if (a[0] == "expect") {
        s.expectContinue = a[1] == "continue";
        s.Sim(JsonLine("set").Str("expect", a[1]));
        return true;
    }
    long long v = 0;
    if (!ParseCount(a[1], &v, error)) return false;
    s.timeoutMs = static_cast<int>(v);
    s.Sim(JsonLine("set").Num("timeout", v));
    return true;
}

bool CheckShow(const Args &a, std::string *error) {
    if (a[0] == "jobs" || a[0] == "apps" || a[0] == "job" || a[0] == "reader") return true;
    *error = "show: jobs, apps, job or reader";
    return false;
}

const char *WaitName(ThreadWait w) {
    switch (w) {
    case ThreadWait::Running: return "running";
    case ThreadWait::Poll: return "polling";
    case ThreadWait::Sleep: return "parked";
    case ThreadWait::Other: return "blocked";
    default: return "gone";
    }
}

// The state as it stands, printed and journalled; waits for nothing.
bool Show(Session &s, const Args &a, std::string *) {
    s.SyncJava();
    JsonLine line("state");
    line.Str("what", a[0]);
    if (a[0] == "jobs") {
        std::printf("jobs: %d ended, %d open\n", s.EndedJobs(), s.OpenJobs());
        for (const JobRecord &j : s.jobs)
            std::printf("  job %d: %s %lld bytes  sha256 %s  %s\n", j.number, j.ended ? "ended" : "open", j.bytes,
                        j.sha256.c_str(), j.file.c_str());
        line.Num("ended", s.EndedJobs()).Num("open", s.OpenJobs());
    } else if (a[0] == "apps") {
        std::printf("application transfers: %d ended of %zu\n", s.EndedApps(), s.apps.size());
        for (const AppRecord &r : s.apps)
            std::printf("  app %d (%s): %s %lld bytes  sha256 %s  %s\n", r.number, r.type.c_str(),
                        r.ended ? "ended" : "open", r.bytes, r.sha256.c_str(), r.file.c_str());
        line.Num("ended", s.EndedApps()).Num("all", static_cast<long long>(s.apps.size()));
    } else if (a[0] == "job") {
        const JobRecord *open = nullptr;
        for (const JobRecord &j : s.jobs)
            if (!j.ended) open = &j;
        if (open) std::printf("open job: %d (%s)\n", open->number, open->name.c_str());
        else std::printf("open job: none\n");
        line.Num("open-job", open ? open->number : 0);
    } else {
        const char *state = s.ReaderGone() ? "returned" : WaitName(ProbeThread(s.printReader.tid));
        const long long pending = static_cast<long long>(vdev::PendingHostBytes(vdev::kPrn));
        std::printf("print reader: %s, device %s, %lld host bytes not read\n", state,
                    s.plugged ? "plugged" : "unplugged", pending);
        line.Str("reader", state).Bool("plugged", s.plugged).Num("pending", pending);
    }
    std::fflush(stdout);
    s.Sim(line);
    return true;
}

bool Note(Session &s, const Args &a, std::string *) {
    std::string text;
    for (const auto &w : a) text += (text.empty() ? "" : " ") + w;
    s.Sim(JsonLine("note").Str("text", text));
    return true;
}

// ---- operator panel -------------------------------------------------------------

// The UI server the panel tests reach; lives until replaced, stopped or the end.
std::unique_ptr<uipeer::Server> uiServer;

bool UiServer(Session &s, const Args &a, std::string *error) {
    if (uiServer) {
        std::string requests;
        for (const std::string &r : uiServer->requests()) {
            if (!requests.empty()) requests += ' ';
            requests += Hex(r);
        }
        uiServer.reset();
        s.Sim(JsonLine("ui-server").Str("state", "stopped").Str("requests", requests));
    }
    if (a[0] == "stop") return true;
    const char *root = std::getenv("USBADAPTER_ROOT");
    if (root == nullptr || *root == 0) {
        *error = "no root for the UI server's address file";
        return false;
    }
    auto server = std::make_unique<uipeer::Server>(uipeer::AnswerAll(a[0]));
    if (!server->ok()) {
        *error = "the UI server cannot listen on 127.0.0.1";
        return false;
    }
    const std::string dir = std::string(root) + "/root/Halvard/osgi";
    std::error_code ec;
    std::filesystem::create_directories(dir, ec);
    if (!(std::ofstream(dir + "/socketAddress.prop", std::ios::binary) << "127.000.000.001")) {
        *error = "cannot write " + dir + "/socketAddress.prop";
        return false;
    }
    ::setenv("USBADAPTER_UI_PORT", std::to_string(server->port()).c_str(), 1);
    s.Sim(JsonLine("ui-server").Str("answer", a[0]).Num("port", server->port()));
    uiServer = std::move(server);
    return true;
}

// The scanner driver answers every scanner-side test with one final result
// frame holding TEXT (result 1), the way the scanner firmware reports a test.
bool ScannerAnswer(Session &s, const Args &a, std::string *) {
    std::vector<uint8_t> frame(12, 0);
    WriteBE32(frame.data(), 1);
    WriteBE32(frame.data() + 4, 1);
    WriteBE32(frame.data() + 8, static_cast<uint32_t>(a[0].size()));
    frame.insert(frame.end(), a[0].begin(), a[0].end());
    vdev::SetScanTestAnswer({frame, std::nullopt, 1, 0});
    s.Sim(JsonLine("scanner-answer").Str("text", a[0]));
    return true;
}

// The fax driver answers every fax-side test with TEXT.
bool FaxAnswer(Session &s, const Args &a, std::string *) {
    vdev::SetFaxTestAnswer({a[0], std::nullopt, 1, 0});
    s.Sim(JsonLine("fax-answer").Str("text", a[0]));
    return true;
}

// ---- scan channel and capability queries --------------------------------------------

constexpr const char kScanServiceSig[] = "()Lcom/tarnwel/vbk/ca/plugin/usbadapter/scan/USBScanService;";

// An int method of `obj` called from the script's thread; false with a reason
// when it is missing or threw.
bool CallIntMethod(Session &s, jobject obj, const char *name, const char *sig, jint *result, std::string *error) {
    jclass cls = s.env->GetObjectClass(obj);
    jmethodID mid = s.env->GetMethodID(cls, name, sig);
    s.env->DeleteLocalRef(cls);
    if (!mid) {
        TakeException(s.env);
        *error = std::string("no method ") + name + sig;
        return false;
    }
    *result = s.env->CallIntMethod(obj, mid);
    std::string thrown = TakeException(s.env);
    if (!thrown.empty()) *error = std::string(name) + " threw " + thrown;
    return thrown.empty();
}

bool ScanStart(Session &s, const Args &, std::string *error) {
    jobject scan = CallObject(s.env, s.service, "getScanService", kScanServiceSig, error);
    if (!scan) return false;
    jobject thread = CallObject(s.env, scan, "start", "()Ljava/lang/Thread;", error);
    s.env->DeleteGlobalRef(scan);
    if (!thread) return false;
    s.env->DeleteGlobalRef(thread);
    s.Sim(JsonLine("scan-start"));
    if (!WaitUntil([] { return vdev::OpenCount(vdev::kScan) > 0; }, s.timeoutMs)) {
        *error = "the scan reader did not open the scan node";
        return false;
    }
    return true;
}

// scan-open / scan-close: the scan service's own calls, each answering 1.
bool ScanOpenClose(Session &s, const char *method, std::string *error) {
    jobject scan = CallObject(s.env, s.service, "getScanService", kScanServiceSig, error);
    if (!scan) return false;
    jint result = 0;
    bool called = CallIntMethod(s, scan, method, "()I", &result, error);
    s.env->DeleteGlobalRef(scan);
    if (!called) return false;
    return Expect(s, JsonLine("expect").Str("what", std::string("scan-") + method).Num("got", result), result == 1,
                  std::string("the scan service's ") + method + " answered " + std::to_string(result), error);
}
bool ScanOpen(Session &s, const Args &, std::string *error) { return ScanOpenClose(s, "open", error); }
bool ScanClose(Session &s, const Args &, std::string *error) { return ScanOpenClose(s, "close", error); }

// expect-app K TYPE [equals DATA...]
bool CheckExpectApp(const Args &a, std::string *error) {
    long long v;
    if (!ParseCount(a[0], &v, error)) return false;
    if (a.size() == 2) return true;
    if (a[2] != "equals") {
        *error = "unexpected '" + a[2] + "' (equals)";
        return false;
    }
    return CheckDataItems(a.begin() + 3, a.end(), error);
}

bool ExpectApp(Session &s, const Args &a, std::string *error) {
    long long number = 0;
    if (!ParseCount(a[0], &number, error)) return false;
    // The scan reader has no idle state to wait for: the transfer's end is.
    auto ended = [&] {
        s.SyncJava();
        return number >= 1 && number <= static_cast<long long>(s.apps.size()) && s.apps[number - 1].ended;
    };
    WaitUntil(ended, s.timeoutMs);
    JsonLine line("expect");
    line.Str("what", "app").Num("app", number).Str("want-type", a[1]);
    if (!ended()) return Expect(s, line, false, "application transfer " + a[0] + " has not ended", error);
    const AppRecord &app = s.apps[number - 1];
    line.Str("type", app.type).Num("bytes", app.bytes);
    std::string failure;
    if (app.type != a[1]) failure = "application transfer " + a[0] + " is of type " + app.type;
    if (failure.empty() && a.size() > 2) {
        std::string want, got;
        if (!Data(s, a.begin() + 3, a.end(), &want, error)) return false;
        line.Str("want-hex", Hex(want));
        if (!ReadFileBytes(s.outDir + "/" + app.file, &got))
            failure = "cannot read " + app.file;
        else if (got != want)
            failure = "application transfer " + a[0] + " holds " + Hex(got) + ", expected " + Hex(want);
    }
    return Expect(s, line, failure.empty(), failure, error);
}

// expect-capability CHAN size|data: the reply to a capability request is what
// the reference service answers (asked here, from the script's thread).
bool CheckExpectCapability(const Args &a, std::string *error) {
    if (!CheckChannel(a[0], error)) return false;
    if (a[1] == "size" || a[1] == "data") return true;
    *error = "capability reply: size or data";
    return false;
}

bool ExpectCapability(Session &s, const Args &a, std::string *error) {
    std::string want;
    if (a[1] == "size") {
        jint size = 0;
        if (!CallIntMethod(s, s.service, "getCapXmlSize", "()I", &size, error)) return false;
        want = std::string("\x1b\x24\xf4\0\0\0\0\0\0\0", 10);
        WriteBE32(reinterpret_cast<uint8_t *>(want.data()) + 6, static_cast<uint32_t>(size));
    } else {
        jobject xml = CallObject(s.env, s.service, "getCapXmlData", "()Ljava/lang/String;", error);
        if (!xml) return false;
        if (const char *chars = s.env->GetStringUTFChars(static_cast<jstring>(xml), nullptr)) {
            want = chars;
            s.env->ReleaseStringUTFChars(static_cast<jstring>(xml), chars);
        }
        s.env->DeleteGlobalRef(xml);
    }
    const char *path = ChannelPath(a[0]);
    std::vector<uint8_t> raw = vdev::HostReadAtLeast(path, want.size(), s.timeoutMs);
    JournalRead(s, a[0], raw);
    std::string got(raw.begin(), raw.end());
    JsonLine line("expect");
    line.Str("what", "capability").Str("chan", a[0]).Str("reply", a[1]).Str("want", Hex(want)).Str("got", Hex(got));
    return Expect(s, line, got == want, "read back " + Hex(got) + ", expected " + Hex(want), error);
}

// ---- what the host sees of the device ------------------------------------------------

std::string CText(const vendor_cmd_t &r) {
    // The staged data up to its last non-zero byte.
    size_t n = sizeof r.data;
    while (n > 0 && r.data[n - 1] == 0) --n;
    return std::string(reinterpret_cast<const char *>(r.data), n);
}

bool ParseWord(const std::string &text, unsigned long max, unsigned long *value) {
    if (text.empty()) return false;
    char *end = nullptr;
    errno = 0;
    unsigned long v = std::strtoul(text.c_str(), &end, 0);
    if (errno != 0 || *end != 0 || v > max || text[0] == '-') return false;
    *value = v;
    return true;
}

bool CheckVendorRequest(const Args &a, std::string *error) {
    unsigned long v;
    for (size_t i = 0; i < a.size(); ++i) {
        if (!ParseWord(a[i], i == 0 ? 0xFF : 0xFFFF, &v)) {
            *error = "not a " + std::string(i == 0 ? "byte" : "16-bit number") + ": '" + a[i] + "'";
            return false;
        }
    }
    return true;
}

bool HostView(Session &s, const Args &, std::string *error) {
    auto d = vdev::LastDescriptor();
    if (!d) {
        *error = "no descriptors staged yet (is the print node set up?)";
        return false;
    }
    char ids[64];
    std::snprintf(ids, sizeof ids, "0x%04x:0x%04x lang 0x%04x", d->param.uwVid, d->param.uwPid, d->param.uwLangID);
    JsonLine line("host-view");
    line.Str("ids", ids)
        .Str("manufacturer", d->manufacturer)
        .Num("manufacturerSize", d->param.ubMf_string_size)
        .Str("product", d->product)
        .Num("productSize", d->param.ubPd_string_size)
        .Str("serial", d->serial)
        .Num("serialSize", d->param.ubSerial_string_size)
        .Str("deviceId", d->deviceId)
        .Num("deviceIdSize", d->param.uwDev_id_1284_size);
    if (auto r = vdev::HostVendorRequest(0x49, 0, 1)) line.Str("serialRecord", CText(*r));
    if (auto c = vdev::ConnectState()) line.Num("connect", *c);
    s.Sim(line);
    return true;
}

bool VendorRequest(Session &s, const Args &a, std::string *error) {
    unsigned long req = 0, value = 0, index = 0;
    ParseWord(a[0], 0xFF, &req);
    ParseWord(a[1], 0xFFFF, &value);
    ParseWord(a[2], 0xFFFF, &index);
    s.Host(JsonLine("vendor-request").Num("bRequest", static_cast<long long>(req))
               .Num("wValue", static_cast<long long>(value)).Num("wIndex", static_cast<long long>(index)));
    auto r = vdev::HostVendorRequest(static_cast<uint8_t>(req), static_cast<uint16_t>(value),
                                     static_cast<uint16_t>(index));
    if (!r) {
        *error = "nothing staged for this request";
        return false;
    }
    const std::string data = CText(*r);
    s.Sim(JsonLine("vendor-record").Num("bytes", static_cast<long long>(data.size())).Str("hex", Hex(data)));
    return true;
}

// Calls an int method without arguments of the service on a thread of its own,
// as the Java service does. With `nudge` the reader's waits are cut short while
// the call is under way, so a close does not wait out a poll period.
bool CallServiceInt(Session &s, const char *method, bool nudge, jint *result, std::string *error) {
    std::atomic<bool> done{false};
    std::string ex;
    jobject service = s.service;
    std::thread call([&] {
        JNIEnv *env = Env(method);
        jclass cls = env->GetObjectClass(service);
        jmethodID mid = env->GetMethodID(cls, method, "()I");
        env->DeleteLocalRef(cls);
        if (!mid) {
            ex = TakeException(env);
        } else {
            *result = env->CallIntMethod(service, mid);
            ex = TakeException(env);
        }
        Vm()->DetachCurrentThread();
        done = true;
    });
    const bool finished = WaitUntil(
        [&] {
            if (!done && nudge && vdev::PollsInProgress(vdev::kPrn) > 0)
                vdev::ExpirePoll(vdev::kPrn);
            return done.load();
        },
        s.timeoutMs);
    if (!finished) {
        call.detach();
        *error = std::string(method) + " did not return";
        return false;
    }
    call.join();
    if (!ex.empty()) {
        *error = std::string(method) + " threw " + ex;
        return false;
    }
    return true;
}

bool Hibernate(Session &s, const Args &, std::string *error) {
    jint r = -1;
    if (!CallServiceInt(s, "USBPrintDrvClose", true, &r, error)) return false;
    s.Sim(JsonLine("hibernate").Num("result", r));
    if (r == 1) return true;
    *error = "USBPrintDrvClose answered " + std::to_string(r);
    return false;
}

bool Wake(Session &s, const Args &, std::string *error) {
    jint r = -1, configured = -1;
    if (!CallServiceInt(s, "USBPrintDrvOpen", false, &r, error)) return false;
    if (!CallServiceInt(s, "USBPrintDrvOpenChk", false, &configured, error)) return false;
    s.Sim(JsonLine("wake").Num("result", r).Num("configured", configured));
    if (r == 1) return true;
    *error = "USBPrintDrvOpen answered " + std::to_string(r);
    return false;
}

bool CheckVendorAnswer(const Args &a, std::string *error) {
    return CheckDataItems(a.begin() + 1, a.end(), error);
}

// The status service's answer through its Java entry, as the service stages it.
bool VendorAnswer(Session &s, const Args &a, std::string *error) {
    std::string bytes;
    if (!Data(s, a.begin() + 1, a.end(), &bytes, error)) return false;
    const bool plugin = a[0] == "extInfo";
    jobject obj = NewObject(s.env,
                            plugin ? "com/tarnwel/vbk/ca/plugin/usbadapter/USBAdapter"
                                   : "com/tarnwel/vbk/common/qz/services/usbadapter/USBAdapterKivoropnlAndDACJNIService",
                            error);
    if (!obj) return false;
    jbyteArray arr = s.env->NewByteArray(static_cast<jsize>(bytes.size()));
    s.env->SetByteArrayRegion(arr, 0, static_cast<jsize>(bytes.size()), reinterpret_cast<const jbyte *>(bytes.data()));
    const bool ok = CallVoid(s.env, obj, a[0].c_str(), "([B)V", error, arr);
    s.env->DeleteLocalRef(arr);
    s.env->DeleteGlobalRef(obj);
    if (ok) s.Sim(JsonLine("vendor-answer").Str("method", a[0]).Num("bytes", static_cast<long long>(bytes.size())));
    return ok;
}

const std::vector<Command> kCommands = {
    {"plug", "",
     "the host configures the device (MFP_DEV_CONFIGURED); the first time, waits until the print reader reads", 0, 0,
     nullptr, Plug},
    {"unplug", "", "the cable is pulled (MFP_DEV_DISCONNECT); waits until the print reader has parked", 0, 0, nullptr,
     Unplug},
    {"notify", "CODE [prn|scan|both]",
     "queues a bridge notification (configured, disconnect, reset, scan-command or a number; default both) and "
     "waits until the library took it",
     1, 2, CheckNotify, Notify},
    {"send", "CHAN DATA... [chunks N,M,...|random:MIN-MAX:SEED] [every N]",
     "host transfers on CHAN (prn or scan): the data cut at the given sizes, the rest in one transfer; at sizes "
     "drawn from MIN..MAX by a generator seeded with SEED; or in transfers of N bytes",
     2, -1, CheckSend, Send},
    {"silence", "CHAN [COUNT]", "the host stays silent for COUNT (default 1) poll periods of the reader", 1, 2,
     CheckSilence, Silence},
    {"end-job", "", "the host stays silent until the open print job has ended (at most 3 poll periods)", 0, 0, nullptr,
     EndJob},
    {"wait-idle", "", "waits until the print reader has taken everything and waits for the host", 0, 0, nullptr,
     WaitIdleCmd},
    {"read", "CHAN [MIN]",
     "reads what the device wrote on CHAN (waits for at least MIN bytes, or for the reader to be idle) into the "
     "journal",
     1, 2, CheckChannelArg, Read},
    {"expect-read", "CHAN DATA...", "reads back exactly DATA on CHAN", 2, -1, CheckExpectRead, ExpectRead},
    {"expect-jobs", "N", "N print jobs have ended on the Java side", 1, 1, CheckNumberArgs, ExpectJobs},
    {"expect-job", "K [bytes N] [sha256 HEX] [equals DATA...]",
     "print job K (from 1) has ended with these properties; equals also compares the job file", 1, -1, CheckExpectJob,
     ExpectJob},
    {"expect-apps", "N", "N application transfers have ended on the Java side", 1, 1, CheckNumberArgs, ExpectApps},
    {"scan-start", "",
     "starts the scan reader on the scan service's thread (it reads once the device is plugged in); waits until it "
     "has opened the scan node",
     0, 0, nullptr, ScanStart},
    {"scan-close", "", "the scan service closes the scan interface (after the packet in progress); expects 1", 0, 0,
     nullptr, ScanClose},
    {"scan-open", "", "the scan service re-opens the scan interface; expects 1", 0, 0, nullptr, ScanOpen},
    {"expect-app", "K TYPE [equals DATA...]",
     "application transfer K (from 1) has ended with type TYPE (pcscan, scan2pc, taviklight, ids, dcu, ...); equals "
     "compares its bytes",
     2, -1, CheckExpectApp, ExpectApp},
    {"expect-capability", "CHAN size|data",
     "reads back on CHAN the reply to a capability request: the size reply or the XML the service answers", 2, 2,
     CheckExpectCapability, ExpectCapability},
    {"sleep", "MS", "waits MS milliseconds of real time", 1, 1, CheckNumberArgs, Sleep},
    {"set", "timeout MS | expect continue|stop",
     "bound of every later wait (default 10000); whether a failed expectation ends the script (stop, the default) "
     "or is reported and counted (the exit status is still 1)",
     2, 2, CheckSet, Set},
    {"show", "jobs|apps|job|reader",
     "prints the state without waiting or expecting: the jobs, the application transfers, the open job, the "
     "print reader", 1, 1, CheckShow, Show},
    {"note", "TEXT...", "writes TEXT into the journal", 0, -1, nullptr, Note},
    {"shell-start", "", "opens a test-shell session (ESC w MAASTART) and expects its acknowledgement", 0, 0, nullptr,
     ShellStart},
    {"shell", "LINE",
     "sends a test-shell command line and prints the records that come back, decoded; $addr is the buffer of the "
     "last shell-put",
     1, 1, nullptr, ShellLine},
    {"shell-expect", "TEXT...", "the decoded records of the last shell line are exactly TEXT..., in order", 0, -1,
     nullptr, ShellExpect},
    {"shell-put", "DATA...", "downloads DATA into a device buffer (H2T special command); its address becomes $addr", 1,
     -1, CheckShellPut, ShellPut},
    {"shell-stop", "", "stops the test-shell session (MAA-STOP) and expects its acknowledgement", 0, 0, nullptr,
     ShellStop},
    {"pty", "prn LINK",
     "hands the print channel to a host tool: a pseudo-terminal, LINK a symbolic link to it, opened as a printer's "
     "device node; returns when the tool has closed it",
     2, 2, CheckPty, Pty},
    {"serve", "[prn LINK] [scan LINK]",
     "the simulated printer for host software: each channel at LINK (default: prn at OUT/prn), a pseudo-terminal "
     "that stays there through any number of host opens and closes; a close ends the print job it carried; runs "
     "until SIGINT or SIGTERM",
     0, 4, CheckServe, Serve},
    {"ui-server", "ANSWER|stop",
     "starts the operator panel's UI server on 127.0.0.1, answering every panel test with ANSWER (e.g. 9); stop "
     "ends it and journals the requests it received",
     1, 1, nullptr, UiServer},
    {"scanner-answer", "TEXT", "the scanner driver answers every scanner-side test with one final record TEXT", 1, 1,
     nullptr, ScannerAnswer},
    {"fax-answer", "TEXT", "the fax driver answers every fax-side test with TEXT", 1, 1, nullptr, FaxAnswer},
    {"host-view", "", "prints the descriptors, serial number (also its vendor record) and Device ID staged in the bridge",
     0, 0, nullptr, HostView},
    {"vendor-answer", "METHOD DATA...",
     "the status service stages DATA through its Java entry METHOD (KivoroSize, trayInfo1, extInfo, ...)", 2, -1,
     CheckVendorAnswer, VendorAnswer},
    {"vendor-request", "BREQUEST WVALUE WINDEX",
     "the host's vendor control request: prints the record staged for it (numbers may be 0x...)", 3, 3,
     CheckVendorRequest, VendorRequest},
    {"hibernate", "", "the Java service closes the print channel (USBPrintDrvClose); the reader parks", 0, 0, nullptr,
     Hibernate},
    {"wake", "", "the Java service re-opens the print channel (USBPrintDrvOpen) and asks USBPrintDrvOpenChk", 0, 0,
     nullptr, Wake},
    {"fw-manager", "[MISBEHAVIOUR]",
     "starts the update manager on loopback and points the library at it; again: changes its behaviour "
     "(none, checksum-error, progress-fail, silence, early-close, slow-progress)",
     0, 1, CheckFwManager, FwManager},
    {"fw-send", "ID DATA... [, ID DATA...]",
     "sends a firmware file on the print channel: per image an 80-byte header with subsystem id ID, then the body "
     "DATA, each its own transfer",
     2, -1, CheckFwSend, FwSend},
    {"fw-expect-images", "N [ends M]",
     "the update manager has received N whole images (and M end exchanges); the host is silent after the file", 1,
     3, CheckFwExpectImages, FwExpectImages},
    {"fw-expect-image", "K [type T] [bytes N] [sha256 HEX] [checksum ok|bad] [equals DATA...]",
     "image K (from 1) as the update manager received it", 1, -1, CheckFwExpectImage, FwExpectImage},
};

}  // namespace

const std::vector<Command> &Commands() { return kCommands; }

const Command *FindCommand(const std::string &name) {
    for (const Command &c : kCommands)
        if (name == c.name) return &c;
    return nullptr;
}

}  // namespace sim
