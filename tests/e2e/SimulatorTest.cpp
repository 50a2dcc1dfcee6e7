// usbadapter-sim as a black box: each test writes a script and its data files,
// runs the simulator on them and checks what came out: the exit status, the
// session journal and the job files the Java side wrote. The simulator's own
// output is echoed so that JNI complaints fail the test.
#include <sys/wait.h>

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <regex>
#include <sstream>
#include <string>
#include <vector>

#include "Sha256.h"
#include "support/Bytes.h"
#include "support/RandomBytes.h"
#include "support/Uel.h"

namespace {

namespace fs = std::filesystem;

// Print data as a driver makes it: no ESC, so no stray selector or UEL.
std::string PrintData(size_t n, unsigned seed) {
    std::string s = RandomBytes(n, seed);
    std::replace(s.begin(), s.end(), '\x1b', 'E');
    return s;
}

std::string UelJob(const std::string &body) { return Framed("@PJL ENTER LANGUAGE=PCL\r\n" + body); }

std::string Sample(const std::string &name) {
    return std::string(USBADAPTER_SOURCE_DIR) + "/tools/sim/samples/" + name + ".sim";
}

// One journal line; a string or number field by name ("" when absent).
struct Event {
    std::string line;
    std::string operator[](const std::string &key) const {
        std::smatch m;
        if (!std::regex_search(line, m, std::regex("\"" + key + "\":(\"([^\"]*)\"|(-?[0-9]+|true|false))")))
            return {};
        return m[2].matched ? m[2].str() : m[3].str();
    }
    long Seq() const { return std::stol((*this)["seq"]); }
};

class Simulator : public ::testing::Test {
protected:
    void SetUp() override {
        char tmpl[] = "/tmp/usbadapter-e2e-XXXXXX";
        ASSERT_NE(::mkdtemp(tmpl), nullptr);
        dir_ = tmpl;
    }
    void TearDown() override {
        std::error_code ec;
        if (!HasFailure()) fs::remove_all(dir_, ec);
    }

    std::string Path(const std::string &name) const { return dir_ + "/" + name; }
    std::string Out(const std::string &name) const { return dir_ + "/out/" + name; }
    // Writes the data file `name` for a script; its bytes.
    std::string Put(const std::string &name, const std::string &bytes) const {
        std::ofstream(Path(name), std::ios::binary) << bytes;
        return bytes;
    }

    // Runs the simulator with `args` (no blanks in them); its exit status, 137
    // when it had to be killed.
    int Run(const std::vector<std::string> &args) {
        std::string cmd = "timeout -s KILL " E2E_SIM_KILL_S " " USBADAPTER_SIM " --out " + dir_ + "/out --timeout 8000";
        for (const std::string &a : args) cmd += " '" + a + "'";
        const int status = std::system((cmd + " >" + Path("sim-output.txt") + " 2>&1").c_str());
        output_ = ReadFile(Path("sim-output.txt"));
        std::fputs(output_.c_str(), stdout);
        return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    }

    int RunScript(const std::string &script, std::vector<std::string> extra = {}) {
        Put("session.sim", script);
        extra.insert(extra.begin(), {"--script", Path("session.sim")});
        return Run(extra);
    }

    // The session journal's events of `src` named `event`, in order.
    std::vector<Event> Events(const std::string &src, const std::string &event) const {
        std::vector<Event> out;
        std::istringstream in(ReadFile(Out("session.jsonl")));
        for (std::string line; std::getline(in, line);) {
            const Event e{line};
            if (e["src"] == src && e["event"] == event) out.push_back(e);
        }
        return out;
    }

    std::string dir_;
    std::string output_;
};

// Status 1: the session ran and an expectation failed; 2: the script is refused
// before the session starts.
TEST_F(Simulator, ScriptsThatMustFailDoWithTheirReason) {
    Put("job.prn", UelJob("abc"));
    Put("other.prn", UelJob("abd"));
    const struct {
        const char *script;
        int status;
        const char *why;  // in the simulator's output
    } cases[] = {
        {"send prn file:job.prn\nexpect-job 1 equals file:other.prn\n", 1, "session FAILED"},
        {"set timeout 300\nexpect-read prn hex:41\n", 1, "session FAILED"},
        {"send prn file:missing.prn\n", 1, "cannot read"},
        {"send prn slice:4:99999:job.prn\n", 1, "session FAILED"},  // past the file's end
        {"scan-start\nsend scan hex:1ba8280100\nexpect-app 1 ids\n", 1, "is of type pcscan"},
        {"scan-start\nsend scan hex:1ba8280100\nexpect-app 1 pcscan equals hex:1ba8280101\n", 1, "holds 1ba8280100"},
        {"scan-start\nset timeout 300\nsend scan hex:1b24f407000000000000\nexpect-capability scan size\n", 1,
         "read back ,"},
        {"send prn uel\nsend prn hex:1b2\n", 2, "session.sim:2"},
        {"plug\nsendd prn uel\n", 2, "unknown command 'sendd'"},
        {"send prn uel chunks random:9-3:1\n", 2, "session.sim:1"},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.script);
        fs::remove_all(Out(""));
        EXPECT_EQ(RunScript(c.script), c.status);
        EXPECT_NE(output_.find(c.why), std::string::npos);
        EXPECT_EQ(fs::exists(Out("journal.jsonl")), c.status == 1);
    }
}

// A slice of a file at random transfer sizes (the same cuts for the same seed,
// each within the bounds), state shown without waiting, failed expectations
// counted while the script goes on, and the one that stops it. Every other
// end-to-end check rests on a failed expectation failing.
TEST_F(Simulator, SliceAtSeededRandomSizesWithQueriesAndExpectationsThatGoOnOrStop) {
    const std::string job = UelJob(PrintData(50000, 9));
    Put("f.bin", "head" + job + "tail");
    const std::string slice = "slice:4:" + std::to_string(job.size()) + ":f.bin";
    const std::string send = "send prn " + slice + " chunks random:1-700:7\n";

    ASSERT_EQ(RunScript("set expect continue\n" + send + send + "expect-jobs 3\nshow jobs\nshow job\nshow reader\n"
                        "expect-job 1 equals " + slice + "\nexpect-jobs 5\nnote still here\nset expect stop\n"
                        "expect-jobs 9\nnote not reached\n"),
              1);

    EXPECT_EQ(ReadFile(Out("job-001.prn")), job);
    EXPECT_EQ(ReadFile(Out("job-002.prn")), job);
    auto sends = Events("host", "send");
    ASSERT_EQ(sends.size(), 2u);
    EXPECT_EQ(sends[0]["transfers"], sends[1]["transfers"]);
    EXPECT_GE(std::stoi(sends[0]["transfers"]), static_cast<int>(job.size() / 700));
    // Two failures counted (3 and 5 jobs), the third stops the script.
    auto expects = Events("sim", "expect");
    ASSERT_EQ(expects.size(), 4u);
    EXPECT_EQ(expects[1]["ok"], "true");
    EXPECT_EQ(expects[3]["ok"], "false");
    EXPECT_EQ(expects[3]["got"], "2");
    auto errors = Events("sim", "error");
    ASSERT_EQ(errors.size(), 3u);
    EXPECT_NE(errors[2]["where"].find("session.sim:12"), std::string::npos);
    auto notes = Events("sim", "note");
    ASSERT_EQ(notes.size(), 1u);
    EXPECT_EQ(notes[0]["text"], "still here");
    EXPECT_EQ(Events("sim", "end").at(0)["status"], "failed");
    EXPECT_NE(output_.find("session FAILED"), std::string::npos);
    EXPECT_NE(output_.find("jobs: 2 ended, 0 open\n  job 1: ended " + std::to_string(job.size()) + " bytes"),
              std::string::npos);
    EXPECT_NE(output_.find("open job: none"), std::string::npos);
    EXPECT_NE(output_.find("print reader: polling, device plugged, 0 host bytes not read"), std::string::npos);
}

TEST_F(Simulator, CommandLineFilesAreOneJobEachAndWithoutThemTheSampleIsSent) {
    const std::string a = Put("a.prn", UelJob(PrintData(1000, 7)));
    const std::string b = Put("b.prn", PrintData(1500, 8));  // no UEL: ended by silence

    ASSERT_EQ(Run({Path("a.prn"), Path("b.prn")}), 0);
    EXPECT_EQ(ReadFile(Out("job-001.prn")), a);
    EXPECT_EQ(ReadFile(Out("job-002.prn")), b);
    EXPECT_NE(output_.find("job-001.prn  = a.prn"), std::string::npos);
    EXPECT_NE(output_.find("job-002.prn  = b.prn"), std::string::npos);

    ASSERT_EQ(Run({}), 0);
    const std::string job = ReadFile(Out("job-001.prn"));
    ASSERT_GT(job.size(), 2 * kUel.size());
    EXPECT_EQ(job.substr(0, kUel.size()), kUel);
    EXPECT_EQ(job.substr(job.size() - kUel.size()), kUel);
    EXPECT_NE(job.find("@PJL"), std::string::npos);
    EXPECT_FALSE(fs::exists(Out("job-002.prn")));
}

// Data sent before the host configures the device is read afterwards; a pulled
// cable ends the open job, and a re-plug lets the parked reader go on at once.
TEST_F(Simulator, PlugAndUnplugAsTheHostDoes) {
    const std::string early = Put("early.prn", UelJob(PrintData(4000, 11)));
    const std::string partial = Put("partial.prn", kUel + PrintData(800, 9));  // the closing UEL never comes
    const std::string next = Put("next.prn", UelJob(PrintData(500, 10)));

    ASSERT_EQ(RunScript("send prn file:early.prn\nexpect-jobs 0\nplug\nexpect-jobs 1\nsend prn file:partial.prn\n"
                        "wait-idle\nexpect-jobs 1\nunplug\nexpect-jobs 2\nplug\nsend prn file:next.prn\nexpect-jobs 3\n",
                        {"--no-plug"}),
              0);

    auto steps = Events("sim", "startup");
    ASSERT_GE(steps.size(), 3u);
    EXPECT_EQ(steps[0]["step"], "creatPrnScanMsgQs");
    EXPECT_EQ(steps[1]["step"], "initDevice");
    EXPECT_EQ(steps[2]["step"], "readPrintMsg");
    EXPECT_LT(Events("host", "plug").at(0).Seq(), Events("java", "job-start").at(0).Seq());
    const auto ends = Events("java", "job-end");
    ASSERT_EQ(ends.size(), 3u);
    EXPECT_GT(ends[1].Seq(), Events("host", "unplug").at(0).Seq());
    EXPECT_EQ(ReadFile(Out("job-001.prn")), early);
    EXPECT_EQ(ReadFile(Out("job-002.prn")), partial);
    EXPECT_EQ(ReadFile(Out("job-003.prn")), next);
    // The parked reader looks at the flags once a second but goes on as soon as
    // the host configures the device again.
    const long plugged = std::stol(Events("host", "plug").back()["ms"]);
    const long started = std::stol(Events("java", "job-start").back()["ms"]);
    EXPECT_LT(started - plugged, 600);
}

// Every sample session passes with each of its expectations met, and the
// journal's digest of each job is that of the job file Java wrote.
TEST_F(Simulator, SampleSessionsPass) {
    const struct {
        const char *name;
        size_t expects, jobs;
    } samples[] = {{"session", 11, 7}, {"scan", 15, 1}, {"firmware", 8, 2}};
    for (const auto &sample : samples) {
        SCOPED_TRACE(sample.name);
        ASSERT_EQ(Run({"--script", Sample(sample.name)}), 0);
        EXPECT_EQ(Events("sim", "expect").size(), sample.expects);
        const auto ends = Events("java", "job-end");
        ASSERT_EQ(ends.size(), sample.jobs);
        for (size_t i = 0; i < ends.size(); ++i) {
            const std::string job = ReadFile(Out("job-00" + std::to_string(i + 1) + ".prn"));
            EXPECT_EQ(ends[i]["sha256"], sim::Sha256Hex(job)) << i;
            EXPECT_EQ(ends[i]["bytes"], std::to_string(job.size())) << i;
        }
    }
}

// The model Java configured is what the host sees; the status service's
// answers reach the host; hibernation and wake leave printing whole.
TEST_F(Simulator, IdentitySampleShowsTheConfiguredModel) {
    const std::string model = "tw-m4020CDN Office";
    ASSERT_EQ(Run({"--script", Sample("identity"), "--model", model}), 0);
    auto view = Events("sim", "host-view").at(0);
    EXPECT_EQ(view["ids"], "0x2f3a:0x0121 lang 0x0409");
    EXPECT_EQ(view["productSize"], std::to_string(model.size() + 1));
    EXPECT_EQ(view["serialRecord"], view["serial"]);
    EXPECT_NE(view["deviceId"].find(";MDL:" + model + ";"), std::string::npos);
    EXPECT_NE(view["deviceId"].find("CID:NV_PCL6_Color;STATUS:IDLE;"), std::string::npos);
    EXPECT_EQ(Events("sim", "vendor-record").at(0)["hex"], "010203");
    EXPECT_EQ(Events("sim", "wake").at(0)["configured"], "1");
    EXPECT_EQ(ReadFile(Out("job-002.prn")), kUel + "after wake" + kUel);
}

// ---- firmware: the update manager on loopback -------------------------------------

#ifdef USBADAPTER_FW
// The host tool packs the file; the host sends it as a driver would, each
// header and each body a transfer of its own.
TEST_F(Simulator, TwoImagesOfSixtyFourMebibytesReachTheManagerIntact) {
    const std::string a = Put("scan.img", PrintData(40u << 20, 21)), b = Put("rootfs.img", PrintData(24u << 20, 22));
    const std::string cmd = std::string(USBADAPTER_FW) + " -q -o " + Path("fw.pkg") + " - E7=" + Path("scan.img") +
                            " EC3=" + Path("rootfs.img");
    ASSERT_EQ(std::system(cmd.c_str()), 0);
    ASSERT_EQ(fs::file_size(Path("fw.pkg")), 160 + a.size() + b.size());

    ASSERT_EQ(RunScript("fw-manager\nsend prn file:fw.pkg chunks 80," + std::to_string(a.size()) +
                        ",80\nfw-expect-images 2 ends 1\nfw-expect-image 1 type 1 checksum ok sha256 " +
                        sim::Sha256Hex(a) + "\nfw-expect-image 2 type 15 checksum ok sha256 " + sim::Sha256Hex(b) +
                        "\nsend prn sample\nexpect-jobs 1\nexpect-job 1 equals sample\n"),
              0);
    EXPECT_EQ(ReadFile(Out("update-manager/image-001-type1.bin")), a);
    EXPECT_EQ(ReadFile(Out("update-manager/image-002-type15.bin")), b);
    EXPECT_NE(ReadFile(Out("usbadapter.log")).find("[USBAdp] Firmware download success"), std::string::npos);
    // The firmware file itself never reached the print service.
    EXPECT_EQ(Events("java", "job-start").size(), 1u);
}
#endif

}  // namespace
