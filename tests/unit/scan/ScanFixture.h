// The scan channel over the emulated scan node, delivering application
// transfers to the print recorder instead of Java.
#pragma once

#include <unistd.h>

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "LoggerHost.h"
#include "adapter/USB.h"
#include "print/PrintRecorder.h"
#include "scan/USBScan.h"
#include "scan/scan_thread.h"
#include "vdev.h"
#include "vendor/VLX_Main.h"

inline std::string Bytes(std::initializer_list<int> bytes) {
    std::string s;
    for (int b : bytes) s.push_back(static_cast<char>(b));
    return s;
}

class ScanTest : public ::testing::Test {
protected:
    void SetUp() override {
        vdev::Reset();
        LoggerHost_StartCapture();
        rec::Clear();
        USBPrint_SetDelivery(&rec::kRecorder);
        IsConfigured = 1;
        IsDisconnected = 0;
        hibernation_flag = 0;
        g_IsScanCanClose = 0;
        fdScan = -1;
        ASSERT_EQ(USBAdpScan_Openfd(), 1);
        slDeviceHndl = fdScan.load();
    }
    void TearDown() override {
        if (fdScan > 0) ::close(fdScan);
        fdScan = -1;
        IsConfigured = 0;
        IsDisconnected = 0;
        g_IsScanCanClose = 0;
        USBPrint_SetDelivery(nullptr);
        vdev::Reset();
    }

    static void Send(const std::vector<std::string> &transfers) {
        for (const std::string &t : transfers) vdev::HostWrite(vdev::kScan, t);
    }
    // Reader turns until the host's bytes are all taken (bounded).
    static void Drain() {
        for (int turns = 0; vdev::PendingHostBytes(vdev::kScan) > 0; ++turns) {
            ASSERT_LT(turns, 10000) << "the reader stopped taking host data";
            USBAdpScan_ReadTurn();
        }
    }
    // Each transfer as Java got it: type and all bytes written.
    static std::vector<std::pair<std::string, std::string>> Forwarded() {
        std::vector<std::pair<std::string, std::string>> out;
        for (const rec::App &a : rec::Apps()) {
            std::string all;
            for (const std::string &w : a.writes) all += w;
            EXPECT_TRUE(a.closed) << a.type << " transfer not closed";
            out.emplace_back(a.type, all);
        }
        return out;
    }
    static std::string Reply() {
        auto r = vdev::HostRead(vdev::kScan);
        return std::string(r.begin(), r.end());
    }
};
