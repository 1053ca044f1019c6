// The string helpers, one table per family. Folding is checked at the edges
// of both letter ranges ('@' 'A' 'Z' '[' and '`' 'a' 'z' '{').
#include "xpl/Xstr.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <string>
#include <vector>

namespace {

TEST(Xstr, CaseInsensitiveCompare_FoldsAsciiLettersOnly) {
    const struct {
        const char *name, *a, *b;
        int count;  // below 0: xstr_icmp, else xstr_nicmp over this many
        int sign;
    } rows[] = {
        {"A and Z fold", "AZ", "az", -1, 0},
        {"@ and ` are no letters", "@", "`", -1, -1},
        {"[ and { are no letters", "[", "{", -1, -1},
        {"a letter meets [ as lower case", "[", "A", -1, -1},
        {"c before d whatever the case", "abc", "ABD", -1, -1},
        {"the terminator meets b", "a", "ab", -1, -1},
        {"the longer after", "ab", "a", -1, 1},
        {"a high byte is negative", "\xC3\xA9", "a", -1, -1},
        {"Latin-1 letters do not fold", "\xC9", "\xE9", -1, -1},
        {"count 3 stops before the difference", "abcX", "ABCy", 3, 0},
        {"count 4 reaches it", "abcX", "ABCy", 4, -1},
        {"count 0 compares nothing", "x", "y", 0, 0},
        {"stops where both end", "ab", "AB", 10, 0},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.name);
        int result = row.count < 0 ? xstr_icmp(row.a, row.b) : xstr_nicmp(row.a, row.b, row.count);
        EXPECT_EQ((result > 0) - (result < 0), row.sign);
    }
}

TEST(Xstr, Predicates_CompareTextsAsTheirRulesSay) {
    const struct {
        const char* name;
        bool (*test)(const std::string&, const std::string&);
        std::string s, arg;
        bool want;
    } rows[] = {
        {"equal when folded", xstrEqualsIgnoreCase, "Hello", "hELLO", true},
        {"a prefix is not equal", xstrEqualsIgnoreCase, "Hello", "Hell", false},
        {"equality ends at a NUL", xstrEqualsIgnoreCase, {"ab\0x", 4}, {"AB\0y", 4}, true},
        {"a prefix", xstrStartsWith, "abc", "ab", true},
        {"a prefix longer than the text", xstrStartsWith, "ab", "abc", false},
        {"case counts", xstrStartsWith, "ABC", "ab", false},
        {"a folded prefix", xstrStartsWithIgnoreCase, "ABC", "ab", true},
        {"a folded prefix too long", xstrStartsWithIgnoreCase, "AB", "abc", false},
        {"an empty suffix", xstrEndsWith, "abc", "", true},
        {"the whole text", xstrEndsWith, "abc", "abc", true},
        {"a suffix longer than the text", xstrEndsWith, "bc", "abc", false},
        {"a folded suffix", xstrEndsWithIgnoreCase, "name.TXT", ".txt", true},
        {"a folded suffix that differs", xstrEndsWithIgnoreCase, "name.txz", ".TXT", false},
        {"containment counts case", xstrContains, "Hello", "LL", false},
        {"the search goes past a NUL", xstrContains, {"a\0bc", 4}, "bc", true},
        {"folded containment", xstrContainsIgnoreCase, "Hello", "LL", true},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.name);
        EXPECT_EQ(row.test(row.s, row.arg), row.want);
    }
}

TEST(Xstr, TrimAndFold_ChangeOnlyWhiteSpaceAndAsciiLetters) {
    const struct {
        std::string (*transform)(const std::string&);
        std::string in, want;
    } rows[] = {
        {xstrTrim, " \t a b\r\n", "a b"},
        {xstrTrim, "\v\f x \v\f", "x"},
        {xstrTrim, "\b\xA0x\x0E", "\b\xA0x\x0E"},  // neighbours of white space, a high byte
        {xstrTrim, " \t\n", ""},
        {xstrToLower, "@AZ[`az{\xC9", "@az[`az{\xC9"},
        {xstrToUpper, "@AZ[`az{\xE9", "@AZ[`AZ{\xE9"},
    };
    for (const auto& row : rows) EXPECT_EQ(row.transform(row.in), row.want) << row.in;
}

TEST(Xstr, Split_DropsEmptyFieldsButAlwaysKeepsTheLast) {
    const struct {
        const char *s, *delims;
        std::vector<std::string> want;
    } rows[] = {
        {" a , b ", ",", {"a", "b"}},
        {"a,,b", ",", {"a", "b"}},
        {",a", ",", {"a"}},
        {"a,", ",", {"a", ""}},
        {"a, ,b", ",", {"a", "", "b"}},
        {"", ",", {""}},
        {",,,", ",", {""}},
        {"*:I XMEM:D", " ", {"*:I", "XMEM:D"}},
        {"a, b,c", ", ", {"a", "b", "c"}},
        {" x ", "", {"x"}},
    };
    for (const auto& row : rows) {
        EXPECT_EQ(xstrSplit(row.s, row.delims), row.want) << row.s << " at " << row.delims;
    }
}

// Regression (last row): an encoding error made the first pass report -1,
// which was taken as a length and turned into a huge allocation.
TEST(Xstr, Printf_HoldsTheWholeOutput) {
    const std::string longText(5000, 'q');
    EXPECT_EQ(xstrPrintf("%d-%s", 42, "x"), "42-x");
    EXPECT_EQ(xstrPrintf("%s", ""), "");
    EXPECT_EQ(xstrPrintf("<%s>", longText.c_str()), "<" + longText + ">") << "no fixed buffer";
    const wchar_t notInCLocale[] = {0xE9, 0};
    ASSERT_LT(std::snprintf(nullptr, 0, "%ls", notInCLocale), 0) << "the C locale lacks U+00E9";
    EXPECT_EQ(xstrPrintf("%ls", notInCLocale), "");
}

}  // namespace
