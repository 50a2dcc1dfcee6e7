// The 32-bit address map: placement, bounds, refusal and function handles.
#include <vector>

#include "maa/ShellFixture.h"

namespace maatest {
namespace {

using AddressMap = ShellTest;

TEST_F(AddressMap, RegionsGetDistinctBasesAboveOneMillion) {
    U8 a[10], b[100], c[1];
    U32 ra = MAA_AddrMap(a, sizeof a), rb = MAA_AddrMap(b, sizeof b), rc = MAA_AddrMap(c, sizeof c);
    EXPECT_GT(ra, 1000000u);
    EXPECT_GE(rb, ra + sizeof a + 1);  // never adjacent: a gap is left between regions
    EXPECT_GE(rc, rb + sizeof b + 1);
    EXPECT_EQ(MAA_AddrTranslate(ra, 10), a);
    EXPECT_EQ(MAA_AddrTranslate(rb + 99, 1), b + 99);
    EXPECT_EQ(MAA_AddrOf(b + 5), rb + 5);
    EXPECT_EQ(MAA_AddrOf(&rc), 0u);
    EXPECT_EQ(MAA_AddrMap(a, 0), 0u);
    EXPECT_EQ(MAA_AddrMap(nullptr, 4), 0u);
}

TEST_F(AddressMap, AccessOutsideARegionIsRefusedAndLogged) {
    U8 cell[4] = {1, 2, 3, 4};
    U32 base = MAA_AddrMap(cell, sizeof cell);
    EXPECT_EQ(MAA_AddrTranslate(base, 5), nullptr);
    EXPECT_EQ(MAA_AddrTranslate(base + 4, 1), nullptr);
    EXPECT_EQ(MAA_AddrTranslate(base - 1, 1), nullptr);
    EXPECT_EQ(MAA_AddrTranslate(base + 3, 0xFFFFFFFF), nullptr);
    char expected[40];
    std::snprintf(expected, sizeof expected, "invalid address 0x%x", base + 4);
    EXPECT_EQ(LoggerHost_Count(expected), 1);

    U32 v = 99;
    EXPECT_TRUE(MAA_AddrRead(base + 2, 2, &v));
    EXPECT_EQ(v, 0x0403u);
    EXPECT_FALSE(MAA_AddrRead(base + 2, 4, &v));
    EXPECT_EQ(v, 0u);
    EXPECT_FALSE(MAA_AddrWrite(0, 1, 5));
    EXPECT_FALSE(MAA_AddrWrite(0xFFFFFFFF, 1, 5));
    EXPECT_TRUE(MAA_AddrWrite(base, 1, 0x1FF));
    EXPECT_EQ(cell[0], 0xFF);

    MAA_AddrUnmap(base);
    EXPECT_EQ(MAA_AddrTranslate(base, 1), nullptr);
    EXPECT_EQ(MAA_AddrRegionCount(), 0u);
}

TEST_F(AddressMap, TextMustEndInsideItsRegion) {
    char good[] = "ok";
    char bad[3] = {'a', 'b', 'c'};
    U32 g = MAA_AddrMap(good, sizeof good), b = MAA_AddrMap(bad, sizeof bad);
    EXPECT_STREQ(MAA_AddrString(g), "ok");
    EXPECT_STREQ(MAA_AddrString(g + 1), "k");
    EXPECT_EQ(MAA_AddrString(b), nullptr);
    EXPECT_EQ(MAA_AddrString(12345), nullptr);
}

TEST_F(AddressMap, AFullMapRefusesAndRecoversWhenRegionsAreReleased) {
    static U8 cells[MAA_ADDR_MAX_REGIONS][4];
    std::vector<U32> bases;
    for (auto &c : cells) bases.push_back(MAA_AddrMap(c, 4));
    for (U32 base : bases) ASSERT_NE(base, 0u);
    U8 extra[4];
    EXPECT_EQ(MAA_AddrMap(extra, 4), 0u);
    EXPECT_TRUE(LoggerHost_Contains("address map full"));
    MAA_AddrUnmap(bases[500]);
    U32 again = MAA_AddrMap(extra, 4);
    EXPECT_NE(again, 0u);
    EXPECT_EQ(MAA_AddrTranslate(again, 4), extra);
    EXPECT_EQ(MAA_AddrTranslate(bases[499], 4), cells[499]);
    EXPECT_EQ(MAA_AddrTranslate(bases[501], 4), cells[501]);
}

TEST_F(AddressMap, PlacementWrapsAroundTheAddressSpace) {
    // Far more space than the 32-bit range holds is mapped over time; a
    // long-lived region stays reachable throughout.
    static std::vector<U8> big(64u << 20);
    U8 keep[4] = {9, 9, 9, 9};
    U32 kept = MAA_AddrMap(keep, 4);
    for (int i = 0; i < 200; ++i) {
        U32 base = MAA_AddrMap(big.data(), static_cast<U32>(big.size()));
        ASSERT_NE(base, 0u) << i;
        ASSERT_TRUE(base >= kept + 4 || base + big.size() <= kept) << i;
        ASSERT_EQ(MAA_AddrTranslate(base + static_cast<U32>(big.size()) - 1, 1), &big.back());
        MAA_AddrUnmap(base);
    }
    EXPECT_EQ(MAA_AddrTranslate(kept, 4), keep);
}

TEST_F(AddressMap, FunctionHandlesAreStableAndOfOneKind) {
    U32 h0 = MAA_FuncEntry<f0>(), h3 = MAA_FuncEntry<f3>();
    EXPECT_EQ(MAA_FuncEntry<f0>(), h0);
    EXPECT_NE(h0, h3);
    EXPECT_GE(h0, MAA_FUNC_HANDLE_BASE);
    U32 hg = MAA_AddrGeneralHandle(&general);
    EXPECT_EQ(MAA_AddrFunc(hg), nullptr);
    EXPECT_EQ(MAA_AddrGeneral(h0), nullptr);
    EXPECT_EQ(MAA_AddrFunc(h0 + 1), nullptr);
    EXPECT_EQ(MAA_AddrFunc(0x01000000), nullptr);
}

}  // namespace
}  // namespace maatest
