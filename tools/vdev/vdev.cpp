// The node framework behind vdev.h: descriptors, host transfers, virtual time,
// notifications and ioctl recording. Driver models plug in through NodeModel.
//
// Locking: one model mutex guards everything except what a SIGIO handler
// reaches (MFP_IOC_GET_NOTIF): the descriptor table, each node's generation,
// notification ring and injected failures, and a log of the calls made there.
// Those are atomics only, so the handler can interrupt a thread that holds the
// mutex (or is inside malloc) without deadlock. SIGIO itself is raised after
// the mutex is released.
#include "vdev.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <condition_variable>
#include <cstring>
#include <deque>
#include <stdexcept>
#include <unordered_map>

#include "Model.h"
#include "common/UniqueFd.h"

namespace vdev::detail {

std::atomic<uint32_t> gFdTable[kMaxFd];

namespace {

// ---- registry -----------------------------------------------------------------

constexpr NodeModel kNodes[] = {
    {MS_PRN_FILE_NAME, BridgePrnReadTimeout, BridgeIoctl, BridgeReset, true},
    {MS_SCAN_FILE_NAME, BridgeScanReadTimeout, BridgeIoctl, BridgeReset, true},
    {SCAN_DEVICE_NAME, nullptr, ScannerIoctl, ScannerReset, false},
    {FAX_DEVICE_NAME, nullptr, FaxIoctl, FaxReset, false},
    {JBIG_ENC_DEVICE_NAME, nullptr, JbigIoctl, JbigReset, false},
    {JBIG_DEC_DEVICE_NAME, nullptr, JbigIoctl, JbigReset, false},
};
constexpr int kNodeCount = static_cast<int>(std::size(kNodes));
static_assert(kNodeCount < 255);

// ---- what the signal path touches (atomics only) ---------------------------------

static_assert(std::atomic<uint64_t>::is_always_lock_free);
static_assert(std::atomic<uint32_t>::is_always_lock_free);
static_assert(std::atomic<unsigned long>::is_always_lock_free);

// Multi-consumer ring: producers hold the model mutex; consumers (GET_NOTIF,
// possibly in a signal handler) claim the head with a CAS. A slot is rewritten
// only after the head has moved past it, so a consumer whose CAS succeeds read
// a live value.
struct NotifRing {
    static constexpr uint32_t kCap = kNotificationCapacity;
    std::atomic<uint64_t> slot[kCap];
    std::atomic<uint32_t> head{0}, tail{0};

    bool push(uint64_t v) {
        uint32_t t = tail.load(std::memory_order_relaxed);
        if (t - head.load(std::memory_order_acquire) >= kCap) return false;
        slot[t % kCap].store(v, std::memory_order_relaxed);
        tail.store(t + 1, std::memory_order_release);
        return true;
    }
    bool pop(uint64_t *v) {
        uint32_t h = head.load(std::memory_order_acquire);
        for (;;) {
            if (h == tail.load(std::memory_order_acquire)) return false;
            uint64_t got = slot[h % kCap].load(std::memory_order_relaxed);
            if (head.compare_exchange_weak(h, h + 1, std::memory_order_acq_rel, std::memory_order_acquire)) {
                *v = got;
                return true;
            }
        }
    }
    size_t size() const {
        return tail.load(std::memory_order_acquire) - head.load(std::memory_order_acquire);
    }
    void clear() { head.store(tail.load(std::memory_order_acquire), std::memory_order_release); }
};

struct FailRule {
    std::atomic<unsigned long> request{0};
    std::atomic<int> err{0};
    std::atomic<int> count{0};
};

struct SignalSide {
    std::atomic<uint32_t> generation{1};
    NotifRing notifs;
    FailRule fail[16];
};
SignalSide gSignal[kNodeCount];

// Global call order across both recording paths.
std::atomic<uint64_t> gSeq{1};

// Calls recorded on the lock-free path, merged into the main record on query.
struct SigRecord {
    std::atomic<int> state{0};  // 0 free, 1 being written, 2 ready
    std::atomic<uint64_t> seq{0};
    std::atomic<int> node{0};
    std::atomic<unsigned long> request{0};
    std::atomic<uint64_t> payload{0};
    std::atomic<int> hasPayload{0};
    std::atomic<int> result{0};
    std::atomic<int> error{0};
};
constexpr int kSigLog = 1024;
SigRecord gSigLog[kSigLog];
std::atomic<uint32_t> gSigLogHint{0};
std::atomic<uint32_t> gSigLogLost{0};

int ConsumeFailure(int node, unsigned long request) {
    for (FailRule &r : gSignal[node].fail) {
        int c = r.count.load(std::memory_order_acquire);
        while (c > 0) {
            if (r.request.load(std::memory_order_acquire) != request) break;
            if (r.count.compare_exchange_weak(c, c - 1, std::memory_order_acq_rel)) {
                return r.err.load(std::memory_order_acquire);
            }
        }
    }
    return 0;
}

void SigLogAppend(uint64_t seq, int node, unsigned long request, const mfp_notif_t *out, int result, int error) {
    uint32_t start = gSigLogHint.fetch_add(1, std::memory_order_relaxed);
    for (int i = 0; i < kSigLog; ++i) {
        SigRecord &r = gSigLog[(start + i) % kSigLog];
        int expected = 0;
        if (!r.state.compare_exchange_strong(expected, 1, std::memory_order_acquire)) continue;
        uint64_t bytes = 0;
        if (out) std::memcpy(&bytes, out, sizeof bytes);
        r.seq.store(seq, std::memory_order_relaxed);
        r.node.store(node, std::memory_order_relaxed);
        r.request.store(request, std::memory_order_relaxed);
        r.payload.store(bytes, std::memory_order_relaxed);
        r.hasPayload.store(out != nullptr, std::memory_order_relaxed);
        r.result.store(result, std::memory_order_relaxed);
        r.error.store(error, std::memory_order_relaxed);
        r.state.store(2, std::memory_order_release);
        return;
    }
    gSigLogLost.fetch_add(1, std::memory_order_relaxed);
}

static_assert(sizeof(mfp_notif_t) == sizeof(uint64_t));

// Async-signal-safe: atomics and memcpy only.
int GetNotif(int node, uint32_t generation, void *arg) {
    SignalSide &s = gSignal[node];
    if (s.generation.load(std::memory_order_acquire) != generation) {
        errno = EIO;
        return -1;
    }
    uint64_t seq = gSeq.fetch_add(1, std::memory_order_relaxed);
    int err = ConsumeFailure(node, MFP_IOC_GET_NOTIF);
    uint64_t v = 0;
    if (!err && !IsPointer(arg)) err = EFAULT;
    if (!err && !s.notifs.pop(&v)) err = EAGAIN;
    if (err) {
        SigLogAppend(seq, node, MFP_IOC_GET_NOTIF, nullptr, -1, err);
        errno = err;
        return -1;
    }
    mfp_notif_t n;
    std::memcpy(&n, &v, sizeof n);
    std::memcpy(arg, &n, sizeof n);
    SigLogAppend(seq, node, MFP_IOC_GET_NOTIF, &n, 0, 0);
    return 0;
}

// ---- model state (model mutex) ---------------------------------------------------

struct FdState {
    int node;
    uint32_t generation;
    int accmode;
    int status;
    int owner;
};

struct NodeState {
    bool present = true;
    UniqueFd devEnd, hostEnd;  // of the current generation
    std::deque<std::vector<uint8_t>> rx;
    size_t rxOffset = 0;  // consumed bytes of rx.front()
    bool marker = false;  // a byte waits on devEnd while rx is not empty
    std::vector<uint8_t> tx;
    int expirePoll = 0, expireRead = 0;
    bool instant = false;
    UniqueFd readWake, pollWake;  // eventfds, kept for the process lifetime
    bool readWakeOn = false, pollWakeOn = false;
    std::vector<int> pollTimeouts;
    std::vector<size_t> readSizes;
    size_t pollCalls = 0, readCalls = 0;
    int pollsInProgress = 0;  // survives Reset: a poll may be under way
    size_t opens = 0;  // successful opens
    size_t expiredPolls = 0;  // polls that returned 0
    std::vector<int> openFds;  // oldest first
    int lastFlags = 0;
    std::optional<int> forcedFlags;
};

struct Record {
    uint64_t seq;
    IoctlCall call;
};

struct Model {
    std::mutex mu;
    std::condition_variable txCv;
    std::array<NodeState, kNodeCount> nodes;
    std::unordered_map<int, FdState> fds;
    std::vector<Record> ioctls;
};

// Never destroyed: other threads may still call into vdev while the process
// exits.
Model &M() {
    static Model *m = new Model;
    return *m;
}

constexpr int kSettableFlags = O_APPEND | O_ASYNC | O_DIRECT | O_NOATIME | O_NONBLOCK;
constexpr int kOpenStatusFlags = O_APPEND | O_NONBLOCK | O_DSYNC | O_SYNC | O_DIRECT | O_NOATIME;

uint32_t Generation(int node) { return gSignal[node].generation.load(std::memory_order_acquire); }

void ForgetFd(Model &m, int fd);

// A descriptor the model opens for itself. Its number may still carry the
// mapping of a node descriptor closed behind vdev's back; closing it through
// that mapping would come back into the model with the lock held.
int OwnFd(int fd) {
    if (fd >= 0 && fd < kMaxFd && gFdTable[fd].exchange(0, std::memory_order_acq_rel)) ForgetFd(M(), fd);
    return fd;
}

void SetWake(UniqueFd &fd, bool &on, bool want) {
    if (want == on || !fd) return;
    uint64_t v = 1;
    if (want) {
        (void)RealWrite(fd.get(), &v, sizeof v);
    } else {
        (void)RealRead(fd.get(), &v, sizeof v);
    }
    on = want;
}

// Keeps each eventfd readable exactly while a waiter of its kind should wake.
void SyncWake(NodeState &n) {
    if (!n.readWake) n.readWake.reset(OwnFd(eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC)));
    if (!n.pollWake) n.pollWake.reset(OwnFd(eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC)));
    SetWake(n.readWake, n.readWakeOn, n.expireRead > 0 || n.instant);
    SetWake(n.pollWake, n.pollWakeOn, n.expirePoll > 0 || n.instant);
}

bool EnsurePair(NodeState &n) {
    if (n.devEnd) return true;
    int sv[2];
    if (socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, sv) != 0) return false;
    n.devEnd.reset(OwnFd(sv[0]));
    n.hostEnd.reset(OwnFd(sv[1]));
    n.marker = false;
    if (!n.rx.empty()) {
        char m = 'm';
        n.marker = send(n.hostEnd.get(), &m, 1, MSG_DONTWAIT | MSG_NOSIGNAL) == 1;
    }
    return true;
}

void PushTransfer(NodeState &n, std::vector<uint8_t> bytes) {
    n.rx.push_back(std::move(bytes));
    // A pair made here already carries the marker for what rx holds: a second
    // one would leave the node readable after the last byte was taken.
    if (!n.marker && EnsurePair(n) && !n.marker) {
        char m = 'm';
        n.marker = send(n.hostEnd.get(), &m, 1, MSG_DONTWAIT | MSG_NOSIGNAL) == 1;
    }
}

// Takes up to `size` bytes of the front transfer.
size_t TakeTransfer(NodeState &n, void *buf, size_t size) {
    std::vector<uint8_t> &front = n.rx.front();
    size_t got = std::min(size, front.size() - n.rxOffset);
    if (got) std::memcpy(buf, front.data() + n.rxOffset, got);
    n.rxOffset += got;
    if (n.rxOffset == front.size()) {
        n.rx.pop_front();
        n.rxOffset = 0;
    }
    if (n.rx.empty() && n.marker) {
        char m;
        (void)recv(n.devEnd.get(), &m, 1, MSG_DONTWAIT);
        n.marker = false;
    }
    return got;
}

void DropTransfers(NodeState &n) {
    n.rx.clear();
    n.rxOffset = 0;
    if (n.marker) {
        char m;
        (void)recv(n.devEnd.get(), &m, 1, MSG_DONTWAIT);
        n.marker = false;
    }
}

void RemoveOpenFd(NodeState &n, int fd) {
    auto it = std::find(n.openFds.begin(), n.openFds.end(), fd);
    if (it != n.openFds.end()) n.openFds.erase(it);
}

// Drops the model's view of a descriptor number (closed, or reused by the
// kernel behind vdev's back).
void ForgetFd(Model &m, int fd) {
    auto it = m.fds.find(fd);
    if (it == m.fds.end()) return;
    if (it->second.generation == Generation(it->second.node)) RemoveOpenFd(m.nodes[it->second.node], fd);
    m.fds.erase(it);
}

FdState *LiveFd(Model &m, int fd, uint32_t entry) {
    auto it = m.fds.find(fd);
    if (it == m.fds.end()) return nullptr;
    int node = EntryNode(entry);
    if (it->second.node != node || it->second.generation != Generation(node)) return nullptr;
    return &it->second;
}

int NodeIndex(const char *path) {
    int i = FindNode(path);
    if (i < 0) throw std::invalid_argument(std::string("vdev: not an emulated node: ") + (path ? path : "(null)"));
    return i;
}

int64_t NowMs() {
    timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<int64_t>(ts.tv_sec) * 1000 + ts.tv_nsec / 1000000;
}

int Remaining(int64_t deadline) {
    if (deadline < 0) return -1;
    int64_t left = deadline - NowMs();
    return left < 0 ? 0 : static_cast<int>(std::min<int64_t>(left, INT32_MAX));
}

// Records of a long-running process (the simulator) stay bounded: past the
// limit the older half is dropped.
template <typename T>
void Bound(std::vector<T> &v) {
    if (v.size() > kRecordLimit) v.erase(v.begin(), v.begin() + static_cast<std::ptrdiff_t>(v.size() / 2));
}

void MergeSigLog(Model &m) {
    bool merged = false;
    for (SigRecord &r : gSigLog) {
        if (r.state.load(std::memory_order_acquire) != 2) continue;
        IoctlCall c;
        int node = r.node.load(std::memory_order_relaxed);
        c.path = kNodes[node].path;
        c.request = r.request.load(std::memory_order_relaxed);
        if (r.hasPayload.load(std::memory_order_relaxed)) {
            uint64_t v = r.payload.load(std::memory_order_relaxed);
            c.payload.resize(sizeof v);
            std::memcpy(c.payload.data(), &v, sizeof v);
        }
        c.result = r.result.load(std::memory_order_relaxed);
        c.error = r.error.load(std::memory_order_relaxed);
        m.ioctls.push_back({r.seq.load(std::memory_order_relaxed), std::move(c)});
        r.state.store(0, std::memory_order_release);
        merged = true;
    }
    if (merged) {
        std::stable_sort(m.ioctls.begin(), m.ioctls.end(),
                         [](const Record &a, const Record &b) { return a.seq < b.seq; });
        Bound(m.ioctls);
    }
}

void ClearSigLog() {
    for (SigRecord &r : gSigLog) {
        int ready = 2;
        r.state.compare_exchange_strong(ready, 0, std::memory_order_acq_rel);
    }
}

}  // namespace

// ---- framework entry points ---------------------------------------------------------

std::mutex &ModelMutex() { return M().mu; }

bool NodeAlive(int node, uint32_t generation) { return Generation(node) == generation; }

int FindNode(const char *path) {
    if (!path || path[0] != '/') return -1;
    for (int i = 0; i < kNodeCount; ++i) {
        if (std::strcmp(path, kNodes[i].path) == 0) return i;
    }
    return -1;
}

int Open(int node, int flags) {
    Model &m = M();
    std::lock_guard lk(m.mu);
    NodeState &n = m.nodes[node];
    if (!n.present) {
        errno = ENOENT;
        return -1;
    }
    if (!EnsurePair(n)) return -1;
    int fd = RealFcntl(n.devEnd.get(), (flags & O_CLOEXEC) ? F_DUPFD_CLOEXEC : F_DUPFD, nullptr);
    if (fd < 0) return -1;
    if (fd >= kMaxFd) {
        RealClose(fd);
        errno = EMFILE;
        return -1;
    }
    ForgetFd(m, fd);
    uint32_t gen = Generation(node);
    m.fds[fd] = FdState{node, gen, flags & O_ACCMODE, flags & kOpenStatusFlags, 0};
    n.openFds.push_back(fd);
    ++n.opens;
    n.lastFlags = flags & kOpenStatusFlags;
    gFdTable[fd].store((gen << 8) | static_cast<uint32_t>(node + 1), std::memory_order_release);
    return fd;
}

int Close(int fd, uint32_t) {
    {
        Model &m = M();
        std::lock_guard lk(m.mu);
        // Unmapped before the number can be handed out again.
        gFdTable[fd].store(0, std::memory_order_release);
        ForgetFd(m, fd);
    }
    return RealClose(fd);
}

ssize_t Read(int fd, uint32_t entry, void *buf, size_t size) {
    Model &m = M();
    int node = EntryNode(entry);
    int64_t deadline = -2;  // not computed yet
    std::unique_lock lk(m.mu);
    NodeState &n = m.nodes[node];
    if (LiveFd(m, fd, entry)) {
        n.readSizes.push_back(size);
        Bound(n.readSizes);
        ++n.readCalls;
    }
    for (;;) {
        FdState *st = LiveFd(m, fd, entry);
        if (!st) return 0;
        if (size == 0) return 0;
        if (!n.rx.empty()) return static_cast<ssize_t>(TakeTransfer(n, buf, size));
        if (st->status & O_NONBLOCK) {
            errno = EAGAIN;
            return -1;
        }
        if (n.instant) return 0;
        if (n.expireRead > 0) {
            --n.expireRead;
            SyncWake(n);
            return 0;
        }
        if (deadline == -2) {
            uint32_t to = kNodes[node].readTimeoutMs ? kNodes[node].readTimeoutMs() : 0;
            deadline = to ? NowMs() + to : -1;
        }
        int wait = Remaining(deadline);
        if (wait == 0) return 0;
        SyncWake(n);
        pollfd p[2] = {{fd, POLLIN, 0}, {n.readWake.get(), POLLIN, 0}};
        lk.unlock();
        int r = RealPoll(p, 2, wait);
        int err = errno;
        lk.lock();
        if (r < 0 && err == EINTR) {
            errno = EINTR;
            return -1;
        }
    }
}

ssize_t Write(int fd, uint32_t entry, const void *buf, size_t size) {
    Model &m = M();
    std::lock_guard lk(m.mu);
    if (!LiveFd(m, fd, entry)) {
        errno = EIO;
        return -1;
    }
    const uint8_t *p = static_cast<const uint8_t *>(buf);
    m.nodes[EntryNode(entry)].tx.insert(m.nodes[EntryNode(entry)].tx.end(), p, p + size);
    m.txCv.notify_all();
    return static_cast<ssize_t>(size);
}

bool Fcntl(int fd, uint32_t entry, int cmd, void *arg, int *result) {
    if (cmd != F_GETFL && cmd != F_SETFL && cmd != F_GETOWN && cmd != F_SETOWN) return false;
    Model &m = M();
    std::lock_guard lk(m.mu);
    auto it = m.fds.find(fd);
    if (it == m.fds.end() || it->second.node != EntryNode(entry)) return false;
    FdState &st = it->second;
    NodeState &n = m.nodes[st.node];
    bool live = st.generation == Generation(st.node);
    bool newest = live && !n.openFds.empty() && n.openFds.back() == fd;
    int value = static_cast<int>(reinterpret_cast<intptr_t>(arg));
    switch (cmd) {
    case F_GETFL:
        if (live && n.forcedFlags) {
            st.status = *n.forcedFlags;
            n.forcedFlags.reset();
            if (newest) n.lastFlags = st.status;
        }
        *result = st.accmode | st.status;
        break;
    case F_SETFL:
        st.status = (st.status & ~kSettableFlags) | (value & kSettableFlags);
        if (newest) n.lastFlags = st.status;
        *result = 0;
        break;
    case F_GETOWN: *result = st.owner; break;
    case F_SETOWN:
        st.owner = value;
        *result = 0;
        break;
    }
    return true;
}

int Ioctl(int fd, uint32_t entry, unsigned long request, void *arg) {
    int node = EntryNode(entry);
    const NodeModel &model = kNodes[node];
    if (request == MFP_IOC_GET_NOTIF && model.notifications) return GetNotif(node, EntryGeneration(entry), arg);

    Model &m = M();
    std::unique_lock lk(m.mu);
    FdState *st = LiveFd(m, fd, entry);
    if (!st) {
        errno = EIO;
        return -1;
    }
    uint64_t seq = gSeq.fetch_add(1, std::memory_order_relaxed);
    std::vector<uint8_t> payload;
    IoctlContext ctx{node, st->status, EntryGeneration(entry), ConsumeFailure(node, request), lk, payload};
    int r;
    if (model.ioctl) {
        r = model.ioctl(ctx, request, arg);
    } else {
        r = ctx.injectedError ? -ctx.injectedError : -ENOTTY;
    }
    int err = r < 0 ? -r : 0;
    m.ioctls.push_back({seq, IoctlCall{model.path, request, std::move(payload), r < 0 ? -1 : r, err}});
    Bound(m.ioctls);
    if (r < 0) {
        errno = err;
        return -1;
    }
    return r;
}

namespace {

// The wait of Poll once its nodes are known (and recorded).
int PollNodes(struct pollfd *fds, nfds_t count, int timeout, const std::vector<int> &nodes) {
    Model &m = M();
    int64_t deadline = timeout < 0 ? -1 : NowMs() + timeout;
    std::vector<pollfd> ext;
    for (;;) {
        int r = RealPoll(fds, count, 0);
        if (r != 0 || timeout == 0) return r;
        {
            std::lock_guard lk(m.mu);
            for (int node : nodes) {
                NodeState &n = m.nodes[node];
                if (n.instant) return 0;
                if (n.expirePoll > 0) {
                    --n.expirePoll;
                    SyncWake(n);
                    return 0;
                }
            }
            ext.assign(fds, fds + count);
            for (int node : nodes) {
                SyncWake(m.nodes[node]);
                ext.push_back({m.nodes[node].pollWake.get(), POLLIN, 0});
            }
        }
        int wait = Remaining(deadline);
        if (wait == 0) return 0;
        r = RealPoll(ext.data(), ext.size(), wait);
        if (r < 0) return r;
        int ready = 0;
        for (nfds_t i = 0; i < count; ++i) {
            fds[i].revents = ext[i].revents;
            if (ext[i].revents) ++ready;
        }
        if (ready) return ready;
        if (r == 0) return 0;
        // Only a wake-up: look at the node's virtual time again.
    }
}

}  // namespace

int Poll(struct pollfd *fds, nfds_t count, int timeout) {
    Model &m = M();
    std::vector<int> nodes;
    {
        std::lock_guard lk(m.mu);
        for (nfds_t i = 0; i < count; ++i) {
            uint32_t e = FdEntry(fds[i].fd);
            if (!e || !LiveFd(m, fds[i].fd, e)) continue;
            int node = EntryNode(e);
            if (std::find(nodes.begin(), nodes.end(), node) != nodes.end()) continue;
            nodes.push_back(node);
            m.nodes[node].pollTimeouts.push_back(timeout);
            Bound(m.nodes[node].pollTimeouts);
            ++m.nodes[node].pollCalls;
        }
    }
    {
        std::lock_guard lk(m.mu);
        for (int node : nodes) ++m.nodes[node].pollsInProgress;
    }
    int r = PollNodes(fds, count, timeout, nodes);
    {
        std::lock_guard lk(m.mu);
        for (int node : nodes) --m.nodes[node].pollsInProgress;
    }
    if (r == 0 && timeout != 0) {
        std::lock_guard lk(m.mu);
        for (int node : nodes) ++m.nodes[node].expiredPolls;
    }
    return r;
}

}  // namespace vdev::detail

// ---- test-side API ------------------------------------------------------------------

namespace vdev {

using namespace detail;

void Reset() {
    Model &m = M();
    std::vector<int> dead;
    {
        std::lock_guard lk(m.mu);
        for (int i = 0; i < kNodeCount; ++i) {
            NodeState &n = m.nodes[i];
            gSignal[i].generation.fetch_add(1, std::memory_order_acq_rel);
            gSignal[i].notifs.clear();
            for (FailRule &r : gSignal[i].fail) r.count.store(0, std::memory_order_release);
            // Closing the host end wakes readers and pollers of the old
            // descriptors (hang-up); they find themselves dead.
            n.devEnd.reset();
            n.hostEnd.reset();
            n.present = true;
            n.rx.clear();
            n.rxOffset = 0;
            n.marker = false;
            n.tx.clear();
            n.expirePoll = n.expireRead = 0;
            n.instant = false;
            SyncWake(n);
            n.pollTimeouts.clear();
            n.readSizes.clear();
            n.pollCalls = n.readCalls = 0;
            n.opens = 0;
            n.expiredPolls = 0;
            n.openFds.clear();
            n.lastFlags = 0;
            n.forcedFlags.reset();
        }
        for (const NodeModel &s : kNodes) {
            if (s.reset) s.reset();
        }
        m.ioctls.clear();
        ClearSigLog();
        m.txCv.notify_all();
    }
}

void SetPresent(const char *path, bool present) {
    int i = NodeIndex(path);
    std::lock_guard lk(M().mu);
    M().nodes[i].present = present;
}

int OpenCount(const char *path) {
    int i = NodeIndex(path);
    std::lock_guard lk(M().mu);
    return static_cast<int>(M().nodes[i].openFds.size());
}

size_t Opens(const char *path) {
    int i = NodeIndex(path);
    std::lock_guard lk(M().mu);
    return M().nodes[i].opens;
}

void HostWrite(const char *path, const void *data, size_t size) {
    int i = NodeIndex(path);
    const uint8_t *p = static_cast<const uint8_t *>(data);
    // Copied before the lock: a reader of any node must not wait for the copy.
    std::vector<uint8_t> transfer(p, p + size);
    std::lock_guard lk(M().mu);
    PushTransfer(M().nodes[i], std::move(transfer));
}

void HostWrite(const char *path, const std::string &bytes) { HostWrite(path, bytes.data(), bytes.size()); }

namespace {

// Takes the device's writes; bytes that reached the host end of the socket
// without passing vdev's write are taken as well.
std::vector<uint8_t> TakeTx(NodeState &n) {
    std::vector<uint8_t> out;
    out.swap(n.tx);
    if (n.hostEnd) {
        ssize_t size;
        while ((size = recv(n.hostEnd.get(), nullptr, 0, MSG_DONTWAIT | MSG_PEEK | MSG_TRUNC)) >= 0) {
            size_t at = out.size();
            out.resize(at + static_cast<size_t>(size));
            if (recv(n.hostEnd.get(), out.data() + at, static_cast<size_t>(size), MSG_DONTWAIT) != size) break;
        }
    }
    return out;
}

}  // namespace

std::vector<uint8_t> HostRead(const char *path) {
    int i = NodeIndex(path);
    std::lock_guard lk(M().mu);
    return TakeTx(M().nodes[i]);
}

std::vector<uint8_t> HostReadAtLeast(const char *path, size_t size, int timeoutMs) {
    int i = NodeIndex(path);
    Model &m = M();
    std::unique_lock lk(m.mu);
    m.txCv.wait_for(lk, std::chrono::milliseconds(timeoutMs), [&] { return m.nodes[i].tx.size() >= size; });
    return TakeTx(m.nodes[i]);
}

size_t PendingHostBytes(const char *path) {
    int i = NodeIndex(path);
    std::lock_guard lk(M().mu);
    const NodeState &n = M().nodes[i];
    size_t total = 0;
    for (const auto &t : n.rx) total += t.size();
    return total - n.rxOffset;
}

void QueueNotification(const char *path, const mfp_notif_t &notif) {
    int i = NodeIndex(path);
    std::vector<int> owners;
    {
        std::lock_guard lk(M().mu);
        uint64_t v;
        std::memcpy(&v, &notif, sizeof v);
        if (!gSignal[i].notifs.push(v)) throw std::length_error("vdev: notification queue full");
        if (notif.ub_notif == MFP_DEV_DISCONNECT) {
            // A cable pull loses what the host had in flight, on every
            // interface of the bridge.
            for (int j = 0; j < kNodeCount; ++j) {
                if (kNodes[j].notifications) DropTransfers(M().nodes[j]);
            }
        }
        NodeState &n = M().nodes[i];
        for (int fd : n.openFds) {
            const FdState &st = M().fds.at(fd);
            if ((st.status & O_ASYNC) && st.owner != 0 &&
                std::find(owners.begin(), owners.end(), st.owner) == owners.end()) {
                owners.push_back(st.owner);
            }
        }
    }
    // Outside the lock: the handler may run on this very thread.
    for (int owner : owners) kill(owner, SIGIO);
}

size_t PendingNotifications(const char *path) { return gSignal[NodeIndex(path)].notifs.size(); }

void ExpirePoll(const char *path, int count) {
    int i = NodeIndex(path);
    std::lock_guard lk(M().mu);
    M().nodes[i].expirePoll += count;
    SyncWake(M().nodes[i]);
}

void ExpireRead(const char *path, int count) {
    int i = NodeIndex(path);
    std::lock_guard lk(M().mu);
    M().nodes[i].expireRead += count;
    SyncWake(M().nodes[i]);
}

void SetInstantTimeouts(const char *path, bool on) {
    int i = NodeIndex(path);
    std::lock_guard lk(M().mu);
    M().nodes[i].instant = on;
    SyncWake(M().nodes[i]);
}

std::vector<IoctlCall> Ioctls(const char *path) {
    int i = path ? NodeIndex(path) : -1;
    Model &m = M();
    std::lock_guard lk(m.mu);
    MergeSigLog(m);
    std::vector<IoctlCall> out;
    for (const Record &r : m.ioctls) {
        if (i < 0 || r.call.path == kNodes[i].path) out.push_back(r.call);
    }
    return out;
}

void ClearIoctls() {
    std::lock_guard lk(M().mu);
    ClearSigLog();
    M().ioctls.clear();
}

std::vector<int> PollTimeouts(const char *path) {
    int i = NodeIndex(path);
    std::lock_guard lk(M().mu);
    return M().nodes[i].pollTimeouts;
}

std::vector<size_t> ReadSizes(const char *path) {
    int i = NodeIndex(path);
    std::lock_guard lk(M().mu);
    return M().nodes[i].readSizes;
}

size_t PollCalls(const char *path) {
    int i = NodeIndex(path);
    std::lock_guard lk(M().mu);
    return M().nodes[i].pollCalls;
}

int PollsInProgress(const char *path) {
    int i = NodeIndex(path);
    std::lock_guard lk(M().mu);
    return M().nodes[i].pollsInProgress;
}

size_t ExpiredPolls(const char *path) {
    int i = NodeIndex(path);
    std::lock_guard lk(M().mu);
    return M().nodes[i].expiredPolls;
}

size_t ReadCalls(const char *path) {
    int i = NodeIndex(path);
    std::lock_guard lk(M().mu);
    return M().nodes[i].readCalls;
}

int Owner(const char *path) {
    int i = NodeIndex(path);
    std::lock_guard lk(M().mu);
    const NodeState &n = M().nodes[i];
    return n.openFds.empty() ? 0 : M().fds.at(n.openFds.back()).owner;
}

bool AsyncEnabled(const char *path) {
    int i = NodeIndex(path);
    std::lock_guard lk(M().mu);
    for (int fd : M().nodes[i].openFds) {
        if (M().fds.at(fd).status & O_ASYNC) return true;
    }
    return false;
}

int StatusFlags(const char *path) {
    int i = NodeIndex(path);
    std::lock_guard lk(M().mu);
    return M().nodes[i].lastFlags;
}

void ForceStatusFlags(const char *path, int flags) {
    int i = NodeIndex(path);
    std::lock_guard lk(M().mu);
    M().nodes[i].forcedFlags = flags;
}

void FailIoctl(const char *path, unsigned long request, int err, int count) {
    int i = NodeIndex(path);
    std::lock_guard lk(M().mu);
    FailRule *slot = nullptr;
    for (FailRule &r : gSignal[i].fail) {
        if (r.count.load(std::memory_order_acquire) > 0 && r.request.load() == request) {
            slot = &r;
            break;
        }
        if (!slot && r.count.load(std::memory_order_acquire) == 0) slot = &r;
    }
    if (!slot) throw std::length_error("vdev: too many injected ioctl failures");
    slot->count.store(0, std::memory_order_release);
    slot->request.store(request, std::memory_order_release);
    slot->err.store(err, std::memory_order_release);
    slot->count.store(count, std::memory_order_release);
}

}  // namespace vdev
