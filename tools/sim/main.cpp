// usbadapter-sim: the library inside a real JVM with the reference print
// service, on virtual devices, with a scriptable USB host side.
//
// Start-up is the service's: creatPrnScanMsgQs, initDevice, readPrintMsg on a
// thread of its own, then the host configures the device. After that the
// script's commands act as the host; the session journal records every host
// action, everything the Java side received and everything the host read back.
#include <fcntl.h>
#include <getopt.h>
#include <sys/ipc.h>
#include <sys/msg.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <string>
#include <vector>

#include "Data.h"
#include "FirmwareCommands.h"
#include "Host.h"
#include "Jvm.h"
#include "Script.h"
#include "Session.h"
#include "Sha256.h"
#include "vdev.h"

namespace fs = std::filesystem;

namespace {

constexpr int kExitPassed = 0;
constexpr int kExitFailed = 1;
constexpr int kExitUsage = 2;
constexpr int kExitStartup = 3;

constexpr const char *kService = "com/tarnwel/vbk/ca/plugin/usbadapter/print/ReferencePrintService";
constexpr const char *kKeyFile = "/halvard/spool/tmp/testfile";
constexpr int kPrintQueueProject = 5;
constexpr int kScanQueueProject = 6;

const char kUsage[] =
    "usage: usbadapter-sim [options] [FILE.prn ...]\n"
    "       usbadapter-sim serve [options]\n"
    "\n"
    "Starts a JVM with the reference print service and libusbadapter on virtual\n"
    "devices, plays the service's start-up (creatPrnScanMsgQs, initDevice,\n"
    "readPrintMsg on its thread, the host configures the device) and then acts as\n"
    "the USB host. Each FILE is sent as one host transfer and the host then stays\n"
    "silent until the job has ended; -s and -e run script commands instead. With\n"
    "neither, the built-in sample job (PJL in UEL framing) is sent. Sources run in\n"
    "the order given.\n"
    "\n"
    "serve: a simulated printer for host software until SIGINT or SIGTERM. The\n"
    "print channel is the pseudo-terminal at OUT/prn (--prn), the scan channel the\n"
    "one at OUT/scan (--scan); both stay there through any number of host opens and\n"
    "closes. A close ends the print job it carried. It runs fw-manager and\n"
    "scan-start first (after -s and -e, if given) and prints a line per host\n"
    "session, job, application transfer and firmware image as it ends.\n"
    "\n"
    "  -s, --script FILE      run the commands in FILE ('-': standard input)\n"
    "  -e, --exec LINE        run one command line\n"
    "  -o, --out DIR          output directory: the Java side's job-NNN.prn,\n"
    "                         app-NNN-TYPE.bin and journal.jsonl, the session\n"
    "                         journal and the library log (default: usbadapter-sim-out)\n"
    "      --journal FILE     session journal (default: OUT/session.jsonl)\n"
    "      --root DIR         root of the controller's fixed paths (default:\n"
    "                         $USBADAPTER_ROOT, else a temporary directory)\n"
    "      --no-plug          leave the device unconfigured after start-up\n"
    "      --prn LINK         serve: path of the print channel (default OUT/prn)\n"
    "      --scan LINK        serve: path of the scan channel (default OUT/scan)\n"
    "      --timeout MS       bound of every wait (default 10000)\n"
    "      --model NAME       model name (default \"Tarnwel MFP\")\n"
    "      --manufacturer S   manufacturer string (default \"Tarnwel\")\n"
    "      --device-class S   device class name (default \"PRINTER\")\n"
    "      --fax N            fax availability (default 1)\n"
    "      --xmx SIZE         Java heap (default 256m)\n"
    "      --no-check-jni     run without -Xcheck:jni\n"
    "      --jar FILE         usbadapter.jar (default: the build tree's)\n"
    "      --libdir DIR       directory of libusbadapter.so (default: the build tree's)\n"
    "      --jvm-option OPT   a further JVM option (repeatable)\n"
    "  -v, --verbose          echo the journal on standard output\n"
    "  -h, --help             this text and the script commands\n"
    "\n"
    "Exit status: 0 every command passed, 1 a command or expectation failed,\n"
    "2 usage or script error, 3 start-up failed (JVM, library or print reader).\n"
    "Environment: USBADAPTER_LOG (default OUT/usbadapter.log), USBADAPTER_LOG_LEVEL,\n"
    "USBADAPTER_COMMAND_LOG (default OUT/commands.log).\n";

struct Options {
    std::vector<sim::ScriptLine> lines;
    std::vector<std::string> files;  // sent by the command-line shortcut, in order
    std::string outDir = "usbadapter-sim-out";
    std::string journal, root;
    bool plug = true;
    bool verbose = false;
    bool serve = false;
    std::string prnLink, scanLink;
    int timeoutMs = 10000;
    std::string model = "Tarnwel MFP", manufacturer = "Tarnwel", deviceClass = "PRINTER";
    int fax = 1;
    sim::JvmConfig jvm = sim::DefaultJvmConfig();
};

sim::Session gSession;
std::string gRoot;
bool gOwnRoot = false;

std::string Absolute(const std::string &path) {
    std::error_code ec;
    fs::path p = fs::absolute(path, ec);
    return ec ? path : p.lexically_normal().string();
}

int Usage(const std::string &message) {
    std::fprintf(stderr, "usbadapter-sim: %s\n(usbadapter-sim --help for the options and commands)\n",
                 message.c_str());
    return kExitUsage;
}

bool AddLine(Options &o, const std::string &text, const std::string &where, std::string *error) {
    return sim::ParseScriptLine(text, where, Absolute("."), &o.lines, error);
}

// 0 to go on, else the exit status.
int ParseOptions(int argc, char **argv, Options &o) {
    enum {
        kJournal = 256, kRoot, kNoPlug, kTimeout, kModel, kManufacturer, kDeviceClass, kFax, kXmx, kNoCheckJni,
        kJar, kLibDir, kJvmOption, kPrn, kScan,
    };
    static const option longs[] = {
        {"script", required_argument, nullptr, 's'},   {"exec", required_argument, nullptr, 'e'},
        {"out", required_argument, nullptr, 'o'},      {"journal", required_argument, nullptr, kJournal},
        {"root", required_argument, nullptr, kRoot},   {"no-plug", no_argument, nullptr, kNoPlug},
        {"timeout", required_argument, nullptr, kTimeout}, {"model", required_argument, nullptr, kModel},
        {"manufacturer", required_argument, nullptr, kManufacturer},
        {"device-class", required_argument, nullptr, kDeviceClass}, {"fax", required_argument, nullptr, kFax},
        {"xmx", required_argument, nullptr, kXmx},     {"no-check-jni", no_argument, nullptr, kNoCheckJni},
        {"jar", required_argument, nullptr, kJar},     {"libdir", required_argument, nullptr, kLibDir},
        {"jvm-option", required_argument, nullptr, kJvmOption}, {"verbose", no_argument, nullptr, 'v'},
        {"prn", required_argument, nullptr, kPrn},     {"scan", required_argument, nullptr, kScan},
        {"help", no_argument, nullptr, 'h'},           {nullptr, 0, nullptr, 0},
    };
    int execCount = 0;
    std::string error;
    // '-' first: positional files keep their place among -s and -e.
    for (int c; (c = getopt_long(argc, argv, "-s:e:o:vh", longs, nullptr)) != -1;) {
        switch (c) {
        case 1: {
            // Added as parsed lines: a path needs no quoting.
            std::string path = Absolute(optarg);
            o.files.push_back(path);
            o.lines.push_back({optarg, "send prn file:" + path, "", sim::FindCommand("send"), {"prn", "file:" + path}});
            o.lines.push_back({optarg, "end-job", "", sim::FindCommand("end-job"), {}});
            break;
        }
        case 's': {
            bool stdinScript = std::string(optarg) == "-";
            std::ifstream file;
            if (!stdinScript) {
                file.open(optarg);
                if (!file) return Usage(std::string("cannot read the script ") + optarg);
            }
            std::string base = stdinScript ? Absolute(".") : fs::path(Absolute(optarg)).parent_path().string();
            if (!sim::ParseScript(stdinScript ? std::cin : file, stdinScript ? "stdin" : optarg, base, &o.lines,
                                  &error)) {
                std::fprintf(stderr, "usbadapter-sim: %s\n", error.c_str());
                return kExitUsage;
            }
            break;
        }
        case 'e':
            if (!AddLine(o, optarg, "-e#" + std::to_string(++execCount), &error)) {
                std::fprintf(stderr, "usbadapter-sim: %s\n", error.c_str());
                return kExitUsage;
            }
            break;
        case 'o': o.outDir = optarg; break;
        case kJournal: o.journal = optarg; break;
        case kRoot: o.root = optarg; break;
        case kNoPlug: o.plug = false; break;
        case kTimeout: o.timeoutMs = std::atoi(optarg); break;
        case kModel: o.model = optarg; break;
        case kManufacturer: o.manufacturer = optarg; break;
        case kDeviceClass: o.deviceClass = optarg; break;
        case kFax: o.fax = std::atoi(optarg); break;
        case kXmx: o.jvm.maxHeap = optarg; break;
        case kNoCheckJni: o.jvm.checkJni = false; break;
        case kJar: o.jvm.classPath = Absolute(optarg); break;
        case kLibDir: o.jvm.libDir = Absolute(optarg); break;
        case kJvmOption: o.jvm.extra.push_back(optarg); break;
        case kPrn: o.prnLink = Absolute(optarg); break;
        case kScan: o.scanLink = Absolute(optarg); break;
        case 'v': o.verbose = true; break;
        case 'h': std::fputs(kUsage, stdout); std::fputs(("\n" + sim::ScriptHelp()).c_str(), stdout); return -1;
        default: return Usage("unknown option");
        }
    }
    if (o.timeoutMs <= 0) return Usage("--timeout needs a positive number of milliseconds");
    if (o.serve) {
        if (o.prnLink.empty()) o.prnLink = Absolute(o.outDir + "/prn");
        if (o.scanLink.empty()) o.scanLink = Absolute(o.outDir + "/scan");
        const std::vector<std::string> words = {"serve", "prn", o.prnLink, "scan", o.scanLink};
        AddLine(o, "fw-manager", "serve", &error);
        AddLine(o, "scan-start", "serve", &error);
        o.lines.push_back({"serve", "serve", "", sim::FindCommand("serve"), {words.begin() + 1, words.end()}});
    }
    // SIGINT and SIGTERM end a serve command, not the JVM.
    for (const sim::ScriptLine &line : o.lines) {
        if (line.command != sim::FindCommand("serve")) continue;
        o.jvm.extra.push_back("-Xrs");
        break;
    }
    if (o.lines.empty() && o.files.empty()) {
        AddLine(o, "send prn sample", "sample", &error);
        AddLine(o, "end-job", "sample", &error);
    }
    return 0;
}

int QueueOf(int project) {
    key_t key = ftok((gRoot + kKeyFile).c_str(), project);
    return key == -1 ? -1 : msgget(key, 0);
}

void RemoveQueues() {
    for (int project : {kPrintQueueProject, kScanQueueProject}) {
        int q = QueueOf(project);
        if (q >= 0) msgctl(q, IPC_RMID, nullptr);
    }
}

// The controller's directories under the root, and no queue left on its keys
// by an earlier run: a reused key file inode gives the same keys.
bool PrepareRoot(const Options &o, std::string *error) {
    if (!o.root.empty()) {
        gRoot = Absolute(o.root);
    } else if (const char *env = std::getenv("USBADAPTER_ROOT"); env && *env) {
        gRoot = Absolute(env);
    } else {
        char tmpl[] = "/tmp/usbadapter-sim-XXXXXX";
        if (!::mkdtemp(tmpl)) {
            *error = "cannot make a temporary directory";
            return false;
        }
        gRoot = tmpl;
        gOwnRoot = true;
    }
    std::error_code ec;
    fs::create_directories(gRoot + "/halvard/sys/statusinfo", ec);
    fs::create_directories(gRoot + "/halvard/spool/tmp", ec);
    int fd = ::open((gRoot + kKeyFile).c_str(), O_CREAT | O_RDWR | O_CLOEXEC, 0644);
    if (fd < 0) {
        *error = "cannot prepare the controller root " + gRoot;
        return false;
    }
    ::close(fd);
    RemoveQueues();
    ::setenv("USBADAPTER_ROOT", gRoot.c_str(), 1);
    return true;
}

// Files of an earlier session would mix with this one's (the service numbers
// jobs from 1 and appends to its journal).
void ClearOutDir(const std::string &dir) {
    std::error_code ec;
    fs::create_directories(dir, ec);
    for (const auto &entry : fs::directory_iterator(dir, ec)) {
        const std::string name = entry.path().filename().string();
        bool ours = name == "journal.jsonl" || name == "session.jsonl" || name == "usbadapter.log" ||
                    name == "commands.log" ||
                    (name.rfind("job-", 0) == 0 && name.size() > 4 && name.substr(name.size() - 4) == ".prn") ||
                    (name.rfind("app-", 0) == 0 && name.size() > 4 && name.substr(name.size() - 4) == ".bin");
        if (ours) fs::remove(entry.path(), ec);
    }
}

std::string FileSha256(const std::string &path) {
    std::ifstream in(path, std::ios::binary);
    if (!in) return {};
    sim::Sha256 sha;
    char buf[1 << 16];
    while (in.read(buf, sizeof buf) || in.gcount() > 0) sha.Update(buf, static_cast<size_t>(in.gcount()));
    return sha.HexDigest();
}

void Summary(const Options &o, bool passed) {
    sim::Session &s = gSession;
    std::printf("usbadapter-sim: session %s\n", passed ? "passed" : "FAILED");
    std::printf("  output:    %s\n  journal:   %s\n", Absolute(s.outDir).c_str(), s.journal.Path().c_str());
    std::printf("  host sent: %llu bytes in %llu transfers\n", static_cast<unsigned long long>(s.bytesSent),
                static_cast<unsigned long long>(s.transfersSent));
    std::printf("  print jobs received by the Java side: %d\n", s.EndedJobs());
    for (size_t i = 0; i < s.jobs.size(); ++i) {
        const sim::JobRecord &j = s.jobs[i];
        if (!j.ended) {
            std::printf("    job %d: still open\n", j.number);
            continue;
        }
        std::string same;
        if (i < o.files.size() && FileSha256(o.files[i]) == j.sha256)
            same = "  = " + fs::path(o.files[i]).filename().string();
        std::printf("    job %d: %lld bytes  sha256 %s  %s%s\n", j.number, j.bytes, j.sha256.c_str(), j.file.c_str(),
                    same.c_str());
    }
    if (!s.apps.empty()) {
        std::printf("  application transfers: %d\n", s.EndedApps());
        for (const sim::AppRecord &a : s.apps)
            std::printf("    app %d (%s): %lld bytes  sha256 %s  %s\n", a.number, a.type.c_str(), a.bytes,
                        a.sha256.c_str(), a.file.c_str());
    }
    std::printf("  host read back: %llu bytes\n", static_cast<unsigned long long>(s.bytesReadBack));
}

// The print reader never returns: end the process without running exit
// handlers or static destructors under its feet.
[[noreturn]] void Finish(const Options &o, int status, bool summary) {
    sim::Session &s = gSession;
    if (s.env) s.SyncJava();
    s.Sim(sim::JsonLine("end").Str("status", status == kExitPassed ? "passed" : "failed").Num("exit", status)
              .Num("jobs", s.EndedJobs()).Num("open-jobs", s.OpenJobs()).Num("apps", s.EndedApps()));
    if (summary) Summary(o, status == kExitPassed);
    sim::FwStopManager();
    if (!gRoot.empty()) {
        RemoveQueues();
        std::error_code ec;
        if (gOwnRoot) fs::remove_all(gRoot, ec);
    }
    std::fflush(nullptr);
    _exit(status);
}

[[noreturn]] void StartupFailed(const Options &o, const std::string &message) {
    gSession.Sim(sim::JsonLine("error").Str("where", "start-up").Str("message", message));
    std::fprintf(stderr, "usbadapter-sim: start-up failed: %s\n", message.c_str());
    Finish(o, kExitStartup, false);
}

jstring Str(JNIEnv *env, const std::string &text) { return env->NewStringUTF(text.c_str()); }

// creatPrnScanMsgQs, initDevice, readPrintMsg on its thread; returns when the
// reader has set up the print node for the driver's notifications.
void StartService(const Options &o) {
    sim::Session &s = gSession;
    std::string error;
    sim::JvmConfig config = o.jvm;
    config.properties.push_back("usbadapter.outdir=" + Absolute(s.outDir));
    config.properties.push_back("usbadapter.model=" + o.model);
    std::string options;
    for (const auto &opt : sim::JvmOptions(config))
        options += (options.empty() ? "\"" : ",\"") + sim::JsonEscape(opt) + "\"";
    s.Sim(sim::JsonLine("start").Str("root", gRoot).Str("out", Absolute(s.outDir)).Raw("jvm", "[" + options + "]"));
    if (!sim::CreateJvm(config, &error)) StartupFailed(o, error);
    JNIEnv *env = sim::Env();
    s.env = env;

    jobject service = sim::NewObject(env, kService, &error);
    if (!service) StartupFailed(o, error);
    s.service = service;
    jobject maa = sim::CallObject(env, service, "getMaaService",
                                  "()Lcom/tarnwel/vbk/ca/plugin/usbadapter/print/USBMaaService;", &error);
    if (!maa) StartupFailed(o, error);

    jstring model = Str(env, o.model);
    bool ok = sim::CallVoid(env, service, "setModelName", "(Ljava/lang/String;)V", &error, model) &&
              sim::CallVoid(env, service, "creatPrnScanMsgQs", "(Ljava/lang/String;)V", &error, model);
    env->DeleteLocalRef(model);
    if (!ok) StartupFailed(o, error);
    s.Sim(sim::JsonLine("startup").Str("step", "creatPrnScanMsgQs").Num("print-queue", QueueOf(kPrintQueueProject))
              .Num("scan-queue", QueueOf(kScanQueueProject)));
    if (QueueOf(kPrintQueueProject) < 0)
        StartupFailed(o, "creatPrnScanMsgQs made no print queue (see the library log)");

    if (!sim::CallVoid(env, service, "initDevice", "()V", &error)) StartupFailed(o, error);
    s.Sim(sim::JsonLine("startup").Str("step", "initDevice"));

    sim::StartServiceThread(s.printReader, "usbadapter-print", [service, maa, manufacturerText = o.manufacturer,
                                                                modelText = o.model, deviceClassText = o.deviceClass,
                                                                fax = o.fax](JNIEnv *penv) {
        jclass cls = penv->GetObjectClass(service);
        jmethodID read = penv->GetMethodID(
            cls, "readPrintMsg", "(Ljava/lang/Object;Ljava/lang/String;Ljava/lang/String;Ljava/lang/String;I)V");
        penv->DeleteLocalRef(cls);
        if (!read) return;
        jstring manufacturer = Str(penv, manufacturerText), model = Str(penv, modelText),
                deviceClass = Str(penv, deviceClassText);
        penv->CallVoidMethod(service, read, maa, manufacturer, model, deviceClass, static_cast<jint>(fax));
    });
    s.Sim(sim::JsonLine("startup").Str("step", "readPrintMsg"));
    bool ready = sim::WaitUntil(
        [&] {
            return s.ReaderGone() || (vdev::OpenCount(vdev::kPrn) > 0 && vdev::AsyncEnabled(vdev::kPrn) &&
                                      s.printReader.tid.load() > 0);
        },
        s.timeoutMs);
    if (s.ReaderGone()) {
        StartupFailed(o, "readPrintMsg returned" +
                             (s.printReader.exception.empty() ? std::string() : ": " + s.printReader.exception));
    }
    if (!ready) StartupFailed(o, "the print reader did not open the print node for notifications");
    // Every wait for the reader looks at its blocking call.
    if (sim::ProbeThread(s.printReader.tid) == sim::ThreadWait::Unknown)
        StartupFailed(o, "the kernel does not show the reader thread's system call (/proc/self/task/TID/syscall)");
    s.Sim(sim::JsonLine("startup").Str("step", "print node ready").Num("reader-tid", s.printReader.tid.load()));
}

}  // namespace

int main(int argc, char **argv) {
    Options o;
    if (argc > 1 && std::string(argv[1]) == "serve") {
        o.serve = true;
        argv[1] = argv[0];
        --argc;
        ++argv;
    }
    if (int rc = ParseOptions(argc, argv, o); rc != 0) return rc < 0 ? kExitPassed : rc;

    sim::Session &s = gSession;
    s.outDir = o.outDir;
    s.timeoutMs = o.timeoutMs;
    s.journal.SetEcho(o.verbose);
    ClearOutDir(o.outDir);
    std::string error;
    if (!s.journal.Open(o.journal.empty() ? Absolute(o.outDir + "/session.jsonl") : Absolute(o.journal), &error)) {
        std::fprintf(stderr, "usbadapter-sim: %s\n", error.c_str());
        return kExitStartup;
    }
    s.javaJournal.SetPath(o.outDir + "/journal.jsonl");
    if (!PrepareRoot(o, &error)) StartupFailed(o, error);
    ::setenv("USBADAPTER_LOG", (Absolute(o.outDir) + "/usbadapter.log").c_str(), 0);
    // The test functions' shell commands (killall, rm -rf, device scripts) are
    // meant for the controller: on a PC they are recorded, never run.
    ::setenv("USBADAPTER_COMMAND_LOG", (Absolute(o.outDir) + "/commands.log").c_str(), 0);

    StartService(o);
    if (o.plug && !sim::FindCommand("plug")->run(s, {}, &error)) StartupFailed(o, error);
    bool passed = sim::RunScript(s, o.lines);
    Finish(o, passed ? kExitPassed : kExitFailed, true);
}
