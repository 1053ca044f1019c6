// Test-only JNI helper for the bridge's JVM tests: captures the Android log
// through liblog's own hook, drives the preloaded device model, and reaches
// getStringFromJstring with a runtime that cannot lend string bytes.
#include <android_runtime/AndroidRuntime.h>
#include <jni.h>

#include <chrono>
#include <condition_variable>
#include <cstring>
#include <mutex>
#include <string>
#include <vector>

#include "JavaString.h"
#include "VmsgDeviceModel.h"
#include "support/AndroidLogCapture.h"

namespace {

AndroidLogCapture* gCapture = nullptr;  // never destroyed: late lines arrive at exit

jobjectArray toStringArray(JNIEnv* env, const std::vector<std::string>& items) {
    jclass stringClass = env->FindClass("java/lang/String");
    jobjectArray array = env->NewObjectArray(jsize(items.size()), stringClass, nullptr);
    for (size_t i = 0; array != nullptr && i < items.size(); ++i) {
        jstring item = env->NewStringUTF(items[i].c_str());
        env->SetObjectArrayElement(array, jsize(i), item);
        env->DeleteLocalRef(item);
    }
    return array;
}

jbyteArray toByteArray(JNIEnv* env, const std::vector<uint8_t>& bytes) {
    jbyteArray array = env->NewByteArray(jsize(bytes.size()));
    if (array != nullptr)
        env->SetByteArrayRegion(array, 0, jsize(bytes.size()),
                                reinterpret_cast<const jbyte*>(bytes.data()));
    return array;
}

// Holds exchanges of one operation inside the host until released.
struct HostGate {
    std::mutex mutex;
    std::condition_variable changed;
    bool open = true;
    int held = 0;
};
HostGate* const gGate = new HostGate();

// A runtime out of memory: GetStringUTFChars lends nothing. Calls the
// conversion may make with its environment are forwarded to the real one of
// the calling thread (-Xcheck:jni insists on it).
struct StarvedRuntime {
    JNIEnv* real;
    JNINativeInterface functions;
    JNIEnv env;
    int releases = 0;
    int releasesOfNull = 0;
};
StarvedRuntime* gStarved = nullptr;

jboolean starvedExceptionCheck(JNIEnv*) { return gStarved->real->ExceptionCheck(); }

const char* starvedGetStringUTFChars(JNIEnv*, jstring, jboolean*) { return nullptr; }
void starvedReleaseStringUTFChars(JNIEnv*, jstring, const char* chars) {
    ++gStarved->releases;
    if (chars == nullptr) ++gStarved->releasesOfNull;
}

}  // namespace

extern "C" {

// Found first when the JVM looks for the entry point of this library, so the
// service library it links is entered only when the test loads it itself.
JNIEXPORT jint JNI_OnLoad(JavaVM*, void*) { return JNI_VERSION_1_6; }

JNIEXPORT void JNICALL Java_com_zelvane_server_bridgetest_TestNative_startLogCapture(JNIEnv*,
                                                                                     jclass) {
    if (gCapture == nullptr) gCapture = new AndroidLogCapture();
}

// Every captured line as "priority|tag|text".
JNIEXPORT jobjectArray JNICALL Java_com_zelvane_server_bridgetest_TestNative_logLines(JNIEnv* env,
                                                                                      jclass) {
    std::vector<std::string> lines;
    if (gCapture != nullptr)
        for (const AndroidLogLine& line : gCapture->lines())
            lines.push_back(std::to_string(line.priority) + "|" + line.tag + "|" + line.text);
    return toStringArray(env, lines);
}

JNIEXPORT void JNICALL Java_com_zelvane_server_bridgetest_TestNative_resetDevice(JNIEnv*, jclass) {
    VmsgDeviceScript keep = vmsgDeviceScript();
    vmsgDeviceReset();
    VmsgDeviceScript fresh = vmsgDeviceScript();
    fresh.tracePath = keep.tracePath;
    fresh.printCalls = keep.printCalls;
    vmsgDeviceConfigure(fresh);
}

// codeResults holds pairs of operation code and result.
JNIEXPORT void JNICALL Java_com_zelvane_server_bridgetest_TestNative_configureHost(
    JNIEnv* env, jclass, jint defaultResult, jboolean launchAllowed, jint delayUs,
    jintArray codeResults) {
    VmsgDeviceScript script = vmsgDeviceScript();
    script.defaultResult = defaultResult;
    script.launchAllowed = launchAllowed != JNI_FALSE;
    script.delayUs = uint32_t(delayUs);
    script.results.clear();
    std::vector<jint> pairs(size_t(env->GetArrayLength(codeResults)));
    env->GetIntArrayRegion(codeResults, 0, jsize(pairs.size()), pairs.data());
    for (size_t i = 0; i + 1 < pairs.size(); i += 2)
        script.results[uint32_t(pairs[i])] = pairs[i + 1];
    vmsgDeviceConfigure(script);
}

JNIEXPORT void JNICALL Java_com_zelvane_server_bridgetest_TestNative_setOpenErrno(JNIEnv*, jclass,
                                                                                  jint error) {
    VmsgDeviceScript script = vmsgDeviceScript();
    script.openErrno = error;
    vmsgDeviceConfigure(script);
}

JNIEXPORT jobjectArray JNICALL Java_com_zelvane_server_bridgetest_TestNative_requests(JNIEnv* env,
                                                                                      jclass) {
    std::vector<VmsgDeviceExchange> exchanges = vmsgDeviceExchanges();
    jclass bytesClass = env->FindClass("[B");
    jobjectArray array = env->NewObjectArray(jsize(exchanges.size()), bytesClass, nullptr);
    for (size_t i = 0; array != nullptr && i < exchanges.size(); ++i) {
        jbyteArray bytes = toByteArray(env, exchanges[i].request);
        env->SetObjectArrayElement(array, jsize(i), bytes);
        env->DeleteLocalRef(bytes);
    }
    return array;
}

JNIEXPORT jobjectArray JNICALL
Java_com_zelvane_server_bridgetest_TestNative_exchangeTexts(JNIEnv* env, jclass) {
    std::vector<std::string> texts;
    for (const VmsgDeviceExchange& exchange : vmsgDeviceExchanges()) texts.push_back(exchange.text);
    return toStringArray(env, texts);
}

JNIEXPORT jint JNICALL Java_com_zelvane_server_bridgetest_TestNative_overlaps(JNIEnv*, jclass) {
    return jint(vmsgDeviceOverlapCount());
}

// How many CONNECT requests reached the device, successful or not.
JNIEXPORT jint JNICALL Java_com_zelvane_server_bridgetest_TestNative_connects(JNIEnv*, jclass) {
    jint count = 0;
    for (const VmsgDeviceEvent& event : vmsgDeviceEvents())
        if (event.kind == VmsgDeviceEventKind::Connect) ++count;
    return count;
}

JNIEXPORT jint JNICALL Java_com_zelvane_server_bridgetest_TestNative_openDevices(JNIEnv*, jclass) {
    return jint(vmsgDeviceOpenCount());
}

JNIEXPORT void JNICALL Java_com_zelvane_server_bridgetest_TestNative_holdHost(JNIEnv*, jclass,
                                                                              jint opCode) {
    {
        std::lock_guard<std::mutex> lock(gGate->mutex);
        gGate->open = false;
        gGate->held = 0;
    }
    vmsgDeviceSetHostHook([opCode](uint32_t code) {
        if (code != uint32_t(opCode)) return;
        std::unique_lock<std::mutex> lock(gGate->mutex);
        ++gGate->held;
        gGate->changed.notify_all();
        gGate->changed.wait(lock, [] { return gGate->open; });
    });
}

JNIEXPORT jboolean JNICALL
Java_com_zelvane_server_bridgetest_TestNative_awaitHostHeld(JNIEnv*, jclass, jlong timeoutMs) {
    std::unique_lock<std::mutex> lock(gGate->mutex);
    return gGate->changed.wait_for(lock, std::chrono::milliseconds(timeoutMs),
                                   [] { return gGate->held > 0; })
               ? JNI_TRUE
               : JNI_FALSE;
}

JNIEXPORT void JNICALL Java_com_zelvane_server_bridgetest_TestNative_releaseHost(JNIEnv*, jclass) {
    vmsgDeviceSetHostHook({});
    std::lock_guard<std::mutex> lock(gGate->mutex);
    gGate->open = true;
    gGate->changed.notify_all();
}

// The bytes getStringFromJstring yields for `s`.
JNIEXPORT jbyteArray JNICALL Java_com_zelvane_server_bridgetest_TestNative_convert(JNIEnv* env,
                                                                                   jclass,
                                                                                   jstring s) {
    std::string bytes = getStringFromJstring(env, nullptr, s);
    if (env->ExceptionCheck()) return nullptr;
    return toByteArray(env, std::vector<uint8_t>(bytes.begin(), bytes.end()));
}

// Converts `s` through a runtime whose GetStringUTFChars lends nothing; returns
// {bytes converted, releases, releases of a null pointer}.
JNIEXPORT jintArray JNICALL
Java_com_zelvane_server_bridgetest_TestNative_convertStarved(JNIEnv* env, jclass, jstring s) {
    StarvedRuntime starved;
    starved.real = env;
    std::memcpy(&starved.functions, env->functions, sizeof(JNINativeInterface));
    starved.functions.ExceptionCheck = starvedExceptionCheck;
    starved.functions.GetStringUTFChars = starvedGetStringUTFChars;
    starved.functions.ReleaseStringUTFChars = starvedReleaseStringUTFChars;
    starved.env.functions = &starved.functions;
    gStarved = &starved;
    std::string bytes = getStringFromJstring(&starved.env, nullptr, s);
    gStarved = nullptr;
    jint counts[3] = {jint(bytes.size()), starved.releases, starved.releasesOfNull};
    jintArray result = env->NewIntArray(3);
    if (result != nullptr) env->SetIntArrayRegion(result, 0, 3, counts);
    return result;
}

static jint boundLater(JNIEnv*, jclass) { return 42; }

// Registers one method through the runtime stand-in; returns {result, whether
// an exception is left pending}.
JNIEXPORT jintArray JNICALL Java_com_zelvane_server_bridgetest_TestNative_register(
    JNIEnv* env, jclass, jstring className, jstring methodName, jstring signature) {
    const char* cls = env->GetStringUTFChars(className, nullptr);
    const char* name = env->GetStringUTFChars(methodName, nullptr);
    const char* sig = env->GetStringUTFChars(signature, nullptr);
    JNINativeMethod method{name, sig, reinterpret_cast<void*>(boundLater)};
    jint outcome[2] = {android::AndroidRuntime::registerNativeMethods(env, cls, &method, 1), 0};
    outcome[1] = env->ExceptionCheck() ? 1 : 0;
    env->ExceptionClear();
    env->ReleaseStringUTFChars(signature, sig);
    env->ReleaseStringUTFChars(methodName, name);
    env->ReleaseStringUTFChars(className, cls);
    jintArray result = env->NewIntArray(2);
    if (result != nullptr) env->SetIntArrayRegion(result, 0, 2, outcome);
    return result;
}

}  // extern "C"
