// One simulator session: the Java service with the library inside, the host
// side on the virtual devices, and what has been seen so far. Script commands
// act on it (Commands.cpp).
#pragma once

#include <jni.h>

#include <cstdint>
#include <string>
#include <vector>

#include "Journal.h"
#include "Jvm.h"

namespace sim {

struct JobRecord {
    int number = 0;
    std::string name;
    bool ended = false;
    long long bytes = 0;
    std::string sha256, file;
};

struct AppRecord {
    int number = 0;
    std::string type;
    bool ended = false;
    long long bytes = 0;
    std::string sha256, file;
};

struct Session {
    // Set up by main before the first command.
    JNIEnv *env = nullptr;            // of the thread running the script
    jobject service = nullptr;        // the reference print service (global ref)
    ServiceThread printReader;        // the thread inside readPrintMsg
    std::string outDir;               // the reference service's output directory
    std::string baseDir;              // relative file: paths start here
    int timeoutMs = 10000;            // bound of every wait
    bool expectContinue = false;      // a failed expect-* is counted, not the end
    int expectFailures = 0;
    Journal journal;
    FileTail javaJournal;

    bool plugged = false;
    bool everPlugged = false;
    std::vector<JobRecord> jobs;      // by number - 1
    std::vector<AppRecord> apps;
    uint64_t bytesSent = 0, transfersSent = 0, bytesReadBack = 0;

    void Host(const JsonLine &line) { journal.Write("host", line); }
    void Sim(const JsonLine &line) { journal.Write("sim", line); }

    // Brings the job and application records up to date: asks the service to
    // journal the jobs the reader has ended, then merges the new lines.
    void SyncJava();
    void MergeJavaJournal();
    int JavaOpenJobs();
    int EndedJobs() const;
    int OpenJobs() const;
    int EndedApps() const;

    // The print reader waits for the host (or is parked, or gone). False with
    // `error` set after the time-out.
    bool WaitIdle(std::string *error);
    bool ReaderGone() const { return printReader.returned.load(); }
};

}  // namespace sim
