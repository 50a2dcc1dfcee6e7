// Common set-up of the driver-channel tests: clean virtual devices, the
// session's channel on the virtual print node (forwarded frames land there),
// captured result records and log lines, and a virtual sleeper.
#pragma once

#include <fcntl.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <vector>

#include "LoggerHost.h"
#include "adapter/USB.h"
#include "maa/MAA_Address.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_Result.h"
#include "maa/functions/MAA_SysResult.h"
#include "vdev.h"
#include "vendor/VLX_Main.h"

namespace drivertest {

struct Record {
    U32 enContinue, ulResult;
    std::string data;
    bool operator==(const Record &) const = default;
};
inline std::ostream &operator<<(std::ostream &os, const Record &r) {
    return os << "{" << r.enContinue << "," << r.ulResult << ",\"" << r.data << "\"}";
}

inline std::vector<Record> records;
inline std::vector<U32> sleeps;

inline Record Returned(const TMAAResult *r) {
    return {r->enContinue, r->ulResult,
            std::string(reinterpret_cast<const char *>(r->pubData), r->pubData ? r->ulDataSize : 0)};
}
inline void capture(const TMAAResult *r) { records.push_back(Returned(r)); }
inline void sleepVirtually(U32 ms) { sleeps.push_back(ms); }

inline Record End0(const std::string &text) { return {MAA_RESULT_END, 0, text}; }
inline Record End1(const std::string &text) { return {MAA_RESULT_END, 1, text}; }
inline Record Cont(const std::string &text) { return {MAA_RESULT_CONTINUE, 1, text}; }

// Requests made on a node, in order.
inline std::vector<unsigned long> Requests(const char *path) {
    std::vector<unsigned long> out;
    for (const vdev::IoctlCall &c : vdev::Ioctls(path)) out.push_back(c.request);
    return out;
}
inline size_t CountOf(const std::vector<unsigned long> &requests, unsigned long request) {
    return static_cast<size_t>(std::count(requests.begin(), requests.end(), request));
}

class DriverTest : public ::testing::Test {
protected:
    void SetUp() override {
        vdev::Reset();
        MAA_AddrReset();
        IsDisconnected = 0;
        enSpecialMode = MAA_NORMAL_CMD;
        records.clear();
        sleeps.clear();
        MAA_SetResultWriter(&capture);
        MAA_SetSleeper(&sleepVirtually);
        LoggerHost_StartCapture();
        channel = ::open(vdev::kPrn, O_RDWR);
        ASSERT_GT(channel, 0);
        ulDrvHandle = static_cast<U32>(channel);
    }
    void TearDown() override {
        ::close(channel);
        vdev::Reset();
        MAA_AddrReset();
        MAA_SetResultWriter(nullptr);
        MAA_SetSleeper(nullptr);
        LoggerHost_StopCapture();
    }

    // A clean model and channel inside a table of cases.
    void Restart() {
        ::close(channel);
        vdev::Reset();
        channel = ::open(vdev::kPrn, O_RDWR);
        ulDrvHandle = static_cast<U32>(channel);
        records.clear();
        sleeps.clear();
    }

    // Bytes the device sent on the session's channel other than by the writer.
    static std::string Wire() {
        std::vector<uint8_t> b = vdev::HostRead(vdev::kPrn);
        return {b.begin(), b.end()};
    }
    static bool Logged(int level, const std::string &text) {
        for (const LoggedLine &l : LoggerHost_Captured()) {
            if (l.level == level && l.text == text) return true;
        }
        return false;
    }

    int channel = -1;
};

}  // namespace drivertest
