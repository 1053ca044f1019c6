// Host calls beyond the golden corpus: the limits of both shared buffers, odd replies,
// exchanges that fail or never start, and callers on several threads.

#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <cerrno>
#include <cstring>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include "DeviceSession.h"
#include "support/Gate.h"
#include "support/LogRecorder.h"

namespace {

char gBuffer[80];
int32_t gValue;
uint64_t gTime;

int64_t locale(size_t n) { return hcallOnLocaleChangedRpc(std::string(n, 'x').c_str()); }
int64_t props(int32_t n) { return hcallGetPropsRpc(gBuffer, n, &gValue); }
int64_t launch() { return hcallIsAppLaunchAllowedRpc("a"); }
void host64(VmsgDeviceScript& s) { s.hostBoundCapacity = 64; }
void guest72(VmsgDeviceScript& s) { s.guestBoundCapacity = 72; }
void rawReply(VmsgDeviceScript& s, uint8_t first) {
    s.replyMode = VmsgDeviceReplyMode::Raw;
    s.rawReply = {first, 0xFF, 0xFF, 0xFF};
}

// 715827890 bytes of 'a', then a NUL, in little memory: one MiB mapped over and over.
[[maybe_unused]] const char* huge() {
    const size_t length = 715827890, tile = 1 << 20, tail = length - length % tile;
    const int fd = memfd_create("huge-string", 0);
    if (ftruncate(fd, tile) != 0) return "";
    std::memset(mmap(nullptr, tile, PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0), 'a', tile);
    auto* s = static_cast<char*>(
        mmap(nullptr, tail + tile, PROT_NONE, MAP_PRIVATE | MAP_ANONYMOUS | MAP_NORESERVE, -1, 0));
    for (size_t at = 0; at < tail; at += tile)
        mmap(s + at, tile, PROT_READ, MAP_SHARED | MAP_FIXED, fd, 0);
    mmap(s + tail, tile, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_FIXED, fd, 0);  // own copy
    s[length] = '\0';
    close(fd);
    return s;
}

// A locale of n letters makes a request of 13 + n bytes; props with a buffer
// of n bytes a reply of 8 + n.
TEST(HcallWire, Call_AgainstTheLimitsAndFailures_IsSentOrRefused) {
    const struct {
        const char* name;
        ScriptTweak tweak;
        int64_t (*call)();
        int64_t want;
        size_t sent;  // exchanges that reached the host
        const char* errors = "";
    } rows[] =
    { {"request at host-bound capacity", host64, [] { return locale(51); }, 0, 1},
      {"request one over host-bound capacity", host64, [] { return locale(52); }, -1, 0,
       "void *VmsgGuestClient::getHostBoundBuffer(uint32_t):119 len 65, mMaxHostBoundSize 64|"},
      // Regression: an unchecked reply length read a large buffer from beyond the mapping.
      {"reply at guest-bound capacity", guest72, [] { return props(64); }, 0, 1},
      {"reply one over guest-bound capacity", guest72, [] { return props(65); }, -1, 0,
       "xerr_t hcallGetPropsRpc(char *, i32, i32 *): reply of 73 bytes, mMaxGuestBoundSize 72|"},
      // Regression: a negative buffer length became a 4 GiB copy.
      {"buffer length -1", nullptr, [] { return props(-1); }, -1, 0,
       "xerr_t hcallGetPropsRpc(char *, i32, i32 *): negative buffer length|"},
      {"buffer length INT32_MIN", nullptr,
       [] { return int64_t(hcallGetTimeInfoRpc(&gTime, gBuffer, INT32_MIN)); }, -1, 0,
       "xerr_t hcallGetTimeInfoRpc(u64 *, char *, i32): negative buffer length|"},
      {"exchange fails", [](VmsgDeviceScript& s) { s.sendErrno = EPIPE; }, [] { return props(8); },
       -1, 1,
       "void *VmsgGuestClient::processRequest(void *, uint32_t): service hcal: SEND_RECEIVE ioctl "
       "failed: ret -1, errno 32|"},
      // The launch answer is the reply's first byte alone.
      {"launch, reply byte 2", [](VmsgDeviceScript& s) { rawReply(s, 2); }, launch, 1, 1},
      {"launch, reply byte 0", [](VmsgDeviceScript& s) { rawReply(s, 0); }, launch, 0, 1},
      // Chosen: a host that cannot be asked does not veto launches.
      {"unconnected, the launch query", [](VmsgDeviceScript& s) { s.openErrno = ENOENT; }, launch,
       1, 0,
       "bool VmsgGuestClient::connect(VmsgServiceId): service hcal: open failed for /dev/kivvmsg|"
       "void *VmsgGuestClient::getHostBoundBuffer(uint32_t): service hcal: not connected|"},
#if !defined(__SANITIZE_THREAD__)  // which would shadow every byte of the 4 GiB of strings
      // Regression: a length summed in 32 bits wrapped to a small one and the strings were
      // copied past the shared buffer. Six make 46 + 6 * 715827890 = 2^32 + 90 bytes.
      {"request whose length wraps in 32 bits", nullptr,
       [] {
           const char* s = huge();
           return int64_t(hcallOnAppInstalledRpc(s, s, s, 1, s, s, s, false));
       },
       -1, 0,
       "xerr_t hcallOnAppInstalledRpc(const char *, const char *, const char *, i32, const char *, "
       "const char *, const char *, bool): request of 4294967386 bytes, mMaxHostBoundSize 65536|"},
#endif
    };
    LogRecorder log(XLOG_LEVEL_E);
    for (const auto& row : rows) {
        SCOPED_TRACE(row.name);
        log.clear();
        const VmsgDeviceScript script = scriptWith(row.tweak);
        HcallSession session(script);
        ASSERT_EQ(session.connected, script.openErrno == 0);
        auto* request = static_cast<uint8_t*>(g_hcall.client.mHostBoundBuf);
        if (session.connected) request[0] = 0xEE;
        EXPECT_EQ(row.call(), row.want);
        EXPECT_EQ(vmsgDeviceExchanges().size(), row.sent);
        EXPECT_TRUE(!session.connected || row.sent > 0 || request[0] == 0xEE) << "written";
        std::string errors;
        for (int module : {XLOG_MODULE_VMSG, XLOG_MODULE_HCALL})
            for (const LoggedLine& line : log.lines(module)) {
                errors += line.text + "|";
                EXPECT_EQ(line.function.find("VmsgGuestClient::") == std::string::npos,
                          module == XLOG_MODULE_HCALL)
                    << "module of " << line.text;
            }
        EXPECT_EQ(errors, row.errors);
    }
}

TEST(HcallThreads, Calls_FromSeveralThreadsAtOnce_NeverOverlapAndEachGetsItsOwnReply) {
    LogRecorder log(XLOG_LEVEL_E);
    VmsgDeviceScript script;
    script.results = {{7, 700}, {40, 4000}};
    script.launchAllowed = false;  // unlike the answer of a call that never reached the host
    script.propsText = "props";
    script.propsValue = 123;
    script.delayUs = 20;  // holds each exchange open long enough for a collision
    HcallSession session(script);
    ASSERT_TRUE(session.connected);
    const std::vector<std::function<bool()>> callers = {
        [] { return hcallOnOrientationChangedRpc(1) == 700; },
        [] { return hcallOnImportFilesCompletedRpc(0, "/sdcard/Download") == 4000; },
        [] { return !hcallIsAppLaunchAllowedRpc("com.example.game"); },
        [] {
            char buffer[32] = "";
            int32_t value = 0;
            return hcallGetPropsRpc(buffer, sizeof(buffer), &value) == 0 &&
                   std::string(buffer) == "props" && value == 123;
        },
    };
    Gate start;
    std::vector<int> wrong(callers.size(), 0);
    std::vector<std::thread> threads;
    for (size_t t = 0; t < callers.size(); ++t)
        threads.emplace_back([&, t] {
            start.wait();
            for (int i = 0; i < 200; ++i) wrong[t] += !callers[t]();  // 200 calls per thread
        });
    start.open();
    for (std::thread& thread : threads) thread.join();
    EXPECT_EQ(wrong, std::vector<int>(callers.size(), 0)) << "calls got another call's reply";
    EXPECT_EQ(vmsgDeviceOverlapCount(), 0u) << "two exchanges were in flight at once";
    for (const VmsgDeviceExchange& exchange : vmsgDeviceExchanges())
        ASSERT_TRUE(exchange.wellFormed);
}

// Regression: capacities read under the exchange lock waited behind an endless host call.
// A reader spinning through connecting shows (under ThreadSanitizer) it races no one.
TEST(HcallThreads, GetBufferSizes_DuringConnectAndExchanges_NeverWaits) {
    LogRecorder quiet(XLOG_LEVEL_E - 1);  // refuses every line
    std::atomic<bool> reading{true};
    std::thread spinner([&] {  // and a query, which the connect keeps out of its way
        for (int host = 0, n = 0; reading && n < 100000; ++n, hcallIsAppLaunchAllowedRpc("a"))
            hcallGetBufferSizes(&host, nullptr);
    });
    HcallSession session(scriptWith(
        [](VmsgDeviceScript& s) { s.hostBoundCapacity = 1000, s.guestBoundCapacity = 3000; }));
    reading = false;
    spinner.join();
    ASSERT_TRUE(session.connected);
    Gate inHost, release, answered;
    vmsgDeviceSetHostHook([&](uint32_t) {
        inHost.open();
        release.wait(2 * kGateTolerance);  // outlasts the reader's wait below
    });
    std::thread caller([] { hcallOnOrientationChangedRpc(1); });
    ASSERT_TRUE(inHost.wait());
    std::array<int, 2> sizes{};
    std::thread reader([&] {
        hcallGetBufferSizes(nullptr, nullptr);  // a null pointer is skipped
        hcallGetBufferSizes(&sizes[0], &sizes[1]);
        answered.open();
    });
    EXPECT_TRUE(answered.wait()) << "hcallGetBufferSizes waited for the host";
    release.open();
    reader.join();
    caller.join();
    EXPECT_EQ(sizes, (std::array<int, 2>{1000, 3000}));
}

}  // namespace
