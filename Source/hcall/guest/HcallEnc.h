// Host calls: the one connection to the host-call service and the 43
// operations that travel over it. Each operation sends one request and waits
// for the host's reply; calls from several threads take turns.
#pragma once

#include <cstdint>
#include <mutex>

#include "hcall/guest/HcallCatalogue.h"
#include "vmsg/guest/VmsgGuest.h"
#include "xpl/Xerr.h"
#include "xpl/XplExport.h"
#include "xpl/XplThreadAnnotations.h"

constexpr VmsgServiceId HCALL_SERVICE_ID = hcall::kServiceId;

struct HcallMsgHeader {
    uint32_t opCode;
    uint32_t totalLength;
};
static_assert(sizeof(HcallMsgHeader) == hcall::kHeaderSize, "the header is two u32 words");

namespace hcall {
// Serialises whole exchanges on g_hcall, and its start and end (see
// HcallExchange.h). Never destroyed. Not exported.
extern std::mutex& gExchangeLock;
}  // namespace hcall

// The one host-call connection. Its destructor runs at unload or process exit
// and disconnects the client unless an exchange is still in progress on
// another thread; then the mapping and descriptor are left to the process's
// end, because unmapping them would pull the buffers out from under it.
struct HcallGuestGlobals {
    ~HcallGuestGlobals();
    VmsgGuestClient client GUARDED_BY(hcall::gExchangeLock);
};

XPL_EXPORT extern HcallGuestGlobals g_hcall;

// Connects g_hcall to the host-call service: 0 on success, -1 on failure.
XPL_EXPORT xerr_t hcallLibInitGuest();
// The host-bound and guest-bound capacities; either pointer may be null. Never
// waits: it reads them without the exchange lock.
XPL_EXPORT void hcallGetBufferSizes(int* maxHostBoundSize, int* maxGuestBoundSize);

// The operations. Each returns the host's result, or -1 when the request does
// not fit the connection, its reply would not fit, the connection is closed or
// the exchange fails. Strings must not be null. A filled buffer must hold a
// terminated string on entry (it is logged), and its length must not be
// negative.
extern "C" {
XPL_EXPORT xerr_t hcallGetPropsRpc(char* buffer, int32_t bufferLength, int32_t* value);
XPL_EXPORT xerr_t hcallInitInputDebuggingStatusRpc(bool showTouches, bool showPointerLocation);
XPL_EXPORT xerr_t hcallInitImeStatusRpc(const char* imeName);
XPL_EXPORT xerr_t hcallInitVolumeRpc(bool mute, int32_t volume, int32_t maxVolume);
XPL_EXPORT xerr_t hcallGetTimeInfoRpc(uint64_t* time, char* buffer, int32_t bufferLength);
XPL_EXPORT xerr_t hcallSyncInstalledAppsRpc(const char* jsonData);
XPL_EXPORT xerr_t hcallOnOrientationChangedRpc(int32_t orientation);
XPL_EXPORT xerr_t hcallOnImeChangedRpc(const char* imeName);
XPL_EXPORT xerr_t hcallOnTextEditModeChangedRpc(bool isTextEditMode);
XPL_EXPORT xerr_t hcallOnActivityDisplayedRpc(const char* package, const char* activity);
XPL_EXPORT xerr_t hcallOnScreenshotSavedRpc(const char* fileName);
XPL_EXPORT xerr_t hcallOnLocaleChangedRpc(const char* locale);
XPL_EXPORT xerr_t hcallOnAppInstalledRpc(const char* package, const char* activity,
                                         const char* appLabel, int32_t versionCode,
                                         const char* versionName, const char* iconFileName,
                                         const char* source, bool isUpdate);
XPL_EXPORT xerr_t hcallOnAppUninstalledRpc(const char* pkgName);
XPL_EXPORT xerr_t hcallExportFilesRpc(const char* folder);
XPL_EXPORT xerr_t hcallStartImportFilesRpc();
XPL_EXPORT xerr_t hcallStartExportFilesRpc();
XPL_EXPORT xerr_t hcallSetClipboardTextRpc(const char* text);
XPL_EXPORT xerr_t hcallOnVolumeChangedRpc(bool mute, int32_t volume);
XPL_EXPORT xerr_t hcallOnGoogleLoginCompletedRpc(const char* emailId);
XPL_EXPORT xerr_t hcallOnZelvaneLoginCompletedRpc(const char* emailId);
XPL_EXPORT xerr_t hcallSetAppConfigDbParamsRpc(const char* package, bool macrosDisabled,
                                               bool showFeedbackPopup, const char* mouseCursorStyle,
                                               bool nativeGamepad);
XPL_EXPORT xerr_t hcallGoogleAccountListUpdatedRpc(const char* emailId, int action);
// When the host cannot be asked (no connection, or the exchange fails) the
// answer is true: see the definition.
XPL_EXPORT bool hcallIsAppLaunchAllowedRpc(const char* pkg);
XPL_EXPORT xerr_t hcallOnCursorLocationChangedRpc(int32_t x, int32_t y);
XPL_EXPORT xerr_t hcallOpenUrlRpc(const char* urlString);
XPL_EXPORT xerr_t hcallCreateDesktopShortcutRpc(const char* pkgName);
XPL_EXPORT xerr_t hcallSetGoogleAdIdRpc(const char* googleAdId);
XPL_EXPORT xerr_t hcallLaunchOrxRpc();
XPL_EXPORT xerr_t hcallOnVibrateRpc(int32_t duration, const char* pkg);
XPL_EXPORT xerr_t hcallOnSetDeviceProfileCompletedRpc(xerr_t outcome);
XPL_EXPORT xerr_t hcallOnSetLocaleCompletedRpc(xerr_t outcome);
XPL_EXPORT xerr_t hcallOnRootDeviceCompletedRpc(xerr_t outcome);
XPL_EXPORT xerr_t hcallOnEnableInputDebuggingCompletedRpc(xerr_t outcome);
XPL_EXPORT xerr_t hcallOnInstallApkCompletedRpc(xerr_t outcome, const char* package);
XPL_EXPORT xerr_t hcallOnUninstallAppCompletedRpc(xerr_t outcome);
XPL_EXPORT xerr_t hcallOnLaunchActivityCompletedRpc(xerr_t outcome);
XPL_EXPORT xerr_t hcallOnEnableAdbCompletedRpc(xerr_t outcome);
XPL_EXPORT xerr_t hcallOnClearAppDataCompletedRpc(xerr_t outcome);
XPL_EXPORT xerr_t hcallOnImportFilesCompletedRpc(xerr_t outcome, const char* folderString);
XPL_EXPORT xerr_t hcallOnAppNotificationReceivedRpc(const char* notificationJsonString);
XPL_EXPORT xerr_t hcallSetUsageStatsUpdateIntervalRpc(int32_t secs);
XPL_EXPORT xerr_t hcallOnConsoleModeStateChangedRpc(bool consoleModeState);
}
