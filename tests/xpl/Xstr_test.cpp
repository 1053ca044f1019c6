#include "xpl/Xstr.h"

#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <vector>

namespace {

using Fields = std::vector<std::string>;

TEST(XstrIcmp, WhenCaseDiffers_ComparesFoldedLetters) {
    EXPECT_LT(xstr_icmp("abc", "ABD"), 0) << "c sorts before d whatever the case";
    EXPECT_EQ(xstr_icmp("ABC", "abc"), 0) << "only the case differs";
    EXPECT_LT(xstr_icmp("a", "ab"), 0) << "the terminator meets the b";
    EXPECT_GT(xstr_icmp("ab", "a"), 0);
    EXPECT_EQ(xstr_nicmp("abcX", "ABCy", 3), 0) << "only the first three characters count";
    EXPECT_NE(xstr_nicmp("abcX", "ABCy", 4), 0);
    EXPECT_EQ(xstr_nicmp("x", "y", 0), 0) << "a count of zero compares nothing";
    EXPECT_EQ(xstr_nicmp("ab", "AB", 10), 0) << "stops where both strings end";
}

TEST(XstrIcmp, WhenBytesAreAboveAscii_OrdersThemBeforeAscii) {
    // Bytes 0x80-0xFF compare as negative chars, unchanged by folding.
    EXPECT_LT(xstr_icmp("\xC3\xA9", "a"), 0) << "0xC3 is a negative char";
    EXPECT_LT(xstr_icmp("\xFF", ""), 0) << "a high byte orders before the terminator";
    EXPECT_EQ(xstr_icmp("\xC9", "\xC9"), 0);
    EXPECT_NE(xstr_icmp("\xC9", "\xE9"), 0)
        << "Latin-1 capital and small E acute are not folded together";
    EXPECT_EQ(xstr_icmp("\xC9", "\xE9"),
              static_cast<signed char>('\xC9') - static_cast<signed char>('\xE9'))
        << "the result is the difference of the signed bytes";
    EXPECT_LT(xstr_icmp("[", "A"), 0) << "letters fold to lower case, so 'A' meets '[' as 'a'";
}

TEST(XstrPrintf, WhenFormatted_HoldsTheWholeOutput) {
    EXPECT_EQ(xstrPrintf("%d-%s", 42, "x"), "42-x");
    EXPECT_EQ(xstrPrintf("%s", ""), "");
    std::string longText(5000, 'q');
    std::string out = xstrPrintf("<%s>", longText.c_str());
    EXPECT_EQ(out.size(), 5002u) << "no fixed buffer limits the output";
    EXPECT_EQ(out, "<" + longText + ">");
}

// Regression: an encoding error made the first pass report -1, which was
// taken as a length and turned into a huge allocation.
TEST(XstrPrintf, WhenEncodingFails_ReturnsEmpty) {
    const wchar_t notInCLocale[] = {0xE9, 0};
    ASSERT_LT(std::snprintf(nullptr, 0, "%ls", notInCLocale), 0)
        << "precondition: the C locale cannot encode U+00E9";
    EXPECT_EQ(xstrPrintf("%ls", notInCLocale), "") << "an encoding error yields the empty string";
}

TEST(XstrTrim, RemovesPosixWhitespaceAtBothEnds) {
    EXPECT_EQ(xstrTrim(" \t a b\r\n"), "a b");
    EXPECT_EQ(xstrTrim("\v\f x \v\f"), "x");
    EXPECT_EQ(xstrTrim(" \t\n"), "");
    EXPECT_EQ(xstrTrim(""), "");
    EXPECT_EQ(xstrTrim("\xA0x\xA0"), "\xA0x\xA0") << "a non-breaking space byte is not white space";
}

TEST(XstrCase, ConvertsAsciiLettersOnly) {
    EXPECT_EQ(xstrToLower("AbC-1\xC9"), "abc-1\xC9");
    EXPECT_EQ(xstrToUpper("aBc-1\xE9"), "ABC-1\xE9");
    EXPECT_TRUE(xstrEqualsIgnoreCase("Hello", "hELLO"));
    EXPECT_FALSE(xstrEqualsIgnoreCase("Hello", "Hell"));
    EXPECT_TRUE(xstrEqualsIgnoreCase(std::string("ab\0x", 4), std::string("AB\0y", 4)))
        << "comparison ends at an embedded NUL";
}

TEST(XstrAffixes, MatchPrefixesAndSuffixes) {
    EXPECT_FALSE(xstrStartsWith("ab", "abc")) << "a prefix longer than the string";
    EXPECT_TRUE(xstrStartsWith("abc", "ab"));
    EXPECT_TRUE(xstrStartsWith("abc", ""));
    EXPECT_TRUE(xstrStartsWithIgnoreCase("ABC", "ab"));
    EXPECT_FALSE(xstrStartsWithIgnoreCase("AB", "abc"));

    EXPECT_TRUE(xstrEndsWith("abc", ""));
    EXPECT_TRUE(xstrEndsWith("abc", "bc"));
    EXPECT_FALSE(xstrEndsWith("bc", "abc")) << "a suffix longer than the string";
    EXPECT_FALSE(xstrEndsWith("abc", "bx"));
    EXPECT_TRUE(xstrEndsWithIgnoreCase("fileName.TXT", ".txt"));
    EXPECT_FALSE(xstrEndsWithIgnoreCase("txt", ".txt"));
}

TEST(XstrContains, SearchesTheWholeStoredText) {
    EXPECT_TRUE(xstrContainsIgnoreCase("Hello", "LL"));
    EXPECT_FALSE(xstrContains("Hello", "LL"));
    EXPECT_TRUE(xstrContains("abc", ""));
    EXPECT_TRUE(xstrContains(std::string("a\0bc", 4), "bc")) << "an embedded NUL does not end it";
}

TEST(XstrSplit, WhenDelimitersVary_DropsEmptyFieldsButKeepsTheLast) {
    struct Case {
        const char* s;
        const char* delims;
        Fields expected;
    };
    const Case cases[] = {
        {"a,b", ",", {"a", "b"}},
        {" a , b ", ",", {"a", "b"}},
        {"a,,b", ",", {"a", "b"}},
        {",a", ",", {"a"}},
        {"a,", ",", {"a", ""}},
        {"a, ,b", ",", {"a", "", "b"}},
        {"", ",", {""}},
        {"*:I XMEM:D", " ", {"*:I", "XMEM:D"}},
        {"a b,c", " ,", {"a", "b", "c"}},
        {" x ", "", {"x"}},
        {",,,", ",", {""}},
    };
    for (const Case& c : cases) {
        EXPECT_EQ(xstrSplit(c.s, c.delims), c.expected)
            << "splitting '" << c.s << "' at '" << c.delims << "'";
    }
}

}  // namespace
