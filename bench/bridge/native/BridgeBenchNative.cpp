// Floors for the bridge benchmark: the same JNI calls doing only the string
// conversions, and doing the least the design allows (conversions, one task
// holding the copies, one locked push with its notification, a consumer that
// takes the tasks), plus a counter of the host calls the device model serves.
#include <android/log.h>
#include <jni.h>

#include <atomic>
#include <condition_variable>
#include <deque>
#include <functional>
#include <mutex>
#include <string>
#include <thread>
#include <tuple>

#include "VmsgDeviceModel.h"

namespace {

std::string convert(JNIEnv* env, jstring s) {
    std::string bytes;
    if (s == nullptr) return bytes;
    const char* chars = env->GetStringUTFChars(s, nullptr);
    if (chars != nullptr) {
        bytes = chars;
        env->ReleaseStringUTFChars(s, chars);
    }
    return bytes;
}

// Holds the consumers (the bridge's worker inside the host, the floor's
// consumer before its task) while the Java side is measured, so both producers
// see the same thing: an uncontended lock and nobody waiting for the push.
struct Gate {
    std::mutex mutex;
    std::condition_variable opened;
    bool open = true;

    void pass() {
        std::unique_lock<std::mutex> lock(mutex);
        opened.wait(lock, [this] { return open; });
    }
    void set(bool value) {
        std::lock_guard<std::mutex> lock(mutex);
        open = value;
        opened.notify_all();
    }
};
Gate* const gGate = new Gate();

std::atomic<long> gFloorDone{0};

// The design's minimum: a mutex-guarded deque of std::function and one
// consumer, like the pool with its single worker but with nothing to send.
struct FloorQueue {
    std::mutex mutex;
    std::condition_variable taskCond;
    std::deque<std::function<void()>> tasks;

    FloorQueue() {
        std::thread([this] {
            for (;;) {
                std::function<void()> task;
                {
                    std::unique_lock<std::mutex> lock(mutex);
                    taskCond.wait(lock, [this] { return !tasks.empty(); });
                    task = std::move(tasks.front());
                    tasks.pop_front();
                }
                gGate->pass();
                task();
                gFloorDone.fetch_add(1, std::memory_order_relaxed);
            }
        }).detach();
    }

    void push(std::function<void()> task) {
        std::lock_guard<std::mutex> lock(mutex);
        tasks.push_back(std::move(task));
        taskCond.notify_one();
    }
};
FloorQueue* const gFloor = new FloorQueue();  // never destroyed: its consumer runs to exit

std::atomic<long> gHostCalls{0};
volatile int gSink = 0;

}  // namespace

extern "C" {

JNIEXPORT jint JNICALL Java_com_zelvane_server_bench_BenchNative_bareInt(JNIEnv*, jclass, jint v) {
    return v & 0;
}

JNIEXPORT jint JNICALL Java_com_zelvane_server_bench_BenchNative_bareString(JNIEnv* env, jclass,
                                                                            jstring s) {
    return jint(convert(env, s).size() & 0);
}

JNIEXPORT jint JNICALL Java_com_zelvane_server_bench_BenchNative_bareInstall(
    JNIEnv* env, jclass, jstring p, jstring a, jstring l, jint vc, jstring vn, jstring i, jstring s,
    jboolean u) {
    std::tuple<std::string, std::string, std::string, jint, std::string, std::string, std::string,
               jboolean>
        values{convert(env, p),  convert(env, a), convert(env, l), vc,
               convert(env, vn), convert(env, i), convert(env, s), u};
    return jint(std::get<0>(values).size() & 0);
}

JNIEXPORT jint JNICALL Java_com_zelvane_server_bench_BenchNative_floorInt(JNIEnv*, jclass, jint v) {
    gFloor->push([v] { gSink = v; });
    return 0;
}

// The floor with the value kept as the bridge keeps its copies, in a
// std::tuple: a tuple is not trivially copyable, so std::function stores the
// task on the heap rather than inside itself.
JNIEXPORT jint JNICALL Java_com_zelvane_server_bench_BenchNative_floorIntTuple(JNIEnv*, jclass,
                                                                               jint v) {
    std::tuple<jint> values{v};
    gFloor->push([values] { gSink = std::get<0>(values); });
    return 0;
}

JNIEXPORT jint JNICALL Java_com_zelvane_server_bench_BenchNative_floorString(JNIEnv* env, jclass,
                                                                             jstring s) {
    std::string bytes = convert(env, s);
    if (bytes.empty()) return -1;
    gFloor->push([bytes = std::move(bytes)] { gSink = int(bytes.size()); });
    return 0;
}

JNIEXPORT jint JNICALL Java_com_zelvane_server_bench_BenchNative_floorInstall(
    JNIEnv* env, jclass, jstring p, jstring a, jstring l, jint vc, jstring vn, jstring i, jstring s,
    jboolean u) {
    std::tuple<std::string, std::string, std::string, jint, std::string, std::string, std::string,
               jboolean>
        values{convert(env, p),  convert(env, a), convert(env, l), vc,
               convert(env, vn), convert(env, i), convert(env, s), u};
    if (std::get<0>(values).empty() || std::get<1>(values).empty()) return -1;
    gFloor->push([values = std::move(values)] { gSink = int(std::get<3>(values)); });
    return 0;
}

// Counts host calls, and drops Android log lines: the library logs every host
// call at info level, and on this machine liblog would write each to standard
// error, which would measure the terminal rather than the library.
JNIEXPORT void JNICALL Java_com_zelvane_server_bench_BenchNative_countHostCalls(JNIEnv*, jclass) {
    __android_log_set_logger([](const struct __android_logger_data*, const char*) {});
    vmsgDeviceSetHostHook([](uint32_t) {
        gGate->pass();
        gHostCalls.fetch_add(1, std::memory_order_relaxed);
    });
}

JNIEXPORT void JNICALL Java_com_zelvane_server_bench_BenchNative_holdConsumers(JNIEnv*, jclass,
                                                                               jboolean hold) {
    gGate->set(hold == JNI_FALSE);
}

JNIEXPORT jlong JNICALL Java_com_zelvane_server_bench_BenchNative_floorDone(JNIEnv*, jclass) {
    return gFloorDone.load(std::memory_order_relaxed);
}

JNIEXPORT jlong JNICALL Java_com_zelvane_server_bench_BenchNative_hostCalls(JNIEnv*, jclass) {
    return gHostCalls.load(std::memory_order_relaxed);
}

}  // extern "C"
