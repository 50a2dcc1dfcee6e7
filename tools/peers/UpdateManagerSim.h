// An update manager on loopback for tests, benchmarks and the simulator: it
// takes the library's image requests ("$IMG", type, size, body, checksum) on
// each connection, checks the order and the checksum rule (image-header words
// + body words + checksum = 0xA5A5 mod 65536, seeded with the previous image's
// checksum within one file), answers the verdict, and after "$END" reports
// progress and "$END". Every image received can be written to a directory.
// It can be told to misbehave. Every wait is bounded; Stop() ends it cleanly.
#pragma once

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

namespace peers {

enum class UmMisbehaviour {
    None,
    ChecksumError,  // every verdict is 2
    ProgressFail,   // progress goes to -1
    Silence,        // never answers anything
    EarlyClose,     // closes the connection instead of giving the verdict
    SlowProgress,   // waits slowProgressMs before each progress pair
    EndlessProgress,  // a pair below 100 every slowProgressMs until the library lets go
};

// "none", "checksum-error", "progress-fail", "silence", "early-close",
// "slow-progress", "endless-progress"; false for anything else.
bool ParseUmMisbehaviour(const std::string &name, UmMisbehaviour *out);
const char *UmMisbehaviourName(UmMisbehaviour m);

struct UmImage {
    uint32_t type = 0;
    uint32_t size = 0;       // announced
    uint64_t received = 0;   // body bytes that came
    uint16_t checksum = 0;   // as sent by the library
    bool complete = false;   // body and checksum arrived
    bool checksumOk = false;
    bool chained = false;    // verified with the previous image's checksum as seed
    std::string file;        // where the body was written ("" when not kept)
};

struct UmOptions {
    uint16_t port = 0;          // 0: an ephemeral port (see Port())
    std::string dir;            // images are written here; "" keeps none
    UmMisbehaviour misbehaviour = UmMisbehaviour::None;
    int ioTimeoutMs = 10000;    // a connection silent this long is dropped
    int slowProgressMs = 300;
    std::vector<int8_t> progress;  // reported after "$END"; empty: 10, 40, 70, 100
};

class UpdateManagerSim {
public:
    UpdateManagerSim() = default;
    ~UpdateManagerSim() { Stop(); }
    UpdateManagerSim(const UpdateManagerSim &) = delete;
    UpdateManagerSim &operator=(const UpdateManagerSim &) = delete;

    bool Start(const UmOptions &options, std::string *error);
    void Stop();
    uint16_t Port() const { return port_; }
    void SetMisbehaviour(UmMisbehaviour m);

    // Observations, safe while the manager runs.
    std::vector<UmImage> Images() const;
    std::vector<std::string> Errors() const;  // protocol violations seen
    int Connections() const;
    int Ends() const;                         // "$END" exchanges completed
    int Active() const;                       // connections still open
    // Waits (bounded) until pred() holds; pred may use the observers above.
    bool WaitFor(const std::function<bool()> &pred, int timeoutMs) const;

private:
    void acceptLoop();
    void serve(int fd);
    bool serveImage(int fd);
    bool serveEnd(int fd);
    bool readFull(int fd, void *buf, size_t size);
    bool writeAll(int fd, const void *buf, size_t size);
    void error(const std::string &what);

    UmOptions opt_;
    int listenFd_ = -1;
    uint16_t port_ = 0;
    std::atomic<bool> stop_{false};
    std::atomic<UmMisbehaviour> misbehaviour_{UmMisbehaviour::None};
    std::thread acceptor_;
    struct Worker {
        std::thread thread;
        std::shared_ptr<std::atomic<bool>> done;
    };
    std::vector<Worker> workers_;  // finished ones are joined at the next accept

    mutable std::mutex mu_;
    mutable std::condition_variable changed_;
    std::vector<UmImage> images_;
    std::vector<std::string> errors_;
    int connections_ = 0;
    int active_ = 0;
    int ends_ = 0;
    bool haveSeed_ = false;   // the previous image's checksum chains the next
    uint16_t seed_ = 0;
    uint32_t lastType_ = 0;
};

}  // namespace peers
