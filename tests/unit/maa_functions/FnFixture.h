// One set-up for the test-function tests: clean virtual devices and address
// map, the session's channel on the virtual print node, a private root, and
// the records, commands, pauses and log lines caught instead of sent or run.
#pragma once

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <list>

#include "maa/MAA_Hook.h"
#include "maa/MAA_Result.h"
#include "maa/ShellFixture.h"
#include "maa/functions/MAA_CpuTemp.h"
#include "maa/functions/MAA_Panel.h"
#include "maa/functions/MAA_SysResult.h"
#include "support/TempRoot.h"
#include "vdev.h"
#include "vendor/VLX_Main.h"

namespace fntest {

using namespace maarec;

// Requests made on a node, in order.
inline std::vector<unsigned long> Requests(const char *path) {
    std::vector<unsigned long> out;
    for (const vdev::IoctlCall &c : vdev::Ioctls(path)) out.push_back(c.request);
    return out;
}
inline size_t CountOf(const std::vector<unsigned long> &requests, unsigned long request) {
    return static_cast<size_t>(std::count(requests.begin(), requests.end(), request));
}

class FnTest : public maatest::ShellBase {
protected:
    void SetUp() override {
        ShellBase::SetUp();
        MAA_SetResultWriter(&Capture);
        MAA_SetCommandRunner(&RecordCommand);
        MAA_SetSleeper(&RecordSleep);
        MAA_PanelSetWaits(50, 50, 50);  // no UI server answers unless a test starts one
        Restart();
        ASSERT_GT(channel, 0);
    }
    void TearDown() override {
        ::close(channel);
        vdev::Reset();
        MAA_SetCommandRunner(nullptr);
        MAA_SetSleeper(nullptr);
        MAA_SetCmdString(nullptr);
        MAA_SetMachineName(nullptr);
        MAA_PanelSetWaits(0, 0, 0);
        ShellBase::TearDown();
    }
    // A clean model, channel and catch, also between the rows of a table.
    void Restart() {
        if (channel > 0) ::close(channel);
        vdev::Reset();
        channel = ::open(vdev::kPrn, O_RDWR);
        ulDrvHandle = static_cast<U32>(channel);
        written.clear();
        commands.clear();
        sleeps.clear();
    }
    // A command line through the shell, with the registered vocabulary.
    static U32 Run(const std::string &line) {
        if (pstRoot == nullptr) MAA_SymbolReg();
        return run(line);
    }
    // What the host receives from one command line through the shell.
    static Recs HostSees(const std::string &line) {
        written.clear();
        EXPECT_EQ(Run(line), 0u) << line;
        return written;
    }
    // The address of a copy of `text` in the shell's map, NUL included.
    U32 Map(const std::string &text) {
        std::string &kept = texts_.emplace_back(text);
        return MAA_AddrMap(kept.data(), static_cast<U32>(kept.size() + 1));
    }
    // Bytes the device sent on the session's channel other than by the writer.
    static std::string Wire() {
        std::vector<uint8_t> b = vdev::HostRead(vdev::kPrn);
        return {b.begin(), b.end()};
    }

    TempRoot root;
    int channel = -1;
    std::list<std::string> texts_;  // stable addresses for the map
};

}  // namespace fntest
