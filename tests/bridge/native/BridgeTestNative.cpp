// The bridge suites' JNI helper: Android log capture, the preloaded device
// model, an exit gate, and a runtime that lends no string bytes. It does not
// link the service library: loaded first, its statics outlive the library's.
#include <ScopedPrimitiveArray.h>
#include <ScopedUtfChars.h>
#include <dlfcn.h>
#include <jni.h>
#include <malloc.h>
#include <unistd.h>

#include <chrono>
#include <condition_variable>
#include <mutex>
#include <string>

#include "VmsgDeviceModel.h"
#include "support/AndroidLogCapture.h"

namespace {

// From before the library's JNI_OnLoad; never destroyed: lines arrive at exit.
AndroidLogCapture* const gCapture = new AndroidLogCapture();

// Holds host calls of one operation until the process exits, after the
// library's static destructors; never destroyed, the worker uses it at exit.
struct ExitGate {
    std::mutex mutex;
    std::condition_variable changed;
    bool open = false, left = false;
    int held = 0;
};
ExitGate* const gGate = new ExitGate();

struct OpenAtExit {
    ~OpenAtExit() {
        {
            std::lock_guard<std::mutex> lock(gGate->mutex);
            if (gGate->held == 0) return;
            gGate->open = true;
            gGate->changed.notify_all();
        }
        usleep(300 * 1000);  // the released worker's grace
        std::lock_guard<std::mutex> lock(gGate->mutex);
        // Straight to the descriptor: stdio may already be shut down.
        if (gGate->left) (void)!write(STDOUT_FILENO, "workerLeftHost=true\n", 20);
    }
} gOpenAtExit;

// Its other calls go to the calling thread's real environment (-Xcheck:jni).
struct StarvedRuntime {
    JNIEnv* real;
    JNINativeInterface functions;
    JNIEnv env;
    int releases = 0;
};
StarvedRuntime* gStarved = nullptr;

}  // namespace

#define TEST_NATIVE(type, name) \
    extern "C" JNIEXPORT type JNICALL Java_com_zelvane_server_bridgetest_Bridge_##name

TEST_NATIVE(jstring, takeLogLines)(JNIEnv* env, jclass) {
    std::string text;
    for (const AndroidLogLine& line : gCapture->take())
        text += std::to_string(line.priority) + "|" + line.tag + "|" + line.text + '\1';
    return env->NewStringUTF(text.c_str());
}

TEST_NATIVE(void, configureHost)(JNIEnv* env, jclass, jboolean launchAllowed, jintArray results) {
    vmsgDeviceReset();
    VmsgDeviceScript script;
    script.launchAllowed = launchAllowed != JNI_FALSE;
    ScopedIntArrayRO pairs(env, results);
    for (size_t i = 0; i + 1 < pairs.size(); i += 2)
        script.results[uint32_t(pairs[i])] = pairs[i + 1];
    vmsgDeviceConfigure(script);
}

TEST_NATIVE(jstring, exchanges)(JNIEnv* env, jclass) {
    std::string hex;
    for (const VmsgDeviceExchange& exchange : vmsgDeviceExchanges()) {
        for (uint8_t byte : exchange.request)
            hex += {"0123456789abcdef"[byte >> 4], "0123456789abcdef"[byte & 15]};
        hex += ' ';
    }
    return env->NewStringUTF(hex.c_str());
}

TEST_NATIVE(jint, overlaps)(JNIEnv*, jclass) { return jint(vmsgDeviceOverlapCount()); }
TEST_NATIVE(jint, openDevices)(JNIEnv*, jclass) { return jint(vmsgDeviceOpenCount()); }
TEST_NATIVE(jboolean, awaitServed)(JNIEnv*, jclass, jlong count, jlong timeoutMs) {
    return vmsgDeviceWaitForServed(uint64_t(count), uint32_t(timeoutMs));
}

// The JVM logs the library's name after unloading it on a failed JNI_OnLoad,
// a read of freed memory that AddressSanitizer stops on.
TEST_NATIVE(void, keepLoaded)(JNIEnv* env, jclass, jstring path) {
    (void)dlopen(ScopedUtfChars(env, path).c_str(), RTLD_LAZY);
}

TEST_NATIVE(void, holdUntilExit)(JNIEnv*, jclass, jint opCode) {
    vmsgDeviceSetHostHook([opCode](uint32_t code) {
        if (code != uint32_t(opCode)) return;
        std::unique_lock<std::mutex> lock(gGate->mutex);
        ++gGate->held;
        gGate->changed.notify_all();
        gGate->changed.wait(lock, [] { return gGate->open; });
        gGate->left = true;
    });
}

TEST_NATIVE(jboolean, awaitHeld)(JNIEnv*, jclass, jlong timeoutMs) {
    std::unique_lock<std::mutex> lock(gGate->mutex);
    return gGate->changed.wait_for(lock, std::chrono::milliseconds(timeoutMs),
                                   [] { return gGate->held > 0; });
}

TEST_NATIVE(jstring, convertStarved)(JNIEnv* env, jclass, jstring s) {
    using Conversion = std::string (*)(JNIEnv*, jobject, jstring);
    // With no such library dlsym looks everywhere, and finds nothing.
    auto convert = reinterpret_cast<Conversion>(
        dlsym(dlopen("libhostcall_jni.so", RTLD_LAZY | RTLD_NOLOAD),
              "_Z20getStringFromJstringB5cxx11P7_JNIEnvP8_jobjectP8_jstring"));
    if (convert == nullptr) return env->NewStringUTF("no library");
    StarvedRuntime starved{env, *env->functions, {}};
    starved.functions.ExceptionCheck = [](JNIEnv*) { return gStarved->real->ExceptionCheck(); };
    starved.functions.GetStringUTFChars = [](JNIEnv*, jstring, jboolean*) -> const char* {
        return nullptr;
    };
    starved.functions.ReleaseStringUTFChars = [](JNIEnv*, jstring, const char*) {
        ++gStarved->releases;
    };
    starved.env.functions = &starved.functions;
    gStarved = &starved;
    const size_t bytes = convert(&starved.env, nullptr, s).size();
    gStarved = nullptr;
    return env->NewStringUTF(
        ("bytes=" + std::to_string(bytes) + " releases=" + std::to_string(starved.releases))
            .c_str());
}

// A sanitizer's allocator keeps freed blocks in quarantine: only its own count is fair.
TEST_NATIVE(jlong, nativeHeapInUse)(JNIEnv*, jclass) {
    using AllocatedBytes = size_t (*)();
    if (auto allocated = reinterpret_cast<AllocatedBytes>(
            dlsym(RTLD_DEFAULT, "__sanitizer_get_current_allocated_bytes")))
        return jlong(allocated());
    const struct mallinfo2 info = mallinfo2();
    return jlong(info.uordblks + info.hblkhd);
}
