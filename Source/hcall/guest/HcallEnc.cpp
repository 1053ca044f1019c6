#include "hcall/guest/HcallEnc.h"

#include "hcall/guest/HcallCall.h"
#include "hcall/guest/HcallExchange.h"
#include "xpl/XplLayout.h"
#include "xpl/XplLoadOrder.h"

using hcall::invoke;

// The record holds the client and nothing else.
XPL_LAYOUT_FIRST(HcallGuestGlobals, client)
XPL_LAYOUT_LAST(HcallGuestGlobals, client)

HcallGuestGlobals g_hcall XPL_LOAD_ORDER(XPL_LOAD_ORDER_HCALL);

xerr_t hcallLibInitGuest() {
    std::lock_guard<std::mutex> lock(hcall::gExchangeLock);
    return g_hcall.client.connect(HCALL_SERVICE_ID) ? XERR_SUCCESS : XERR_FAILURE;
}

// A host call has no time limit, so this must not queue behind one for the
// exchange lock. The capacities change only inside connect, which stores each
// atomically; each is read atomically here.
void hcallGetBufferSizes(int* maxHostBoundSize, int* maxGuestBoundSize) NO_THREAD_SAFETY_ANALYSIS {
    const VmsgGuestClient& client = g_hcall.client;
    if (maxHostBoundSize) *maxHostBoundSize = int(vmsgLoadCapacity(client.mMaxHostBoundSize));
    if (maxGuestBoundSize) *maxGuestBoundSize = int(vmsgLoadCapacity(client.mMaxGuestBoundSize));
}

// Every exported operation has exactly the type its catalogue line describes.
#define HCALL_CHECK_TYPE(code, name, result, sig, params)                          \
    static_assert(std::is_same<decltype(&name), hcall::Op<code>::Function>::value, \
                  #name " differs from its catalogue line");
HCALL_CATALOGUE(HCALL_CHECK_TYPE)
#undef HCALL_CHECK_TYPE

// clang-format off
xerr_t hcallGetPropsRpc(char* buffer, int32_t bufferLength, int32_t* value) { return invoke<hcall::kOp_hcallGetPropsRpc>(buffer, bufferLength, value); }
xerr_t hcallInitInputDebuggingStatusRpc(bool showTouches, bool showPointerLocation) { return invoke<hcall::kOp_hcallInitInputDebuggingStatusRpc>(showTouches, showPointerLocation); }
xerr_t hcallInitImeStatusRpc(const char* imeName) { return invoke<hcall::kOp_hcallInitImeStatusRpc>(imeName); }
xerr_t hcallInitVolumeRpc(bool mute, int32_t volume, int32_t maxVolume) { return invoke<hcall::kOp_hcallInitVolumeRpc>(mute, volume, maxVolume); }
xerr_t hcallGetTimeInfoRpc(uint64_t* time, char* buffer, int32_t bufferLength) { return invoke<hcall::kOp_hcallGetTimeInfoRpc>(time, buffer, bufferLength); }
xerr_t hcallSyncInstalledAppsRpc(const char* jsonData) { return invoke<hcall::kOp_hcallSyncInstalledAppsRpc>(jsonData); }
xerr_t hcallOnOrientationChangedRpc(int32_t orientation) { return invoke<hcall::kOp_hcallOnOrientationChangedRpc>(orientation); }
xerr_t hcallOnImeChangedRpc(const char* imeName) { return invoke<hcall::kOp_hcallOnImeChangedRpc>(imeName); }
xerr_t hcallOnTextEditModeChangedRpc(bool isTextEditMode) { return invoke<hcall::kOp_hcallOnTextEditModeChangedRpc>(isTextEditMode); }
xerr_t hcallOnActivityDisplayedRpc(const char* package, const char* activity) { return invoke<hcall::kOp_hcallOnActivityDisplayedRpc>(package, activity); }
xerr_t hcallOnScreenshotSavedRpc(const char* fileName) { return invoke<hcall::kOp_hcallOnScreenshotSavedRpc>(fileName); }
xerr_t hcallOnLocaleChangedRpc(const char* locale) { return invoke<hcall::kOp_hcallOnLocaleChangedRpc>(locale); }
xerr_t hcallOnAppInstalledRpc(const char* package, const char* activity, const char* appLabel, int32_t versionCode, const char* versionName, const char* iconFileName, const char* source, bool isUpdate) { return invoke<hcall::kOp_hcallOnAppInstalledRpc>(package, activity, appLabel, versionCode, versionName, iconFileName, source, isUpdate); }
xerr_t hcallOnAppUninstalledRpc(const char* pkgName) { return invoke<hcall::kOp_hcallOnAppUninstalledRpc>(pkgName); }
xerr_t hcallExportFilesRpc(const char* folder) { return invoke<hcall::kOp_hcallExportFilesRpc>(folder); }
xerr_t hcallStartImportFilesRpc() { return invoke<hcall::kOp_hcallStartImportFilesRpc>(); }
xerr_t hcallStartExportFilesRpc() { return invoke<hcall::kOp_hcallStartExportFilesRpc>(); }
xerr_t hcallSetClipboardTextRpc(const char* text) { return invoke<hcall::kOp_hcallSetClipboardTextRpc>(text); }
xerr_t hcallOnVolumeChangedRpc(bool mute, int32_t volume) { return invoke<hcall::kOp_hcallOnVolumeChangedRpc>(mute, volume); }
xerr_t hcallOnGoogleLoginCompletedRpc(const char* emailId) { return invoke<hcall::kOp_hcallOnGoogleLoginCompletedRpc>(emailId); }
xerr_t hcallOnZelvaneLoginCompletedRpc(const char* emailId) { return invoke<hcall::kOp_hcallOnZelvaneLoginCompletedRpc>(emailId); }
xerr_t hcallSetAppConfigDbParamsRpc(const char* package, bool macrosDisabled, bool showFeedbackPopup, const char* mouseCursorStyle, bool nativeGamepad) { return invoke<hcall::kOp_hcallSetAppConfigDbParamsRpc>(package, macrosDisabled, showFeedbackPopup, mouseCursorStyle, nativeGamepad); }
xerr_t hcallGoogleAccountListUpdatedRpc(const char* emailId, int action) { return invoke<hcall::kOp_hcallGoogleAccountListUpdatedRpc>(emailId, action); }
// A host that cannot be asked answers true: the launch policy is the host's,
// and without it the guest behaves as when no package is named, rather than
// refusing every application while the connection is down.
bool hcallIsAppLaunchAllowedRpc(const char* pkg) { return invoke<hcall::kOp_hcallIsAppLaunchAllowedRpc>(pkg); }
xerr_t hcallOnCursorLocationChangedRpc(int32_t x, int32_t y) { return invoke<hcall::kOp_hcallOnCursorLocationChangedRpc>(x, y); }
xerr_t hcallOpenUrlRpc(const char* urlString) { return invoke<hcall::kOp_hcallOpenUrlRpc>(urlString); }
xerr_t hcallCreateDesktopShortcutRpc(const char* pkgName) { return invoke<hcall::kOp_hcallCreateDesktopShortcutRpc>(pkgName); }
xerr_t hcallSetGoogleAdIdRpc(const char* googleAdId) { return invoke<hcall::kOp_hcallSetGoogleAdIdRpc>(googleAdId); }
xerr_t hcallLaunchOrxRpc() { return invoke<hcall::kOp_hcallLaunchOrxRpc>(); }
xerr_t hcallOnVibrateRpc(int32_t duration, const char* pkg) { return invoke<hcall::kOp_hcallOnVibrateRpc>(duration, pkg); }
xerr_t hcallOnSetDeviceProfileCompletedRpc(xerr_t outcome) { return invoke<hcall::kOp_hcallOnSetDeviceProfileCompletedRpc>(outcome); }
xerr_t hcallOnSetLocaleCompletedRpc(xerr_t outcome) { return invoke<hcall::kOp_hcallOnSetLocaleCompletedRpc>(outcome); }
xerr_t hcallOnRootDeviceCompletedRpc(xerr_t outcome) { return invoke<hcall::kOp_hcallOnRootDeviceCompletedRpc>(outcome); }
xerr_t hcallOnEnableInputDebuggingCompletedRpc(xerr_t outcome) { return invoke<hcall::kOp_hcallOnEnableInputDebuggingCompletedRpc>(outcome); }
xerr_t hcallOnInstallApkCompletedRpc(xerr_t outcome, const char* package) { return invoke<hcall::kOp_hcallOnInstallApkCompletedRpc>(outcome, package); }
xerr_t hcallOnUninstallAppCompletedRpc(xerr_t outcome) { return invoke<hcall::kOp_hcallOnUninstallAppCompletedRpc>(outcome); }
xerr_t hcallOnLaunchActivityCompletedRpc(xerr_t outcome) { return invoke<hcall::kOp_hcallOnLaunchActivityCompletedRpc>(outcome); }
xerr_t hcallOnEnableAdbCompletedRpc(xerr_t outcome) { return invoke<hcall::kOp_hcallOnEnableAdbCompletedRpc>(outcome); }
xerr_t hcallOnClearAppDataCompletedRpc(xerr_t outcome) { return invoke<hcall::kOp_hcallOnClearAppDataCompletedRpc>(outcome); }
xerr_t hcallOnImportFilesCompletedRpc(xerr_t outcome, const char* folderString) { return invoke<hcall::kOp_hcallOnImportFilesCompletedRpc>(outcome, folderString); }
xerr_t hcallOnAppNotificationReceivedRpc(const char* notificationJsonString) { return invoke<hcall::kOp_hcallOnAppNotificationReceivedRpc>(notificationJsonString); }
xerr_t hcallSetUsageStatsUpdateIntervalRpc(int32_t secs) { return invoke<hcall::kOp_hcallSetUsageStatsUpdateIntervalRpc>(secs); }
xerr_t hcallOnConsoleModeStateChangedRpc(bool consoleModeState) { return invoke<hcall::kOp_hcallOnConsoleModeStateChangedRpc>(consoleModeState); }
// clang-format on
