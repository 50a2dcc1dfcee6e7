// The supplies report and the spool-file upload as the host sees them: the
// result records, the file transfer on the channel (write by write) and the
// report left in the spool directory.
#include <cstring>
#include <filesystem>

#include "maa/MAA_Wire.h"
#include "maa/functions/MAA_Supplies.h"
#include "maa_functions/FnFixture.h"

namespace fntest {
namespace {

constexpr char kSupplies[] = "/halvard/sys/portability/printdid/crum_data.bin";
constexpr char kReport[] = "/halvard/spool/tmp/suppliesinforeport.txt";

// A supplies file of `size` bytes: version word, then a recognisable pattern.
std::string SuppliesFile(U32 version, size_t size = sizeof(TSuppliesInfoData)) {
    std::string bytes = Pattern(size);
    U8 v[4];
    WriteLE32(v, version);
    bytes.replace(0, std::min<size_t>(4, size), reinterpret_cast<char *>(v), std::min<size_t>(4, size));
    return bytes;
}

class Supplies : public FnTest {
protected:
    void SetUp() override {
        FnTest::SetUp();
        ASSERT_GE(packets.device, 0);
        ulDrvHandle = static_cast<U32>(packets.device);
        std::filesystem::create_directories(root / "/halvard/sys/portability/printdid");
    }
    void Put(const char *fixed, const std::string &bytes) { std::ofstream(root / fixed, std::ios::binary) << bytes; }
    PacketChannel packets;
};

TEST_F(Supplies, ReportHoldsTheDataVersionLineAndIsUploaded) {
    const std::string raw = SuppliesFile(258), line = "DataVersion = 0x00000102\r\n";
    Put(kSupplies, raw);
    EXPECT_EQ(Seen(Get_SuppliesInfo_Report()), (Recs{Cont("[ GetSuppliesInfoReport ]"), End("Data Upload Complete")}));
    EXPECT_EQ(ReadFile(root / kReport), line);
    EXPECT_EQ(packets.Writes(), (std::vector<std::string>{Transfer(MAA_FILE_TRANS_T2H, line.size()), line,
                                                       Transfer(MAA_FILE_END, 0)}));
    // The whole record is loaded, in the file's byte order.
    EXPECT_EQ(std::memcmp(&gstSuppliesInfoData, raw.data(), raw.size()), 0);
    EXPECT_EQ(gstSuppliesInfoData.stCrumData[26].ulNewImagingUnitCount,
              ReadLE32(reinterpret_cast<const U8 *>(raw.data()) + 4 + 26 * 308 + 304));

    // A short file still reports its version and leaves no stale counters.
    ASSERT_NE(gstSuppliesInfoData.ulPunchWasteHopper, 0u);
    Put(kSupplies, SuppliesFile(0xABCDEF12, 100));
    written.clear();
    EXPECT_EQ(Seen(Get_SuppliesInfo_Report()).back(), End("Data Upload Complete"));
    EXPECT_EQ(ReadFile(root / kReport), "DataVersion = 0xabcdef12\r\n");
    EXPECT_EQ(gstSuppliesInfoData.ulPunchWasteHopper, 0u);
    EXPECT_EQ(gstSuppliesInfoData.stCrumData[5].ulVersion, 0u);
}

TEST_F(Supplies, WithoutAVersionWordNothingIsUploaded) {
    for (const char *supplies : {static_cast<const char *>(nullptr), "", "\x01\x02\x03"}) {
        SCOPED_TRACE(supplies ? std::strlen(supplies) : 99);
        std::filesystem::remove(root / kSupplies);
        if (supplies) Put(kSupplies, supplies);
        Put(kReport, "DataVersion = 0x00000001\r\n");  // an earlier run's report
        written.clear();
        EXPECT_EQ(Seen(Get_SuppliesInfo_Report()), (Recs{Cont("[ GetSuppliesInfoReport ]"), End("Fil")}));
        EXPECT_TRUE(packets.Writes().empty());
        EXPECT_FALSE(std::filesystem::exists(root / kReport));
    }
}

TEST_F(Supplies, UploadSendsASpoolFileOrFailsWithThreeCharacters) {
    Put("/halvard/spool/tmp/upload.bin", std::string("a\0b", 3));
    std::filesystem::create_directories(root / "/halvard/spool/tmp/adir");
    struct Case { std::string name; S32 result; std::string message; std::vector<std::string> writes; } cases[] = {
        {"upload.bin", 0, "", {Transfer(MAA_FILE_TRANS_T2H, 3), std::string("a\0b", 3), Transfer(MAA_FILE_END, 0)}},
        {"missing.txt", -4, "Fil", {}},
        {"adir", -4, "Fil", {}},
        {"", -4, "Fil", {}},
        {std::string(100, 'n'), -4, "Fil", {}},  // a path over the bound would name another file
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        char message[MAA_UPLOAD_MESSAGE_SIZE] = {};
        EXPECT_EQ(UploadFileData(c.name.c_str(), message), c.result);
        EXPECT_EQ(std::string(message), c.message);
        EXPECT_EQ(packets.Writes(), c.writes);
    }
}

TEST(CrumStrings, SizesOfTheStringFields) {
    struct Case { U32 unit, field, size; } cases[] = {
        {0, 19, 8},  {0, 20, 8},  {0, 27, 8},  {0, 28, 8},   {0, 29, 8},  {0, 30, 8},
        {0, 21, 16}, {0, 24, 16}, {0, 25, 16}, {26, 26, 16}, {0, 50, 16}, {0, 49, 4},
        {27, 19, 0}, {0xFFFFFFFF, 21, 0},      {0, 0, 0},    {0, 22, 0},  {0, 51, 0},
        {0, 52, 0},  {0, 0xFFFFFFFF, 0},       {0, 2, 0},
    };
    for (const Case &c : cases) {
        EXPECT_EQ(MAA_GetCrumStr_S_Size(c.unit, c.field), c.size) << c.unit << "," << c.field;
        if (c.unit == 0) { EXPECT_EQ(MAA_IsCrumStr(c.field), c.size != 0) << c.field; }
    }
}

}  // namespace
}  // namespace fntest
