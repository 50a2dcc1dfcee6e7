// The operator panel's UI server, played on loopback for tests and the
// simulator: a server that the panel's client tests connect to, and a client
// that connects to the two listening tests. Both answer from a script, record
// what they received, bound every wait and stop cleanly.
#pragma once

#include <condition_variable>
#include <cstdint>
#include <functional>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

namespace uipeer {

// What the server does with one connection once the request has arrived.
struct Step {
    std::string answer;  // sent back; empty: nothing is sent
    bool hold = false;   // keep the connection open until the test closes it
};

// Chooses the step for the `connection`-th connection (from 0) and its request.
using Responder = std::function<Step(size_t connection, const std::string &request)>;
// The steps in order, one per connection; connections after them get `after`
// (by default: closed without an answer).
Responder Scripted(std::vector<Step> steps, Step after = {});
// Every request answered with `answer` (a UI server that passes every test).
Responder AnswerAll(std::string answer);

// Appends what one read of the socket brings; false when the peer closed or
// failed. SendAll sends every byte (resuming after signals) unless it fails.
bool ReadSome(int fd, std::string &into);
void SendAll(int fd, const std::string &bytes);

// A free TCP port on 127.0.0.1 at the time of the call.
uint16_t FreePort();

class Server {
public:
    // Listens on a loopback `address`; port 0 takes any free port. Anything but
    // a 127.x.x.x address is refused (ok() false).
    explicit Server(Responder responder, const char *address = "127.0.0.1", uint16_t port = 0);
    ~Server();
    Server(const Server &) = delete;
    Server &operator=(const Server &) = delete;

    bool ok() const { return listenFd_ >= 0; }
    uint16_t port() const { return port_; }
    // The request bytes of each connection served so far, in order.
    std::vector<std::string> requests() const;
    // Waits (real time, bounded) until `count` connections have been served.
    bool awaitServed(size_t count, int timeoutMs) const;
    void stop();

private:
    void run();
    void serve(int fd, size_t connection);

    Responder responder_;
    int listenFd_ = -1;
    int stopPipe_[2] = {-1, -1};
    uint16_t port_ = 0;
    std::thread thread_;
    mutable std::mutex mutex_;
    mutable std::condition_variable served_;
    std::vector<std::string> requests_;
};

// Connects to a listening test on loopback (retrying while nobody listens yet),
// takes its command, sends `answers` one by one with a pause between them so
// each arrives as its own read, and records everything the test sends until
// it closes. No answers: closes right after the command.
class Client {
public:
    Client(std::vector<std::string> answers, uint16_t port, const char *address = "127.0.0.1",
           int gapMs = 100);
    ~Client();
    Client(const Client &) = delete;
    Client &operator=(const Client &) = delete;

    // Waits for the exchange to end (it is bounded: about 5 s without a peer).
    void join();
    bool connected() const;
    std::string received() const;  // every byte the test sent, in order

private:
    void run(std::string address, uint16_t port);

    std::vector<std::string> answers_;
    int gapMs_;
    std::thread thread_;
    mutable std::mutex mutex_;
    bool connected_ = false;
    std::string received_;
};

}  // namespace uipeer
