// The host half beyond the golden corpus: requests it refuses and why, odd replies, and
// what the dispatcher hands a handler.

#include "hcall/host/HcallHost.h"

#include <gtest/gtest.h>

#include <deque>
#include <string>
#include <vector>

namespace {

std::vector<uint8_t> hex(const std::string& text) {
    std::vector<uint8_t> bytes;
    EXPECT_TRUE(hcallParseHex(text, bytes)) << "not hex: " << text;
    return bytes;
}

// The request's strings point into its bytes, which are kept for the run.
HcallRequest parse(const std::string& request, HcallLimits limits = {}) {
    static std::deque<std::vector<uint8_t>> kept;
    kept.push_back(hex(request));
    return hcallParseRequest(kept.back().data(), kept.back().size(), limits);
}

constexpr char kProps[] = "01000000 14000000 08000000 08000000 04000000";

TEST(HcallHost, Parse_OfRequestsBreakingARule_SaysWhich) {
    const struct {
        const char *request, *problem;  // problem "" for a request that is well formed
        uint32_t host = 0, guest = 0;   // capacities, 0 for none
    } rows[] = {
        {"0C000000 1000", "request of 6 bytes is shorter than the header"},
        {"00000000 08000000", "unknown operation code 0"},
        {"2C000000 08000000", "unknown operation code 44"},
        {"10000000 04000000", "totalLength 4 is shorter than the header"},
        {"07000000 0C000000 01000000", "totalLength 12 exceeds the host-bound capacity 11", 11},
        {"07000000 0C000000 01000000", "", 12},
        {"07000000 0C000000", "totalLength 12 runs past the 8 bytes received"},
        {"07000000 08000000", "parameter at offset 8 runs past totalLength 8"},
        {"0C000000 10000000 00000000 61626300",
         "string count 0 at offset 8 leaves no room for the NUL"},
        {"0C000000 10000000 09000000 61626300",
         "string count 9 at offset 8 runs past totalLength 16"},
        {"0C000000 10000000 04000000 61626364", "string at offset 8 lacks its terminating NUL"},
        {"0C000000 10000000 04000000 61006300", "string at offset 8 holds a NUL before its end"},
        {"09000000 0C000000 02000000", "bool field at offset 8 holds 0x00000002"},
        {"09000000 0C000000 00010000", "bool field at offset 8 holds 0x00000100"},
        {"01000000 14000000 08000000 08000000 08000000",
         "i32* size field at offset 16 is 8, not 4"},
        {"05000000 14000000 04000000 08000000 08000000", "u64* size field at offset 8 is 4, not 8"},
        {"10000000 0C000000 00000000", "totalLength 12 but the fields end at 8"},
        {"01000000 14000000 FFFFFFFF FFFFFFFF 04000000", "buffer length -1 is negative"},
        {"01000000 14000000 08000000 10000000 04000000",
         "buffer capacity 8 differs from its length parameter 16"},
        {kProps, "reply of 16 bytes exceeds the guest-bound capacity 15", 0, 15},
        {kProps, "", 20, 16},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.request);
        const HcallRequest r = parse(row.request, {row.host, row.guest});
        EXPECT_EQ(hcallFaultText(r), row.problem);
        EXPECT_EQ(r.ok(), *row.problem == '\0');
        EXPECT_EQ(hcallCallText(r).rfind("!malformed ", 0) == 0, !r.ok()) << "refusals are marked";
    }
}

TEST(HcallHost, Reply_ShortOrWithStrayBytes_ReadsAsTheGuestReadsIt) {
    const char* launch = "18000000 0E000000 02000000 7000";
    const struct {
        const char *request, *reply, *text;
    } rows[] = {
        {kProps, "61626300 00000000",
         "hcallGetPropsRpc(char[8]=\"abc\", 8, i32*) -> !short reply: 8 of 16 bytes"},
        {launch, "00FFFFFF", "hcallIsAppLaunchAllowedRpc(\"p\") -> false"},
        {launch, "02000000", "hcallIsAppLaunchAllowedRpc(\"p\") -> true"},
    };
    for (const auto& row : rows) {
        const std::vector<uint8_t> reply = hex(row.reply);
        EXPECT_EQ(hcallExchangeText(parse(row.request), reply.data(), reply.size()), row.text);
    }
    HcallRequest r = parse("01000000 14000000 04000000 04000000 04000000");
    std::vector<uint8_t> out(12, 0xEE);
    r.params[0].text = "0123456789";
    ASSERT_EQ(hcallBuildReply(r, -1, out.data(), out.size()), 12u);
    EXPECT_EQ(out, hex("30313233 00000000 FFFFFFFF")) << "a long text is cut to the capacity";
    r.params[0].text = "a", r.params[2].i32 = 9;
    ASSERT_EQ(hcallBuildReply(r, 0, out.data(), out.size()), 12u);
    EXPECT_EQ(out, hex("61000000 09000000 00000000")) << "a short text is NUL-padded";
    EXPECT_EQ(hcallBuildReply(r, 0, out.data(), 11), 0u) << "11 bytes cannot hold the reply";
    ASSERT_EQ(hcallBuildReply(parse("18000000 0E000000 02000000 7000"), 2, out.data(), 4), 4u);
    EXPECT_EQ(out, hex("01000000 09000000 00000000")) << "a launch answer is a bool field";
}

class RecordingHost : public HcallHandler {
  public:
    int32_t hcallOnAppInstalledRpc(std::string_view package, std::string_view activity,
                                   std::string_view label, int32_t versionCode,
                                   std::string_view versionName, std::string_view icon,
                                   std::string_view source, bool isUpdate) override {
        for (std::string_view s : {package, activity, label}) seen += std::string(s) + "|";
        seen += std::to_string(versionCode);
        for (std::string_view s : {versionName, icon, source}) seen += "|" + std::string(s);
        seen += isUpdate ? "|1" : "|0";
        return 11;
    }
    int32_t hcallOnVibrateRpc(int32_t duration, std::string_view pkg) override {
        seen = std::to_string(duration) + "|" + std::string(pkg);
        return 12;
    }
    bool hcallIsAppLaunchAllowedRpc(std::string_view pkg) override { return pkg == "yes"; }
    int32_t malformed(const HcallRequest& request) override {
        seen = hcallFaultText(request);
        return 99;
    }
    std::string seen;
};

TEST(HcallHost, Dispatch_HandsEachEntryItsValuesAndRepliesWithItsAnswer) {
    const struct {
        const char* request;
        size_t room;
        const char *reply, *seen;
    } rows[] = {
        {"0D000000 34000000 02000000 7000 03000000 616300 02000000 6C00 F9FFFFFF 01000000 00 "
         "02000000 6900 02000000 7300 01000000",
         12, "0B000000", "p|ac|l|-7||i|s|1"},
        {"1E000000 12000000 9CFFFFFF 02000000 6100", 12, "0C000000", "-100|a"},
        {"18000000 10000000 04000000 79657300", 12, "01000000", ""},
        {"18000000 0F000000 03000000 6E6F00", 12, "00000000", ""},
        {"07000000 0C000000 05000000", 4, "00000000", ""},
        {"07000000 0C000000 05000000", 3, "", ""},
        {"09000000 0C000000 02000000", 12, "63000000", "bool field at offset 8 holds 0x00000002"},
        {kProps, 12, "63000000", "reply of 16 bytes exceeds the guest-bound capacity 12"},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.request);
        RecordingHost host;
        const std::vector<uint8_t> request = hex(row.request);
        std::vector<uint8_t> reply(row.room, 0xEE);
        reply.resize(hcallDispatch(host, request.data(), request.size(), reply.data(), row.room));
        EXPECT_EQ(reply, hex(row.reply));
        EXPECT_EQ(host.seen, row.seen);
    }
}

TEST(HcallHost, ParseHex_TakesBlanksBetweenBytesOnly) {
    std::vector<uint8_t> bytes;
    EXPECT_TRUE(hcallParseHex("0a0B c0,\tFD", bytes));
    EXPECT_EQ(hcallHex(bytes.data(), bytes.size()), "0a0bc0fd");
    for (const char* bad : {"0a 0", "0 a", "0g"}) EXPECT_FALSE(hcallParseHex(bad, bytes)) << bad;
}

}  // namespace
