// Host calls on the wire, through the device model, beyond what the golden
// corpus holds: replies no proper host builds, the limits of both shared
// buffers, and exchanges that fail or never start.

#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <string>

#include "DeviceSession.h"
#include "LogRecorder.h"

namespace {

class HcallWireTest : public ::testing::Test {
  protected:
    LogRecorder log{XLOG_LEVEL_E};  // keeps the run quiet; lines are checked elsewhere
};

TEST_F(HcallWireTest, IsAppLaunchAllowed_ReadsOnlyTheFirstByteOfTheReply) {
    struct Case {
        std::vector<uint8_t> reply;
        bool allowed;
    };
    const Case cases[] = {
        {bytes({0x02, 0xFF, 0xFF, 0xFF}), true},
        {bytes({0x00, 0xFF, 0xFF, 0xFF}), false},
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
