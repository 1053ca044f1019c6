// Encode-and-exchange cost of host calls, one benchmark per operation shape,
// against the in-process device model. Every allocation in the process is
// counted, so "allocs/call" shows what one host call costs the heap (the
// device model records nothing here, so its own share is zero too).

#include <benchmark/benchmark.h>

#include <atomic>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <new>
#include <string>

#include "VmsgDeviceModel.h"
#include "hcall/guest/HcallEnc.h"
#include "xpl/Xlog.h"

namespace {

std::atomic<long> gAllocations{0};

}  // namespace

// Every path to the heap is counted: operator new ends in malloc, and C code
// calls malloc, calloc and realloc directly.
extern "C" void* __libc_malloc(size_t);
extern "C" void* __libc_calloc(size_t, size_t);
extern "C" void* __libc_realloc(void*, size_t);
extern "C" void* malloc(size_t size) {
    gAllocations.fetch_add(1, std::memory_order_relaxed);
    return __libc_malloc(size);
}
extern "C" void* calloc(size_t count, size_t size) {
    gAllocations.fetch_add(1, std::memory_order_relaxed);
    return __libc_calloc(count, size);
}
extern "C" void* realloc(void* old, size_t size) {
    gAllocations.fetch_add(1, std::memory_order_relaxed);
    return __libc_realloc(old, size);
}

namespace {

// A logger that wants lines up to a level and formats them into a stack
// buffer, as a sink would, without keeping them.
std::atomic<int> gLogLevel{XLOG_LEVEL_E};
int benchShouldLog(int /*module*/, int level) { return level <= gLogLevel.load() ? 1 : 0; }
__attribute__((format(printf, 6, 7))) void benchPrint(int, int, const char*, const char*, int,
                                                      const char* format, ...) {
    char line[512];
    va_list args;
    va_start(args, format);
    std::vsnprintf(line, sizeof(line), format, args);
    va_end(args);
    benchmark::DoNotOptimize(line);
}

bool connect() {
    static const bool connected = [] {
        const XlogLogger logger = {benchShouldLog, benchPrint};
        xlogLibInit(&logger, "", "");
        VmsgDeviceScript script;
        script.record = false;
        script.propsText = "ro.kiv.version=5.21";
        vmsgDeviceConfigure(script);
        return hcallLibInitGuest() == XERR_SUCCESS;
    }();
    return connected;
}

// Runs `call` per iteration at the given log level and reports the
// allocations per call.
template <typename Call>
void run(benchmark::State& state, Call call) {
    if (!connect()) {
        state.SkipWithError("no connection to the device model");
        return;
    }
    gLogLevel = int(state.range(0));
    call();  // warm-up: first-use allocations of the C library are not the call's
    long before = gAllocations.load();
    for (auto _ : state) benchmark::DoNotOptimize(call());
    state.counters["allocs/call"] = benchmark::Counter(double(gAllocations.load() - before),
                                                       benchmark::Counter::kAvgIterations);
}

const std::string kClipboard(4096, 'c');

void HeaderOnly(benchmark::State& s) {
    run(s, [] { return hcallLaunchOrxRpc(); });
}
void OneInt(benchmark::State& s) {
    run(s, [] { return hcallOnOrientationChangedRpc(1); });
}
void ShortString(benchmark::State& s) {
    run(s, [] { return hcallOnLocaleChangedRpc("en-US"); });
}
void String4KiB(benchmark::State& s) {
    run(s, [] { return hcallSetClipboardTextRpc(kClipboard.c_str()); });
}
void EightParams(benchmark::State& s) {
    run(s, [] {
        return hcallOnAppInstalledRpc("com.example.game", "com.example.game.MainActivity",
                                      "Example Game", 42, "1.2.3", "/data/icons/game.png",
                                      "com.android.vending", true);
    });
}
void FilledBuffer(benchmark::State& s) {
    run(s, [] {
        char buffer[256] = "";
        int32_t value = 0;
        return hcallGetPropsRpc(buffer, sizeof(buffer), &value);
    });
}
void LaunchQuery(benchmark::State& s) {
    run(s, [] { return hcallIsAppLaunchAllowedRpc("com.example.game"); });
}

// Shows that the counter sees allocations at all: one per iteration.
void CounterCheck(benchmark::State& s) {
    run(s, [] {
        int* p = new int(1);
        benchmark::DoNotOptimize(p);
        int value = *p;
        delete p;
        return value;
    });
}
BENCHMARK(CounterCheck)->Arg(XLOG_LEVEL_E);

// Argument: the highest log level wanted. E: both lines suppressed; I: the
// entry line formatted (the service's default); D: both lines formatted.
#define HCALL_BENCH(name) \
    BENCHMARK(name)->ArgName("level")->Arg(XLOG_LEVEL_E)->Arg(XLOG_LEVEL_I)->Arg(XLOG_LEVEL_D)
HCALL_BENCH(HeaderOnly);
HCALL_BENCH(OneInt);
HCALL_BENCH(ShortString);
HCALL_BENCH(String4KiB);
HCALL_BENCH(EightParams);
HCALL_BENCH(FilledBuffer);
HCALL_BENCH(LaunchQuery);

}  // namespace

BENCHMARK_MAIN();
