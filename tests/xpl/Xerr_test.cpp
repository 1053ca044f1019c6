#include "xpl/Xerr.h"

#include <gtest/gtest.h>

#include <cstring>
#include <string>

namespace {

class XerrTest : public ::testing::Test {
  protected:
    void SetUp() override { ASSERT_EQ(xerrLibInit(), XERR_SUCCESS); }
};

TEST_F(XerrTest, LibInit_FillsBothTablesAndOnlyTheNamedSlots) {
    EXPECT_STREQ(g_xerr_str_table[0], "XERR_SUCCESS");
    EXPECT_STREQ(g_xerr_str_table[1], "XERR_PERM");
    EXPECT_STREQ(g_xerr_str_table[7], "XERR_2BIG");
    EXPECT_STREQ(g_xerr_str_table[40], "XERR_LOOP");
    EXPECT_STREQ(g_xerr_str_table[42], "XERR_NOMSG");
    EXPECT_STREQ(g_xerr_str_table[59], "XERR_BFONT");
    EXPECT_STREQ(g_xerr_str_table[133], "XERR_HWPOISON");
    int named = 0;
    for (int i = 0; i < XERR_STR_TABLE_SIZE; ++i) named += g_xerr_str_table[i] != nullptr;
    EXPECT_EQ(named, 132) << "XERR_SUCCESS and the 131 Linux names, nothing else";
    EXPECT_EQ(g_xerr_str_table[41], nullptr);
    EXPECT_EQ(g_xerr_str_table[58], nullptr);
    EXPECT_EQ(g_xerr_str_table[134], nullptr);
    EXPECT_EQ(g_xerr_str_table[1001], nullptr);

    for (int n = 0; n < XERR_XLAT_TABLE_SIZE; ++n) {
        int expected = (n == 0 || n == 41 || n == 58) ? 0 : n;
        EXPECT_EQ(g_xerr_xlat_table[n], expected) << "translation slot " << n;
    }
    EXPECT_EQ(xerrLibInit(), XERR_SUCCESS) << "a second run writes the same values";
    EXPECT_STREQ(g_xerr_str_table[110], "XERR_TIMEDOUT");
}

TEST_F(XerrTest, FromNative_TranslatesNamedNumbersAndOffsetsTheRest) {
    EXPECT_EQ(xerrFromNative(2), 2);
    EXPECT_EQ(xerrFromNative(133), 133);
    EXPECT_EQ(xerrFromNative(41), 100041) << "41 has no name";
    EXPECT_EQ(xerrFromNative(58), 100058) << "58 has no name";
    EXPECT_EQ(xerrFromNative(134), 100134) << "past the table";
    EXPECT_EQ(xerrFromNative(-3), 99997) << "a negative number has no slot";
    EXPECT_EQ(xerrFromNative(0), 100000) << "0 has no translation";
}

TEST_F(XerrTest, Str_NamesKnownCodesAndDescribesTheRest) {
    EXPECT_EQ(xerrStr(-1), "XERR_FAILURE");
    EXPECT_EQ(xerrStr(0), "XERR_SUCCESS");
    EXPECT_EQ(xerrStr(22), "XERR_INVAL");
    EXPECT_EQ(xerrStr(110), "XERR_TIMEDOUT");
    EXPECT_EQ(xerrStr(41), "NOTDEFINED: 41");
    EXPECT_EQ(xerrStr(1001), "NOTDEFINED: 1001");
    EXPECT_EQ(xerrStr(100000), "NOTDEFINED: 100000") << "no platform text at exactly 100000";
    EXPECT_EQ(xerrStr(-7), "NOTDEFINED: -7");
    EXPECT_EQ(xerrStr(xerrFromNative(41)), std::string("NOTDEFINED: 100041 ") + strerror(41))
        << "an unnamed native number carries the platform's text";
    EXPECT_EQ(xerrStr(xerrFromNative(200)), std::string("NOTDEFINED: 100200 ") + strerror(200));
}

}  // namespace
