// Entry and exit lines of host calls of every shape, exactly as the logger receives them.

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <string>

#include "DeviceSession.h"
#include "support/LogRecorder.h"

namespace {

// What the filled-parameter rows hand the calls; gBuffer starts each row as "before".
char gBuffer[16];
int32_t gValue;
uint64_t gTime;

TEST(HcallLog, Lines_OfEveryShape_AreExact) {
    char pv[32], pt[32];
    std::snprintf(pv, sizeof(pv), "%p", static_cast<void*>(&gValue));
    std::snprintf(pt, sizeof(pt), "%p", static_cast<void*>(&gTime));
    const std::string v = pv, t = pt;
    const char* props = "xerr_t hcallGetPropsRpc(char *, i32, i32 *)";
    const char* time = "xerr_t hcallGetTimeInfoRpc(u64 *, char *, i32)";
    constexpr int kNoExit = INT32_MIN;  // refused: no exit line
    const struct {
        const char* name;
        ScriptTweak tweak;
        void (*call)();
        const char* signature;
        std::string format, entry;
        int result;                        // shown by the exit line
        std::string after = "";            // the exit line's arguments when not the entry's
        const char* exitFormat = nullptr;  // when not "returning [%d] from " + format
    } rows[] = {
        {"no parameters", nullptr, [] { hcallLaunchOrxRpc(); }, "xerr_t hcallLaunchOrxRpc()",
         "%s()\n", "hcallLaunchOrxRpc()\n", 0},
        {"bool and ints, host's result", [](VmsgDeviceScript& s) { s.results[4] = -7; },
         [] { hcallInitVolumeRpc(true, -5, 15); }, "xerr_t hcallInitVolumeRpc(bool, i32, i32)",
         "%s(%d, %d, %d)\n", "hcallInitVolumeRpc(1, -5, 15)\n", -7},
        {"i32 before an empty string", nullptr, [] { hcallOnVibrateRpc(100, ""); },
         "xerr_t hcallOnVibrateRpc(i32, const char *)", "%s(%d, %s)\n",
         "hcallOnVibrateRpc(100, )\n", 0},
        {"launch query prints the reply byte",
         [](VmsgDeviceScript& s) {
             s.replyMode = VmsgDeviceReplyMode::Raw;
             s.rawReply = {2, 0, 0, 0};
         },
         [] { hcallIsAppLaunchAllowedRpc("x"); }, "bool hcallIsAppLaunchAllowedRpc(const char *)",
         "%s(%s)\n", "hcallIsAppLaunchAllowedRpc(x)\n", 2},
        {"buffer before and after filling", [](VmsgDeviceScript& s) { s.propsText = "after"; },
         [] { hcallGetPropsRpc(gBuffer, 16, &gValue); }, props, "%s(%s, %d, %p)\n",
         "hcallGetPropsRpc(before, 16, " + v + ")\n", 0,
         "hcallGetPropsRpc(after, 16, " + v + ")\n"},
        {"u64 before the buffer, NUL in the last byte",
         [](VmsgDeviceScript& s) { s.timeText = "Europe/Brussels"; },
         [] { hcallGetTimeInfoRpc(&gTime, gBuffer, 16); }, time, "%s(%p, %s, %d)\n",
         "hcallGetTimeInfoRpc(" + t + ", before, 16)\n", 0,
         "hcallGetTimeInfoRpc(" + t + ", Europe/Brussels, 16)\n"},
        {"null target skipped, buffer still filled", [](VmsgDeviceScript& s) { s.timeText = "tz"; },
         [] { hcallGetTimeInfoRpc(nullptr, gBuffer, 16); }, time, "%s(%p, %s, %d)\n",
         "hcallGetTimeInfoRpc((nil), before, 16)\n", 0, "hcallGetTimeInfoRpc((nil), tz, 16)\n"},
        {"capacity 0, no buffer text", nullptr, [] { hcallGetPropsRpc(gBuffer, 0, nullptr); },
         props, "%s(%.*s, %d, %p)\n", "hcallGetPropsRpc(, 0, (nil))\n", 0},
        // Regression: a plain "%s" read past a buffer the host left unterminated.
        {"host leaves the buffer unterminated",
         [](VmsgDeviceScript& s) { s.propsText = "ABCDEFGHIJKL"; },
         [] {
             std::memset(gBuffer, 'Z', 15);  // what a print past the capacity would show
             gBuffer[0] = gBuffer[15] = '\0';
             hcallGetPropsRpc(gBuffer, 8, &gValue);
         },
         props, "%s(%s, %d, %p)\n", "hcallGetPropsRpc(, 8, " + v + ")\n", 0,
         "hcallGetPropsRpc(ABCDEFGH, 8, " + v + ")\n", "returning [%d] from %s(%.*s, %d, %p)\n"},
        {"refused call stops after its entry line",
         [](VmsgDeviceScript& s) { s.hostBoundCapacity = 16; },
         [] { hcallOnLocaleChangedRpc("too long for sixteen"); },
         "xerr_t hcallOnLocaleChangedRpc(const char *)", "%s(%s)\n",
         "hcallOnLocaleChangedRpc(too long for sixteen)\n", kNoExit},
    };
    LogRecorder log;
    for (const auto& row : rows) {
        SCOPED_TRACE(row.name);
        HcallSession session(scriptWith(row.tweak));
        ASSERT_TRUE(session.connected);
        std::strcpy(gBuffer, "before");
        log.clear();
        row.call();
        const std::vector<LoggedLine> lines = log.lines(XLOG_MODULE_HCALL);
        ASSERT_EQ(lines.size(), row.result == kNoExit ? 1u : 2u);
        for (const LoggedLine& line : lines) {
            EXPECT_EQ(line.file, "Source/hcall/guest/HcallEnc");
            EXPECT_EQ(line.function, row.signature);
            EXPECT_GT(line.line, 0);
        }
        EXPECT_EQ(levelLetter(lines[0].level) + lines[0].format + lines[0].text,
                  "I" + row.format + row.entry);
        if (lines.size() < 2) continue;
        EXPECT_EQ(levelLetter(lines[1].level) + lines[1].format,
                  "D" + (row.exitFormat ? row.exitFormat : "returning [%d] from " + row.format));
        EXPECT_EQ(lines[1].text, "returning [" + std::to_string(row.result) + "] from " +
                                     (row.after.empty() ? row.entry : row.after));
    }
}

TEST(HcallLog, Lines_WhenLevelIsOff_AreNeverFormatted) {
    HcallSession session;
    ASSERT_TRUE(session.connected);
    LogRecorder log(XLOG_LEVEL_W);
    hcallOnOrientationChangedRpc(3);
    EXPECT_TRUE(log.lines(XLOG_MODULE_HCALL).empty());
    const auto asked = log.asked();
    for (int level : {XLOG_LEVEL_I, XLOG_LEVEL_D})
        EXPECT_GT(std::count(asked.begin(), asked.end(), std::pair(+XLOG_MODULE_HCALL, level)), 0)
            << "asked for HCALL at level " << level;
}

// Each signature text names its parameters' kinds ("int" and "xerr_t" are
// i32), so a slip in the list the encoder, the lines and the host share shows.
TEST(HcallLog, SignatureTexts_NameTheCataloguedKinds) {
    const char* kinds[] = {"const char *", "i32", "bool", "char *", "i32 *", "u64 *"};
    for (const hcall::OpInfo& op : hcall::kOps) {
        std::string want = (op.result == hcall::Flag ? "bool " : "xerr_t ") + std::string(op.name);
        for (int i = 0; i < op.numParams; ++i)
            want += (i ? ", " : "(") + std::string(kinds[op.params[i]]);
        std::string signature = op.signature;  // <regex> trips GCC's warnings under ASan
        for (const std::string alias : {"int", "xerr_t"})
            for (size_t at = signature.find('(');
                 (at = signature.find(alias, at)) != std::string::npos; ++at)
                if (strchr("( ", signature[at - 1]) && strchr(",)", signature[at + alias.size()]))
                    signature.replace(at, alias.size(), "i32");
        EXPECT_EQ(signature, want + (op.numParams ? ")" : "()"));
    }
}

}  // namespace
