// g_hcall connected to the device model, and readers for what the device saw.
#pragma once

#include <string>
#include <vector>

#include "VmsgDeviceModel.h"
#include "hcall/guest/HcallEnc.h"

// g_hcall connected to the device model under `script` for the life of the
// object; disconnected again afterwards so that every test starts alike.
class HcallSession {
  public:
    explicit HcallSession(const VmsgDeviceScript& script = VmsgDeviceScript()) {
        if (g_hcall.client.mFd >= 0) g_hcall.client.disconnect();
        vmsgDeviceReset();
        vmsgDeviceConfigure(script);
        connected_ = hcallLibInitGuest() == XERR_SUCCESS;
    }
    ~HcallSession() {
        if (g_hcall.client.mFd >= 0) g_hcall.client.disconnect();
        vmsgDeviceSetHostHook({});
        vmsgDeviceReset();
    }
    HcallSession(const HcallSession&) = delete;
    HcallSession& operator=(const HcallSession&) = delete;

    bool connected() const { return connected_; }

  private:
    bool connected_ = false;
};

// A script changed by `tweak`, for table rows.
using ScriptTweak = void (*)(VmsgDeviceScript&);
inline VmsgDeviceScript scriptWith(ScriptTweak tweak) {
    VmsgDeviceScript script;
    if (tweak) tweak(script);
    return script;
}

inline size_t countEvents(VmsgDeviceEventKind kind) {
    size_t n = 0;
    for (const VmsgDeviceEvent& event : vmsgDeviceEvents()) n += event.kind == kind;
    return n;
}
