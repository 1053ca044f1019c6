// Test-only JNI helper for the soak: counts the Android log instead of keeping
// it (a long run must not grow with its own evidence), sets the preloaded
// device model up as a slow and unreliable host, and reads the native heap.
#include <android/log.h>
#include <dlfcn.h>
#include <jni.h>
#include <malloc.h>

#include <map>
#include <mutex>
#include <string>
#include <vector>

#include "VmsgDeviceModel.h"

namespace {

constexpr char kBridgeTag[] = "KivHostCallService-JNI";

// Lines of the service bridge count by their exact text, which takes a bounded
// set of values while debug lines are off; other tags count by priority only
// (the logger's lines carry argument values).
struct LogCounts {
    std::mutex mutex;
    std::map<std::string, long> counts;
};
LogCounts* const gLog = new LogCounts();  // never destroyed: lines arrive during exit

void countLine(const struct __android_logger_data* data, const char* message) {
    const char* tag = data->tag != nullptr ? data->tag : "";
    std::string key = std::to_string(data->priority) + "|" + tag + "|";
    if (std::string(tag) == kBridgeTag)
        key += message != nullptr ? message : "";
    else
        key += "*";
    std::lock_guard<std::mutex> lock(gLog->mutex);
    ++gLog->counts[key];
}

using AllocatedBytes = size_t (*)();

// A sanitizer's allocator keeps its own books; glibc's otherwise.
AllocatedBytes sanitizerAllocatedBytes() {
    return reinterpret_cast<AllocatedBytes>(
        dlsym(RTLD_DEFAULT, "__sanitizer_get_current_allocated_bytes"));
}

}  // namespace

extern "C" {

JNIEXPORT jint JNI_OnLoad(JavaVM*, void*) { return JNI_VERSION_1_6; }

JNIEXPORT void JNICALL Java_com_zelvane_server_bridgetest_SoakNative_countLog(JNIEnv*, jclass) {
    __android_log_set_logger(countLine);
    __android_log_set_minimum_priority(ANDROID_LOG_VERBOSE);
}

// Every count as "priority|tag|text\tcount".
JNIEXPORT jobjectArray JNICALL Java_com_zelvane_server_bridgetest_SoakNative_logCounts(JNIEnv* env,
                                                                                       jclass) {
    std::vector<std::string> items;
    {
        std::lock_guard<std::mutex> lock(gLog->mutex);
        for (const auto& [key, count] : gLog->counts)
            items.push_back(key + "\t" + std::to_string(count));
    }
    jobjectArray array =
        env->NewObjectArray(jsize(items.size()), env->FindClass("java/lang/String"), nullptr);
    for (size_t i = 0; array != nullptr && i < items.size(); ++i) {
        jstring item = env->NewStringUTF(items[i].c_str());
        env->SetObjectArrayElement(array, jsize(i), item);
        env->DeleteLocalRef(item);
    }
    return array;
}

// Keeps no exchange in memory; tracePath (may be empty) gets one line each.
JNIEXPORT void JNICALL Java_com_zelvane_server_bridgetest_SoakNative_configureHost(
    JNIEnv* env, jclass, jint jitterUs, jint failurePerMille, jint sendFailurePerMille,
    jint failureResult, jlong seed, jstring tracePath) {
    vmsgDeviceReset();
    VmsgDeviceScript script;
    script.record = false;
    script.delayJitterUs = uint32_t(jitterUs);
    script.failurePerMille = uint32_t(failurePerMille);
    script.sendFailurePerMille = uint32_t(sendFailurePerMille);
    script.failureResult = failureResult;
    script.randomSeed = uint64_t(seed);
    const char* path = env->GetStringUTFChars(tracePath, nullptr);
    if (path != nullptr) {
        script.tracePath = path;
        env->ReleaseStringUTFChars(tracePath, path);
    }
    vmsgDeviceConfigure(script);
}

// Closes the trace so that everything written so far is in the file.
JNIEXPORT void JNICALL Java_com_zelvane_server_bridgetest_SoakNative_closeTrace(JNIEnv*, jclass) {
    VmsgDeviceScript script = vmsgDeviceScript();
    script.tracePath.clear();
    vmsgDeviceConfigure(script);
}

JNIEXPORT jlong JNICALL Java_com_zelvane_server_bridgetest_SoakNative_served(JNIEnv*, jclass) {
    return jlong(vmsgDeviceServedCount());
}

JNIEXPORT jboolean JNICALL Java_com_zelvane_server_bridgetest_SoakNative_awaitServed(
    JNIEnv*, jclass, jlong count, jlong timeoutMs) {
    return vmsgDeviceWaitForServed(uint64_t(count), uint32_t(timeoutMs)) ? JNI_TRUE : JNI_FALSE;
}

JNIEXPORT jint JNICALL Java_com_zelvane_server_bridgetest_SoakNative_overlaps(JNIEnv*, jclass) {
    return jint(vmsgDeviceOverlapCount());
}

JNIEXPORT jlong JNICALL Java_com_zelvane_server_bridgetest_SoakNative_nativeHeapInUse(JNIEnv*,
                                                                                      jclass) {
    if (AllocatedBytes allocated = sanitizerAllocatedBytes()) return jlong(allocated());
    const struct mallinfo2 info = mallinfo2();
    return jlong(info.uordblks + info.hblkhd);
}

JNIEXPORT jboolean JNICALL Java_com_zelvane_server_bridgetest_SoakNative_sanitized(JNIEnv*,
                                                                                   jclass) {
    return sanitizerAllocatedBytes() != nullptr ? JNI_TRUE : JNI_FALSE;
}

}  // extern "C"
