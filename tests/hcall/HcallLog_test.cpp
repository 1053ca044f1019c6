// The entry and exit lines of host calls of each shape, exactly as the logger
// receives them, and no formatting when the logger does not want a line.

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <memory>
#include <string>

#include "DeviceSession.h"
#include "LogRecorder.h"

namespace {

constexpr char kSource[] = "Source/hcall/guest/HcallEnc";

std::string pointer(const void* p) {
    char text[32];
    std::snprintf(text, sizeof(text), "%p", p);
    return text;
}

class HcallLogTest : public ::testing::Test {
  protected:
    // Each call's lines: entry at I, exit at D, both under HCALL with the
    // operation's signature text, and the format that produced the text.
    void expectLines(const std::string& signature, const std::string& entryFormat,
                     const std::string& entry, const std::string& exit) {
        std::vector<LoggedLine> lines = log.lines(XLOG_MODULE_HCALL);
        ASSERT_EQ(lines.size(), 2u) << signature;
        EXPECT_EQ(lines[0].level, XLOG_LEVEL_I) << "the entry line is info";
        EXPECT_EQ(lines[1].level, XLOG_LEVEL_D) << "the exit line is debug";
        for (const LoggedLine& line : lines) {
            EXPECT_EQ(line.file, kSource);
            EXPECT_EQ(line.function, signature);
            EXPECT_GT(line.line, 0);
        }
        EXPECT_EQ(lines[0].format, entryFormat);
        EXPECT_EQ(lines[1].format, "returning [%d] from " + entryFormat);
        EXPECT_EQ(lines[0].text, entry);
        EXPECT_EQ(lines[1].text, exit);
        log.clear();
    }

    LogRecorder log;
};

TEST_F(HcallLogTest, Lines_OfEachShape_AreExact) {
    VmsgDeviceScript script;
    script.results[12] = -12;
    script.results[4] = 7;
    script.launchAllowed = true;
    HcallSession session(script);
    ASSERT_TRUE(session.connected());
    log.clear();

    hcallLaunchOrxRpc();
    expectLines("xerr_t hcallLaunchOrxRpc()", "%s()\n", "hcallLaunchOrxRpc()\n",
                "returning [0] from hcallLaunchOrxRpc()\n");

    hcallOnLocaleChangedRpc("en-US");
    expectLines("xerr_t hcallOnLocaleChangedRpc(const char *)", "%s(%s)\n",
                "hcallOnLocaleChangedRpc(en-US)\n",
                "returning [-12] from hcallOnLocaleChangedRpc(en-US)\n");

    hcallInitVolumeRpc(true, -5, 15);
    expectLines("xerr_t hcallInitVolumeRpc(bool, i32, i32)", "%s(%d, %d, %d)\n",
                "hcallInitVolumeRpc(1, -5, 15)\n",
                "returning [7] from hcallInitVolumeRpc(1, -5, 15)\n");

    hcallOnVibrateRpc(100, "");
    expectLines("xerr_t hcallOnVibrateRpc(i32, const char *)", "%s(%d, %s)\n",
                "hcallOnVibrateRpc(100, )\n", "returning [0] from hcallOnVibrateRpc(100, )\n");

    hcallIsAppLaunchAllowedRpc("com.game");
    expectLines("bool hcallIsAppLaunchAllowedRpc(const char *)", "%s(%s)\n",
                "hcallIsAppLaunchAllowedRpc(com.game)\n",
                "returning [1] from hcallIsAppLaunchAllowedRpc(com.game)\n");

    hcallOnAppInstalledRpc("p", "a", "l", 3, "v", "i", "s", false);
    expectLines(
        "xerr_t hcallOnAppInstalledRpc(const char *, const char *, const char *, i32, const char "
        "*, const char *, const char *, bool)",
        "%s(%s, %s, %s, %d, %s, %s, %s, %d)\n", "hcallOnAppInstalledRpc(p, a, l, 3, v, i, s, 0)\n",
        "returning [0] from hcallOnAppInstalledRpc(p, a, l, 3, v, i, s, 0)\n");
}

TEST_F(HcallLogTest, Lines_OfFilledParameters_ShowTheBufferBeforeAndAfterFilling) {
    VmsgDeviceScript script;
    script.propsText = "after";
    script.timeText = "tz";
    HcallSession session(script);
    ASSERT_TRUE(session.connected());
    log.clear();
    char buffer[16] = "before";
    int32_t value = 0;
    uint64_t time = 0;

    hcallGetPropsRpc(buffer, 16, &value);
    expectLines("xerr_t hcallGetPropsRpc(char *, i32, i32 *)", "%s(%s, %d, %p)\n",
                "hcallGetPropsRpc(before, 16, " + pointer(&value) + ")\n",
                "returning [0] from hcallGetPropsRpc(after, 16, " + pointer(&value) + ")\n");

    hcallGetTimeInfoRpc(&time, buffer, 16);
    expectLines("xerr_t hcallGetTimeInfoRpc(u64 *, char *, i32)", "%s(%p, %s, %d)\n",
                "hcallGetTimeInfoRpc(" + pointer(&time) + ", after, 16)\n",
                "returning [0] from hcallGetTimeInfoRpc(" + pointer(&time) + ", tz, 16)\n");

    // A buffer of capacity 0 has no byte the call may read, whatever the
    // caller's memory holds; a null target is skipped, and the result stands.
    EXPECT_EQ(hcallGetPropsRpc(buffer, 0, nullptr), 0);
    expectLines("xerr_t hcallGetPropsRpc(char *, i32, i32 *)", "%s(%.*s, %d, %p)\n",
                "hcallGetPropsRpc(, 0, (nil))\n",
                "returning [0] from hcallGetPropsRpc(, 0, (nil))\n");
    EXPECT_STREQ(buffer, "tz");
    std::strcpy(buffer, "before");
    EXPECT_EQ(hcallGetTimeInfoRpc(nullptr, buffer, 16), 0);
    EXPECT_STREQ(buffer, "tz") << "the buffer after the skipped target is still filled";
}

TEST_F(HcallLogTest, ExitLine_OfLaunchQuery_PrintsTheReplyByte) {
    VmsgDeviceScript script;
    script.replyMode = VmsgDeviceReplyMode::Raw;
    script.rawReply = bytes({0x02, 0x00, 0x00, 0x00});
    HcallSession session(script);
    ASSERT_TRUE(session.connected());
    log.clear();

    EXPECT_TRUE(hcallIsAppLaunchAllowedRpc("x"));
    ASSERT_EQ(log.texts(XLOG_MODULE_HCALL).size(), 2u);
    EXPECT_EQ(log.texts(XLOG_MODULE_HCALL)[1],
              "returning [2] from hcallIsAppLaunchAllowedRpc(x)\n");
}

TEST_F(HcallLogTest, Lines_OfRefusedCall_StopAfterTheEntryLine) {
    VmsgDeviceScript script;
    script.hostBoundCapacity = 16;
    HcallSession session(script);
    ASSERT_TRUE(session.connected());
    log.clear();

    EXPECT_EQ(hcallOnLocaleChangedRpc("too long for sixteen"), -1);
    std::vector<std::string> texts = log.texts(XLOG_MODULE_HCALL);
    ASSERT_EQ(texts.size(), 1u) << "a refused call writes nothing after its entry line";
    EXPECT_EQ(texts[0], "hcallOnLocaleChangedRpc(too long for sixteen)\n");
}

// Regression: the filled buffer was printed with a plain "%s", so host data
// without a NUL inside the buffer was read past the buffer's end.
TEST_F(HcallLogTest, ExitLine_WhenHostLeavesBufferUnterminated_StopsAtItsCapacity) {
    VmsgDeviceScript script;
    script.propsText = "ABCDEFGHIJKL";  // cut to the capacity, without a NUL
    HcallSession session(script);
    ASSERT_TRUE(session.connected());
    log.clear();
    // Capacity 8, followed by bytes that a print running past it would show.
    std::unique_ptr<char[]> buffer(new char[16]);
    std::memset(buffer.get(), 'Z', 15);
    buffer[0] = '\0';
    buffer[15] = '\0';
    int32_t value = 0;

    EXPECT_EQ(hcallGetPropsRpc(buffer.get(), 8, &value), 0);

    std::vector<LoggedLine> lines = log.lines(XLOG_MODULE_HCALL);
    ASSERT_EQ(lines.size(), 2u);
    EXPECT_EQ(lines[0].format, "%s(%s, %d, %p)\n") << "terminated data keeps the plain format";
    EXPECT_EQ(lines[1].text,
              "returning [0] from hcallGetPropsRpc(ABCDEFGH, 8, " + pointer(&value) + ")\n");
}

TEST_F(HcallLogTest, Lines_WhenLevelIsOff_AreNeverFormatted) {
    HcallSession session;
    ASSERT_TRUE(session.connected());

    log.setMaxLevel(XLOG_LEVEL_I);
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
    const std::vector<std::pair<int, int>> asked = log.asked();
    EXPECT_NE(
        std::find(asked.begin(), asked.end(), std::pair<int, int>(XLOG_MODULE_HCALL, XLOG_LEVEL_I)),
        asked.end())
        << "the entry line asks for HCALL at I";
    EXPECT_NE(
        std::find(asked.begin(), asked.end(), std::pair<int, int>(XLOG_MODULE_HCALL, XLOG_LEVEL_D)),
        asked.end())
        << "the exit line asks for HCALL at D";
}

}  // namespace
