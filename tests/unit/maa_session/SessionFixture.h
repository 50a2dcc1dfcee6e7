// The test shell on the emulated print node: the session runs on a thread of
// its own while the test plays the host with vdev's host side.
#pragma once

#include <fcntl.h>
#include <unistd.h>

#include <chrono>
#include <functional>
#include <future>

#include "adapter/Classifier.h"
#include "common/ByteOrder.h"
#include "common/Wait.h"
#include "maa/MAA_Hook.h"
#include "maa/MAA_Result.h"
#include "maa/ShellFixture.h"
#include "print/PrintRecorder.h"
#include "vdev.h"
#include "vendor/VLX_Main.h"

namespace maasession {

using namespace maarec;

using namespace std::string_literals;  // "..."s keeps NUL bytes
inline std::string Str(const std::vector<uint8_t> &v) { return std::string(v.begin(), v.end()); }

// Registered functions (kind 1). A probe's argument is its result code; a
// peek's result text is the bytes at an address ("unreachable" when the
// address is not a live buffer), as a test function consuming a download.
inline std::vector<U32> probes;
inline TMAAResult *Reply(U32 result, std::string text) {
    static TMAAResult stReply;
    static std::string kept;
    kept = std::move(text);
    stReply = {MAA_RESULT_END, result, static_cast<U32>(kept.size()), reinterpret_cast<U8 *>(kept.data())};
    return &stReply;
}
inline TMAAResult *probe(U32 n) {
    probes.push_back(n);
    return Reply(n, "probe " + std::to_string(n));
}
inline TMAAResult *peek(U32 address, U32 size) {
    const void *p = MAA_AddrTranslate(address, size);
    return Reply(1, p ? std::string(static_cast<const char *>(p), size) : "unreachable");
}
inline std::string PeekLine(U32 address, U32 size) {
    return "peek(" + std::to_string(address) + ", " + std::to_string(size) + ")\r";
}
// The big-endian word at `at` of what the host received, or 0.
inline U32 WordAt(const std::string &received, size_t at) {
    return received.size() >= at + 4 ? ReadBE32(reinterpret_cast<const U8 *>(received.data() + at)) : 0;
}

// Runs fn on a thread; if it has not returned in time the cable is pulled
// so that it does, and the test fails.
template <typename F>
auto Bounded(F fn, std::function<void()> whileRunning = {}) {
    auto f = std::async(std::launch::async, fn);
    if (whileRunning) whileRunning();
    if (f.wait_for(std::chrono::seconds(10)) != std::future_status::ready) {
        ADD_FAILURE() << "still waiting for the host";
        IsDisconnected = 1;
        vdev::ExpirePoll(vdev::kPrn, 1);
    }
    return f.get();
}

struct Outcome {
    S32 ret;
    std::string command;  // the classifier's buffer afterwards
    std::string wire;     // everything the device wrote
};

class SessionTest : public maatest::ShellBase {
protected:
    void SetUp() override {
        ShellBase::SetUp();
        maa_session::slPollTimeout = MAA_POLL_TIMEOUT_FIRST;
        MAA_HeapFree(stCmdHeap.ulHeapPtr, 0);
        stCmdHeap = {};
        probes.clear();
        MAA_SymbolAdd(ftarget_ppc, "probe", MAA_SYM_FUNC, MAA_FuncEntry<probe>(), 1);
        MAA_SymbolAdd(ftarget_ppc, "peek", MAA_SYM_FUNC, MAA_FuncEntry<peek>(), 2);
        Reopen();
        ASSERT_GT(fd, 0);
    }
    void TearDown() override {
        ::close(fd);
        vdev::Reset();
        ShellBase::TearDown();
    }

    // A fresh print node and channel.
    void Reopen() {
        if (fd > 0) ::close(fd);
        vdev::Reset();
        Wait_PutBack(-1, nullptr, 0, false);
        fd = ::open(vdev::kPrn, O_RDWR);
        ulDrvHandle = static_cast<U32>(fd);
    }

    // The classifier has taken ESC "w"; the host sends `transfers`, then stays
    // silent for `silences` poll periods.
    Outcome Session(const std::vector<std::string> &transfers, int silences = 0,
                    std::function<void()> whileRunning = {}) {
        for (const std::string &t : transfers) vdev::HostWrite(vdev::kPrn, t);
        if (silences) vdev::ExpirePoll(vdev::kPrn, silences);
        U8 cmd[COMMAND_SIZE] = {0x1B, 'w'};
        S32 ret = Bounded([&] { return MAA_Hook(static_cast<U32>(fd), cmd); }, std::move(whileRunning));
        return {ret, std::string(reinterpret_cast<char *>(cmd), sizeof cmd), Str(vdev::HostRead(vdev::kPrn))};
    }

    int fd = -1;
};

// The whole road through the print reader and the classifier.
class SessionRoad : public ReaderTest {
protected:
    void SetUp() override {
        ReaderTest::SetUp();
        IsDisconnected = 0;
        MAA_SymbolClear();
        probes.clear();
        MAA_SymbolAdd(ftarget_ppc, "probe", MAA_SYM_FUNC, MAA_FuncEntry<probe>(), 1);
    }
    void TearDown() override {
        MAA_SymbolClear();
        MAA_SetResultWriter(nullptr);
        ReaderTest::TearDown();
    }
};

}  // namespace maasession
