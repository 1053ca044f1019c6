// The one test-only JNI helper of the bridge's JVM suites: captures the
// Android log, drives the preloaded device model, holds a host call across
// the process exit, and reaches getStringFromJstring with a runtime that
// cannot lend string bytes.
//
// It does not link the service library: the tests load it first, so its
// static objects are constructed before the library's and destroyed after
// them, which is what the exit gate below relies on.
#include <ScopedPrimitiveArray.h>
#include <ScopedUtfChars.h>
#include <dlfcn.h>
#include <jni.h>
#include <malloc.h>
#include <unistd.h>

#include <chrono>
#include <condition_variable>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "VmsgDeviceModel.h"
#include "support/AndroidLogCapture.h"

namespace {

AndroidLogCapture* gCapture = nullptr;  // never destroyed: late lines arrive at exit

// Holds exchanges of one operation inside the host until the process exits,
// then lets them finish while the exit goes on.
struct ExitGate {
    std::mutex mutex;
    std::condition_variable changed;
    bool open = false;
    int held = 0;
    bool left = false;  // a held call came back out of the host
};
ExitGate* const gGate = new ExitGate();  // never destroyed: the worker uses it at exit

// How long the exit waits for a released worker to finish its exchange, log
// its lines and return to the pool before the process goes on ending.
constexpr std::chrono::milliseconds kWorkerGrace{300};

struct OpenAtExit {
    ~OpenAtExit() {
        {
            std::lock_guard<std::mutex> lock(gGate->mutex);
            if (gGate->held == 0) return;
            gGate->open = true;
            gGate->changed.notify_all();
        }
        std::this_thread::sleep_for(kWorkerGrace);
        std::lock_guard<std::mutex> lock(gGate->mutex);
        // Straight to the descriptor: stdio may already be shut down.
        const char* line =
            gGate->left ? "RESULT workerLeftHost=true\n" : "RESULT workerLeftHost=false\n";
        (void)!write(STDOUT_FILENO, line, strlen(line));
    }
};
OpenAtExit gOpenAtExit;

// A runtime out of memory: GetStringUTFChars lends nothing. The other calls
// the conversion makes go to the real environment of the calling thread
// (-Xcheck:jni insists on it).
struct StarvedRuntime {
    JNIEnv* real;
    JNINativeInterface functions;
    JNIEnv env;
    int releases = 0;
};
StarvedRuntime* gStarved = nullptr;

}  // namespace

#define TEST_NATIVE(type, name) \
    extern "C" JNIEXPORT type JNICALL Java_com_zelvane_server_bridgetest_TestNative_##name

TEST_NATIVE(void, startLogCapture)(JNIEnv*, jclass) {
    if (gCapture == nullptr) gCapture = new AndroidLogCapture();
}

TEST_NATIVE(jstring, takeLogLines)(JNIEnv* env, jclass) {
    std::string text;
    for (const AndroidLogLine& line : gCapture->take())
        text += std::to_string(line.priority) + "|" + line.tag + "|" + line.text + '\1';
    return env->NewStringUTF(text.c_str());
}

TEST_NATIVE(void, configureHost)
(JNIEnv* env, jclass, jboolean launchAllowed, jintArray codeResults) {
    vmsgDeviceReset();
    VmsgDeviceScript script;
    script.launchAllowed = launchAllowed != JNI_FALSE;
    ScopedIntArrayRO pairs(env, codeResults);
    for (size_t i = 0; i + 1 < pairs.size(); i += 2)
        script.results[uint32_t(pairs[i])] = pairs[i + 1];
    vmsgDeviceConfigure(script);
}

TEST_NATIVE(jstring, requests)(JNIEnv* env, jclass) {
    std::string hex;
    for (const VmsgDeviceExchange& exchange : vmsgDeviceExchanges()) {
        for (uint8_t byte : exchange.request) {
            hex += "0123456789abcdef"[byte >> 4];
            hex += "0123456789abcdef"[byte & 15];
        }
        hex += ' ';
    }
    return env->NewStringUTF(hex.c_str());
}

TEST_NATIVE(jint, overlaps)(JNIEnv*, jclass) { return jint(vmsgDeviceOverlapCount()); }
TEST_NATIVE(jint, openDevices)(JNIEnv*, jclass) { return jint(vmsgDeviceOpenCount()); }
TEST_NATIVE(jlong, served)(JNIEnv*, jclass) { return jlong(vmsgDeviceServedCount()); }

TEST_NATIVE(jboolean, awaitServed)(JNIEnv*, jclass, jlong count, jlong timeoutMs) {
    return vmsgDeviceWaitForServed(uint64_t(count), uint32_t(timeoutMs)) ? JNI_TRUE : JNI_FALSE;
}

// Threads of this process named `name`: a thread inherits its creator's name.
TEST_NATIVE(jint, threadsNamed)(JNIEnv* env, jclass, jstring name) {
    ScopedUtfChars wanted(env, name);
    jint count = 0;
    for (const auto& task : std::filesystem::directory_iterator("/proc/self/task")) {
        std::ifstream comm(task.path() / "comm");
        std::string line;
        count += std::getline(comm, line) && line == wanted.c_str();  // not when it ended meanwhile
    }
    return count;
}

// Loads `path` for good, so that the JVM's own unloading of it after a failed
// JNI_OnLoad leaves it mapped: the JVM logs the library's name after it has
// unloaded it, a read of freed memory that AddressSanitizer stops on.
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
                                   [] { return gGate->held > 0; })
               ? JNI_TRUE
               : JNI_FALSE;
}

// {bytes converted, releases} of converting `s` through a runtime whose
// GetStringUTFChars lends nothing; -1 bytes when the library is not loaded.
TEST_NATIVE(jintArray, convertStarved)(JNIEnv* env, jclass, jstring s) {
    using Conversion = std::string (*)(JNIEnv*, jobject, jstring);
    void* library = dlopen("libhostcall_jni.so", RTLD_LAZY | RTLD_NOLOAD);
    auto convert = reinterpret_cast<Conversion>(
        library ? dlsym(library, "_Z20getStringFromJstringB5cxx11P7_JNIEnvP8_jobjectP8_jstring")
                : nullptr);
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
    jint counts[2] = {convert ? jint(convert(&starved.env, nullptr, s).size()) : -1, 0};
    gStarved = nullptr;
    counts[1] = starved.releases;
    jintArray result = env->NewIntArray(2);
    if (result != nullptr) env->SetIntArrayRegion(result, 0, 2, counts);
    return result;
}

// Bytes the native allocator has handed out and not taken back; a sanitizer's
// allocator keeps freed blocks in quarantine, so only its own count is fair.
TEST_NATIVE(jlong, nativeHeapInUse)(JNIEnv*, jclass) {
    using AllocatedBytes = size_t (*)();
    if (auto allocated = reinterpret_cast<AllocatedBytes>(
            dlsym(RTLD_DEFAULT, "__sanitizer_get_current_allocated_bytes")))
        return jlong(allocated());
    const struct mallinfo2 info = mallinfo2();
    return jlong(info.uordblks + info.hblkhd);
}
