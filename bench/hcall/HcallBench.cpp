// Encode-and-exchange cost of host calls, one benchmark per operation shape,
// against the in-process device model, beside the floor the design allows:
// the same bytes written into the shared buffer with memcpy and one doorbell
// of the device model with an empty request. Every allocation in the process
// is counted, so "allocs/call" shows what one host call costs the heap (the
// device model records nothing here, so its own share is zero too). Prints
// table rows (bench/common/BenchRow.h).

#include <benchmark/benchmark.h>
#include <sys/ioctl.h>

#include <algorithm>
#include <atomic>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <new>
#include <string>
#include <vector>

#include "../common/BenchRow.h"
#include "../common/Interleaved.h"
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

// One operation shape: a host call with typical arguments.
struct Shape {
    const char* name;
    int (*call)();
};
const Shape kShapes[] = {
    {"HeaderOnly", [] { return int(hcallLaunchOrxRpc()); }},
    {"OneInt", [] { return int(hcallOnOrientationChangedRpc(1)); }},
    {"ShortString", [] { return int(hcallOnLocaleChangedRpc("en-US")); }},
    {"String4KiB", [] { return int(hcallSetClipboardTextRpc(kClipboard.c_str())); }},
    {"EightParams",
     [] {
         return int(hcallOnAppInstalledRpc("com.example.game", "com.example.game.MainActivity",
                                           "Example Game", 42, "1.2.3", "/data/icons/game.png",
                                           "com.android.vending", true));
     }},
    {"FilledBuffer",
     [] {
         char buffer[256] = "";
         int32_t value = 0;
         return int(hcallGetPropsRpc(buffer, sizeof(buffer), &value));
     }},
    {"LaunchQuery", [] { return int(hcallIsAppLaunchAllowedRpc("com.example.game")); }},
};

// The request a shape's call leaves in the host-bound buffer, as the host
// would read it.
std::vector<uint8_t> requestOf(const Shape& shape) {
    shape.call();
    const auto* shared = static_cast<const uint8_t*>(g_hcall.client.mHostBoundBuf);
    uint32_t length = 0;
    std::memcpy(&length, shared + 4, sizeof(length));
    return std::vector<uint8_t>(shared, shared + length);
}

// The header of the emptiest request there is: an operation without
// parameters.
const HcallMsgHeader kEmpty = {hcall::kOp_hcallLaunchOrxRpc, sizeof(HcallMsgHeader)};

// The floors share the bench's one connection; nothing else runs meanwhile.
int ring() { return ioctl(g_hcall.client.mFd, VMSG_IOC_SEND_RECEIVE); }

// How a floor hands the shape's bytes to the device.
enum class Floor {
    Empty,     // the shape's parameter bytes written, then an empty request rung
    Carrying,  // the whole request written and rung, so the model does its work too
};

// A block of the floor: the request's bytes written with memcpy, one doorbell.
std::function<void(int)> floorBlock(const Shape& shape, Floor floor) {
    const std::vector<uint8_t> request = requestOf(shape);
    return [request, floor](int count) {
        auto* shared = static_cast<uint8_t*>(g_hcall.client.mHostBoundBuf);
        for (int i = 0; i < count; ++i) {
            if (floor == Floor::Empty) {
                std::memcpy(shared + sizeof(kEmpty), request.data() + sizeof(kEmpty),
                            request.size() - sizeof(kEmpty));
                std::memcpy(shared, &kEmpty, sizeof(kEmpty));
            } else {
                std::memcpy(shared, request.data(), request.size());
            }
            benchmark::DoNotOptimize(ring());
        }
    };
}

// A block of host calls at a log level.
std::function<void(int)> callBlock(const Shape& shape, int level) {
    return [&shape, level](int count) {
        gLogLevel = level;
        for (int i = 0; i < count; ++i) benchmark::DoNotOptimize(shape.call());
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

// Levels: E, both lines suppressed (the log off); I, the entry line formatted
// (the service's default); D, both lines formatted.
struct ShapeFigures {
    bench::Contender off, info, debug, floor, carrying;
    double mostAllocations = 0;
};

ShapeFigures measure(const Shape& shape) {
    ShapeFigures f;
    f.off.block = callBlock(shape, XLOG_LEVEL_E);
    f.info.block = callBlock(shape, XLOG_LEVEL_I);
    f.debug.block = callBlock(shape, XLOG_LEVEL_D);
    f.floor.block = floorBlock(shape, Floor::Empty);
    f.carrying.block = floorBlock(shape, Floor::Carrying);
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
    const char* area = "host call";
    double mostAllocations = 0;
    bench::Contender doorbell;
    doorbell.block = floorBlock(kShapes[0], Floor::Carrying);
    bench::interleave({&doorbell}, kRounds, kPerBlock);
    bench::printRow({"floors", "device model doorbell, empty request", doorbell.medianNs(), "ns"});
    for (const Shape& shape : kShapes) {
        const ShapeFigures f = measure(shape);
        const std::string name = shape.name;
        mostAllocations = std::max(mostAllocations, f.mostAllocations);
        bench::printRow({area, name + ", log off", f.off.medianNs(), "ns",
                         "memcpy + empty doorbell", f.floor.medianNs(), "<=1.50"});
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
