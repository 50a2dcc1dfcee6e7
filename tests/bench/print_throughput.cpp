// Print throughput through the whole print path: host transfers on the
// emulated print node, the library's reader (classification, UEL framing) and
// PassData into the Java job handler, which copies each buffer, in a real JVM
// (without -Xcheck:jni, as in production). Baseline in the same run: the same
// transfers through the bare emulated channel (the scan node, the same model
// as the print node), read by a native thread with the reader's poll-and-read
// of up to 1 MiB, each read handed as a direct buffer to a job handler of the
// same class, made by the same daemon: what the Java side costs is in both.
//
// One iteration is one UEL-framed job of kJobSize bytes, timed from the first
// host write until the reader has taken every byte and waits for the host
// again (every up-call of the job has returned by then); both paths are
// watched for that the same way.
#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <poll.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <string>
#include <thread>
#include <vector>

#include "Host.h"
#include "Jvm.h"
#include "LoggerHost.h"
#include "RatioReporter.h"
#include "support/MsgQueue.h"
#include "support/RandomBytes.h"
#include "support/Uel.h"
#include "vdev.h"

namespace {

constexpr size_t kJobSize = 32 << 20;
constexpr size_t kReadSize = 1 << 20;  // the reader's RX_BUFFER_SIZE
constexpr const char *kDaemon = "com/tarnwel/vbk/ca/plugin/usbadapter/print/USBPrintDaemon";
constexpr const char *kMaa = "com/tarnwel/vbk/ca/plugin/usbadapter/print/USBMaaService";

TempRoot *gRoot;  // removed by hand: the process ends with _exit
sim::ServiceThread gReader;
sim::ServiceThread gBare;
jobject gDaemon;
std::string gJob;

[[noreturn]] void Fail(const std::string &why) {
    std::fprintf(stderr, "print_throughput: %s\n", why.c_str());
    std::fflush(nullptr);
    _exit(1);
}

// The service's start-up on the plain print daemon, then the host configures
// the device; returns when the reader polls the print node.
void StartService() {
    gRoot = new TempRoot;
    sim::JvmConfig config = sim::DefaultJvmConfig();
    config.checkJni = false;
    config.maxHeap = "1g";
    // A job's chunks (32 MiB) stay alive until its end: a young generation
    // that holds them, and a heap touched in advance, keep collections and
    // first-touch page faults from landing on one path more than the other.
    config.extra = {"-Xms1g", "-Xmn768m", "-XX:+AlwaysPreTouch"};
    std::string error;
    if (!sim::CreateJvm(config, &error)) Fail(error);
    JNIEnv *env = sim::Env();
    jobject daemon = gDaemon = sim::NewObject(env, kDaemon, &error);
    jobject maa = daemon ? sim::NewObject(env, kMaa, &error) : nullptr;
    if (!maa) Fail(error);
    jstring model = env->NewStringUTF("Bench MFP");
    if (!sim::CallVoid(env, daemon, "creatPrnScanMsgQs", "(Ljava/lang/String;)V", &error, model) ||
        !sim::CallVoid(env, daemon, "initDevice", "()V", &error))
        Fail(error);
    env->DeleteLocalRef(model);
    sim::StartServiceThread(gReader, "usbadapter-print", [daemon, maa](JNIEnv *penv) {
        jclass cls = penv->GetObjectClass(daemon);
        jmethodID read = penv->GetMethodID(
            cls, "readPrintMsg", "(Ljava/lang/Object;Ljava/lang/String;Ljava/lang/String;Ljava/lang/String;I)V");
        penv->DeleteLocalRef(cls);
        if (read)
            penv->CallVoidMethod(daemon, read, maa, penv->NewStringUTF("Tarnwel"), penv->NewStringUTF("Bench MFP"),
                                 penv->NewStringUTF("PRINTER"), 1);
    });
    if (!sim::WaitUntil([] { return vdev::AsyncEnabled(vdev::kPrn) && gReader.tid > 0; }, 10000))
        Fail("the print reader did not set up the print node");
    if (!sim::NotifyAndWait(vdev::kPrn, MFP_DEV_CONFIGURED, eMfp_Notif_Both, 10000) ||
        !sim::WaitUntil([] { return sim::PollCount(vdev::kPrn) > 0; }, 10000))
        Fail("the print reader did not start reading");
}

// The bare channel's reader: poll and read, as the library's reader does, and
// hand every read to a job handler with the fewest JNI calls there can be
// (look-ups once; a handler per job of gJob.size() bytes, ended as the
// library ends one).
void BareReader(JNIEnv *env) {
    int fd = ::open(vdev::kScan, O_RDWR);
    if (fd < 0) Fail("cannot open the scan node");
    jclass daemonClass = env->GetObjectClass(gDaemon);
    jmethodID open = env->GetMethodID(daemonClass, "processPrintCommand",
                                      "(Ljava/lang/String;)Lcom/tarnwel/vbk/ca/plugin/usbadapter/print/"
                                      "USBPrintFileStreamHandler;");
    jstring name = env->NewStringUTF("bench");
    jobject first = open ? env->CallObjectMethod(gDaemon, open, name) : nullptr;
    jclass handlerClass = first ? env->GetObjectClass(first) : nullptr;
    jmethodID add = handlerClass ? env->GetMethodID(handlerClass, "addBufferToList", "(Ljava/nio/ByteBuffer;)V")
                                 : nullptr;
    jfieldID status = handlerClass ? env->GetFieldID(handlerClass, "fileParsingStatus", "I") : nullptr;
    if (!add || !status || env->ExceptionCheck()) Fail("the bare reader cannot reach the job handler");
    env->DeleteLocalRef(first);
    std::vector<char> buf(kReadSize);
    jobject handler = nullptr;
    size_t jobBytes = 0;
    for (;;) {
        pollfd p{fd, POLLIN, 0};
        if (::poll(&p, 1, -1) <= 0) continue;
        ssize_t n = ::read(fd, buf.data(), buf.size());
        if (n <= 0) continue;
        if (!handler) handler = env->CallObjectMethod(gDaemon, open, name);
        jobject b = env->NewDirectByteBuffer(buf.data(), n);
        env->CallVoidMethod(handler, add, b);
        env->DeleteLocalRef(b);
        jobBytes += static_cast<size_t>(n);
        if (jobBytes >= gJob.size()) {
            env->SetIntField(handler, status, 1);
            env->DeleteLocalRef(handler);
            handler = nullptr;
            jobBytes = 0;
        }
        if (env->ExceptionCheck()) Fail("the job handler threw");
    }
}

void StartBareReader() {
    sim::StartServiceThread(gBare, "bare-reader", BareReader);
    if (!sim::WaitUntil([] { return gBare.tid > 0 && sim::ProbeThread(gBare.tid) == sim::ThreadWait::Poll; }, 10000))
        Fail("the bare reader did not start");
}

// The reader `tid` has taken every host byte of `path` and waits for more.
bool Drained(const char *path, pid_t tid) {
    return vdev::PendingHostBytes(path) == 0 && sim::ProbeThread(tid) == sim::ThreadWait::Poll;
}

// PCL without ESC, framed: the job ends only at its closing UEL.
std::string MakeJob() {
    const std::string pjl = "@PJL ENTER LANGUAGE=PCL\r\n";
    std::string body = RandomBytes(kJobSize - pjl.size() - 2 * kUel.size(), 7);
    std::replace(body.begin(), body.end(), '\x1b', 'E');
    return Framed(pjl + body);
}

// Host writes of the job in transfers of `size`; returns when the reader
// `tid` has drained `path`, polled every 100 us (both paths alike). Seconds.
double SendJob(const char *path, size_t size, pid_t tid) {
    const auto start = std::chrono::steady_clock::now();
    for (size_t off = 0; off < gJob.size(); off += size)
        vdev::HostWrite(path, gJob.data() + off, std::min(size, gJob.size() - off));
    const auto deadline = start + std::chrono::seconds(60);
    while (!Drained(path, tid)) {
        if (std::chrono::steady_clock::now() > deadline) Fail("a job did not get through within 60 s");
        std::this_thread::sleep_for(std::chrono::microseconds(100));
    }
    return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

// One small job with the library's log captured: the handler was made, every
// chunk passed and nothing was refused. Otherwise the figures would measure a
// path that drops the data.
void CheckPrintPath() {
    const std::string job = Framed("@PJL ENTER LANGUAGE=PCL\r\nsanity");
    const pid_t reader = gReader.tid;
    LoggerHost_StartCapture();
    vdev::HostWrite(vdev::kPrn, job.data(), job.size());
    bool idle = sim::WaitUntil([reader] { return Drained(vdev::kPrn, reader); }, 10000);
    LoggerHost_StopCapture();
    int errors = 0;
    for (const LoggedLine &l : LoggerHost_Captured()) errors += l.level >= 40000;
    if (!idle || LoggerHost_Count("[USBAdp] Inside RegisterJob().\n") != 1 ||
        LoggerHost_Contains("globalUSBPrintFileStreamObj") || errors != 0)
        Fail("the print path does not deliver a job to Java: see the library log (USBADAPTER_LOG_LEVEL=DEBUG)");
}

// CPU time the thread `tid` of this process has run, in seconds.
double ThreadCpuSeconds(pid_t tid) {
    unsigned long long ns = 0;
    if (FILE *f = std::fopen(("/proc/self/task/" + std::to_string(tid) + "/schedstat").c_str(), "r")) {
        if (std::fscanf(f, "%llu", &ns) != 1) ns = 0;
        std::fclose(f);
    }
    return static_cast<double>(ns) / 1e9;
}

// Jobs sent on `path` in transfers of state.range(0) bytes, read by `reader`.
// Besides the rate, the reader's own CPU time per byte: what the path costs,
// unlike the elapsed time hardly touched by what else runs on the machine.
void RunJobs(benchmark::State &state, const char *path, const sim::ServiceThread &reader) {
    const size_t size = static_cast<size_t>(state.range(0));
    const pid_t tid = reader.tid;
    double cpu = 0;
    for (auto _ : state) {
        const double cpuStart = ThreadCpuSeconds(tid);
        state.SetIterationTime(SendJob(path, size, tid));
        cpu += ThreadCpuSeconds(tid) - cpuStart;
        if (reader.returned) Fail("a reader returned: " + reader.exception);
    }
    const double bytes = static_cast<double>(state.iterations()) * static_cast<double>(gJob.size());
    state.SetBytesProcessed(static_cast<int64_t>(bytes));
    if (cpu > 0) state.counters["reader_cpu_bytes_per_second"] = bytes / cpu;
}

void BM_PrintPath(benchmark::State &state) { RunJobs(state, vdev::kPrn, gReader); }
void BM_BareChannel(benchmark::State &state) { RunJobs(state, vdev::kScan, gBare); }

const int64_t kTransferSizes[] = {4 << 10, 64 << 10, 1 << 20};

}  // namespace

int main(int argc, char **argv) {
    if (!RatioReporter::Initialize(&argc, argv, 15)) return 1;
    gJob = MakeJob();
    StartService();
    StartBareReader();
    CheckPrintPath();

    RatioReporter reporter;
    for (int64_t size : kTransferSizes) {
        using Fn = void (*)(benchmark::State &);
        for (auto [name, fn] : {std::pair<const char *, Fn>{"BM_BareChannel", BM_BareChannel}, {"BM_PrintPath", BM_PrintPath}})
            benchmark::RegisterBenchmark(name, fn)->Arg(size)->UseManualTime()->MinTime(0.25)->Unit(
                benchmark::kMillisecond);
        const std::string arg = "/" + std::to_string(size);
        reporter.Compare("BM_PrintPath" + arg, "BM_BareChannel" + arg);
        reporter.Compare("BM_PrintPath" + arg, "BM_BareChannel" + arg, "reader_cpu_bytes_per_second");
    }
    reporter.RunAll();
    RemoveQueues(*gRoot);
    delete gRoot;
    std::fflush(nullptr);
    _exit(0);  // the print reader never returns
}
