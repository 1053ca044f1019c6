// g_hcall connected to the device model under a script.
#pragma once

#include "VmsgDeviceModel.h"
#include "hcall/guest/HcallEnc.h"

// g_hcall connected under a script for the object's life, so every test starts alike.
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
