// What the library itself adds to a host call, one row per operation shape,
// with the device answering at once (the model's fast answers: nothing read,
// checked or recorded), beside the shape's design floor (HcallFloor.h) and
// beside the whole request written with memcpy and rung. The calls go through
// the shipped libhostcall_jni.so, as the service makes them. Every allocation
// in the process is counted, so the allocation row shows what one host call
// costs the heap. Prints table rows (bench/common/BenchRow.h).

#include <benchmark/benchmark.h>
#include <sys/ioctl.h>

#include <algorithm>
#include <atomic>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <iterator>
#include <new>
#include <string>
#include <vector>

#include "../common/BenchRow.h"
#include "../common/Interleaved.h"
#include "HcallFloor.h"
#include "VmsgDeviceModel.h"
#include "hcall/guest/HcallCatalogue.h"
#include "hcall/guest/HcallEnc.h"
#include "vmsg/guest/VmsgDevice.h"
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

const std::string kClipboard(4096, 'c');

// Arguments reach both contenders as values the compiler cannot see through,
// so a floor measures its strings at run time as the library must.
template <typename T>
T opaque(T value) {
    benchmark::DoNotOptimize(value);
    return value;
}
const char* locale() { return opaque("en-US"); }
const char* clipboard() { return opaque(kClipboard.c_str()); }
const char* package() { return opaque("com.example.game"); }
const char* const kAppInstalled[] = {"com.example.game",     "com.example.game.MainActivity",
                                     "Example Game",         "1.2.3",
                                     "/data/icons/game.png", "com.android.vending"};
const char* appInstalled(int i) { return opaque(kAppInstalled[i]); }

// One operation shape: a host call with typical arguments, and its design
// floor (HcallFloor.h) with the same arguments.
struct Shape {
    const char* name;
    int (*call)();
    int (*floor)();
};
#define APP_INSTALLED_ARGS                                                          \
    appInstalled(0), appInstalled(1), appInstalled(2), opaque(42), appInstalled(3), \
        appInstalled(4), appInstalled(5), opaque(true)
const Shape kShapes[] = {
    {"HeaderOnly", [] { return int(hcallLaunchOrxRpc()); },
     [] { return int(hcallfloor::launchOrx()); }},
    {"OneInt", [] { return int(hcallOnOrientationChangedRpc(opaque(1))); },
     [] { return int(hcallfloor::onOrientationChanged(opaque(1))); }},
    {"ShortString", [] { return int(hcallOnLocaleChangedRpc(locale())); },
     [] { return int(hcallfloor::oneString(hcall::kOp_hcallOnLocaleChangedRpc, locale())); }},
    {"String4KiB", [] { return int(hcallSetClipboardTextRpc(clipboard())); },
     [] { return int(hcallfloor::oneString(hcall::kOp_hcallSetClipboardTextRpc, clipboard())); }},
    {"EightParams", [] { return int(hcallOnAppInstalledRpc(APP_INSTALLED_ARGS)); },
     [] { return int(hcallfloor::onAppInstalled(APP_INSTALLED_ARGS)); }},
    {"FilledBuffer",
     [] {
         char buffer[256] = "";
         int32_t value = 0;
         return int(hcallGetPropsRpc(buffer, opaque(int32_t(sizeof(buffer))), &value));
     },
     [] {
         char buffer[256] = "";
         int32_t value = 0;
         return int(hcallfloor::getProps(buffer, opaque(int32_t(sizeof(buffer))), &value));
     }},
    {"LaunchQuery", [] { return int(hcallIsAppLaunchAllowedRpc(package())); },
     [] { return int(hcallfloor::isAppLaunchAllowed(package())); }},
};
#undef APP_INSTALLED_ARGS

// The request a shape's call leaves in the host-bound buffer, as the host
// would read it.
std::vector<uint8_t> requestOf(const Shape& shape) {
    shape.call();
    const auto* shared = static_cast<const uint8_t*>(g_hcall.client.mHostBoundBuf);
    uint32_t length = 0;
    std::memcpy(&length, shared + 4, sizeof(length));
    return std::vector<uint8_t>(shared, shared + length);
}

// The floors share the bench's one connection; nothing else runs meanwhile.
int ring() { return ioctl(g_hcall.client.mFd, VMSG_IOC_SEND_RECEIVE); }

// A block of "memcpy + doorbell carrying it": the shape's whole request
// written with memcpy, one doorbell.
std::function<void(int)> carryingBlock(const std::vector<uint8_t>& request) {
    return [request](int count) {
        auto* shared = static_cast<uint8_t*>(g_hcall.client.mHostBoundBuf);
        for (int i = 0; i < count; ++i) {
            std::memcpy(shared, request.data(), request.size());
            benchmark::DoNotOptimize(ring());
        }
    };
}

// A block of calls of `call` with the logger answering up to `level`.
std::function<void(int)> callBlock(int (*call)(), int level) {
    return [call, level](int count) {
        gLogLevel = level;
        for (int i = 0; i < count; ++i) benchmark::DoNotOptimize(call());
    };
}

// Heap allocations per call of a block, after a warm-up call: first-use
// allocations of the C library are not the call's.
double allocationsPerCall(const std::function<void(int)>& block) {
    constexpr int kCalls = 1000;
    block(1);
    const long before = gAllocations.load();
    block(kCalls);
    return double(gAllocations.load() - before) / kCalls;
}

// Rounds of blocks per shape; a block is short enough to finish inside one
// time slice of a busy machine most of the time.
constexpr int kRounds = 2000;
constexpr int kPerBlock = 200;

// Levels: E, every line suppressed (the log off); I, the entry line formatted
// (the service's default); D, both lines formatted.
struct ShapeFigures {
    bench::Contender off, info, debug, floor, carrying;
    double mostAllocations = 0;
};

ShapeFigures measure(const Shape& shape, const std::vector<uint8_t>& request) {
    ShapeFigures f;
    f.off.block = callBlock(shape.call, XLOG_LEVEL_E);
    f.info.block = callBlock(shape.call, XLOG_LEVEL_I);
    f.debug.block = callBlock(shape.call, XLOG_LEVEL_D);
    f.floor.block = callBlock(shape.floor, XLOG_LEVEL_E);
    f.carrying.block = carryingBlock(request);
    for (const bench::Contender* c : {&f.off, &f.info, &f.debug})
        f.mostAllocations = std::max(f.mostAllocations, allocationsPerCall(c->block));
    // The formatted lines take far longer; fewer of them keep the run short.
    bench::interleave({&f.off, &f.floor, &f.carrying}, kRounds, kPerBlock);
    bench::interleave({&f.info, &f.debug}, kRounds / 8, kPerBlock / 4);
    return f;
}

}  // namespace

int main() {
    if (!connect()) {
        std::fprintf(stderr, "hcall_bench: no connection to the device model\n");
        return 1;
    }
    // The requests, taken while the model still validates every exchange; a
    // floor that wrote other bytes than its call would measure something else.
    std::vector<std::vector<uint8_t>> requests;
    for (const Shape& shape : kShapes) {
        requests.push_back(requestOf(shape));
        const Shape floorAsCall = {shape.name, shape.floor, shape.floor};
        if (requestOf(floorAsCall) != requests.back()) {
            std::fprintf(stderr, "hcall_bench: the floor of %s writes other bytes\n", shape.name);
            return 1;
        }
    }
    bench::Contender validating, fast;
    validating.block = carryingBlock(requests[0]);
    bench::interleave({&validating}, kRounds / 4, kPerBlock);
    vmsgDeviceSetFastAnswers(true);
    fast.block = carryingBlock(requests[0]);
    bench::interleave({&fast}, kRounds / 4, kPerBlock);

    const char* area = "host call";
    bench::printRow(
        {"floors", "validating device model doorbell, empty request", validating.medianNs(), "ns"});
    bench::printRow({"floors", "fast device doorbell, empty request", fast.medianNs(), "ns"});
    double mostAllocations = 0;
    for (size_t i = 0; i < std::size(kShapes); ++i) {
        const ShapeFigures f = measure(kShapes[i], requests[i]);
        const std::string name = kShapes[i].name;
        mostAllocations = std::max(mostAllocations, f.mostAllocations);
        bench::printRow({area, name + ", log off", f.off.medianNs(), "ns", "design floor",
                         f.floor.medianNs(), "<=1.20"});
        bench::printRow({area, name + ", log off", f.off.medianNs(), "ns",
                         "memcpy + doorbell carrying it", f.carrying.medianNs()});
        bench::printRow({area, name + ", entry line (level I)", f.info.medianNs(), "ns"});
        bench::printRow({area, name + ", both lines (level D)", f.debug.medianNs(), "ns"});
    }
    bench::printRow({area, "heap allocations per call, most of any shape and level",
                     mostAllocations, "allocs", "-", 0, "=0"});
    // Shows that the counter sees allocations at all: one per call.
    const double check = allocationsPerCall([](int count) {
        for (int i = 0; i < count; ++i) {
            int* p = new int(i);
            benchmark::DoNotOptimize(p);
            delete p;
        }
    });
    bench::printRow({area, "(counter check: one new per call)", check, "allocs"});
    return 0;
}
