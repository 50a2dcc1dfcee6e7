#include "Session.h"

#include <cstdlib>
#include <map>

#include "Host.h"
#include "vdev.h"

namespace sim {
namespace {

long long Number(const std::map<std::string, std::string> &f, const char *key) {
    auto it = f.find(key);
    return it == f.end() ? 0 : std::atoll(it->second.c_str());
}

std::string Text(const std::map<std::string, std::string> &f, const char *key) {
    auto it = f.find(key);
    return it == f.end() ? std::string() : it->second;
}

template <typename Record>
Record &Slot(std::vector<Record> &records, long long number) {
    if (number < 1) number = 1;
    if (records.size() < static_cast<size_t>(number)) records.resize(static_cast<size_t>(number));
    records[static_cast<size_t>(number - 1)].number = static_cast<int>(number);
    return records[static_cast<size_t>(number - 1)];
}

}  // namespace

// Jobs the service still holds as open (their "job-end" line not yet written);
// -1 when it cannot be asked.
int Session::JavaOpenJobs() {
    jclass cls = env->GetObjectClass(service);
    jmethodID count = env->GetMethodID(cls, "openJobCount", "()I");
    env->DeleteLocalRef(cls);
    if (!count) {
        TakeException(env);
        return -1;
    }
    int size = env->CallIntMethod(service, count);
    if (!TakeException(env).empty()) return -1;
    return size;
}

void Session::MergeJavaJournal() {
    for (const std::string &line : javaJournal.NewLines()) {
        journal.WriteJava(line);
        std::map<std::string, std::string> f;
        if (!ParseFlatJson(line, &f)) continue;
        const std::string event = Text(f, "event");
        if (event == "job-start") {
            JobRecord &job = Slot(jobs, Number(f, "job"));
            job.name = Text(f, "name");
        } else if (event == "job-end") {
            JobRecord &job = Slot(jobs, Number(f, "job"));
            job.ended = true;
            job.bytes = Number(f, "bytes");
            job.sha256 = Text(f, "sha256");
            job.file = Text(f, "file");
        } else if (event == "app-start") {
            Slot(apps, Number(f, "app")).type = Text(f, "type");
        } else if (event == "app-end") {
            AppRecord &app = Slot(apps, Number(f, "app"));
            app.type = Text(f, "type");
            app.ended = true;
            app.bytes = Number(f, "bytes");
            app.sha256 = Text(f, "sha256");
            app.file = Text(f, "file");
        }
    }
}

void Session::SyncJava() {
    if (!env || !service) {
        MergeJavaJournal();
        return;
    }
    jclass cls = env->GetObjectClass(service);
    jmethodID finish = env->GetMethodID(cls, "finishEndedJobs", "()V");
    env->DeleteLocalRef(cls);
    if (finish) env->CallVoidMethod(service, finish);
    std::string ex = TakeException(env);
    if (!ex.empty()) Sim(JsonLine("java-exception").Str("where", "finishEndedJobs").Str("text", ex));
    MergeJavaJournal();
    // The service's own watcher may have taken an ended job off its list and
    // not written its "job-end" yet: wait until every job missing from the
    // list has its line.
    if (OpenJobs() == 0) return;
    const int held = JavaOpenJobs();
    WaitUntil(
        [&] {
            MergeJavaJournal();
            return held < 0 ? false : OpenJobs() <= held;
        },
        held < 0 ? 50 : timeoutMs);
}

int Session::EndedJobs() const {
    int n = 0;
    for (const auto &j : jobs) n += j.ended;
    return n;
}

int Session::OpenJobs() const { return static_cast<int>(jobs.size()) - EndedJobs(); }

int Session::EndedApps() const {
    int n = 0;
    for (const auto &a : apps) n += a.ended;
    return n;
}

bool Session::WaitIdle(std::string *error) {
    if (ReaderGone()) {
        *error = "the print reader returned from readPrintMsg" +
                 (printReader.exception.empty() ? std::string() : ": " + printReader.exception);
        return false;
    }
    if (!everPlugged) return true;  // it waits for the configuration, not for data
    const pid_t reader = printReader.tid;
    bool idle = WaitUntil(
        [&] {
            if (ReaderGone()) return true;
            if (!plugged && ProbeThread(reader) == ThreadWait::Sleep) return true;
            return ReaderWaiting(reader, vdev::kPrn);
        },
        timeoutMs);
    if (ReaderGone()) return WaitIdle(error);
    if (!idle) {
        *error = "the print reader did not come back to wait for the host within " + std::to_string(timeoutMs) +
                 " ms (" + std::to_string(vdev::PendingHostBytes(vdev::kPrn)) + " host bytes not read)";
    }
    return idle;
}

}  // namespace sim
