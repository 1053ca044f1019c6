// The native side of com.zelvane.server.KivHostCallService: the library entry,
// the service start, and one declaration per event and query method. The
// conversion, checks, lines, queuing and host call they share live in
// HostEvent.h.
#include <android_runtime/AndroidRuntime.h>
#include <jni.h>

#include <iterator>

#include "BridgeLog.h"
#include "HostEvent.h"
#include "ServiceStart.h"
#include "hcall/guest/HcallEnc.h"

namespace {

using bridge::askHost;
using bridge::FirstLine;
using bridge::forwardEvent;
using bridge::MethodTexts;
using bridge::Required;
using bridge::Unlogged;

constexpr const char* kServiceClass = "com/zelvane/server/KivHostCallService";

void native_init(JNIEnv* /*env*/, jobject /*object*/) { bridge::startService(); }

constexpr MethodTexts kInitInputDebuggingStatus{
    BRIDGE_NAMES("jint", "initInputDebuggingStatus(JNIEnv *, jobject, jboolean, jboolean)"),
    FirstLine::None, "%s: showTouches = %d showPointerLocation = %d"};
jint initInputDebuggingStatus(JNIEnv* env, jobject object, jboolean showTouches,
                              jboolean showPointerLocation) {
    return forwardEvent<kInitInputDebuggingStatus, hcallInitInputDebuggingStatusRpc>(
        env, object, showTouches, showPointerLocation);
}

constexpr MethodTexts kInitImeStatus{
    BRIDGE_NAMES("jint", "initImeStatus(JNIEnv *, jobject, jstring)"), FirstLine::Called,
    "%s: imeName = %s"};
jint initImeStatus(JNIEnv* env, jobject object, jstring imeName) {
    return forwardEvent<kInitImeStatus, hcallInitImeStatusRpc>(env, object, Required{imeName});
}

constexpr MethodTexts kSyncInstalledApps{
    BRIDGE_NAMES("jint", "syncInstalledApps(JNIEnv *, jobject, jstring)"), FirstLine::Called,
    "%s: jsonData = %s"};
jint syncInstalledApps(JNIEnv* env, jobject object, jstring jsonData) {
    return forwardEvent<kSyncInstalledApps, hcallSyncInstalledAppsRpc>(env, object,
                                                                       Required{jsonData});
}

constexpr MethodTexts kOnOrientationChanged{
    BRIDGE_NAMES("jint", "onOrientationChanged(JNIEnv *, jobject, int)"), FirstLine::None,
    "%s: orientation = %d"};
jint onOrientationChanged(JNIEnv* env, jobject object, int orientation) {
    return forwardEvent<kOnOrientationChanged, hcallOnOrientationChangedRpc>(env, object,
                                                                             orientation);
}

constexpr MethodTexts kOnImeChanged{
    BRIDGE_NAMES("jint", "onImeChanged(JNIEnv *, jobject, jstring)"), FirstLine::Called,
    "%s: imeName = %s"};
jint onImeChanged(JNIEnv* env, jobject object, jstring imeName) {
    return forwardEvent<kOnImeChanged, hcallOnImeChangedRpc>(env, object, Required{imeName});
}

constexpr MethodTexts kOnTextEditModeChanged{
    BRIDGE_NAMES("jint", "onTextEditModeChanged(JNIEnv *, jobject, jboolean)"), FirstLine::None,
    "%s: isTextEditMode = %d"};
jint onTextEditModeChanged(JNIEnv* env, jobject object, jboolean isTextEditMode) {
    return forwardEvent<kOnTextEditModeChanged, hcallOnTextEditModeChangedRpc>(env, object,
                                                                               isTextEditMode);
}

constexpr MethodTexts kOnActivityDisplayed{
    BRIDGE_NAMES("jint", "onActivityDisplayed(JNIEnv *, jobject, jstring, jstring)"),
    FirstLine::Called, "%s: package = %s, activity = %s"};
jint onActivityDisplayed(JNIEnv* env, jobject object, jstring package, jstring activity) {
    return forwardEvent<kOnActivityDisplayed, hcallOnActivityDisplayedRpc>(
        env, object, Required{package}, Required{activity});
}

constexpr MethodTexts kExportFiles{BRIDGE_NAMES("jint", "exportFiles(JNIEnv *, jobject, jstring)"),
                                   FirstLine::Called, "%s: folder = %s"};
jint exportFiles(JNIEnv* env, jobject object, jstring folder) {
    return forwardEvent<kExportFiles, hcallExportFilesRpc>(env, object, Required{folder});
}

constexpr MethodTexts kStartImportFiles{BRIDGE_NAMES("jint", "startImportFiles(JNIEnv *, jobject)"),
                                        FirstLine::Called, nullptr};
jint startImportFiles(JNIEnv* env, jobject object) {
    return forwardEvent<kStartImportFiles, hcallStartImportFilesRpc>(env, object);
}

constexpr MethodTexts kStartExportFiles{BRIDGE_NAMES("jint", "startExportFiles(JNIEnv *, jobject)"),
                                        FirstLine::Called, nullptr};
jint startExportFiles(JNIEnv* env, jobject object) {
    return forwardEvent<kStartExportFiles, hcallStartExportFilesRpc>(env, object);
}

constexpr MethodTexts kLaunchOrx{BRIDGE_NAMES("jint", "launchOrx(JNIEnv *, jobject)"),
                                 FirstLine::Called, nullptr};
jint launchOrx(JNIEnv* env, jobject object) {
    return forwardEvent<kLaunchOrx, hcallLaunchOrxRpc>(env, object);
}

constexpr MethodTexts kSetClipboardText{
    BRIDGE_NAMES("jint", "setClipboardText(JNIEnv *, jobject, jstring)"), FirstLine::Called,
    "%s: text = %s"};
jint setClipboardText(JNIEnv* env, jobject object, jstring text) {
    return forwardEvent<kSetClipboardText, hcallSetClipboardTextRpc>(env, object, Required{text});
}

constexpr MethodTexts kOnVolumeChanged{
    BRIDGE_NAMES("jint", "onVolumeChanged(JNIEnv *, jobject, jboolean, jint)"), FirstLine::None,
    "%s: mute = %d, volume = %d"};
jint onVolumeChanged(JNIEnv* env, jobject object, jboolean mute, jint volume) {
    return forwardEvent<kOnVolumeChanged, hcallOnVolumeChangedRpc>(env, object, mute, volume);
}

constexpr MethodTexts kOnGoogleLoginCompleted{
    BRIDGE_NAMES("jint", "onGoogleLoginCompleted(JNIEnv *, jobject, jstring)"), FirstLine::Called,
    "%s: emailId = %s"};
jint onGoogleLoginCompleted(JNIEnv* env, jobject object, jstring emailId) {
    return forwardEvent<kOnGoogleLoginCompleted, hcallOnGoogleLoginCompletedRpc>(env, object,
                                                                                 Required{emailId});
}

constexpr MethodTexts kOnZelvaneLoginCompleted{
    BRIDGE_NAMES("jint", "onZelvaneLoginCompleted(JNIEnv *, jobject, jstring)"), FirstLine::Called,
    "%s: emailId = %s"};
jint onZelvaneLoginCompleted(JNIEnv* env, jobject object, jstring emailId) {
    return forwardEvent<kOnZelvaneLoginCompleted, hcallOnZelvaneLoginCompletedRpc>(
        env, object, Required{emailId});
}

constexpr MethodTexts kSetAppConfigDbParams{
    BRIDGE_NAMES("jint",
                 "setAppConfigDbParams(JNIEnv *, jobject, jstring, jboolean, jboolean, "
                 "jstring, jboolean)"),
    FirstLine::Called,
    "%s: package = %s, macrosDisabled = %d, showFeedbackPopup = %d, mouseCursorStyle = %s, "
    "nativeGamepad = %d"};
jint setAppConfigDbParams(JNIEnv* env, jobject object, jstring package, jboolean macrosDisabled,
                          jboolean showFeedbackPopup, jstring mouseCursorStyle,
                          jboolean nativeGamepad) {
    return forwardEvent<kSetAppConfigDbParams, hcallSetAppConfigDbParamsRpc>(
        env, object, Required{package}, macrosDisabled, showFeedbackPopup, mouseCursorStyle,
        nativeGamepad);
}

constexpr MethodTexts kGoogleAccountListUpdated{
    BRIDGE_NAMES("jint", "googleAccountListUpdated(JNIEnv *, jobject, jstring, jint)"),
    FirstLine::Called, "%s: emailId = %s, action = %d"};
jint googleAccountListUpdated(JNIEnv* env, jobject object, jstring emailId, jint action) {
    return forwardEvent<kGoogleAccountListUpdated, hcallGoogleAccountListUpdatedRpc>(
        env, object, Required{emailId}, action);
}

constexpr MethodTexts kIsAppLaunchAllowed{
    BRIDGE_NAMES("jboolean", "isAppLaunchAllowed(JNIEnv *, jobject, jstring)"), FirstLine::Called,
    "%s: pkg = %s"};
jboolean isAppLaunchAllowed(JNIEnv* env, jobject object, jstring pkg) {
    return askHost<kIsAppLaunchAllowed, hcallIsAppLaunchAllowedRpc>(env, object, jboolean{JNI_TRUE},
                                                                    Required{pkg});
}

constexpr MethodTexts kSetGoogleAdId{
    BRIDGE_NAMES("jint", "setGoogleAdId(JNIEnv *, jobject, jstring)"), FirstLine::Called,
    "%s: googleAdId = %s"};
jint setGoogleAdId(JNIEnv* env, jobject object, jstring googleAdId) {
    return askHost<kSetGoogleAdId, hcallSetGoogleAdIdRpc>(env, object, jint{-1},
                                                          Required{googleAdId});
}

constexpr MethodTexts kOnCursorLocationChanged{
    BRIDGE_NAMES("jint", "onCursorLocationChanged(JNIEnv *, jobject, jint, jint)"), FirstLine::None,
    "%s called: x = %d, y = %d"};
jint onCursorLocationChanged(JNIEnv* env, jobject object, jint x, jint y) {
    return forwardEvent<kOnCursorLocationChanged, hcallOnCursorLocationChangedRpc>(env, object, x,
                                                                                   y);
}

constexpr MethodTexts kOnLocaleChanged{
    BRIDGE_NAMES("jint", "onLocaleChanged(JNIEnv *, jobject, jstring)"), FirstLine::Called,
    "%s: locale = %s"};
jint onLocaleChanged(JNIEnv* env, jobject object, jstring locale) {
    return forwardEvent<kOnLocaleChanged, hcallOnLocaleChangedRpc>(env, object, Required{locale});
}

constexpr MethodTexts kOnAppInstalled{
    BRIDGE_NAMES("jint",
                 "onAppInstalled(JNIEnv *, jobject, jstring, jstring, jstring, jint, "
                 "jstring, jstring, jstring, jboolean)"),
    FirstLine::Called,
    "%s: package = %s, activity = %s, appLabel = %s, versionCode = %d, versionName = %s, "
    "iconFileName: %s, source: %s, isUpdate: %d"};
jint onAppInstalled(JNIEnv* env, jobject object, jstring package, jstring activity,
                    jstring appLabel, jint versionCode, jstring versionName, jstring iconFileName,
                    jstring source, jboolean isUpdate) {
    return forwardEvent<kOnAppInstalled, hcallOnAppInstalledRpc>(
        env, object, Required{package}, Required{activity}, appLabel, versionCode, versionName,
        iconFileName, source, isUpdate);
}

constexpr MethodTexts kOnAppUninstalled{
    BRIDGE_NAMES("jint", "onAppUninstalled(JNIEnv *, jobject, jstring)"), FirstLine::Called,
    "%s: pkgName = %s", /*blankBeforeComma=*/true};
jint onAppUninstalled(JNIEnv* env, jobject object, jstring pkgName) {
    return forwardEvent<kOnAppUninstalled, hcallOnAppUninstalledRpc>(env, object,
                                                                     Required{pkgName});
}

constexpr MethodTexts kOnScreenshotSaved{
    BRIDGE_NAMES("jint", "onScreenshotSaved(JNIEnv *, jobject, jstring)"), FirstLine::Called,
    "%s: fileName = %s"};
jint onScreenshotSaved(JNIEnv* env, jobject object, jstring fileName) {
    return forwardEvent<kOnScreenshotSaved, hcallOnScreenshotSavedRpc>(env, object,
                                                                       Required{fileName});
}

constexpr MethodTexts kCreateDesktopShortcut{
    BRIDGE_NAMES("jint", "createDesktopShortcut(JNIEnv *, jobject, jstring)"), FirstLine::Called,
    "%s: pkgName = %s"};
jint createDesktopShortcut(JNIEnv* env, jobject object, jstring pkgName) {
    return forwardEvent<kCreateDesktopShortcut, hcallCreateDesktopShortcutRpc>(env, object,
                                                                               Required{pkgName});
}

constexpr MethodTexts kImportFilesCompleted{
    BRIDGE_NAMES("jint", "importFilesCompleted(JNIEnv *, jobject, jint, jstring)"),
    FirstLine::Called, "%s: folderString = %s"};
jint importFilesCompleted(JNIEnv* env, jobject object, jint outcome, jstring folderString) {
    return forwardEvent<kImportFilesCompleted, hcallOnImportFilesCompletedRpc>(
        env, object, Unlogged<jint>{outcome}, Required{folderString});
}

constexpr MethodTexts kOpenUrl{BRIDGE_NAMES("jint", "openUrl(JNIEnv *, jobject, jstring)"),
                               FirstLine::Called, "%s: urlString = %s"};
jint openUrl(JNIEnv* env, jobject object, jstring urlString) {
    return forwardEvent<kOpenUrl, hcallOpenUrlRpc>(env, object, Required{urlString});
}

constexpr MethodTexts kInitVolume{
    BRIDGE_NAMES("jint", "initVolume(JNIEnv *, jobject, jboolean, jint, jint)"), FirstLine::None,
    "%s: mute = %d, volume = %d, maxVolume = %d"};
jint initVolume(JNIEnv* env, jobject object, jboolean mute, jint volume, jint maxVolume) {
    return forwardEvent<kInitVolume, hcallInitVolumeRpc>(env, object, mute, volume, maxVolume);
}

constexpr MethodTexts kOnAppNotificationReceived{
    BRIDGE_NAMES("jint", "onAppNotificationReceived(JNIEnv *, jobject, jstring)"),
    FirstLine::Called, "%s: notificationJsonString = %s"};
jint onAppNotificationReceived(JNIEnv* env, jobject object, jstring notificationJsonString) {
    return forwardEvent<kOnAppNotificationReceived, hcallOnAppNotificationReceivedRpc>(
        env, object, Required{notificationJsonString});
}

constexpr MethodTexts kSetUsageStatsUpdateInterval{
    BRIDGE_NAMES("jint", "setUsageStatsUpdateInterval(JNIEnv *, jobject, int)"), FirstLine::None,
    "%s: secs = %d"};
jint setUsageStatsUpdateInterval(JNIEnv* env, jobject object, int secs) {
    return forwardEvent<kSetUsageStatsUpdateInterval, hcallSetUsageStatsUpdateIntervalRpc>(
        env, object, secs);
}

constexpr MethodTexts kOnVibrate{
    BRIDGE_NAMES("jint", "onVibrate(JNIEnv *, jobject, jint, jstring)"), FirstLine::CalledAlways,
    "%s: duration = %d, pkg = %s"};
jint onVibrate(JNIEnv* env, jobject object, jint duration, jstring pkg) {
    return forwardEvent<kOnVibrate, hcallOnVibrateRpc>(env, object, duration, Required{pkg});
}

constexpr MethodTexts kOnConsoleModeStateChanged{
    BRIDGE_NAMES("jint", "onConsoleModeStateChanged(JNIEnv *, jobject, jboolean)"), FirstLine::None,
    "%s: called consoleModeState : %d"};
jint onConsoleModeStateChanged(JNIEnv* env, jobject object, jboolean consoleModeState) {
    return forwardEvent<kOnConsoleModeStateChanged, hcallOnConsoleModeStateChangedRpc>(
        env, object, consoleModeState);
}

// clang-format off
const JNINativeMethod gMethods[] = {
    /* name, signature, funcPtr */
    {"native_init", "()V", (void*)native_init},
    {"native_initInputDebuggingStatus", "(ZZ)I", (void*)initInputDebuggingStatus},
    {"native_initImeStatus", "(Ljava/lang/String;)I", (void*)initImeStatus},
    {"native_syncInstalledApps", "(Ljava/lang/String;)I", (void*)syncInstalledApps},
    {"native_onOrientationChange", "(I)I", (void*)onOrientationChanged},
    {"native_onImeChange", "(Ljava/lang/String;)I", (void*)onImeChanged},
    {"native_onTextEditModeChange", "(Z)I", (void*)onTextEditModeChanged},
    {"native_onActivityDisplayed", "(Ljava/lang/String;Ljava/lang/String;)I", (void*)onActivityDisplayed},
    {"native_exportFiles", "(Ljava/lang/String;)I", (void*)exportFiles},
    {"native_startImportFiles", "()I", (void*)startImportFiles},
    {"native_startExportFiles", "()I", (void*)startExportFiles},
    {"native_launchOrx", "()I", (void*)launchOrx},
    {"native_setClipboardText", "(Ljava/lang/String;)I", (void*)setClipboardText},
    {"native_onVolumeChanged", "(ZI)I", (void*)onVolumeChanged},
    {"native_onGoogleLoginCompleted", "(Ljava/lang/String;)I", (void*)onGoogleLoginCompleted},
    {"native_onZelvaneLoginCompleted", "(Ljava/lang/String;)I", (void*)onZelvaneLoginCompleted},
    {"native_setAppConfigDbParams", "(Ljava/lang/String;ZZLjava/lang/String;Z)I", (void*)setAppConfigDbParams},
    {"native_googleAccountListUpdated", "(Ljava/lang/String;I)I", (void*)googleAccountListUpdated},
    {"native_isAppLaunchAllowed", "(Ljava/lang/String;)Z", (void*)isAppLaunchAllowed},
    {"native_setGoogleAdId", "(Ljava/lang/String;)I", (void*)setGoogleAdId},
    {"native_onCursorLocationChanged", "(II)I", (void*)onCursorLocationChanged},
    {"native_onLocaleChanged", "(Ljava/lang/String;)I", (void*)onLocaleChanged},
    {"native_onAppInstalled", "(Ljava/lang/String;Ljava/lang/String;Ljava/lang/String;ILjava/lang/String;Ljava/lang/String;Ljava/lang/String;Z)I", (void*)onAppInstalled},
    {"native_onAppUninstalled", "(Ljava/lang/String;)I", (void*)onAppUninstalled},
    {"native_onScreenshotSaved", "(Ljava/lang/String;)I", (void*)onScreenshotSaved},
    {"native_createDesktopShortcut", "(Ljava/lang/String;)I", (void*)createDesktopShortcut},
    {"native_importFilesCompleted", "(ILjava/lang/String;)I", (void*)importFilesCompleted},
    {"native_openUrl", "(Ljava/lang/String;)I", (void*)openUrl},
    {"native_initVolume", "(ZII)I", (void*)initVolume},
    {"native_onAppNotificationReceived", "(Ljava/lang/String;)I", (void*)onAppNotificationReceived},
    {"native_setUsageStatsUpdateInterval", "(I)I", (void*)setUsageStatsUpdateInterval},
    {"native_onVibrate", "(ILjava/lang/String;)I", (void*)onVibrate},
    {"native_onConsoleModeStateChanged", "(Z)I", (void*)onConsoleModeStateChanged},
};
// clang-format on
static_assert(std::size(gMethods) == 33, "native_init and the 32 event and query methods");

}  // namespace

jint JNI_OnLoad(JavaVM* vm, void* /*reserved*/) {
    ALOGI("%s called", "jint JNI_OnLoad(JavaVM *, void *)");
    JNIEnv* env = nullptr;
    if (vm->GetEnv(reinterpret_cast<void**>(&env), JNI_VERSION_1_4) != JNI_OK) {
        ALOGE("ERROR: GetEnv failed");
        return -1;
    }
    if (android::AndroidRuntime::registerNativeMethods(env, kServiceClass, gMethods,
                                                       std::size(gMethods)) != 0) {
        ALOGE("ERROR: KivHostCallService native registration failed");
        return -1;
    }
    return JNI_VERSION_1_4;
}
