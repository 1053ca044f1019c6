// Host calls from several threads share one connection: the device never sees
// two exchanges in flight, every caller gets its own reply, and reading the
// capacities never waits for an exchange.

#include <gtest/gtest.h>

#include <atomic>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include "DeviceSession.h"
#include "support/Gate.h"
#include "support/LogRecorder.h"

namespace {

TEST(HcallThreads, Calls_FromSeveralThreadsAtOnce_NeverOverlapAndEachGetsItsOwnReply) {
    LogRecorder log(XLOG_LEVEL_E);
    VmsgDeviceScript script;
    script.results = {{7, 700}, {19, 1900}, {40, 4000}};
    script.launchAllowed = false;  // unlike the answer of a call that never reached the host
    script.propsText = "props";
    script.propsValue = 123;
    script.delayUs = 20;  // holds each exchange open long enough for a collision
    HcallSession session(script);
    ASSERT_TRUE(session.connected);
    // Each thread makes a call whose reply no other thread's call gets.
    const std::vector<std::function<bool()>> callers = {
        [] { return hcallOnOrientationChangedRpc(1) == 700; },
        [] { return hcallOnVolumeChangedRpc(true, 3) == 1900; },
        [] { return hcallOnImportFilesCompletedRpc(0, "/sdcard/Download") == 4000; },
        [] { return !hcallIsAppLaunchAllowedRpc("com.example.game"); },
        [] {
            char buffer[32] = "";
            int32_t value = 0;
            return hcallGetPropsRpc(buffer, sizeof(buffer), &value) == 0 &&
                   std::string(buffer) == "props" && value == 123;
        },
    };
    constexpr int kCalls = 200;  // per thread
    Gate start;
    std::vector<int> wrong(callers.size(), 0);
    std::vector<std::thread> threads;
    for (size_t t = 0; t < callers.size(); ++t) {
        threads.emplace_back([&, t] {
            start.wait();
            for (int i = 0; i < kCalls; ++i) wrong[t] += !callers[t]();
        });
    }
    start.open();
    for (std::thread& thread : threads) thread.join();
    EXPECT_EQ(wrong, std::vector<int>(callers.size(), 0)) << "calls got another call's reply";
    EXPECT_EQ(vmsgDeviceOverlapCount(), 0u) << "two exchanges were in flight at once";
    const std::vector<VmsgDeviceExchange> exchanges = vmsgDeviceExchanges();
    EXPECT_EQ(exchanges.size(), callers.size() * kCalls);
    for (const VmsgDeviceExchange& exchange : exchanges) ASSERT_TRUE(exchange.wellFormed);
}

// Regression: the capacities were read under the exchange lock, so a caller
// waited behind a host call, which has no time limit. A reader spinning all
// through connecting also shows (under ThreadSanitizer) that it races no one.
TEST(HcallThreads, GetBufferSizes_DuringConnectAndExchanges_NeverWaits) {
    std::atomic<bool> reading{true};
    std::thread spinner([&] {
        int host = 0;
        while (reading) hcallGetBufferSizes(&host, nullptr);
    });
    HcallSession session(scriptWith([](VmsgDeviceScript& s) {
        s.hostBoundCapacity = 1000;
        s.guestBoundCapacity = 3000;
    }));
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
    int sizes[2] = {0, 0};
    std::thread reader([&] {
        hcallGetBufferSizes(nullptr, nullptr);  // a null pointer is skipped
        hcallGetBufferSizes(&sizes[0], &sizes[1]);
        answered.open();
    });
    EXPECT_TRUE(answered.wait()) << "hcallGetBufferSizes waited for the host";
    release.open();
    reader.join();
    caller.join();
    EXPECT_EQ(sizes[0], 1000);
    EXPECT_EQ(sizes[1], 3000);
}

}  // namespace
