// Holds the worker inside a host call until the process is exiting, then lets
// it go on while the exit handlers run. Loaded before the service library, so
// this library's exit handler runs after the service library's static
// destructors (g_hcall, g_thr_pool): the worker then finishes its exchange and
// returns to the pool after both were destroyed, which must not crash.
#include <jni.h>
#include <unistd.h>

#include <chrono>
#include <condition_variable>
#include <cstring>
#include <mutex>
#include <thread>

#include "VmsgDeviceModel.h"

namespace {

// How long the exit handler gives the released worker to finish its exchange,
// log its lines and return to the pool before the process goes on ending.
constexpr std::chrono::milliseconds kWorkerGrace{300};

struct GateState {
    std::mutex mutex;
    std::condition_variable changed;
    bool open = false;
    int held = 0;
    bool left = false;  // the held call came back out of the host
};
GateState* const gState = new GateState();  // never destroyed: the worker uses it at exit

struct OpenAtExit {
    ~OpenAtExit() {
        {
            std::lock_guard<std::mutex> lock(gState->mutex);
            gState->open = true;
            gState->changed.notify_all();
        }
        std::this_thread::sleep_for(kWorkerGrace);
        // Reported like the scenarios' results, straight to the descriptor:
        // stdio may already be shut down.
        bool left;
        {
            std::lock_guard<std::mutex> lock(gState->mutex);
            left = gState->left;
        }
        if (gState->held > 0) {
            const char* line =
                left ? "RESULT workerLeftHost=true\n" : "RESULT workerLeftHost=false\n";
            (void)!write(STDOUT_FILENO, line, strlen(line));
        }
    }
};
OpenAtExit gOpenAtExit;

}  // namespace

extern "C" {

JNIEXPORT jint JNI_OnLoad(JavaVM*, void*) { return JNI_VERSION_1_6; }

JNIEXPORT void JNICALL Java_com_zelvane_server_bridgetest_ExitGate_holdUntilExit(JNIEnv*, jclass,
                                                                                 jint opCode) {
    vmsgDeviceSetHostHook([opCode](uint32_t code) {
        if (code != uint32_t(opCode)) return;
        std::unique_lock<std::mutex> lock(gState->mutex);
        ++gState->held;
        gState->changed.notify_all();
        gState->changed.wait(lock, [] { return gState->open; });
        gState->left = true;
    });
}

JNIEXPORT jboolean JNICALL Java_com_zelvane_server_bridgetest_ExitGate_awaitHeld(JNIEnv*, jclass,
                                                                                 jlong timeoutMs) {
    std::unique_lock<std::mutex> lock(gState->mutex);
    return gState->changed.wait_for(lock, std::chrono::milliseconds(timeoutMs),
                                    [] { return gState->held > 0; })
               ? JNI_TRUE
               : JNI_FALSE;
}

}  // extern "C"
