// The design floor of each host-call shape, written plainly: what the framing
// requires and no more. The same four level questions as a host call (its
// entry and exit lines under HCALL, the client's two trace lines under VMSG),
// string lengths measured once, the request's fit checked, the header and the
// fields written in place in the host-bound buffer, one uncontended std::mutex
// held from the buffer to the reply, one SEND_RECEIVE, the reply read in place.
// It shares the library's connection (g_hcall) and logger, and none of its code.
// Each shape is a function of its own, as each operation is in the library.
#pragma once

#include <sys/ioctl.h>

#include <cstdint>
#include <cstring>
#include <mutex>

#include "hcall/guest/HcallCatalogue.h"
#include "hcall/guest/HcallEnc.h"
#include "vmsg/guest/VmsgDevice.h"
#include "xpl/Xlog.h"

namespace hcallfloor {

inline std::mutex gLock;
constexpr char kSource[] = "bench/hcall/HcallFloor";

inline uint8_t* put(uint8_t* out, uint32_t value) {
    std::memcpy(out, &value, sizeof(value));
    return out + sizeof(value);
}
inline uint8_t* put(uint8_t* out, const char* text, size_t length) {
    out = put(out, uint32_t(length + 1));
    std::memcpy(out, text, length + 1);
    return out + length + 1;
}
// Bytes a string field takes: its count, the bytes and the NUL.
constexpr size_t field(size_t length) { return 4 + length + 1; }

inline void lineIf(XlogLogger* logger, int module, int level, const char* name) {
    if (logger->shouldLog(module, level))
        logger->print(level, module, kSource, name, __LINE__, "%s\n", name);
}

// One call: a request of `length` bytes whose reply takes `replyLength`;
// `write` fills the fields after the header, `read` takes the result from the
// reply.
template <typename Result, typename Write, typename Read>
Result exchange(const char* name, uint32_t code, size_t length, size_t replyLength, Result refused,
                Write write, Read read) {
    XlogLogger* logger = xlogGetLogger();
    lineIf(logger, XLOG_MODULE_HCALL, XLOG_LEVEL_I, name);
    std::lock_guard<std::mutex> lock(gLock);
    VmsgGuestClient& client = g_hcall.client;
    lineIf(logger, XLOG_MODULE_VMSG, XLOG_LEVEL_I, name);
    if (length > client.mMaxHostBoundSize || replyLength > client.mMaxGuestBoundSize)
        return refused;
    write(put(put(static_cast<uint8_t*>(client.mHostBoundBuf), code), uint32_t(length)));
    lineIf(logger, XLOG_MODULE_VMSG, XLOG_LEVEL_I, name);
    if (ioctl(client.mFd, VMSG_IOC_SEND_RECEIVE) < 0) return refused;
    const Result result = read(static_cast<const uint8_t*>(client.mGuestBoundBuf));
    lineIf(logger, XLOG_MODULE_HCALL, XLOG_LEVEL_D, name);
    return result;
}

constexpr xerr_t kRefused = XERR_FAILURE;

inline xerr_t resultAt(const uint8_t* reply) {
    xerr_t result;
    std::memcpy(&result, reply, sizeof(result));
    return result;
}

__attribute__((noinline)) inline xerr_t launchOrx() {
    return exchange(
        "launchOrx", hcall::kOp_hcallLaunchOrxRpc, 8, 4, kRefused, [](uint8_t*) {}, resultAt);
}

__attribute__((noinline)) inline xerr_t onOrientationChanged(int32_t orientation) {
    return exchange(
        "onOrientationChanged", hcall::kOp_hcallOnOrientationChangedRpc, 12, 4, kRefused,
        [&](uint8_t* out) { put(out, uint32_t(orientation)); }, resultAt);
}

// Every shape with one string: the locale, the clipboard text.
__attribute__((noinline)) inline xerr_t oneString(uint32_t code, const char* text) {
    const size_t length = std::strlen(text);
    return exchange(
        "oneString", code, 8 + field(length), 4, kRefused,
        [&](uint8_t* out) { put(out, text, length); }, resultAt);
}

__attribute__((noinline)) inline xerr_t onAppInstalled(const char* package, const char* activity,
                                                       const char* appLabel, int32_t versionCode,
                                                       const char* versionName,
                                                       const char* iconFileName, const char* source,
                                                       bool isUpdate) {
    const size_t n[] = {std::strlen(package),     std::strlen(activity),     std::strlen(appLabel),
                        std::strlen(versionName), std::strlen(iconFileName), std::strlen(source)};
    const size_t length = 8 + field(n[0]) + field(n[1]) + field(n[2]) + 4 + field(n[3]) +
                          field(n[4]) + field(n[5]) + 4;
    return exchange(
        "onAppInstalled", hcall::kOp_hcallOnAppInstalledRpc, length, 4, kRefused,
        [&](uint8_t* out) {
            out = put(put(put(out, package, n[0]), activity, n[1]), appLabel, n[2]);
            out = put(put(out, uint32_t(versionCode)), versionName, n[3]);
            put(put(put(out, iconFileName, n[4]), source, n[5]), isUpdate ? 1 : 0);
        },
        resultAt);
}

__attribute__((noinline)) inline xerr_t getProps(char* buffer, int32_t bufferLength,
                                                 int32_t* value) {
    const size_t capacity = size_t(bufferLength);
    return exchange(
        "getProps", hcall::kOp_hcallGetPropsRpc, 20, capacity + 8, kRefused,
        [&](uint8_t* out) { put(put(put(out, uint32_t(capacity)), uint32_t(bufferLength)), 4); },
        [&](const uint8_t* reply) {
            std::memcpy(buffer, reply, capacity);
            std::memcpy(value, reply + capacity, sizeof(*value));
            return resultAt(reply + capacity + 4);
        });
}

__attribute__((noinline)) inline bool isAppLaunchAllowed(const char* package) {
    const size_t length = std::strlen(package);
    return exchange(
        "isAppLaunchAllowed", hcall::kOp_hcallIsAppLaunchAllowedRpc, 8 + field(length), 4, true,
        [&](uint8_t* out) { put(out, package, length); },
        [](const uint8_t* reply) { return reply[0] != 0; });
}

}  // namespace hcallfloor
