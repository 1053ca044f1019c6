// The host-call operations as data: one line per operation gives its code,
// name, result kind, signature text and parameter kinds. Everything else about
// an operation (request layout, reply layout, log formats, host-side decoding)
// is derived from this list, so a wrong byte cannot hide in one of 43 copies.
//
// Header-only and free of the library's other headers so that a stand-in host
// can decode requests with exactly the same table.
#pragma once

#include <cstddef>
#include <cstdint>

namespace hcall {

// How a parameter travels. Every request field starts with 4 bytes.
enum Kind : uint8_t {
    Str,     // const char*: u32 count (length + 1), then the bytes and the NUL
    I32,     // i32, int or xerr_t: the value, two's complement
    Bool,    // bool: first byte 1 or 0, three bytes 0
    Buf,     // char* the host fills; its capacity is the i32 parameter after it.
             // Request: u32 capacity. Reply: exactly capacity bytes.
    OutI32,  // i32* the host fills. Request: u32 4. Reply: 4 bytes.
    OutU64,  // u64* the host fills. Request: u32 8. Reply: 8 bytes.
};

// The 4-byte result that ends every reply.
enum Result : uint8_t {
    Xerr,  // an xerr_t, returned unchanged
    Flag,  // a bool field, true when its first byte is not 0
};

}  // namespace hcall

// clang-format off
#define HCALL_CATALOGUE(X) \
X( 1, hcallGetPropsRpc,                       Xerr, "xerr_t hcallGetPropsRpc(char *, i32, i32 *)", (Buf, I32, OutI32)) \
X( 2, hcallInitInputDebuggingStatusRpc,       Xerr, "xerr_t hcallInitInputDebuggingStatusRpc(bool, bool)", (Bool, Bool)) \
X( 3, hcallInitImeStatusRpc,                  Xerr, "xerr_t hcallInitImeStatusRpc(const char *)", (Str)) \
X( 4, hcallInitVolumeRpc,                     Xerr, "xerr_t hcallInitVolumeRpc(bool, i32, i32)", (Bool, I32, I32)) \
X( 5, hcallGetTimeInfoRpc,                    Xerr, "xerr_t hcallGetTimeInfoRpc(u64 *, char *, i32)", (OutU64, Buf, I32)) \
X( 6, hcallSyncInstalledAppsRpc,              Xerr, "xerr_t hcallSyncInstalledAppsRpc(const char *)", (Str)) \
X( 7, hcallOnOrientationChangedRpc,           Xerr, "xerr_t hcallOnOrientationChangedRpc(i32)", (I32)) \
X( 8, hcallOnImeChangedRpc,                   Xerr, "xerr_t hcallOnImeChangedRpc(const char *)", (Str)) \
X( 9, hcallOnTextEditModeChangedRpc,          Xerr, "xerr_t hcallOnTextEditModeChangedRpc(bool)", (Bool)) \
X(10, hcallOnActivityDisplayedRpc,            Xerr, "xerr_t hcallOnActivityDisplayedRpc(const char *, const char *)", (Str, Str)) \
X(11, hcallOnScreenshotSavedRpc,              Xerr, "xerr_t hcallOnScreenshotSavedRpc(const char *)", (Str)) \
X(12, hcallOnLocaleChangedRpc,                Xerr, "xerr_t hcallOnLocaleChangedRpc(const char *)", (Str)) \
X(13, hcallOnAppInstalledRpc,                 Xerr, "xerr_t hcallOnAppInstalledRpc(const char *, const char *, const char *, i32, const char *, const char *, const char *, bool)", (Str, Str, Str, I32, Str, Str, Str, Bool)) \
X(14, hcallOnAppUninstalledRpc,               Xerr, "xerr_t hcallOnAppUninstalledRpc(const char *)", (Str)) \
X(15, hcallExportFilesRpc,                    Xerr, "xerr_t hcallExportFilesRpc(const char *)", (Str)) \
X(16, hcallStartImportFilesRpc,               Xerr, "xerr_t hcallStartImportFilesRpc()", ()) \
X(17, hcallStartExportFilesRpc,               Xerr, "xerr_t hcallStartExportFilesRpc()", ()) \
X(18, hcallSetClipboardTextRpc,               Xerr, "xerr_t hcallSetClipboardTextRpc(const char *)", (Str)) \
X(19, hcallOnVolumeChangedRpc,                Xerr, "xerr_t hcallOnVolumeChangedRpc(bool, i32)", (Bool, I32)) \
X(20, hcallOnGoogleLoginCompletedRpc,         Xerr, "xerr_t hcallOnGoogleLoginCompletedRpc(const char *)", (Str)) \
X(21, hcallOnZelvaneLoginCompletedRpc,        Xerr, "xerr_t hcallOnZelvaneLoginCompletedRpc(const char *)", (Str)) \
X(22, hcallSetAppConfigDbParamsRpc,           Xerr, "xerr_t hcallSetAppConfigDbParamsRpc(const char *, bool, bool, const char *, bool)", (Str, Bool, Bool, Str, Bool)) \
X(23, hcallGoogleAccountListUpdatedRpc,       Xerr, "xerr_t hcallGoogleAccountListUpdatedRpc(const char *, int)", (Str, I32)) \
X(24, hcallIsAppLaunchAllowedRpc,             Flag, "bool hcallIsAppLaunchAllowedRpc(const char *)", (Str)) \
X(25, hcallOnCursorLocationChangedRpc,        Xerr, "xerr_t hcallOnCursorLocationChangedRpc(i32, i32)", (I32, I32)) \
X(26, hcallOpenUrlRpc,                        Xerr, "xerr_t hcallOpenUrlRpc(const char *)", (Str)) \
X(27, hcallCreateDesktopShortcutRpc,          Xerr, "xerr_t hcallCreateDesktopShortcutRpc(const char *)", (Str)) \
X(28, hcallSetGoogleAdIdRpc,                  Xerr, "xerr_t hcallSetGoogleAdIdRpc(const char *)", (Str)) \
X(29, hcallLaunchOrxRpc,                      Xerr, "xerr_t hcallLaunchOrxRpc()", ()) \
X(30, hcallOnVibrateRpc,                      Xerr, "xerr_t hcallOnVibrateRpc(i32, const char *)", (I32, Str)) \
X(31, hcallOnSetDeviceProfileCompletedRpc,    Xerr, "xerr_t hcallOnSetDeviceProfileCompletedRpc(xerr_t)", (I32)) \
X(32, hcallOnSetLocaleCompletedRpc,           Xerr, "xerr_t hcallOnSetLocaleCompletedRpc(xerr_t)", (I32)) \
X(33, hcallOnRootDeviceCompletedRpc,          Xerr, "xerr_t hcallOnRootDeviceCompletedRpc(xerr_t)", (I32)) \
X(34, hcallOnEnableInputDebuggingCompletedRpc, Xerr, "xerr_t hcallOnEnableInputDebuggingCompletedRpc(xerr_t)", (I32)) \
X(35, hcallOnInstallApkCompletedRpc,          Xerr, "xerr_t hcallOnInstallApkCompletedRpc(xerr_t, const char *)", (I32, Str)) \
X(36, hcallOnUninstallAppCompletedRpc,        Xerr, "xerr_t hcallOnUninstallAppCompletedRpc(xerr_t)", (I32)) \
X(37, hcallOnLaunchActivityCompletedRpc,      Xerr, "xerr_t hcallOnLaunchActivityCompletedRpc(xerr_t)", (I32)) \
X(38, hcallOnEnableAdbCompletedRpc,           Xerr, "xerr_t hcallOnEnableAdbCompletedRpc(xerr_t)", (I32)) \
X(39, hcallOnClearAppDataCompletedRpc,        Xerr, "xerr_t hcallOnClearAppDataCompletedRpc(xerr_t)", (I32)) \
X(40, hcallOnImportFilesCompletedRpc,         Xerr, "xerr_t hcallOnImportFilesCompletedRpc(xerr_t, const char *)", (I32, Str)) \
X(41, hcallOnAppNotificationReceivedRpc,      Xerr, "xerr_t hcallOnAppNotificationReceivedRpc(const char *)", (Str)) \
X(42, hcallSetUsageStatsUpdateIntervalRpc,    Xerr, "xerr_t hcallSetUsageStatsUpdateIntervalRpc(i32)", (I32)) \
X(43, hcallOnConsoleModeStateChangedRpc,      Xerr, "xerr_t hcallOnConsoleModeStateChangedRpc(bool)", (Bool))
// clang-format on

#define HCALL_UNPAREN(...) __VA_ARGS__

namespace hcall {

constexpr uint32_t kServiceId = 0x6C616368;  // "hcal" as it lies in memory
constexpr uint32_t kHeaderSize = 8;          // u32 opCode, u32 totalLength
constexpr uint32_t kFieldSize = 4;           // every fixed field and every count
constexpr uint32_t kResultSize = 4;          // the result that ends every reply
constexpr int kMaxParams = 8;
constexpr uint32_t kNumOps = 43;

// The code of each operation by name: kOp_hcallOpenUrlRpc is 26.
enum OpCode : uint32_t {
#define HCALL_OP_CODE(code, name, result, sig, params) kOp_##name = code,
    HCALL_CATALOGUE(HCALL_OP_CODE)
#undef HCALL_OP_CODE
};

// Bytes of reply a filled parameter takes, given the capacity of a buffer.
constexpr uint32_t filledSize(Kind kind, uint32_t bufferLength) {
    return kind == Buf ? bufferLength : kind == OutI32 ? 4 : kind == OutU64 ? 8 : 0;
}

struct OpInfo {
    uint32_t code;
    const char* name;
    Result result;
    const char* signature;
    int numParams;
    Kind params[kMaxParams];
};

template <Kind... K>
constexpr OpInfo makeOp(uint32_t code, const char* name, Result result, const char* signature) {
    static_assert(sizeof...(K) <= kMaxParams, "raise kMaxParams");
    return OpInfo{code, name, result, signature, int(sizeof...(K)), {K...}};
}

// Indexed by code - 1.
// One table for the whole program, so an entry can be told apart by its address.
inline constexpr OpInfo kOps[] = {
#define HCALL_OP_INFO(code, name, result, sig, params) \
    makeOp<HCALL_UNPAREN params>(code, #name, result, sig),
    HCALL_CATALOGUE(HCALL_OP_INFO)
#undef HCALL_OP_INFO
};
static_assert(sizeof(kOps) / sizeof(kOps[0]) == kNumOps, "43 operations");

constexpr bool codesAreDense() {
    for (uint32_t i = 0; i < kNumOps; ++i)
        if (kOps[i].code != i + 1) return false;
    return true;
}
static_assert(codesAreDense(), "codes run from 1 to 43 in order, without gaps");

// A filled buffer takes its capacity from the i32 parameter right after it.
constexpr bool buffersHaveLengths() {
    for (const OpInfo& op : kOps)
        for (int i = 0; i < op.numParams; ++i)
            if (op.params[i] == Buf && (i + 1 >= op.numParams || op.params[i + 1] != I32))
                return false;
    return true;
}
static_assert(buffersHaveLengths(), "every filled buffer is followed by its length");

// The operation with `code`, or null for a code outside 1 to 43.
constexpr const OpInfo* findOp(uint32_t code) {
    return code >= 1 && code <= kNumOps ? &kOps[code - 1] : nullptr;
}

}  // namespace hcall
