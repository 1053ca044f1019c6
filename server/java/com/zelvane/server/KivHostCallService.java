package com.zelvane.server;

/**
 * Stand-in for the guest's host-call service: the Java surface that
 * libhostcall_jni binds its native methods to. Tests and the demo load the
 * library themselves (System.load) and call the methods directly.
 */
public class KivHostCallService {
    public native void native_init();
    public native int native_initInputDebuggingStatus(boolean showTouches, boolean showPointerLocation);
    public native int native_initImeStatus(String imeName);
    public native int native_syncInstalledApps(String jsonData);
    public native int native_onOrientationChange(int orientation);
    public native int native_onImeChange(String imeName);
    public native int native_onTextEditModeChange(boolean isTextEditMode);
    public native int native_onActivityDisplayed(String packageName, String activity);
    public native int native_exportFiles(String folder);
    public native int native_startImportFiles();
    public native int native_startExportFiles();
    public native int native_launchOrx();
    public native int native_setClipboardText(String text);
    public native int native_onVolumeChanged(boolean mute, int volume);
    public native int native_onGoogleLoginCompleted(String emailId);
    public native int native_onZelvaneLoginCompleted(String emailId);
    public native int native_setAppConfigDbParams(String packageName, boolean macrosDisabled,
            boolean showFeedbackPopup, String mouseCursorStyle, boolean nativeGamepad);
    public native int native_googleAccountListUpdated(String emailId, int action);
    public native boolean native_isAppLaunchAllowed(String pkg);
    public native int native_setGoogleAdId(String googleAdId);
    public native int native_onCursorLocationChanged(int x, int y);
    public native int native_onLocaleChanged(String locale);
    public native int native_onAppInstalled(String packageName, String activity, String appLabel,
            int versionCode, String versionName, String iconFileName, String source, boolean isUpdate);
    public native int native_onAppUninstalled(String pkgName);
    public native int native_onScreenshotSaved(String fileName);
    public native int native_createDesktopShortcut(String pkgName);
    public native int native_importFilesCompleted(int outcome, String folderString);
    public native int native_openUrl(String urlString);
    public native int native_initVolume(boolean mute, int volume, int maxVolume);
    public native int native_onAppNotificationReceived(String notificationJsonString);
    public native int native_setUsageStatsUpdateInterval(int secs);
    public native int native_onVibrate(int duration, String pkg);
    public native int native_onConsoleModeStateChanged(boolean consoleModeState);
}
