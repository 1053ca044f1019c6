// Folding is checked at the edges of both letter ranges: '@' 'A' 'Z' '[' and '`' 'a' 'z' '{'.
#include "xpl/Xstr.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>

#include "xpl/Xmem.h"

namespace {

TEST(Xstr, CaseInsensitiveCompare_FoldsAsciiLettersOnly) {
    const std::tuple<const char*, const char*, int, int> rows[] = {
        {"AZ", "az", -1, 0},      {"@", "`", -1, -1},        {"[", "{", -1, -1},
        {"[", "A", -1, -1},       {"abc", "ABD", -1, -1},    {"a", "ab", -1, -1},
        {"ab", "a", -1, 1},       {"\xC3\xA9", "a", -1, -1},  // a high byte is below ASCII
        {"\xC9", "\xE9", -1, -1}, {"abcX", "ABCy", 3, 0},    {"abcX", "ABCy", 4, -1},
        {"x", "y", 0, 0},         {"ab", "AB", 10, 0},
    };
    for (const auto& [a, b, count, sign] : rows) {  // count below 0: xstr_icmp
        int got = count < 0 ? xstr_icmp(a, b) : xstr_nicmp(a, b, count);
        EXPECT_EQ((got > 0) - (got < 0), sign) << a << " " << b << " " << count;
    }
}

TEST(Xstr, Predicates_CompareTextsAsTheirRulesSay) {
    using namespace std::string_literals;
    using Test = bool (*)(const std::string&, const std::string&);
    const Test eqi = xstrEqualsIgnoreCase, sw = xstrStartsWith, swi = xstrStartsWithIgnoreCase,
               ew = xstrEndsWith, ewi = xstrEndsWithIgnoreCase, has = xstrContains,
               hasi = xstrContainsIgnoreCase;
    // Equality ends at a NUL; the search goes past one.
    const std::tuple<Test, std::string, std::string, bool> rows[] = {
        {eqi, "Hello", "hELLO", true},   {eqi, "Hello", "Hell", false},
        {eqi, "ab\0x"s, "AB\0y"s, true}, {sw, "abc", "ab", true},
        {sw, "ab", "abc", false},        {sw, "ABC", "ab", false},
        {swi, "ABC", "ab", true},        {swi, "AB", "abc", false},
        {ew, "abc", "", true},           {ew, "abc", "abc", true},
        {ew, "bc", "abc", false},        {ewi, "a.TXT", ".txt", true},
        {ewi, "a.txz", ".TXT", false},   {has, "Hello", "LL", false},
        {hasi, "Hello", "LL", true},     {has, "a\0bc"s, "bc", true},
    };
    for (const auto& [test, s, arg, want] : rows) EXPECT_EQ(test(s, arg), want) << s << "," << arg;
}

TEST(Xstr, TrimFoldAndSplit_ChangeOnlyWhiteSpaceAndAsciiLetters) {
    const std::tuple<std::string (*)(const std::string&), std::string, std::string> rows[] = {
        {xstrTrim, " \t a b\r\n", "a b"},
        {xstrTrim, "\v\f x \v\f", "x"},
        {xstrTrim, "\b\xA0x\x0E", "\b\xA0x\x0E"},  // neighbours of white space, a high byte
        {xstrTrim, " \t\n", ""},
        {xstrToLower, "@AZ[`az{\xC9", "@az[`az{\xC9"},
        {xstrToUpper, "@AZ[`az{\xE9", "@AZ[`AZ{\xE9"},
    };
    for (const auto& [transform, in, want] : rows) EXPECT_EQ(transform(in), want) << in;
    // Empty fields are dropped, but the last one always stays.
    const std::tuple<const char*, const char*, std::vector<std::string>> splits[] = {
        {" a , b ", ",", {"a", "b"}}, {"a,,b", ",", {"a", "b"}},         {",a", ",", {"a"}},
        {"a,", ",", {"a", ""}},       {"a, ,b", ",", {"a", "", "b"}},    {"", ",", {""}},
        {",,,", ",", {""}},           {"a, b,c", ", ", {"a", "b", "c"}}, {" x ", "", {"x"}},
    };
    for (const auto& [s, delims, want] : splits) EXPECT_EQ(xstrSplit(s, delims), want) << s;
}

// Regression (last line): an encoding error made the first pass report -1,
// which was taken as a length and turned into a huge allocation.
TEST(Xstr, Printf_HoldsTheWholeOutput) {
    const std::string big(5000, 'q');
    EXPECT_EQ(xstrPrintf("%d-", 42) + xstrPrintf("%s", "") + xstrPrintf("%c", 'x'), "42-x");
    EXPECT_EQ(xstrPrintf("<%s>", big.c_str()), "<" + big + ">") << "no fixed buffer";
    const wchar_t notInCLocale[] = {0xE9, 0};
    ASSERT_LT(std::snprintf(nullptr, 0, "%ls", notInCLocale), 0);
    EXPECT_EQ(xstrPrintf("%ls", notInCLocale), "");
}

// Blocks the allocator hands out again hold 'x': a byte left unwritten shows.
TEST(Xstr, CHelpers_CopyTheTerminatorAndCountWhatTheyRead) {
    char area[8] = "#######";
    EXPECT_STREQ(xstr_ncpy(area, "abc", 4), "abc");
    EXPECT_STREQ(static_cast<char*>(xmem_set(area, 'z', 2)), "zzc");
    int a = 0, b = 0;
    EXPECT_EQ(xstr_sscanf("7 8", "%d %d", &a, &b) * 100 + a * 10 + b, 278);
    void* used[] = {xmem_alloc(18), xmem_alloc(18)};
    for (void* p : used) xmem_free(xmem_set(p, 'x', 18));  // bytes past 16 stay as set
    char* copy = xstr_dup("seventeen letters");
    auto* zeros = static_cast<char*>(xmem_calloc(18, 1));
    EXPECT_EQ(copy + std::to_string(std::count(zeros, zeros + 18, 0)), "seventeen letters18");
    xmem_free(copy), xmem_free(zeros);
}

}  // namespace
