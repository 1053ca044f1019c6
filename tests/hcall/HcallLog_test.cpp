// The entry and exit lines of host calls of every shape, exactly as the logger
// receives them; a line the logger does not want is never formatted.

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <map>
#include <string>

#include "DeviceSession.h"
#include "support/LogRecorder.h"

namespace {

std::string pointer(const void* p) {
    char text[32];
    std::snprintf(text, sizeof(text), "%p", p);
    return text;
}

// What the filled-parameter rows hand the calls.
char gBuffer[16];
int32_t gValue;
uint64_t gTime;

// Every row starts with gBuffer holding "before". The exit line's format is
// "returning [%d] from " and the entry format unless the row names another.
struct Row {
    const char* name;
    ScriptTweak tweak;
    void (*call)();
    const char* signature;
    std::string format, entry;
    std::string exit;  // empty: the call writes no exit line
    const char* exitFormat = nullptr;
};

TEST(HcallLog, Lines_OfEveryShape_AreExact) {
    const std::string v = pointer(&gValue), t = pointer(&gTime);
    const char* props = "xerr_t hcallGetPropsRpc(char *, i32, i32 *)";
    const char* time = "xerr_t hcallGetTimeInfoRpc(u64 *, char *, i32)";
    const char* locale = "xerr_t hcallOnLocaleChangedRpc(const char *)";
    const Row rows[] = {
        {"no parameters", nullptr, [] { hcallLaunchOrxRpc(); }, "xerr_t hcallLaunchOrxRpc()",
         "%s()\n", "hcallLaunchOrxRpc()\n", "returning [0] from hcallLaunchOrxRpc()\n"},
        {"string, host's result", [](VmsgDeviceScript& s) { s.results[12] = -12; },
         [] { hcallOnLocaleChangedRpc("en-US"); }, locale, "%s(%s)\n",
         "hcallOnLocaleChangedRpc(en-US)\n",
         "returning [-12] from hcallOnLocaleChangedRpc(en-US)\n"},
        {"bool and ints", [](VmsgDeviceScript& s) { s.results[4] = 7; },
         [] { hcallInitVolumeRpc(true, -5, 15); }, "xerr_t hcallInitVolumeRpc(bool, i32, i32)",
         "%s(%d, %d, %d)\n", "hcallInitVolumeRpc(1, -5, 15)\n",
         "returning [7] from hcallInitVolumeRpc(1, -5, 15)\n"},
        {"i32 before an empty string", nullptr, [] { hcallOnVibrateRpc(100, ""); },
         "xerr_t hcallOnVibrateRpc(i32, const char *)", "%s(%d, %s)\n",
         "hcallOnVibrateRpc(100, )\n", "returning [0] from hcallOnVibrateRpc(100, )\n"},
        {"eight parameters", nullptr,
         [] { hcallOnAppInstalledRpc("p", "a", "l", 3, "v", "i", "s", 0); },
         "xerr_t hcallOnAppInstalledRpc(const char *, const char *, const char *, i32, "
         "const char *, const char *, const char *, bool)",
         "%s(%s, %s, %s, %d, %s, %s, %s, %d)\n", "hcallOnAppInstalledRpc(p, a, l, 3, v, i, s, 0)\n",
         "returning [0] from hcallOnAppInstalledRpc(p, a, l, 3, v, i, s, 0)\n"},
        {"launch query prints the reply byte",
         [](VmsgDeviceScript& s) {
             s.replyMode = VmsgDeviceReplyMode::Raw;
             s.rawReply = {2, 0, 0, 0};
         },
         [] { hcallIsAppLaunchAllowedRpc("x"); }, "bool hcallIsAppLaunchAllowedRpc(const char *)",
         "%s(%s)\n", "hcallIsAppLaunchAllowedRpc(x)\n",
         "returning [2] from hcallIsAppLaunchAllowedRpc(x)\n"},
        {"buffer before and after filling", [](VmsgDeviceScript& s) { s.propsText = "after"; },
         [] { hcallGetPropsRpc(gBuffer, 16, &gValue); }, props, "%s(%s, %d, %p)\n",
         "hcallGetPropsRpc(before, 16, " + v + ")\n",
         "returning [0] from hcallGetPropsRpc(after, 16, " + v + ")\n"},
        {"u64 before the buffer", [](VmsgDeviceScript& s) { s.timeText = "tz"; },
         [] { hcallGetTimeInfoRpc(&gTime, gBuffer, 16); }, time, "%s(%p, %s, %d)\n",
         "hcallGetTimeInfoRpc(" + t + ", before, 16)\n",
         "returning [0] from hcallGetTimeInfoRpc(" + t + ", tz, 16)\n"},
        {"null target skipped, buffer still filled", [](VmsgDeviceScript& s) { s.timeText = "tz"; },
         [] { hcallGetTimeInfoRpc(nullptr, gBuffer, 16); }, time, "%s(%p, %s, %d)\n",
         "hcallGetTimeInfoRpc((nil), before, 16)\n",
         "returning [0] from hcallGetTimeInfoRpc((nil), tz, 16)\n"},
        // A buffer of capacity 0 has no byte the call may read.
        {"capacity 0 prints nothing of the buffer", [](VmsgDeviceScript& s) { s.propsText = "x"; },
         [] { hcallGetPropsRpc(gBuffer, 0, nullptr); }, props, "%s(%.*s, %d, %p)\n",
         "hcallGetPropsRpc(, 0, (nil))\n", "returning [0] from hcallGetPropsRpc(, 0, (nil))\n"},
        // Regression: the filled buffer was printed with a plain "%s", so host
        // data without a NUL in the buffer was read past its end.
        {"host leaves the buffer unterminated",
         [](VmsgDeviceScript& s) { s.propsText = "ABCDEFGHIJKL"; },
         [] {
             std::memset(gBuffer, 'Z', 15);  // what a print past the capacity would show
             gBuffer[0] = gBuffer[15] = '\0';
             hcallGetPropsRpc(gBuffer, 8, &gValue);
         },
         props, "%s(%s, %d, %p)\n", "hcallGetPropsRpc(, 8, " + v + ")\n",
         "returning [0] from hcallGetPropsRpc(ABCDEFGH, 8, " + v + ")\n",
         "returning [%d] from %s(%.*s, %d, %p)\n"},
        {"refused call stops after its entry line",
         [](VmsgDeviceScript& s) { s.hostBoundCapacity = 16; },
         [] { hcallOnLocaleChangedRpc("too long for sixteen"); }, locale, "%s(%s)\n",
         "hcallOnLocaleChangedRpc(too long for sixteen)\n", ""},
    };
    LogRecorder log;
    for (const Row& row : rows) {
        SCOPED_TRACE(row.name);
        HcallSession session(scriptWith(row.tweak));
        ASSERT_TRUE(session.connected());
        std::strcpy(gBuffer, "before");
        log.clear();
        row.call();
        const std::vector<LoggedLine> lines = log.lines(XLOG_MODULE_HCALL);
        ASSERT_EQ(lines.size(), row.exit.empty() ? 1u : 2u);
        for (const LoggedLine& line : lines) {
            EXPECT_EQ(line.file, "Source/hcall/guest/HcallEnc");
            EXPECT_EQ(line.function, row.signature);
            EXPECT_GT(line.line, 0);
        }
        EXPECT_EQ(lines[0].level, XLOG_LEVEL_I) << "the entry line is info";
        EXPECT_EQ(lines[0].format, row.format);
        EXPECT_EQ(lines[0].text, row.entry);
        if (lines.size() < 2) continue;
        EXPECT_EQ(lines[1].level, XLOG_LEVEL_D) << "the exit line is debug";
        EXPECT_EQ(lines[1].format,
                  row.exitFormat ? row.exitFormat : "returning [%d] from " + row.format);
        EXPECT_EQ(lines[1].text, row.exit);
    }
}

TEST(HcallLog, Lines_WhenLevelIsOff_AreNeverFormatted) {
    LogRecorder log(XLOG_LEVEL_I);
    HcallSession session;
    ASSERT_TRUE(session.connected());
    log.clear();
    hcallOnOrientationChangedRpc(2);
    EXPECT_EQ(log.texts(XLOG_MODULE_HCALL),
              std::vector<std::string>{"hcallOnOrientationChangedRpc(2)\n"})
        << "only the entry line passes at level I";

    log.setMaxLevel(XLOG_LEVEL_W);
    log.clear();
    hcallOnOrientationChangedRpc(3);
    EXPECT_TRUE(log.lines(XLOG_MODULE_HCALL).empty());
    EXPECT_TRUE(log.lines(XLOG_MODULE_VMSG).empty());
    const auto asked = log.asked();
    for (int level : {XLOG_LEVEL_I, XLOG_LEVEL_D})
        EXPECT_NE(
            std::find(asked.begin(), asked.end(), std::make_pair(int(XLOG_MODULE_HCALL), level)),
            asked.end())
            << "asked for HCALL at level " << level;
}

// The signature texts name each parameter's kind, so a slip in the one list
// that the encoder, the log lines and the host all derive from shows here.
TEST(HcallLog, SignatureTexts_NameTheCataloguedKinds) {
    const std::map<std::string, hcall::Kind> kinds = {
        {"const char *", hcall::Str}, {"i32", hcall::I32},     {"int", hcall::I32},
        {"xerr_t", hcall::I32},       {"bool", hcall::Bool},   {"char *", hcall::Buf},
        {"i32 *", hcall::OutI32},     {"u64 *", hcall::OutU64}};
    for (const hcall::OpInfo& op : hcall::kOps) {
        const std::string text = op.signature;
        const std::string lead =
            (op.result == hcall::Flag ? "bool " : "xerr_t ") + std::string(op.name);
        ASSERT_EQ(text.rfind(lead + "(", 0), 0u) << text;
        std::vector<hcall::Kind> named;
        for (size_t at = lead.size() + 1; at < text.size() - 1;) {
            const size_t end = text.find_first_of(",)", at);
            ASSERT_EQ(kinds.count(text.substr(at, end - at)), 1u) << text;
            named.push_back(kinds.at(text.substr(at, end - at)));
            at = end + 2;
        }
        EXPECT_EQ(named, std::vector<hcall::Kind>(op.params, op.params + op.numParams)) << text;
    }
}

}  // namespace
