// The pieces under the download: firmware types, the checksum, the requests
// and blocks on the update-manager socket, and its receive time-out.
#include <chrono>

#include "FirmwareFixture.h"

namespace fwtest {
namespace {

TEST(FirmwareTypes, SubsystemIdsMapToTypesNamesAndWords) {
    struct Row {
        const char *id;
        U32 type;
        const char *word;  // printed on standard output
        const char *logName;
    } rows[] = {
        {"E7xx", SCAN, "SCAN", "SCAN"},
        {"e7  ", SCAN, "SCAN", "SCAN"},
        {"E8..", DADF, "DADF(Halvard)", "DADF"},
        {"E5..", VIDEO, "Video", "Video"},
        {"E6..", VIDEOBOOT, "Video Bootrom", "VideoBootRom"},
        {"E1..", ENGINE, "engine", "engine"},
        {"E2..", SCF, "SCF(Halvard)", "SCF"},
        {"E3..", HCF, "HCF", "HCF"},
        {"E4..", FINISHER, "Finisher(Halvard)", "Finisher"},
        {"eb..", UI, "UI", "UI"},
        {"EC1.", UBOOT, "UBoot", "uboot"},
        {"E9..", CONVERT, "Convert", "Convert"},
        {"Ea..", FAX, "FAX", "Fax"},
        {"ec2.", KERNEL, "Kernel", "kernel"},
        {"EC3.", ROOTFS, "RootFileSystem", "rootFS"},
        {"ED..", EMULATOR, "Emulation", "emul"},
        {"EE1.", SCANDRIVER, "ScanDriver", "Unknown"},
        {"EE2.", VPUDRIVER, "Vpu Driver", "Unknown"},
        {"ee3.", FAXDRIVER, "Fax Driver", "Unknown"},
        {"EE4.", TARNWELMMDRIVER, "Tarnwel_mm Driver", "Unknown"},
        {"0E7.", UNAVAILABLE, "MCB", "Unavailable"},
        {"3...", UNAVAILABLE, "DADF", "Unavailable"},
        {"8...", UNAVAILABLE, "SCF", "Unavailable"},
        {"9...", UNAVAILABLE, "GUI", "Unavailable"},
        {"a...", UNAVAILABLE, "Finisher", "Unavailable"},
        {"EC4.", UNAVAILABLE, "Unknown", "Unavailable"},
        {"EE5.", UNAVAILABLE, "Unknown", "Unavailable"},
        {"E0..", UNAVAILABLE, "Unknown", "Unavailable"},
        {"\xff\x00\x00\x00", UNAVAILABLE, "Unknown", "Unavailable"},
    };
    for (const Row &r : rows) {
        SCOPED_TRACE(r.id);
        testing::internal::CaptureStdout();
        EXPECT_EQ(Convert_FW_SubSID(reinterpret_cast<const U8 *>(r.id)), r.type);
        EXPECT_EQ(testing::internal::GetCapturedStdout(), std::string(r.word) + "\n");
        EXPECT_STREQ(FirmwareType(r.type), r.logName);
    }
    for (U32 outside : {0u, 21u, 0x01000000u, 0xFFFFFFFFu}) EXPECT_STREQ(FirmwareType(outside), "Unknown");
}

TEST(FirmwareChecksum, PlainModularSumOfBigEndianWordsWithTheOddByteHigh) {
    struct Row {
        std::string data;
        U32 seed;
        U16 sum;
    } rows[] = {
        {"", 0, 0},
        {"", 0x12345, 0x2345},                        // the seed counts modulo 65536
        {"\x12\x34\x56\x78", 0, 0x68AC},
        {"\x12\x34\x56\x78", 0x1000, 0x78AC},
        {std::string("\xff\xff\x00\x02", 4), 0, 0x0001},  // carries out of bit 15 are dropped
        {"\x01\x02\x03", 0, 0x0402},                  // odd: 0x0300 + 0x0102
        {"\x80", 0x8000, 0x0000},
        {std::string("\x00\x01\x00", 3), 0xFFFF, 0x0000},
        // Long enough for the wide path: 2048 * 0xFFFF and 1000 * 0x0102 +
        // 0x0300 + 0x10, modulo 65536.
        {std::string(4096, '\xff'), 0, 0xF800},
        {[] { std::string s; for (int i = 0; i < 1000; ++i) s += "\x01\x02"; return s + "\x03"; }(), 0x10, 0xF2E0},
    };
    for (const Row &r : rows) {
        SCOPED_TRACE(testing::PrintToString(r.data));
        EXPECT_EQ(make_checksum(reinterpret_cast<const U8 *>(r.data.data()), static_cast<U32>(r.data.size()), r.seed),
                  r.sum);
    }
}

class LinkTest : public FirmwareTest {
protected:
    void SetUp() override {
        FirmwareTest::SetUp();
        ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM, 0, pair_), 0);
    }
    void TearDown() override {
        ::close(pair_[0]);
        ::close(pair_[1]);
        FirmwareTest::TearDown();
    }
    std::string Drain() {
        std::string got;
        char buf[8192];
        pollfd p{pair_[1], POLLIN, 0};
        while (::poll(&p, 1, 0) == 1) {
            ssize_t n = ::recv(pair_[1], buf, sizeof buf, 0);
            if (n <= 0) break;
            got.append(buf, static_cast<size_t>(n));
        }
        return got;
    }
    int pair_[2];
};

TEST_F(LinkTest, RequestsPutTheirBytesOnTheWire) {
    struct Row {
        U32 code, option;
        S32 result;
        std::string wire;
    } rows[] = {
        {IMG_SIGNATURE, 7, 0, "$IMG"},
        {IMG_TYPE, 0x01020304, 0, "\x01\x02\x03\x04"},
        {IMG_SIZE, 0xFFFFFFFF, 0, "\xff\xff\xff\xff"},
        {IMG_CHECKSUM, 0xABCD2345, 0, "\x23\x45"},
        {IMG_END, 0, 0, "$END"},
        {5, 1, -1, ""},
        {0xFFFFFFFF, 1, -1, ""},
    };
    for (const Row &r : rows) {
        SCOPED_TRACE(r.code);
        EXPECT_EQ(send_to_update_manager(pair_[0], r.code, r.option), r.result);
        EXPECT_EQ(Drain(), r.wire);
    }
    EXPECT_EQ(LoggerHost_Count("send_to_update_manager : invalid request(5)!!!"), 1);
    // A socket that is gone: the send fails (no SIGPIPE) and says which request.
    ::close(pair_[1]);
    pair_[1] = ::open("/dev/null", O_RDONLY);
    EXPECT_EQ(send_to_update_manager(pair_[0], IMG_END, 0), -1);
    EXPECT_EQ(LoggerHost_Count("send_to_update_manager : sending error(4)!!!\n"), 1);
    EXPECT_EQ(LoggerHost_Count("send_data : Sending Error!!!\n"), 1);
}

TEST_F(LinkTest, FileGoesInBlocksOfOneKibibyteWithOneMarkEach) {
    struct Row {
        size_t size;
        std::string marks;
    } rows[] = {
        {0, "#\n"},
        {1, "#\n"},
        {1024, "#\n"},
        {1025, "##\n"},
        {64 * 1024, std::string(64, '#') + "\n\n"},
        {64 * 1024 + 1, std::string(64, '#') + "\n#\n"},
    };
    for (const Row &r : rows) {
        SCOPED_TRACE(r.size);
        const std::string body = RandomBytes(r.size, static_cast<unsigned>(r.size));
        std::ofstream("img.bin", std::ios::binary) << body;
        std::string got;
        std::thread reader([&] {
            char buf[8192];
            while (got.size() < body.size()) {
                ssize_t n = ::recv(pair_[1], buf, sizeof buf, 0);
                if (n <= 0) break;
                got.append(buf, static_cast<size_t>(n));
            }
        });
        testing::internal::CaptureStdout();
        EXPECT_EQ(send_file(pair_[0], "img.bin"), 0);
        EXPECT_EQ(testing::internal::GetCapturedStdout(), r.marks);
        reader.join();
        EXPECT_EQ(got, body);
        EXPECT_EQ(Drain(), "");
    }
    EXPECT_EQ(LoggerHost_Count("Sending Complete...\n"), 6);
    EXPECT_EQ(send_file(pair_[0], "missing.bin"), -1);
    EXPECT_EQ(LoggerHost_Count("send_file : file open error\n"), 1);
}

TEST_F(LinkTest, ReceiveCollectsPiecesAndSilenceOrCloseReadsAsZeros) {
    // Pieces of an answer arrive one by one.
    std::thread writer([&] {
        for (const char *piece : {"$", "PR", "O"}) {
            ::send(pair_[1], piece, std::strlen(piece), 0);
            std::this_thread::sleep_for(std::chrono::milliseconds(5));
        }
    });
    UpdMgrResponse r = recv_data_on_socket(pair_[0], 4);
    writer.join();
    EXPECT_EQ(std::string(reinterpret_cast<char *>(r.data), 5), std::string("$PRO\0", 5));

    // Part of an answer, then silence: what came stays, the rest is 0.
    ::send(pair_[1], "\x01", 1, 0);
    r = recv_data_on_socket(pair_[0], 4);
    EXPECT_EQ(std::string(reinterpret_cast<char *>(r.data), 5), std::string("\x01\0\0\0\0", 5));
    EXPECT_EQ(LoggerHost_Count("timeout!!!\n"), 1);

    // The manager closes: the wait still ends by its time-out, idly.
    ::shutdown(pair_[1], SHUT_WR);
    auto t0 = std::chrono::steady_clock::now();
    U8 buf[4] = {9, 9, 9, 9};
    EXPECT_EQ(recv_data(pair_[0], buf, 4, RECEIVE_TIMEOUT), -1);
    EXPECT_GE(std::chrono::steady_clock::now() - t0, std::chrono::milliseconds(kShortWaitMs - 20));
    EXPECT_EQ(LoggerHost_Count("timeout!!!\n"), 2);
}

// The one test that waits for the real time-out: 5 s and 500000 µs.
TEST_F(LinkTest, SilentManagerTimesOutAfterFiveAndAHalfSeconds) {
    UpdateManager_SetWaitMs(-1);
    auto t0 = std::chrono::steady_clock::now();
    UpdMgrResponse r = recv_data_on_socket(pair_[0], 4);
    auto waited = std::chrono::steady_clock::now() - t0;
    EXPECT_GE(waited, std::chrono::milliseconds(5450));
    EXPECT_LT(waited, std::chrono::milliseconds(7000));
    EXPECT_EQ(r.value, 0);
    EXPECT_EQ(r.data[4], 0);
    EXPECT_EQ(LoggerHost_Count("timeout!!!\n"), 1);
}

TEST_F(LinkTest, ImageHandedToThePlatformWriterInBlocks) {
    std::ofstream(TEMP_FW_IMAGE, std::ios::binary) << RandomBytes(0x10000 * 2 + 5, 1);
    EXPECT_EQ(write_to_update_manager(0x10000 * 2 + 5), 0);
    EXPECT_EQ(LoggerHost_Count("Writing Firmware data to socket\n"), 3);
    std::filesystem::remove(TEMP_FW_IMAGE);
    EXPECT_EQ(write_to_update_manager(10), -1);
    EXPECT_EQ(LoggerHost_Count("write_to_update_manager : Temp datafile open error\n"), 1);
}

}  // namespace
}  // namespace fwtest
