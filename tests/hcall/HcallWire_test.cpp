// Host calls on the wire, through the device model: the exact request bytes,
// the replies as each operation reads them, every operation decoded by the
// host, and the limits of both shared buffers.

#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <functional>
#include <string>

#include "DeviceSession.h"
#include "LogRecorder.h"

namespace {

class HcallWireTest : public ::testing::Test {
  protected:
    LogRecorder log{XLOG_LEVEL_E};  // keeps the run quiet; lines are checked elsewhere
};

// The request bytes that the device received for one call.
std::vector<uint8_t> sent(const std::function<void()>& call,
                          const VmsgDeviceScript& script = VmsgDeviceScript()) {
    HcallSession session(script);
    if (!session.connected()) return {};
    call();
    return onlyExchange().request;
}

TEST_F(HcallWireTest, Request_OfTheDocumentedCalls_HasTheDocumentedBytes) {
    EXPECT_EQ(sent([] { hcallOnOrientationChangedRpc(1); }),
              bytes({0x07, 0, 0, 0, 0x0C, 0, 0, 0, 0x01, 0, 0, 0}));
    EXPECT_EQ(sent([] { hcallOnLocaleChangedRpc("abc"); }),
              bytes({0x0C, 0, 0, 0, 0x10, 0, 0, 0, 0x04, 0, 0, 0, 0x61, 0x62, 0x63, 0x00}));
    EXPECT_EQ(sent([] { hcallInitVolumeRpc(true, 5, 15); }),
              bytes({0x04, 0, 0, 0, 0x14, 0, 0, 0, 0x01, 0, 0, 0, 0x05, 0, 0, 0, 0x0F, 0, 0, 0}));
    EXPECT_EQ(sent([] { hcallOnVibrateRpc(100, "a"); }),
              bytes({0x1E, 0, 0, 0, 0x12, 0, 0, 0, 0x64, 0, 0, 0, 0x02, 0, 0, 0, 0x61, 0x00}))
        << "the i32 goes before the string, in parameter order";
    EXPECT_EQ(sent([] { hcallOnConsoleModeStateChangedRpc(false); }),
              bytes({0x2B, 0, 0, 0, 0x0C, 0, 0, 0, 0, 0, 0, 0}));
    EXPECT_EQ(sent([] { hcallOnSetLocaleCompletedRpc(-2); }),
              bytes({0x20, 0, 0, 0, 0x0C, 0, 0, 0, 0xFE, 0xFF, 0xFF, 0xFF}));
    EXPECT_EQ(sent([] { hcallStartImportFilesRpc(); }), bytes({16, 0, 0, 0, 8, 0, 0, 0}));
    EXPECT_EQ(sent([] { hcallStartExportFilesRpc(); }), bytes({17, 0, 0, 0, 8, 0, 0, 0}));
    EXPECT_EQ(sent([] { hcallLaunchOrxRpc(); }), bytes({29, 0, 0, 0, 8, 0, 0, 0}));
}

TEST_F(HcallWireTest, Request_WithSixEmptyStrings_Is46Bytes) {
    std::vector<uint8_t> expected = bytes({13, 0, 0, 0, 46, 0, 0, 0});
    const std::vector<uint8_t> empty = bytes({1, 0, 0, 0, 0});
    const std::vector<uint8_t> versionCode = bytes({7, 0, 0, 0});
    const std::vector<uint8_t> isUpdate = bytes({1, 0, 0, 0});
    for (int i = 0; i < 6; ++i) {
        expected.insert(expected.end(), empty.begin(), empty.end());
        if (i == 2) expected.insert(expected.end(), versionCode.begin(), versionCode.end());
    }
    expected.insert(expected.end(), isUpdate.begin(), isUpdate.end());

    EXPECT_EQ(sent([] { hcallOnAppInstalledRpc("", "", "", 7, "", "", "", true); }), expected);
}

TEST_F(HcallWireTest, GetProps_With64ByteBuffer_SendsSizesAndReads72Bytes) {
    VmsgDeviceScript script;
    script.propsText = "ro.kiv.version=5";
    script.propsValue = -77;
    script.results[1] = 3;
    script.guestBoundCapacity = 72;  // exactly the reply
    HcallSession session(script);
    ASSERT_TRUE(session.connected());
    char buffer[64] = "";
    int32_t value = 0;

    EXPECT_EQ(hcallGetPropsRpc(buffer, 64, &value), 3);

    EXPECT_EQ(onlyExchange().request,
              bytes({1, 0, 0, 0, 0x14, 0, 0, 0, 0x40, 0, 0, 0, 0x40, 0, 0, 0, 4, 0, 0, 0}));
    EXPECT_STREQ(buffer, "ro.kiv.version=5");
    EXPECT_EQ(value, -77);
    EXPECT_EQ(onlyExchange().reply.size(), 72u);
}

TEST_F(HcallWireTest, GetTimeInfo_With32ByteBuffer_ReadsTimeThenBufferThenResult) {
    VmsgDeviceScript script;
    script.timeValue = 0x0102030405060708ULL;
    script.timeText = "Europe/Zürich";
    script.guestBoundCapacity = 8 + 32 + 4;
    HcallSession session(script);
    ASSERT_TRUE(session.connected());
    uint64_t time = 0;
    char buffer[32] = "";

    EXPECT_EQ(hcallGetTimeInfoRpc(&time, buffer, 32), 0);

    EXPECT_EQ(onlyExchange().request,
              bytes({5, 0, 0, 0, 0x14, 0, 0, 0, 8, 0, 0, 0, 0x20, 0, 0, 0, 0x20, 0, 0, 0}));
    EXPECT_EQ(time, 0x0102030405060708ULL);
    EXPECT_STREQ(buffer, "Europe/Zürich");
}

TEST_F(HcallWireTest, Result_FromTheHost_IsReturnedUnchanged) {
    VmsgDeviceScript script;
    script.results[12] = -12345;
    script.results[28] = 100022;
    HcallSession session(script);
    ASSERT_TRUE(session.connected());
    EXPECT_EQ(hcallOnLocaleChangedRpc("de-CH"), -12345);
    EXPECT_EQ(hcallSetGoogleAdIdRpc("ad"), 100022);
}

TEST_F(HcallWireTest, IsAppLaunchAllowed_ReadsOnlyTheFirstByteOfTheReply) {
    struct Case {
        std::vector<uint8_t> reply;
        bool allowed;
    };
    const Case cases[] = {
        {bytes({0x01, 0, 0, 0}), true},
        {bytes({0x02, 0xFF, 0xFF, 0xFF}), true},
        {bytes({0x00, 0xFF, 0xFF, 0xFF}), false},
        {bytes({0x00, 0, 0, 0}), false},
    };
    for (const Case& c : cases) {
        VmsgDeviceScript script;
        script.replyMode = VmsgDeviceReplyMode::Raw;
        script.rawReply = c.reply;
        HcallSession session(script);
        ASSERT_TRUE(session.connected());
        EXPECT_EQ(hcallIsAppLaunchAllowedRpc("com.example"), c.allowed)
            << "reply starting " << int(c.reply[0]);
    }
}

// The host's own reading of every operation: what the guest encodes, the host
// decodes with the same meaning, with bytes that a text-minded encoder would
// mangle.
TEST_F(HcallWireTest, EveryOperation_WithDistinctiveArguments_DecodesOnTheHost) {
    VmsgDeviceScript script;
    script.defaultResult = -5;
    script.launchAllowed = false;
    script.propsText = "p";
    script.propsValue = -1;
    script.timeValue = 9;
    script.timeText = "t";
    const char* u = "\xC3\xA9t\xC3\xA9\xF0\x9F\x98\x80";  // "été" and an emoji
    const std::string q = "\"\\xc3\\xa9t\\xc3\\xa9\\xf0\\x9f\\x98\\x80\"";
    char props[8] = "";
    char tz[4] = "";
    int32_t value = 0;
    uint64_t time = 0;
    struct Case {
        std::function<int()> call;
        std::string decoded;
    };
    // clang-format off
    const Case cases[] = {
        {[&] { return hcallGetPropsRpc(props, 8, &value); }, "hcallGetPropsRpc(char[8]=\"p\", 8, i32*=-1) -> -5"},
        {[] { return hcallInitInputDebuggingStatusRpc(true, false); }, "hcallInitInputDebuggingStatusRpc(true, false) -> -5"},
        {[&] { return hcallInitImeStatusRpc(u); }, "hcallInitImeStatusRpc(" + q + ") -> -5"},
        {[] { return hcallInitVolumeRpc(false, -1, INT32_MIN); }, "hcallInitVolumeRpc(false, -1, -2147483648) -> -5"},
        {[&] { return hcallGetTimeInfoRpc(&time, tz, 4); }, "hcallGetTimeInfoRpc(u64*=9, char[4]=\"t\", 4) -> -5"},
        {[] { return hcallSyncInstalledAppsRpc("[{\"a\":1}]"); }, "hcallSyncInstalledAppsRpc(\"[{\\\"a\\\":1}]\") -> -5"},
        {[] { return hcallOnOrientationChangedRpc(-90); }, "hcallOnOrientationChangedRpc(-90) -> -5"},
        {[] { return hcallOnImeChangedRpc(""); }, "hcallOnImeChangedRpc(\"\") -> -5"},
        {[] { return hcallOnTextEditModeChangedRpc(true); }, "hcallOnTextEditModeChangedRpc(true) -> -5"},
        {[&] { return hcallOnActivityDisplayedRpc(u, ""); }, "hcallOnActivityDisplayedRpc(" + q + ", \"\") -> -5"},
        {[] { return hcallOnScreenshotSavedRpc("/sdcard/a b.png"); }, "hcallOnScreenshotSavedRpc(\"/sdcard/a b.png\") -> -5"},
        {[] { return hcallOnLocaleChangedRpc("en-US"); }, "hcallOnLocaleChangedRpc(\"en-US\") -> -5"},
        {[&] { return hcallOnAppInstalledRpc("p", "", u, -3, "1.0", "", "\t", true); }, "hcallOnAppInstalledRpc(\"p\", \"\", " + q + ", -3, \"1.0\", \"\", \"\\t\", true) -> -5"},
        {[] { return hcallOnAppUninstalledRpc("com.x"); }, "hcallOnAppUninstalledRpc(\"com.x\") -> -5"},
        {[] { return hcallExportFilesRpc("\\"); }, "hcallExportFilesRpc(\"\\\\\") -> -5"},
        {[] { return hcallStartImportFilesRpc(); }, "hcallStartImportFilesRpc() -> -5"},
        {[] { return hcallStartExportFilesRpc(); }, "hcallStartExportFilesRpc() -> -5"},
        {[] { return hcallSetClipboardTextRpc("line1\nline2"); }, "hcallSetClipboardTextRpc(\"line1\\nline2\") -> -5"},
        {[] { return hcallOnVolumeChangedRpc(true, 0); }, "hcallOnVolumeChangedRpc(true, 0) -> -5"},
        {[] { return hcallOnGoogleLoginCompletedRpc("a@b.c"); }, "hcallOnGoogleLoginCompletedRpc(\"a@b.c\") -> -5"},
        {[] { return hcallOnZelvaneLoginCompletedRpc(""); }, "hcallOnZelvaneLoginCompletedRpc(\"\") -> -5"},
        {[] { return hcallSetAppConfigDbParamsRpc("pkg", true, false, "", true); }, "hcallSetAppConfigDbParamsRpc(\"pkg\", true, false, \"\", true) -> -5"},
        {[] { return hcallGoogleAccountListUpdatedRpc("x@y", -1); }, "hcallGoogleAccountListUpdatedRpc(\"x@y\", -1) -> -5"},
        {[] { return int(hcallIsAppLaunchAllowedRpc("com.game")); }, "hcallIsAppLaunchAllowedRpc(\"com.game\") -> false"},
        {[] { return hcallOnCursorLocationChangedRpc(-1, 2147483647); }, "hcallOnCursorLocationChangedRpc(-1, 2147483647) -> -5"},
        {[] { return hcallOpenUrlRpc("https://x/?q=1&r=\"2\""); }, "hcallOpenUrlRpc(\"https://x/?q=1&r=\\\"2\\\"\") -> -5"},
        {[] { return hcallCreateDesktopShortcutRpc("c"); }, "hcallCreateDesktopShortcutRpc(\"c\") -> -5"},
        {[] { return hcallSetGoogleAdIdRpc("0000-1111"); }, "hcallSetGoogleAdIdRpc(\"0000-1111\") -> -5"},
        {[] { return hcallLaunchOrxRpc(); }, "hcallLaunchOrxRpc() -> -5"},
        {[] { return hcallOnVibrateRpc(-100, "v"); }, "hcallOnVibrateRpc(-100, \"v\") -> -5"},
        {[] { return hcallOnSetDeviceProfileCompletedRpc(-22); }, "hcallOnSetDeviceProfileCompletedRpc(-22) -> -5"},
        {[] { return hcallOnSetLocaleCompletedRpc(0); }, "hcallOnSetLocaleCompletedRpc(0) -> -5"},
        {[] { return hcallOnRootDeviceCompletedRpc(100001); }, "hcallOnRootDeviceCompletedRpc(100001) -> -5"},
        {[] { return hcallOnEnableInputDebuggingCompletedRpc(1); }, "hcallOnEnableInputDebuggingCompletedRpc(1) -> -5"},
        {[&] { return hcallOnInstallApkCompletedRpc(-1, u); }, "hcallOnInstallApkCompletedRpc(-1, " + q + ") -> -5"},
        {[] { return hcallOnUninstallAppCompletedRpc(2); }, "hcallOnUninstallAppCompletedRpc(2) -> -5"},
        {[] { return hcallOnLaunchActivityCompletedRpc(3); }, "hcallOnLaunchActivityCompletedRpc(3) -> -5"},
        {[] { return hcallOnEnableAdbCompletedRpc(4); }, "hcallOnEnableAdbCompletedRpc(4) -> -5"},
        {[] { return hcallOnClearAppDataCompletedRpc(5); }, "hcallOnClearAppDataCompletedRpc(5) -> -5"},
        {[] { return hcallOnImportFilesCompletedRpc(-13, ""); }, "hcallOnImportFilesCompletedRpc(-13, \"\") -> -5"},
        {[] { return hcallOnAppNotificationReceivedRpc("{}"); }, "hcallOnAppNotificationReceivedRpc(\"{}\") -> -5"},
        {[] { return hcallSetUsageStatsUpdateIntervalRpc(-60); }, "hcallSetUsageStatsUpdateIntervalRpc(-60) -> -5"},
        {[] { return hcallOnConsoleModeStateChangedRpc(true); }, "hcallOnConsoleModeStateChangedRpc(true) -> -5"},
    };
    // clang-format on
    static_assert(sizeof(cases) / sizeof(cases[0]) == hcall::kNumOps, "one case per operation");

    HcallSession session(script);
    ASSERT_TRUE(session.connected());
    for (uint32_t code = 1; code <= hcall::kNumOps; ++code) {
        const Case& c = cases[code - 1];
        vmsgDeviceReset();
        vmsgDeviceConfigure(script);
        int result = c.call();
        VmsgDeviceExchange exchange = onlyExchange();
        EXPECT_EQ(exchange.opCode, code) << c.decoded;
        EXPECT_TRUE(exchange.wellFormed) << c.decoded << ": " << exchange.problem;
        EXPECT_EQ(exchange.text, c.decoded);
        EXPECT_EQ(result, code == 24 ? 0 : -5) << c.decoded;
    }
    EXPECT_EQ(value, -1);
    EXPECT_EQ(time, 9u);
    EXPECT_STREQ(props, "p");
    EXPECT_STREQ(tz, "t");
}

TEST_F(HcallWireTest, Request_AtHostBoundCapacity_IsSentAndOneByteMoreIsRefused) {
    VmsgDeviceScript script;
    script.hostBoundCapacity = 64;
    HcallSession session(script);
    ASSERT_TRUE(session.connected());
    const std::string fits(64 - 13, 'x');
    const std::string tooLong(64 - 12, 'y');

    EXPECT_EQ(hcallOnLocaleChangedRpc(fits.c_str()), 0);
    ASSERT_EQ(vmsgDeviceExchanges().size(), 1u);
    EXPECT_EQ(vmsgDeviceExchanges()[0].request.size(), 64u);
    std::vector<uint8_t> before(64);
    std::memcpy(before.data(), g_hcall.client.mHostBoundBuf, 64);

    EXPECT_EQ(hcallOnLocaleChangedRpc(tooLong.c_str()), -1);
    EXPECT_EQ(vmsgDeviceExchanges().size(), 1u) << "nothing is sent";
    EXPECT_EQ(std::memcmp(before.data(), g_hcall.client.mHostBoundBuf, 64), 0)
        << "nothing is written";
}

// Regression: the expected reply was never compared with the guest-bound
// capacity, so a large filled buffer was read from beyond the mapping.
TEST_F(HcallWireTest, Reply_LargerThanGuestBoundCapacity_IsRefusedBeforeSending) {
    VmsgDeviceScript script;
    script.guestBoundCapacity = 72;
    script.propsText = "x";
    HcallSession session(script);
    ASSERT_TRUE(session.connected());
    char buffer[65] = "";
    int32_t value = 5;

    EXPECT_EQ(hcallGetPropsRpc(buffer, 64, &value), 0) << "64 + 4 + 4 bytes fit exactly";
    EXPECT_EQ(hcallGetPropsRpc(buffer, 65, &value), -1) << "one byte more does not";
    EXPECT_EQ(vmsgDeviceExchanges().size(), 1u);
}

// Regression: a negative buffer length became a 4 GiB copy out of the reply.
TEST_F(HcallWireTest, FilledBuffer_WithNegativeLength_IsRefusedBeforeSending) {
    HcallSession session;
    ASSERT_TRUE(session.connected());
    char buffer[4] = "";
    int32_t value = 0;
    uint64_t time = 0;

    EXPECT_EQ(hcallGetPropsRpc(buffer, -1, &value), -1);
    EXPECT_EQ(hcallGetTimeInfoRpc(&time, buffer, INT32_MIN), -1);
    EXPECT_EQ(vmsgDeviceExchanges().size(), 0u);
}

// A string of `length` bytes of 'a' without using that much memory: one
// small shared page run mapped over and over, then a NUL.
class HugeString {
  public:
    explicit HugeString(size_t length) {
        const size_t chunk = 1 << 20;
        size_ = (length / chunk + 1) * chunk;
        int fd = memfd_create("huge-string", 0);
        if (fd < 0 || ftruncate(fd, chunk) != 0) return;
        void* tile = mmap(nullptr, chunk, PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
        std::memset(tile, 'a', chunk);
        munmap(tile, chunk);
        base_ = static_cast<char*>(
            mmap(nullptr, size_, PROT_NONE, MAP_PRIVATE | MAP_ANONYMOUS | MAP_NORESERVE, -1, 0));
        for (size_t at = 0; at + chunk <= length; at += chunk)
            mmap(base_ + at, chunk, PROT_READ, MAP_SHARED | MAP_FIXED, fd, 0);
        const size_t tail = length - length % chunk;
        mmap(base_ + tail, chunk, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS | MAP_FIXED,
             -1, 0);
        std::memset(base_ + tail, 'a', length % chunk);
        close(fd);
    }
    ~HugeString() {
        if (base_) munmap(base_, size_);
    }
    const char* c_str() const { return base_; }

  private:
    char* base_ = nullptr;
    size_t size_ = 0;
};

// Regression: the total length was summed in 32 bits, so strings of several
// GiB wrapped it to a small number that passed the capacity test, and the
// strings were then copied over the end of the shared buffer.
TEST_F(HcallWireTest, Request_WhoseLengthWrapsIn32Bits_IsRefusedWithNothingWritten) {
#if defined(__SANITIZE_THREAD__)
    GTEST_SKIP() << "ThreadSanitizer would shadow every byte of the 4 GiB of strings";
#endif
    // Six copies of one string: 46 + 6 * 715827890 = 2^32 + 90 bytes.
    const size_t length = 715827890;
    HugeString huge(length);
    ASSERT_NE(huge.c_str(), nullptr);
    ASSERT_EQ(std::strlen(huge.c_str()), length);
    HcallSession session;
    ASSERT_TRUE(session.connected());
    std::memset(g_hcall.client.mHostBoundBuf, 0xEE, 128);
    const char* s = huge.c_str();

    EXPECT_EQ(hcallOnAppInstalledRpc(s, s, s, 1, s, s, s, false), -1);

    EXPECT_EQ(vmsgDeviceExchanges().size(), 0u);
    const uint8_t* buffer = static_cast<const uint8_t*>(g_hcall.client.mHostBoundBuf);
    EXPECT_EQ(buffer[0], 0xEE) << "not even the header is written";
}

TEST_F(HcallWireTest, Call_WhenTheExchangeFails_ReturnsFailure) {
    VmsgDeviceScript script;
    script.sendErrno = EPIPE;
    HcallSession session(script);
    ASSERT_TRUE(session.connected());
    char buffer[8] = "keep";
    int32_t value = 42;

    EXPECT_EQ(hcallOnLocaleChangedRpc("fr"), -1);
    EXPECT_EQ(hcallGetPropsRpc(buffer, 8, &value), -1);
    EXPECT_STREQ(buffer, "keep") << "no reply is read";
    EXPECT_EQ(value, 42);
}

TEST_F(HcallWireTest, Call_WhenNeverConnected_IsRefused) {
    HcallSession session([] {
        VmsgDeviceScript script;
        script.openErrno = ENOENT;
        return script;
    }());
    ASSERT_FALSE(session.connected());

    EXPECT_EQ(hcallLaunchOrxRpc(), -1) << "a header-only call fits no buffer at all";
    EXPECT_EQ(hcallOnLocaleChangedRpc("en"), -1);
    // Chosen: a host that cannot be asked does not veto launches.
    EXPECT_TRUE(hcallIsAppLaunchAllowedRpc("com.example"));
    EXPECT_EQ(vmsgDeviceEvents().size(), 1u) << "only the failed open reached the device";
}

TEST_F(HcallWireTest, GetBufferSizes_ReportsCapacitiesAndSkipsNullPointers) {
    VmsgDeviceScript script;
    script.hostBoundCapacity = 1000;
    script.guestBoundCapacity = 3000;
    HcallSession session(script);
    ASSERT_TRUE(session.connected());
    int host = 0;
    int guest = 0;

    hcallGetBufferSizes(&host, &guest);
    EXPECT_EQ(host, 1000);
    EXPECT_EQ(guest, 3000);
    hcallGetBufferSizes(nullptr, nullptr);
    host = 0;
    hcallGetBufferSizes(&host, nullptr);
    EXPECT_EQ(host, 1000);
}

}  // namespace
