// Host calls through the device model beyond what the golden corpus holds:
// the limits of both shared buffers, replies no proper host builds, and
// exchanges that fail or never start.

#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <string>

#include "DeviceSession.h"
#include "support/LogRecorder.h"

namespace {

char gBuffer[80];
int32_t gValue;
uint64_t gTime;

std::string letters(size_t n) { return std::string(n, 'x'); }

// Boundary rows come in threes around each limit. A locale of n letters makes
// a request of 13 + n bytes; props with a buffer of n bytes a reply of 8 + n.
TEST(HcallWire, Call_AgainstTheLimitsAndFailures_IsSentOrRefused) {
    const struct {
        const char* name;
        ScriptTweak tweak;
        int64_t (*call)();
        int64_t want;
        size_t sent;  // exchanges that reached the host
    } rows[] = {
        {"request one below host-bound capacity",
         [](VmsgDeviceScript& s) { s.hostBoundCapacity = 64; },
         [] { return int64_t(hcallOnLocaleChangedRpc(letters(50).c_str())); }, 0, 1},
        {"request at host-bound capacity", [](VmsgDeviceScript& s) { s.hostBoundCapacity = 64; },
         [] { return int64_t(hcallOnLocaleChangedRpc(letters(51).c_str())); }, 0, 1},
        {"request one over host-bound capacity",
         [](VmsgDeviceScript& s) { s.hostBoundCapacity = 64; },
         [] { return int64_t(hcallOnLocaleChangedRpc(letters(52).c_str())); }, -1, 0},
        // Regression: the expected reply was never compared with the
        // guest-bound capacity, so a large buffer was read from beyond the
        // mapping.
        {"reply one below guest-bound capacity",
         [](VmsgDeviceScript& s) { s.guestBoundCapacity = 72; },
         [] { return int64_t(hcallGetPropsRpc(gBuffer, 63, &gValue)); }, 0, 1},
        {"reply at guest-bound capacity", [](VmsgDeviceScript& s) { s.guestBoundCapacity = 72; },
         [] { return int64_t(hcallGetPropsRpc(gBuffer, 64, &gValue)); }, 0, 1},
        {"reply one over guest-bound capacity",
         [](VmsgDeviceScript& s) { s.guestBoundCapacity = 72; },
         [] { return int64_t(hcallGetPropsRpc(gBuffer, 65, &gValue)); }, -1, 0},
        // Regression: a negative buffer length became a 4 GiB copy.
        {"buffer length -1", nullptr,
         [] { return int64_t(hcallGetPropsRpc(gBuffer, -1, &gValue)); }, -1, 0},
        {"buffer length INT32_MIN", nullptr,
         [] { return int64_t(hcallGetTimeInfoRpc(&gTime, gBuffer, INT32_MIN)); }, -1, 0},
        {"exchange fails: no reply is read", [](VmsgDeviceScript& s) { s.sendErrno = EPIPE; },
         [] { return int64_t(hcallGetPropsRpc(gBuffer, 8, &gValue)); }, -1, 1},
        {"launch answer is the first byte, not 0",
         [](VmsgDeviceScript& s) {
             s.replyMode = VmsgDeviceReplyMode::Raw;
             s.rawReply = {0x02, 0xFF, 0xFF, 0xFF};
         },
         [] { return int64_t(hcallIsAppLaunchAllowedRpc("a")); }, 1, 1},
        {"launch answer is the first byte, 0",
         [](VmsgDeviceScript& s) {
             s.replyMode = VmsgDeviceReplyMode::Raw;
             s.rawReply = {0x00, 0xFF, 0xFF, 0xFF};
         },
         [] { return int64_t(hcallIsAppLaunchAllowedRpc("a")); }, 0, 1},
        {"never connected: a header-only call", [](VmsgDeviceScript& s) { s.openErrno = ENOENT; },
         [] { return int64_t(hcallLaunchOrxRpc()); }, -1, 0},
        // Chosen: a host that cannot be asked does not veto launches.
        {"never connected: the launch query", [](VmsgDeviceScript& s) { s.openErrno = ENOENT; },
         [] { return int64_t(hcallIsAppLaunchAllowedRpc("a")); }, 1, 0},
    };
    LogRecorder log(XLOG_LEVEL_E);  // keeps the run quiet; lines are checked in HcallLog_test
    for (const auto& row : rows) {
        SCOPED_TRACE(row.name);
        const VmsgDeviceScript script = scriptWith(row.tweak);
        HcallSession session(script);
        ASSERT_EQ(session.connected(), script.openErrno == 0);
        EXPECT_EQ(row.call(), row.want);
        EXPECT_EQ(countEvents(VmsgDeviceEventKind::SendReceive), row.sent);
    }
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
TEST(HcallWire, Request_WhoseLengthWrapsIn32Bits_IsRefusedWithNothingWritten) {
#if defined(__SANITIZE_THREAD__)
    GTEST_SKIP() << "ThreadSanitizer would shadow every byte of the 4 GiB of strings";
#endif
    LogRecorder log(XLOG_LEVEL_E);
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
    EXPECT_EQ(static_cast<const uint8_t*>(g_hcall.client.mHostBoundBuf)[0], 0xEE)
        << "not even the header is written";
}

}  // namespace
