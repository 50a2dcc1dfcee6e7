// The supplies report and the spool-file upload as the host sees them: the
// result records, the file transfer on the channel (write by write: a packet
// socket keeps each write apart) and the report left in the spool directory.
#include <sys/socket.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <cstring>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include "support/TempRoot.h"
#include "adapter/USB.h"
#include "common/ByteOrder.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_Result.h"
#include "maa/MAA_Wire.h"
#include "maa/functions/MAA_Supplies.h"
#include "vendor/VLX_Main.h"

namespace {

using Rec = std::pair<U32, std::string>;
constexpr U32 C = MAA_RESULT_CONTINUE, E = MAA_RESULT_END;
constexpr char kSupplies[] = "/halvard/sys/portability/printdid/crum_data.bin";
constexpr char kReport[] = "/halvard/spool/tmp/suppliesinforeport.txt";

std::vector<Rec> written;
void capture(const TMAAResult *r) {
    written.emplace_back(r->enContinue, std::string(reinterpret_cast<const char *>(r->pubData), r->ulDataSize));
}

std::string Transfer(U32 op, U32 size) {
    U8 f[12] = {'#', '$', '%', static_cast<U8>(op)};
    WriteBE32(f + 4, size);
    WriteBE32(f + 8, size);
    return std::string(reinterpret_cast<char *>(f), sizeof f);
}

std::string ReadFile(const std::string &path) {
    std::ifstream in(path, std::ios::binary);
    std::stringstream ss;
    ss << in.rdbuf();
    return ss.str();
}

// A supplies file of `size` bytes: version word, then a recognisable pattern.
std::string SuppliesFile(U32 version, size_t size = sizeof(TSuppliesInfoData)) {
    std::string bytes(size, '\0');
    for (size_t i = 4; i < size; ++i) bytes[i] = static_cast<char>(i * 13 + 1);
    U8 v[4];
    WriteLE32(v, version);
    bytes.replace(0, std::min<size_t>(4, size), reinterpret_cast<char *>(v), std::min<size_t>(4, size));
    return bytes;
}

class SuppliesTest : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_EQ(::socketpair(AF_UNIX, SOCK_SEQPACKET, 0, sp), 0);
        ulDrvHandle = static_cast<U32>(sp[0]);
        IsDisconnected = 0;
        enSpecialMode = MAA_NORMAL_CMD;
        written.clear();
        MAA_SetResultWriter(&capture);
        std::filesystem::create_directories(root / "/halvard/sys/portability/printdid");
    }
    void TearDown() override {
        MAA_SetResultWriter(nullptr);
        ::close(sp[0]);
        ::close(sp[1]);
    }
    // The device's writes on the channel, one string each.
    std::vector<std::string> Writes() {
        std::vector<std::string> out;
        std::string buf(1 << 16, '\0');
        for (ssize_t n; (n = ::recv(sp[1], buf.data(), buf.size(), MSG_DONTWAIT)) >= 0;)
            out.push_back(buf.substr(0, n));
        return out;
    }
    static std::vector<Rec> Seen(const TMAAResult *r) {
        std::vector<Rec> all = written;
        all.emplace_back(r->enContinue, std::string(reinterpret_cast<const char *>(r->pubData), r->ulDataSize));
        return all;
    }
    void Put(const char *fixed, const std::string &bytes) { std::ofstream(root / fixed, std::ios::binary) << bytes; }

    TempRoot root;
    int sp[2] = {-1, -1};
};

TEST_F(SuppliesTest, ReportHoldsTheDataVersionLineAndIsUploaded) {
    Put(kSupplies, SuppliesFile(258));
    const std::string line = "DataVersion = 0x00000102\r\n";
    EXPECT_EQ(Seen(Get_SuppliesInfo_Report()),
              (std::vector<Rec>{{C, "[ GetSuppliesInfoReport ]"}, {E, "Data Upload Complete"}}));
    EXPECT_EQ(ReadFile(root / kReport), line);
    EXPECT_EQ(Writes(), (std::vector<std::string>{Transfer(MAA_FILE_TRANS_T2H, line.size()), line,
                                                  Transfer(MAA_FILE_END, 0)}));
    // The whole record is loaded, in the file's byte order.
    const std::string raw = SuppliesFile(258);
    EXPECT_EQ(std::memcmp(&gstSuppliesInfoData, raw.data(), raw.size()), 0);
    EXPECT_EQ(gstSuppliesInfoData.stCrumData[26].ulNewImagingUnitCount,
              ReadLE32(reinterpret_cast<const U8 *>(raw.data()) + 4 + 26 * 308 + 304));
}

TEST_F(SuppliesTest, AShortSuppliesFileStillReportsItsVersionAndLeavesNoStaleCounters) {
    Put(kSupplies, SuppliesFile(1));
    Get_SuppliesInfo_Report();
    ASSERT_NE(gstSuppliesInfoData.ulPunchWasteHopper, 0u);
    Put(kSupplies, SuppliesFile(0xABCDEF12, 100));
    written.clear();
    Writes();
    EXPECT_EQ(Seen(Get_SuppliesInfo_Report()).back(), Rec(E, "Data Upload Complete"));
    EXPECT_EQ(ReadFile(root / kReport), "DataVersion = 0xabcdef12\r\n");
    EXPECT_EQ(gstSuppliesInfoData.ulPunchWasteHopper, 0u);
    EXPECT_EQ(gstSuppliesInfoData.stCrumData[5].ulVersion, 0u);
}

TEST_F(SuppliesTest, WithoutAVersionWordNothingIsUploaded) {
    struct Case {
        const char *name;
        const char *supplies;  // nullptr: no file
    } cases[] = {{"missing", nullptr}, {"empty", ""}, {"three bytes", "\x01\x02\x03"}};
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        std::filesystem::remove(root / kSupplies);
        if (c.supplies) Put(kSupplies, c.supplies);
        Put(kReport, "DataVersion = 0x00000001\r\n");  // an earlier run's report
        written.clear();
        EXPECT_EQ(Seen(Get_SuppliesInfo_Report()),
                  (std::vector<Rec>{{C, "[ GetSuppliesInfoReport ]"}, {E, "Fil"}}));
        EXPECT_TRUE(Writes().empty());
        EXPECT_FALSE(std::filesystem::exists(root / kReport));
    }
}

TEST_F(SuppliesTest, UploadSendsASpoolFileOrFailsWithThreeCharacters) {
    Put("/halvard/spool/tmp/upload.bin", std::string("a\0b", 3));
    std::filesystem::create_directories(root / "/halvard/spool/tmp/adir");
    struct Case {
        std::string name;
        S32 result;
        std::string message;
        std::vector<std::string> writes;
    } cases[] = {
        {"upload.bin", 0, "", {Transfer(MAA_FILE_TRANS_T2H, 3), std::string("a\0b", 3), Transfer(MAA_FILE_END, 0)}},
        {"missing.txt", -4, "Fil", {}},
        {"adir", -4, "Fil", {}},
        {"", -4, "Fil", {}},
        // A path over the bound would name another file.
        {std::string(100, 'n'), -4, "Fil", {}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        char message[MAA_UPLOAD_MESSAGE_SIZE] = {};
        EXPECT_EQ(UploadFileData(c.name.c_str(), message), c.result);
        EXPECT_EQ(std::string(message), c.message);
        EXPECT_EQ(Writes(), c.writes);
    }
}

TEST(CrumStrings, SizesOfTheStringFields) {
    struct Case {
        U32 unit, field, size;
    } cases[] = {
        {0, 19, 8},  {0, 20, 8},  {0, 27, 8},  {0, 28, 8},   {0, 29, 8},  {0, 30, 8},
        {0, 21, 16}, {0, 24, 16}, {0, 25, 16}, {26, 26, 16}, {0, 50, 16}, {0, 49, 4},
        {27, 19, 0}, {0xFFFFFFFF, 21, 0},      {0, 0, 0},    {0, 22, 0},  {0, 51, 0},
        {0, 52, 0},  {0, 0xFFFFFFFF, 0},
    };
    for (const Case &c : cases) {
        EXPECT_EQ(MAA_GetCrumStr_S_Size(c.unit, c.field), c.size) << c.unit << "," << c.field;
        if (c.unit == 0) {
            EXPECT_EQ(MAA_IsCrumStr(c.field), c.size != 0) << c.field;
        }
    }
    EXPECT_FALSE(MAA_IsCrumStr(2));
}

}  // namespace
