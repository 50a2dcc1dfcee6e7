// The scanner, fax and JBIG driver models as the test functions meet them:
// scripted lock answers, responses written into a data block found by its
// kernel address, recorded command lines, and per-node codec verdicts.
#include <sys/ioctl.h>

#include <cerrno>
#include <cstring>
#include <string>
#include <vector>

#include "platform/Platform.h"
#include "vdev/VdevTest.h"

using MaaDrivers = VdevTest;

namespace {

TMAAScanTest Command(const char *line, uint32_t kerAddr, uint32_t bufsize) {
    TMAAScanTest rec;
    std::memset(&rec, 0, sizeof rec);
    std::snprintf(rec.string, sizeof rec.string, "%s", line);
    rec.bufphys = kerAddr;
    rec.bufsize = bufsize;
    rec.jobid = SCAN_MAA_TEST_ID;
    return rec;
}

struct Block {
    explicit Block(unsigned size) : ticket(DataBlock_CreateFromPool(DBPool_GetSystemPoolID(), size)) {}
    ~Block() {
        if (ticket) DataBlock_ReleaseTicket(ticket);
    }
    uint8_t *memory() const { return static_cast<uint8_t *>(DataBlock_Access(ticket)); }
    uint32_t kerAddr() const { return DataBlock_GetKerVirtAddress(ticket); }
    DataBlockTicket ticket;
};

}  // namespace

TEST_F(MaaDrivers, LockAnswersComeFromTheQueueThenTheDefault) {
    UniqueFd fd = Open(vdev::kScanner);
    vdev::QueueScanLockAnswers({0, 2});
    EXPECT_EQ(ioctl(fd.get(), IOCNR_SCAN_APP_LOCK), 0);
    EXPECT_EQ(ioctl(fd.get(), IOCNR_SCAN_APP_LOCK), 2);
    EXPECT_FALSE(vdev::ScanLocked());
    EXPECT_EQ(ioctl(fd.get(), IOCNR_SCAN_APP_LOCK), 1);
    EXPECT_TRUE(vdev::ScanLocked());
    EXPECT_EQ(ioctl(fd.get(), IOCNR_SCAN_APP_LOCK_RELEASE), 0);
    EXPECT_FALSE(vdev::ScanLocked());
    vdev::SetScanLockDefault(0);
    EXPECT_EQ(ioctl(fd.get(), IOCNR_SCAN_APP_LOCK), 0);
    EXPECT_FALSE(vdev::ScanLocked());
}

TEST_F(MaaDrivers, TestCommandIsAnsweredIntoTheDataBlockByItsKernelAddress) {
    UniqueFd fd = Open(vdev::kScanner);
    Block block(64);
    ASSERT_NE(block.kerAddr(), 0u);
    vdev::SetScanTestAnswer({{'o', 'k', '!'}, std::nullopt, 7, 0});
    TMAAScanTest rec = Command("ScanMotorTest(3)", block.kerAddr(), 64);
    ASSERT_EQ(ioctl(fd.get(), IOC_MAA_TEST, &rec), 0);
    EXPECT_EQ(std::string(reinterpret_cast<char *>(block.memory()), 4), std::string("ok!\0", 4));
    EXPECT_EQ(rec.result, 3u);
    EXPECT_EQ(rec.success, 7u);
    EXPECT_EQ(vdev::ScanCommands(), std::vector<std::string>{"ScanMotorTest(3)"});
    std::vector<vdev::IoctlCall> calls = vdev::Ioctls(vdev::kScanner);
    ASSERT_EQ(calls.size(), 1u);
    ASSERT_EQ(calls[0].payload.size(), sizeof(TMAAScanTest));
    TMAAScanTest sent;
    std::memcpy(&sent, calls[0].payload.data(), sizeof sent);
    EXPECT_EQ(sent.bufphys, block.kerAddr());
    EXPECT_EQ(sent.jobid, SCAN_MAA_TEST_ID);
}

TEST_F(MaaDrivers, ResponseStaysInsideTheBufferWhileTheReportedCountMayNot) {
    UniqueFd fd = Open(vdev::kScanner);
    Block block(16);
    vdev::SetScanTestAnswer({std::vector<uint8_t>(40, 'r'), 5u << 20, 1, 0});
    TMAAScanTest rec = Command("GetShadingData(1)", block.kerAddr(), 8);
    ASSERT_EQ(ioctl(fd.get(), IOC_MAA_TEST, &rec), 0);
    EXPECT_EQ(rec.result, 5u << 20);
    EXPECT_EQ(std::string(reinterpret_cast<char *>(block.memory()), 16), std::string(8, 'r') + std::string(8, '\0'));
}

TEST_F(MaaDrivers, ScriptedReturnsAndUnknownAddressesFailTheTestCommand) {
    UniqueFd fd = Open(vdev::kScanner);
    Block block(16);
    TMAAScanTest rec = Command("X()", block.kerAddr(), 16);
    vdev::SetScanTestAnswer({{'a'}, std::nullopt, 1, 3});
    EXPECT_EQ(ioctl(fd.get(), IOC_MAA_TEST, &rec), 3);
    vdev::SetScanTestAnswer({{'a'}, std::nullopt, 1, -EBUSY});
    errno = 0;
    EXPECT_EQ(ioctl(fd.get(), IOC_MAA_TEST, &rec), -1);
    EXPECT_EQ(errno, EBUSY);

    // A released block's address, and a range past a live block, translate to nothing.
    vdev::SetScanTestAnswer({std::vector<uint8_t>(16, 'z'), std::nullopt, 1, 0});
    Block gone(16);
    const uint32_t goneAddr = gone.kerAddr();
    DataBlock_ReleaseTicket(gone.ticket);
    gone.ticket = nullptr;
    rec.bufphys = goneAddr;
    EXPECT_EQ(ioctl(fd.get(), IOC_MAA_TEST, &rec), -1);
    EXPECT_EQ(errno, EFAULT);
    rec.bufphys = block.kerAddr() + 8;
    EXPECT_EQ(ioctl(fd.get(), IOC_MAA_TEST, &rec), -1);
    EXPECT_EQ(errno, EFAULT);
    EXPECT_EQ(vdev::ScanCommands().size(), 4u);
}

TEST_F(MaaDrivers, KernelAddressesOfLiveBlocksNeverOverlap) {
    Block a(5000), b(1), c(4096);
    const uint32_t addrs[] = {a.kerAddr(), b.kerAddr(), c.kerAddr()};
    const Block *blocks[] = {&a, &b, &c};
    for (int i = 0; i < 3; ++i) {
        ASSERT_NE(addrs[i], 0u);
        EXPECT_EQ(DataBlock_HostFromKerVirt(addrs[i], 1), blocks[i]->memory());
    }
    EXPECT_EQ(DataBlock_HostFromKerVirt(a.kerAddr() + 4999, 1), a.memory() + 4999);
    EXPECT_EQ(DataBlock_HostFromKerVirt(a.kerAddr() + 4999, 2), nullptr);
    EXPECT_EQ(DataBlock_HostFromKerVirt(a.kerAddr() - 1, 1), nullptr);
    EXPECT_EQ(DataBlock_HostFromKerVirt(0xFFFFFFFFull + a.kerAddr(), 1), nullptr);
    EXPECT_NE(addrs[0], addrs[1]);
    EXPECT_NE(addrs[1], addrs[2]);
    EXPECT_NE(addrs[0], addrs[2]);
}

TEST_F(MaaDrivers, ADFReadsAnswerTheScriptedMechanism) {
    UniqueFd fd = Open(vdev::kScanner);
    vdev::SetADFMecha(3, 0x0102, 2);
    TADFMechaType mecha{};
    U32 multi = 0;
    ASSERT_EQ(ioctl(fd.get(), IOC_ADF_MECHA_TYPE, &mecha), 0);
    ASSERT_EQ(ioctl(fd.get(), IOC_ADF_MULTI_MECHA_TYPE, &multi), 0);
    EXPECT_EQ(mecha.ulType, 3u);
    EXPECT_EQ(mecha.ulVersion, 0x0102u);
    EXPECT_EQ(multi, 2u);
}

TEST_F(MaaDrivers, FaxTestIsAnsweredInTheSameRecord) {
    UniqueFd fd = Open(vdev::kFax);
    vdev::SetFaxTestAnswer({std::string(2000, 'f'), std::nullopt, 0, 0});
    TFaxMAATest rec;
    std::memset(&rec, 0, sizeof rec);
    std::strcpy(rec.string, "PhoneTest_Ring(1,2)");
    ASSERT_EQ(ioctl(fd.get(), IOCNR_FAX_MAA_TEST, &rec), 0);
    EXPECT_EQ(rec.result, static_cast<U32>(FAX_MAA_RESPONSE_LENGTH));
    EXPECT_EQ(rec.success, 0u);
    EXPECT_EQ(std::string(rec.response, FAX_MAA_RESPONSE_LENGTH), std::string(FAX_MAA_RESPONSE_LENGTH, 'f'));
    EXPECT_EQ(vdev::FaxCommands(), std::vector<std::string>{"PhoneTest_Ring(1,2)"});
    vdev::SetFaxTestAnswer({"", std::nullopt, 1, -EIO});
    EXPECT_EQ(ioctl(fd.get(), IOCNR_FAX_MAA_TEST, &rec), -1);
    EXPECT_EQ(errno, EIO);
}

TEST_F(MaaDrivers, EachCodecNodeHasItsOwnSelfTestVerdict) {
    UniqueFd enc = Open(vdev::kJbigEnc);
    UniqueFd dec = Open(vdev::kJbigDec);
    vdev::SetJbigSelfTestStatus(vdev::kJbigDec, 9);
    TJBIGSelfTest rec{4, 77};
    ASSERT_EQ(ioctl(enc.get(), JBIG_IOC_SELFTEST, &rec), 0);
    EXPECT_EQ(rec.ulStatus, 0u);
    ASSERT_EQ(ioctl(dec.get(), JBIG_IOC_SELFTEST, &rec), 0);
    EXPECT_EQ(rec.ulStatus, 9u);
    ASSERT_EQ(ioctl(dec.get(), JBIG_IOC_RESET), 0);
    EXPECT_EQ(vdev::JbigResets(vdev::kJbigEnc), 0);
    EXPECT_EQ(vdev::JbigResets(vdev::kJbigDec), 1);
    std::vector<vdev::IoctlCall> calls = vdev::Ioctls(vdev::kJbigEnc);
    ASSERT_EQ(calls.size(), 1u);
    EXPECT_EQ(calls[0].payload[0], 4);  // the pattern as sent
}
