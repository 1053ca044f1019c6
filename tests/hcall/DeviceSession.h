// Test helpers around the device model: a fresh script per test, g_hcall
// connected to it, and readers for what the device saw.
#pragma once

#include <cstring>
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

inline std::vector<uint8_t> bytes(std::initializer_list<int> values) {
    std::vector<uint8_t> out;
    for (int v : values) out.push_back(uint8_t(v));
    return out;
}

inline size_t countEvents(VmsgDeviceEventKind kind) {
    size_t n = 0;
    for (const VmsgDeviceEvent& event : vmsgDeviceEvents()) n += event.kind == kind;
    return n;
}

// The one exchange the device saw since the last reset; an empty record (code
// 0) when there was not exactly one.
inline VmsgDeviceExchange onlyExchange() {
    std::vector<VmsgDeviceExchange> all = vmsgDeviceExchanges();
    return all.size() == 1 ? all[0] : VmsgDeviceExchange();
}
