// Host calls through the device model beyond the golden corpus: the limits of
// both shared buffers, replies no proper host builds, exchanges that fail or
// never start.

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

int64_t locale(size_t n) { return hcallOnLocaleChangedRpc(std::string(n, 'x').c_str()); }
void host64(VmsgDeviceScript& s) { s.hostBoundCapacity = 64; }
void guest72(VmsgDeviceScript& s) { s.guestBoundCapacity = 72; }
void rawReply(VmsgDeviceScript& s, uint8_t first) {
    s.replyMode = VmsgDeviceReplyMode::Raw;
    s.rawReply = {first, 0xFF, 0xFF, 0xFF};
}
void noDevice(VmsgDeviceScript& s) { s.openErrno = ENOENT; }

// A locale of n letters makes a request of 13 + n bytes; props with a buffer
// of n bytes a reply of 8 + n.
TEST(HcallWire, Call_AgainstTheLimitsAndFailures_IsSentOrRefused) {
    const struct {
        const char* name;
        ScriptTweak tweak;
        int64_t (*call)();
        int64_t want;
        size_t sent;  // exchanges that reached the host
    } rows[] = {
        {"request one below host-bound capacity", host64, [] { return locale(50); }, 0, 1},
        {"request at host-bound capacity", host64, [] { return locale(51); }, 0, 1},
        {"request one over host-bound capacity", host64, [] { return locale(52); }, -1, 0},
        // Regression: the reply was never compared with the guest-bound
        // capacity, so a large buffer was read from beyond the mapping.
        {"reply one below guest-bound capacity", guest72,
         [] { return int64_t(hcallGetPropsRpc(gBuffer, 63, &gValue)); }, 0, 1},
        {"reply at guest-bound capacity", guest72,
         [] { return int64_t(hcallGetPropsRpc(gBuffer, 64, &gValue)); }, 0, 1},
        {"reply one over guest-bound capacity", guest72,
         [] { return int64_t(hcallGetPropsRpc(gBuffer, 65, &gValue)); }, -1, 0},
        // Regression: a negative buffer length became a 4 GiB copy.
        {"buffer length -1", nullptr,
         [] { return int64_t(hcallGetPropsRpc(gBuffer, -1, &gValue)); }, -1, 0},
        {"buffer length INT32_MIN", nullptr,
         [] { return int64_t(hcallGetTimeInfoRpc(&gTime, gBuffer, INT32_MIN)); }, -1, 0},
        {"exchange fails: no reply is read", [](VmsgDeviceScript& s) { s.sendErrno = EPIPE; },
         [] { return int64_t(hcallGetPropsRpc(gBuffer, 8, &gValue)); }, -1, 1},
        {"launch answer is the first byte, not 0", [](VmsgDeviceScript& s) { rawReply(s, 2); },
         [] { return int64_t(hcallIsAppLaunchAllowedRpc("a")); }, 1, 1},
        {"launch answer is the first byte, 0", [](VmsgDeviceScript& s) { rawReply(s, 0); },
         [] { return int64_t(hcallIsAppLaunchAllowedRpc("a")); }, 0, 1},
        {"never connected: a header-only call", noDevice,
         [] { return int64_t(hcallLaunchOrxRpc()); }, -1, 0},
        // Chosen: a host that cannot be asked does not veto launches.
        {"never connected: the launch query", noDevice,
         [] { return int64_t(hcallIsAppLaunchAllowedRpc("a")); }, 1, 0},
    };
    LogRecorder log(XLOG_LEVEL_E);  // quiet: lines are checked in HcallLog_test
    for (const auto& row : rows) {
        SCOPED_TRACE(row.name);
        const VmsgDeviceScript script = scriptWith(row.tweak);
        HcallSession session(script);
        ASSERT_EQ(session.connected, script.openErrno == 0);
        EXPECT_EQ(row.call(), row.want);
        EXPECT_EQ(countEvents(VmsgDeviceEventKind::SendReceive), row.sent);
    }
}

// Regression: the total length was summed in 32 bits, so strings of several
// GiB wrapped it to a small number that passed the capacity test, and were
// then copied over the end of the shared buffer.
TEST(HcallWire, Request_WhoseLengthWrapsIn32Bits_IsRefusedWithNothingWritten) {
#if defined(__SANITIZE_THREAD__)
    GTEST_SKIP() << "ThreadSanitizer would shadow every byte of the 4 GiB of strings";
#endif
    // Six copies of one string: 46 + 6 * 715827890 = 2^32 + 90 bytes, in little
    // memory: one MiB of 'a' mapped over and over, then a NUL.
    const size_t length = 715827890, tile = 1 << 20, tail = length - length % tile;
    const int fd = memfd_create("huge-string", 0);
    ASSERT_EQ(ftruncate(fd, tile), 0);
    void* page = mmap(nullptr, tile, PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
    std::memset(page, 'a', tile);
    auto* s = static_cast<char*>(
        mmap(nullptr, tail + tile, PROT_NONE, MAP_PRIVATE | MAP_ANONYMOUS | MAP_NORESERVE, -1, 0));
    for (size_t at = 0; at < tail; at += tile)
        mmap(s + at, tile, PROT_READ, MAP_SHARED | MAP_FIXED, fd, 0);
    mmap(s + tail, tile, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_FIXED, fd, 0);  // own copy
    s[length] = '\0';
    close(fd);
    ASSERT_EQ(std::strlen(s), length);
    LogRecorder log(XLOG_LEVEL_E);
    HcallSession session;
    ASSERT_TRUE(session.connected);
    std::memset(g_hcall.client.mHostBoundBuf, 0xEE, 128);
    EXPECT_EQ(hcallOnAppInstalledRpc(s, s, s, 1, s, s, s, false), -1);
    EXPECT_EQ(vmsgDeviceExchanges().size(), 0u);
    EXPECT_EQ(static_cast<const uint8_t*>(g_hcall.client.mHostBoundBuf)[0], 0xEE)
        << "not even the header is written";
    munmap(s, tail + tile);
    munmap(page, tile);
}

}  // namespace
