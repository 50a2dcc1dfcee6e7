// Answers the Java side stages for the host's vendor requests, read back as a
// host would read them, with the print channel open and closed.
#include <gtest/gtest.h>

#include <atomic>
#include <string>

#include "print_Support.h"

namespace {

using printjvm::kUel;


// Non-zero bytes, so a cut or a stale byte shows.
std::string Pattern(size_t n, int seed = 1) {
    std::string s(n, '\0');
    for (size_t i = 0; i < n; ++i) s[i] = static_cast<char>((i + static_cast<size_t>(seed)) % 250 + 1);
    return s;
}

std::string Data(const vendor_cmd_t &r, size_t n = VENDOR_CMD_DATA_SIZE) {
    return std::string(reinterpret_cast<const char *>(r.data), n);
}

struct Entry {
    const char *cls;
    const char *method;
    U8 bRequest;
    U16 wValue, wIndex;
    size_t size;  // bytes of the array that reach the record
    const char *closedLine;
};

const Entry kEntries[] = {
    {jvm::kKivoropnlAndDacService, "KivoroSize", 0x0D, 0, 0, 8, "fdPrnKivoroSize = 0\n"},
    {jvm::kKivoropnlAndDacService, "KivoroPrinterStatus", 0x02, 0, 0, 16, "fdPrnKivoroPrinterStatus = 0\n"},
    {jvm::kKivoropnlAndDacService, "KivoroJobStatus", 0x05, 0, 0, 75, "fdPrnKivoroJobStatus = 0\n"},
    {jvm::kKivoropnlAndDacService, "extCMDInfo", 0xE0, 1, 0, 255, "USBAdapter_extCMDInfo fdPrn = 0\n"},
    {jvm::kKivoropnlAndDacService, "trayInfo1", 0x0A, 0x0000, 0, 8, "fdPrn = 0\n"},
    {jvm::kKivoropnlAndDacService, "trayInfo2", 0x0A, 0x0100, 2, 8, "fdPrn = 0\n"},
    {jvm::kKivoropnlAndDacService, "usageCountInfo", 0x0A, 0x0200, 3, 255, "fdPrn = 0\n"},
    {jvm::kKivoropnlAndDacService, "multiBinInfo1", 0x0A, 0x0300, 4, 255, "fdPrn = 0\n"},
    {jvm::kKivoropnlAndDacService, "multiBinInfo2", 0x0A, 0x0400, 5, 255, "fdPrn = 0\n"},
    {jvm::kKivoropnlAndDacService, "capabilityInfo", 0x0A, 0x0500, 6, 255, "fdPrn = 0\n"},
    {jvm::kKivoropnlAndDacService, "trayInfo3", 0x0A, 0x0600, 7, 255, "fdPrn = 0\n"},
    {jvm::kKivoropnlAndDacService, "pullPrintingInfo", 0x0A, 0x0700, 8, 255, "fdPrn = 0\n"},
    {jvm::kKivoropnlAndDacService, "blackOnlyKeyInfo", 0x0E, 0x0000, 9, 1024, "fdPrn = 0\n"},
    {jvm::kKivoropnlAndDacService, "ecoInfo", 0x23, 0x0002, 10, 255, "fdPrn = 0\n"},
    {jvm::kKivoropnlAndDacService, "fwversion", 0x56, 0, 0, 511, "fdPrn = 0\n"},
    {jvm::kKivoropnlAndDacService, "mpsMode", 0x23, 0x0001, 0, 8, "fdPrn = 0\n"},
    {jvm::kKivoropnlAndDacService, "mpsWakeup", 0x99, 0, 0, 8, "fdPrn = 0\n"},
    {jvm::kPluginAdapter, "extInfo", 0xAC, 0x0000, 11, 1024, "fdPrn = 0\n"},
};

class VendorRecords : public PrintJvmTest {
protected:
    void SetUp() override {
        PrintJvmTest::SetUp();
        StartReader();
        kivoro_ = jvm::New(jvm::kKivoropnlAndDacService);
        plugin_ = jvm::New(jvm::kPluginAdapter);
        service_ = jvm::New(jvm::kPrintAndScanService);
    }
    jobject Of(const char *cls) const { return cls == jvm::kPluginAdapter ? plugin_ : kivoro_; }
    // Calls `method(byte[])`; a null `bytes` passes null.
    void Call(jobject obj, const char *method, const std::string *bytes) {
        jvm::CallVoid(obj, method, "([B)V", bytes ? jvm::ByteArray(*bytes).get() : nullptr);
    }
    jint ScanEvent(const std::string &bytes, jint len) {
        return jvm::CallInt(service_, "sendScanToPCEventData", "([BI)I", jvm::ByteArray(bytes).get(), len);
    }
    size_t DataBlocks() {
        size_t n = 0;
        for (const auto &r : vdev::VendorRecords()) n += r.bRequest == 0x0D && r.wValue == 1;
        return n;
    }
    jobject kivoro_ = nullptr, plugin_ = nullptr, service_ = nullptr;
};

TEST_F(VendorRecords, EachEntryStagesItsBufferWholeAndCutsLongerArrays) {
    for (const Entry &e : kEntries) {
        for (size_t len : {size_t{3}, e.size, e.size + 7}) {
            const std::string bytes = Pattern(len, static_cast<int>(len));
            Call(Of(e.cls), e.method, &bytes);
            auto rec = vdev::HostVendorRequest(e.bRequest, e.wValue, e.wIndex);
            ASSERT_TRUE(rec) << e.method;
            const size_t kept = std::min(len, e.size);
            EXPECT_EQ(Data(*rec, kept), bytes.substr(0, kept)) << e.method << " " << len;
            EXPECT_EQ(Data(*rec).substr(kept), std::string(VENDOR_CMD_DATA_SIZE - kept, '\0'))
                << e.method << " " << len;
        }
    }
    EXPECT_TRUE(LoggerHost_Contains("[USBAdp] trayInfo1: 15 bytes cut to 8"));
}

TEST_F(VendorRecords, EmptyAndNullArrays) {
    const std::string filled = Pattern(8), empty;
    Call(kivoro_, "trayInfo1", &filled);
    Call(kivoro_, "trayInfo1", &empty);  // the buffer is zeroed and sent
    auto rec = vdev::HostVendorRequest(0x0A, 0, 0);
    ASSERT_TRUE(rec);
    EXPECT_EQ(Data(*rec, 8), std::string(8, '\0'));
    const size_t before = vdev::VendorRecords().size();
    Call(kivoro_, "trayInfo1", nullptr);
    Call(kivoro_, "KivoroData", nullptr);
    Call(kivoro_, "KivoroData", &empty);
    EXPECT_EQ(vdev::VendorRecords().size(), before);
    EXPECT_TRUE(LoggerHost_Contains("[USBAdp] trayInfo1: byte array is null"));
}

// Blocks only above one block; the array is copied as a text, up to its first zero.
TEST_F(VendorRecords, KivoroDataGoesInBlocksOnlyAboveOneBlock) {
    struct Case {
        size_t len;
        size_t blocks;  // records sent
        size_t lastSize;
        size_t zeroAt;  // 0: no zero byte
    } const cases[] = {
        {1024, 0, 0, 0}, {1025, 2, 1, 0}, {200000, 180, 1024, 0}, {2048, 2, 1024, 0}, {1500, 2, 6, 1030},
    };
    for (const Case &c : cases) {
        const size_t before = DataBlocks();
        std::string bytes = Pattern(c.len);
        if (c.zeroAt) bytes[c.zeroAt] = '\0';
        Call(kivoro_, "KivoroData", &bytes);
        EXPECT_EQ(DataBlocks() - before, c.blocks) << c.len;
        if (c.blocks == 0) continue;
        auto first = vdev::HostVendorRequest(0x0D, 1, 0);
        auto last = vdev::HostVendorRequest(0x0D, 1, static_cast<U16>(c.blocks - 1));
        ASSERT_TRUE(first && last);
        EXPECT_EQ(Data(*first), bytes.substr(0, 1024)) << c.len;
        EXPECT_EQ(Data(*last, c.lastSize), bytes.substr((c.blocks - 1) * 1024, c.lastSize)) << c.len;
        EXPECT_EQ(Data(*last).substr(c.lastSize), std::string(1024 - c.lastSize, '\0')) << c.len;
    }
    EXPECT_FALSE(vdev::HostVendorRequest(0x0D, 1, 180)) << "nothing past 180 blocks";
    EXPECT_TRUE(LoggerHost_Contains("[USBAdp] KivoroData: 200000 bytes cut to 184320"));
}

TEST_F(VendorRecords, ScanToPcEventTakesOneToEightBytes) {
    struct Case {
        std::string array;
        jint len;
        jint result;
        std::string staged;  // data bytes, "" when nothing is staged
    } const cases[] = {
        {"\x01\x02\x03", 0, 0, ""},
        {"\x01\x02\x03\x04\x05\x06\x07\x08\x09", 9, 0, ""},
        {"", 1, 0, ""},
        {"\x01\x02\x03", 5, 1, std::string("\x01\x02\x03\0\0", 5)},
        {"\x0A\x0B\x0C\x0D\x0E\x0F\x10\x11\x12", 8, 1, "\x0A\x0B\x0C\x0D\x0E\x0F\x10\x11"},
    };
    for (const Case &c : cases) {
        const size_t before = vdev::VendorRecords().size();
        EXPECT_EQ(ScanEvent(c.array, c.len), c.result) << c.len;
        auto recs = vdev::VendorRecords();
        if (c.staged.empty()) {
            EXPECT_EQ(recs.size(), before) << c.len;
            continue;
        }
        ASSERT_EQ(recs.size(), before + 1);
        EXPECT_EQ(recs.back().bRequest, 0x56);
        EXPECT_EQ(unsigned{recs.back().wValue}, 1u);  // copies: the record is packed
        EXPECT_EQ(unsigned{recs.back().wIndex}, 0u);
        EXPECT_EQ(Data(recs.back(), 8), c.staged + std::string(8 - c.staged.size(), '\0'));
    }
    EXPECT_TRUE(LoggerHost_Contains("[USBAdp] Mismatch in size b/n byte array(3) and buf len(5)"));
    vdev::FailIoctl(vdev::kPrn, IOCNR_SET_DEV_VENDOR, EIO);
    EXPECT_EQ(ScanEvent("\x01", 1), 0);
}

TEST_F(VendorRecords, CheckInTimeTellsTheLengthAndKeepsAtMost256Bytes) {
    for (size_t len : {size_t{4}, size_t{300}}) {
        const std::string bytes = Pattern(len);
        Call(kivoro_, "configInfoCheckInTime", &bytes);
        auto rec = vdev::HostVendorRequest(0x26, static_cast<U16>(len), 0);
        ASSERT_TRUE(rec) << len;
        const size_t kept = std::min<size_t>(len, 256);
        EXPECT_EQ(Data(*rec, kept), bytes.substr(0, kept));
        EXPECT_EQ(Data(*rec).substr(kept), std::string(1024 - kept, '\0'));
    }
}

TEST_F(VendorRecords, ClosedChannelWritesTheStandardErrorLinesAndStagesNothing) {
    ASSERT_EQ(printjvm::Hibernate(service_), 1);
    const size_t before = vdev::VendorRecords().size();
    const std::string bytes = Pattern(2000);
    for (const Entry &e : kEntries) {
        ::testing::internal::CaptureStderr();
        Call(Of(e.cls), e.method, &bytes);
        EXPECT_EQ(::testing::internal::GetCapturedStderr(), e.closedLine) << e.method;
    }
    ::testing::internal::CaptureStderr();
    Call(kivoro_, "KivoroData", &bytes);
    EXPECT_EQ(::testing::internal::GetCapturedStderr(), "fdPrnKivoroData = 0\n");
    EXPECT_EQ(ScanEvent("\x01", 1), 0);
    Call(kivoro_, "configInfoCheckInTime", &bytes);
    EXPECT_EQ(vdev::VendorRecords().size(), before);

    // The back channel writes nothing either.
    jvm::CallVoid(service_, "sendBackChannelData", "([BI)V", jvm::ByteArray("response").get(), 8);
    EXPECT_TRUE(vdev::HostRead(vdev::kPrn).empty());
    EXPECT_TRUE(LoggerHost_Contains("[UsbAdp] [write] fdPrn <= 0"));
}

}  // namespace
