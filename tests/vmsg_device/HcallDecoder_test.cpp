#include "HcallDecoder.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace {

std::vector<uint8_t> hex(const std::string& text) {
    std::vector<uint8_t> bytes;
    EXPECT_TRUE(hcallParseHex(text, bytes)) << "test vector is not hex: " << text;
    return bytes;
}

HcallDecoded decode(const std::string& request, const char* reply = nullptr, uint32_t hostCap = 0,
                    uint32_t guestCap = 0) {
    const std::vector<uint8_t> req = hex(request);
    const std::vector<uint8_t> rep = reply ? hex(reply) : std::vector<uint8_t>();
    return hcallDecode(req.data(), req.size(), reply ? rep.data() : nullptr, rep.size(), hostCap,
                       guestCap);
}

struct Vector {
    const char* request;
    const char* reply;  // null: request alone
    const char* text;
};

TEST(HcallDecode, Decode_WhenRequestsAreWellFormed_RendersEveryParameterKind) {
    const Vector vectors[] = {
        {"07000000 0C000000 01000000", nullptr, "hcallOnOrientationChangedRpc(1)"},
        {"0C000000 10000000 04000000 61626300", "00000000",
         "hcallOnLocaleChangedRpc(\"abc\") -> 0"},
        {"04000000 14000000 01000000 05000000 0F000000", "FBFFFFFF",
         "hcallInitVolumeRpc(true, 5, 15) -> -5"},
        {"1E000000 12000000 64000000 02000000 6100", nullptr, "hcallOnVibrateRpc(100, \"a\")"},
        {"10000000 08000000", "00000000", "hcallStartImportFilesRpc() -> 0"},
        {"0D000000 2E000000 0100000000 0100000000 0100000000 00000000 0100000000 0100000000 "
         "0100000000 00000000",
         nullptr, "hcallOnAppInstalledRpc(\"\", \"\", \"\", 0, \"\", \"\", \"\", false)"},
        {"07000000 0C000000 FFFFFF7F", nullptr, "hcallOnOrientationChangedRpc(2147483647)"},
        {"1F000000 0C000000 00000080", nullptr, "hcallOnSetDeviceProfileCompletedRpc(-2147483648)"},
        // Escapes: quote, backslash, tab, newline, a control byte and UTF-8.
        {"12000000 14000000 08000000 22 5C 09 0A 01 C3 A9 00", nullptr,
         "hcallSetClipboardTextRpc(\"\\\"\\\\\\t\\n\\x01\\xc3\\xa9\")"},
        {"01000000 14000000 40000000 40000000 04000000", nullptr,
         "hcallGetPropsRpc(char[64], 64, i32*)"},
        {"05000000 14000000 08000000 20000000 20000000", nullptr,
         "hcallGetTimeInfoRpc(u64*, char[32], 32)"},
    };
    for (const Vector& v : vectors) {
        const HcallDecoded d = decode(v.request, v.reply);
        EXPECT_TRUE(d.wellFormed) << v.request << ": " << d.problem;
        EXPECT_EQ(d.text, v.text) << "decoding of " << v.request;
    }
}

TEST(HcallDecode, Decode_WhenReplyCarriesFilledData_ShowsItAndTheResult) {
    const Vector vectors[] = {
        {"01000000 14000000 08000000 08000000 04000000", "61626300 00000000 07000000 00000000",
         "hcallGetPropsRpc(char[8]=\"abc\", 8, i32*=7) -> 0"},
        // A host that fills the whole buffer leaves it unterminated; the
        // decoder must not read past the capacity.
        {"01000000 14000000 04000000 04000000 04000000", "61626364 FFFFFFFF EAFFFFFF",
         "hcallGetPropsRpc(char[4]=\"abcd\"(unterminated), 4, i32*=-1) -> -22"},
        {"05000000 14000000 08000000 02000000 02000000", "0100000000000080 7A00 00000000",
         "hcallGetTimeInfoRpc(u64*=9223372036854775809, char[2]=\"z\", 2) -> 0"},
        // The launch answer is the first byte alone.
        {"18000000 0E000000 02000000 7000", "01000000",
         "hcallIsAppLaunchAllowedRpc(\"p\") -> true"},
        {"18000000 0E000000 02000000 7000", "00FFFFFF",
         "hcallIsAppLaunchAllowedRpc(\"p\") -> false"},
        {"01000000 14000000 08000000 08000000 04000000", "61626300",
         "hcallGetPropsRpc(char[8], 8, i32*) -> !short reply: 4 of 16 bytes"},
    };
    for (const Vector& v : vectors) EXPECT_EQ(decode(v.request, v.reply).text, v.text);
    EXPECT_EQ(decode("01000000 14000000 08000000 08000000 04000000").replySize, 16u)
        << "filled sizes plus the result";
}

TEST(HcallDecode, Decode_WhenFramingIsBroken_NamesTheFault) {
    const struct {
        const char* request;
        uint32_t hostCap, guestCap;
        const char* problem;
    } cases[] = {
        {"0C000000 1000", 0, 0, "request of 6 bytes is shorter than the header"},
        {"00000000 08000000", 0, 0, "unknown operation code 0"},
        {"2C000000 08000000", 0, 0, "unknown operation code 44"},
        {"10000000 04000000", 0, 0, "totalLength 4 is shorter than the header"},
        {"10000000 0C000000 00000000", 0, 0, "totalLength 12 but the fields end at 8"},
        {"07000000 08000000", 0, 0, "parameter at offset 8 runs past totalLength 8"},
        {"07000000 0C000000", 0, 0, "totalLength 12 runs past the 8 bytes received"},
        {"07000000 0C000000 01000000", 8, 0, "totalLength 12 exceeds the host-bound capacity 8"},
        {"0C000000 10000000 09000000 61626300", 0, 0,
         "string count 9 at offset 8 runs past totalLength 16"},
        {"0C000000 10000000 00000000 61626300", 0, 0,
         "string count 0 at offset 8 leaves no room for the NUL"},
        {"0C000000 10000000 04000000 61626364", 0, 0,
         "string at offset 8 lacks its terminating NUL"},
        {"0C000000 10000000 04000000 61006300", 0, 0,
         "string at offset 8 holds a NUL before its end"},
        {"09000000 0C000000 02000000", 0, 0, "bool field at offset 8 holds 0x00000002"},
        {"09000000 0C000000 00010000", 0, 0, "bool field at offset 8 holds 0x00000100"},
        {"01000000 14000000 08000000 08000000 08000000", 0, 0,
         "i32* size field at offset 16 is 8, not 4"},
        {"05000000 14000000 04000000 08000000 08000000", 0, 0,
         "u64* size field at offset 8 is 4, not 8"},
        {"01000000 14000000 08000000 10000000 04000000", 0, 0,
         "buffer capacity 8 differs from its length parameter 16"},
        {"01000000 14000000 FFFFFFFF FFFFFFFF 04000000", 0, 0, "buffer length -1 is negative"},
        {"01000000 14000000 08000000 08000000 04000000", 0, 15,
         "reply of 16 bytes exceeds the guest-bound capacity 15"},
    };
    for (const auto& c : cases) {
        const HcallDecoded d = decode(c.request, nullptr, c.hostCap, c.guestCap);
        EXPECT_FALSE(d.wellFormed) << c.request << " must be refused";
        EXPECT_EQ(d.problem, c.problem) << c.request;
        EXPECT_EQ(d.text.rfind("!malformed ", 0), 0u) << "malformed lines are marked: " << d.text;
    }
    EXPECT_TRUE(decode("01000000 14000000 08000000 08000000 04000000", nullptr, 20, 16).wellFormed)
        << "a request and reply exactly at the capacities fit";
}

TEST(HcallDecode, ParseHex_AcceptsBlanksBetweenBytesOnly) {
    std::vector<uint8_t> bytes;
    EXPECT_TRUE(hcallParseHex("0a0B 0c,\t0D", bytes));
    EXPECT_EQ(bytes, (std::vector<uint8_t>{0x0A, 0x0B, 0x0C, 0x0D}));
    EXPECT_FALSE(hcallParseHex("0a 0", bytes)) << "odd digit count";
    EXPECT_FALSE(hcallParseHex("0 a", bytes)) << "blank inside a byte";
    EXPECT_FALSE(hcallParseHex("0g", bytes));
    EXPECT_EQ(hcallHex(reinterpret_cast<const uint8_t*>("\x01\xAB"), 2), "01ab");
}

}  // namespace
