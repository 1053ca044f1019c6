#include "ServiceStart.h"

#include <cutils/properties.h>

#include <cstdio>
#include <cstdlib>
#include <mutex>
#include <string>

#include "BridgeLog.h"
#include "hcall/guest/HcallEnc.h"
#include "xpl/Xlog.h"
#include "xpl/Xpl.h"
#include "xpl/XplThreadAnnotations.h"
#include "xpl/XthrPool.h"

std::atomic<bool> g_debug_enabled{false};

namespace bridge {

namespace {

constexpr const char* kInitName = "void native_init(JNIEnv *, jobject)";
constexpr const char* kDebugProperty = "kiv.debug.kivhostcall";
// Log readers match the connection failure by the source path and line it has
// always carried, so both are fixed here rather than taken from this file.
constexpr const char* kInitSourcePath = "server/native/com_zelvane_server_KivHostCallService";
constexpr int kConnectFailureLine = 74;

// Progress of the start, kept so that a repeated native_init neither repeats
// a step that succeeded nor skips one that failed.
struct StartState {
    std::mutex mutex;
    bool supportStarted GUARDED_BY(mutex) = false;
    bool connected GUARDED_BY(mutex) = false;
    bool workerStarted GUARDED_BY(mutex) = false;
};
StartState gStart;

void logConnectFailure(xerr_t err) {
    XlogLogger* logger = xlogGetLogger();
    if (logger->shouldLog(XLOG_MODULE_HCALL, XLOG_LEVEL_E))
        logger->print(XLOG_LEVEL_E, XLOG_MODULE_HCALL, kInitSourcePath, kInitName,
                      kConnectFailureLine, "hcallLibInitGuest failed, error %d", err);
}

// True once the worker runs, now or from an earlier call.
bool bringUp() {
    std::lock_guard<std::mutex> lock(gStart.mutex);
    if (gStart.workerStarted) {
        ALOGI("%s: service already started", kInitName);
        return true;
    }
    if (!gStart.supportStarted) {
        xerr_t err = xplLibInit(nullptr, std::string());
        if (err != XERR_SUCCESS) {
            (void)fprintf(stderr, "%s: xplLibInit failed. err = %d\n", kInitName, err);
            ALOGE("%s: xplLibInit failed. err = %d\n", kInitName, err);
            return false;
        }
        gStart.supportStarted = true;
    }
    if (!gStart.connected) {
        xerr_t err = hcallLibInitGuest();
        if (err != XERR_SUCCESS) {
            logConnectFailure(err);
            return false;
        }
        gStart.connected = true;
    }
    // The start goes on whatever the pool answers, but a worker that could not
    // be created is not remembered as started, so a later call tries again.
    gStart.workerStarted = xthrPoolInit(&g_thr_pool, 1) == XERR_SUCCESS;
    return true;
}

void readDebugSwitch() {
    char value[PROPERTY_VALUE_MAX];
    property_get(kDebugProperty, value, "0");
    // Only ever switched on: a later "0" leaves an earlier "on" in force.
    // atoi on purpose: anything that does not read as a number is 0, i.e. off.
    // NOLINTNEXTLINE(cert-err34-c)
    if (atoi(value) != 0) g_debug_enabled.store(true, std::memory_order_relaxed);
}

}  // namespace

void startService() {
    ALOGD("%s: called", kInitName);
    if (!bringUp()) return;
    ALOGD("%s: returning, rval = %d", kInitName, 0);
    readDebugSwitch();
}

}  // namespace bridge
