// The demo's view of the Android log: the service's own lines (and anything at
// error level or worse) printed as they are written, on the same stream where
// the device model prints what the host received.
#include <android/log.h>
#include <jni.h>

#include <condition_variable>
#include <cstdio>
#include <cstring>
#include <mutex>

namespace {

constexpr const char* kServiceTag = "KivHostCallService-JNI";

struct Sink {
    std::mutex mutex;
    std::condition_variable changed;
    int taskResults = 0;  // "returning" lines of the service's tasks
};
Sink* const gSink = new Sink();  // never destroyed: lines may arrive during exit

char priorityLetter(int priority) {
    static const char kLetters[] = "??VDIWEF";
    return priority >= 0 && priority < int(sizeof(kLetters)) - 1 ? kLetters[priority] : '?';
}

void printLine(const struct __android_logger_data* data, const char* message) {
    const char* tag = data->tag != nullptr ? data->tag : "";
    bool service = strcmp(tag, kServiceTag) == 0;
    if (!service && data->priority < ANDROID_LOG_ERROR) return;
    std::lock_guard<std::mutex> lock(gSink->mutex);
    fprintf(stderr, "    log  %c/%s: %s%s", priorityLetter(data->priority), tag, message,
            message[0] != '\0' && message[strlen(message) - 1] == '\n' ? "" : "\n");
    fflush(stderr);
    if (service && strncmp(message, "auto ", 5) == 0 && strstr(message, ": returning") != nullptr) {
        ++gSink->taskResults;
        gSink->changed.notify_all();
    }
}

}  // namespace

extern "C" {

JNIEXPORT void JNICALL Java_com_zelvane_server_demo_Logcat_start(JNIEnv*, jclass) {
    __android_log_set_logger(printLine);
    __android_log_set_minimum_priority(ANDROID_LOG_VERBOSE);
}

// Waits until `count` tasks have reported their result; false after timeoutMs.
JNIEXPORT jboolean JNICALL Java_com_zelvane_server_demo_Logcat_awaitTaskResults(JNIEnv*, jclass,
                                                                               jint count,
                                                                               jlong timeoutMs) {
    std::unique_lock<std::mutex> lock(gSink->mutex);
    return gSink->changed.wait_for(lock, std::chrono::milliseconds(timeoutMs),
                                   [count] { return gSink->taskResults >= count; })
               ? JNI_TRUE
               : JNI_FALSE;
}

}  // extern "C"
