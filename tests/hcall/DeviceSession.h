// g_hcall on the device model under a script for an object's life: every test starts alike.
#pragma once

#include "VmsgDeviceModel.h"
#include "hcall/guest/HcallEnc.h"

struct HcallSession {
    explicit HcallSession(const VmsgDeviceScript& script = {}) : connected(start(script)) {}
    ~HcallSession() {
        stop();
        vmsgDeviceSetHostHook({});
        vmsgDeviceReset();
    }
    static bool start(const VmsgDeviceScript& script) {
        stop();
        vmsgDeviceReset();
        vmsgDeviceConfigure(script);
        return hcallLibInitGuest() == XERR_SUCCESS;
    }
    static void stop() {
        if (g_hcall.client.mFd >= 0) g_hcall.client.disconnect();
    }
    const bool connected;
};

using ScriptTweak = void (*)(VmsgDeviceScript&);
inline VmsgDeviceScript scriptWith(ScriptTweak tweak) {
    VmsgDeviceScript script;
    if (tweak) tweak(script);
    return script;
}
