package com.zelvane.server.bridgetest;

import com.zelvane.server.KivHostCallService;
import java.util.List;

/**
 * The 30 forwarding methods as the soak sends them. Each event carries its
 * sender's tag (thread and sequence number) in a string argument as "T7#123",
 * or, without a string, in an int argument as {@link #intTag}; the methods
 * with neither (booleans or nothing) go untagged and are counted instead.
 */
final class SoakEvents {
    private SoakEvents() {}

    /** An int tag: far above any other int the soak sends. */
    static final int INT_TAG_BASE = 1_000_000_000;
    static final int MAX_SEQ = 10_000_000;

    static int intTag(int thread, int seq) {
        return INT_TAG_BASE + thread * MAX_SEQ + seq;
    }

    static String tag(int thread, int seq) {
        return "T" + thread + "#" + seq;
    }

    @FunctionalInterface
    interface Send {
        /** Calls the method with the tag in `s` (string) or `i` (int) and returns its result. */
        int call(KivHostCallService service, String s, int i);
    }

    /** One forwarding method: its host call, the name its task logs under, whether it is tagged. */
    record Kind(String op, String method, boolean tagged, Send send) {}

    private static Kind tagged(String op, String method, Send send) {
        return new Kind(op, method, true, send);
    }

    private static Kind untagged(String op, String method, Send send) {
        return new Kind(op, method, false, send);
    }

    static final List<Kind> KINDS = List.of(
            untagged("hcallInitInputDebuggingStatusRpc", "initInputDebuggingStatus",
                    (x, s, i) -> x.native_initInputDebuggingStatus(true, false)),
            tagged("hcallInitImeStatusRpc", "initImeStatus", (x, s, i) -> x.native_initImeStatus(s)),
            tagged("hcallSyncInstalledAppsRpc", "syncInstalledApps",
                    (x, s, i) -> x.native_syncInstalledApps("{\"apps\":[\"" + s + "\"]}")),
            tagged("hcallOnOrientationChangedRpc", "onOrientationChanged", (x, s, i) -> x.native_onOrientationChange(i)),
            tagged("hcallOnImeChangedRpc", "onImeChanged", (x, s, i) -> x.native_onImeChange(s)),
            untagged("hcallOnTextEditModeChangedRpc", "onTextEditModeChanged",
                    (x, s, i) -> x.native_onTextEditModeChange(true)),
            tagged("hcallOnActivityDisplayedRpc", "onActivityDisplayed",
                    (x, s, i) -> x.native_onActivityDisplayed(s, "com.example.Main")),
            tagged("hcallExportFilesRpc", "exportFiles", (x, s, i) -> x.native_exportFiles("/sdcard/" + s)),
            untagged("hcallStartImportFilesRpc", "startImportFiles", (x, s, i) -> x.native_startImportFiles()),
            untagged("hcallStartExportFilesRpc", "startExportFiles", (x, s, i) -> x.native_startExportFiles()),
            untagged("hcallLaunchOrxRpc", "launchOrx", (x, s, i) -> x.native_launchOrx()),
            tagged("hcallSetClipboardTextRpc", "setClipboardText", (x, s, i) -> x.native_setClipboardText("clip " + s)),
            tagged("hcallOnVolumeChangedRpc", "onVolumeChanged", (x, s, i) -> x.native_onVolumeChanged(false, i)),
            tagged("hcallOnGoogleLoginCompletedRpc", "onGoogleLoginCompleted",
                    (x, s, i) -> x.native_onGoogleLoginCompleted(s + "@example.com")),
            tagged("hcallOnZelvaneLoginCompletedRpc", "onZelvaneLoginCompleted",
                    (x, s, i) -> x.native_onZelvaneLoginCompleted(s + "@example.org")),
            tagged("hcallSetAppConfigDbParamsRpc", "setAppConfigDbParams",
                    (x, s, i) -> x.native_setAppConfigDbParams(s, true, false, "", true)),
            tagged("hcallGoogleAccountListUpdatedRpc", "googleAccountListUpdated",
                    (x, s, i) -> x.native_googleAccountListUpdated(s, 2)),
            tagged("hcallOnCursorLocationChangedRpc", "onCursorLocationChanged",
                    (x, s, i) -> x.native_onCursorLocationChanged(i, 17)),
            tagged("hcallOnLocaleChangedRpc", "onLocaleChanged", (x, s, i) -> x.native_onLocaleChanged(s)),
            tagged("hcallOnAppInstalledRpc", "onAppInstalled",
                    (x, s, i) -> x.native_onAppInstalled(s, "Main", "Label \u00e9", 3, "1.0", "", "store", false)),
            tagged("hcallOnAppUninstalledRpc", "onAppUninstalled", (x, s, i) -> x.native_onAppUninstalled(s)),
            tagged("hcallOnScreenshotSavedRpc", "onScreenshotSaved",
                    (x, s, i) -> x.native_onScreenshotSaved(s + ".png")),
            tagged("hcallCreateDesktopShortcutRpc", "createDesktopShortcut",
                    (x, s, i) -> x.native_createDesktopShortcut(s)),
            tagged("hcallOnImportFilesCompletedRpc", "importFilesCompleted",
                    (x, s, i) -> x.native_importFilesCompleted(0, s)),
            tagged("hcallOpenUrlRpc", "openUrl", (x, s, i) -> x.native_openUrl("https://example.com/" + s)),
            tagged("hcallInitVolumeRpc", "initVolume", (x, s, i) -> x.native_initVolume(true, i, 15)),
            tagged("hcallOnAppNotificationReceivedRpc", "onAppNotificationReceived",
                    (x, s, i) -> x.native_onAppNotificationReceived("{\"id\":\"" + s + "\"}")),
            tagged("hcallSetUsageStatsUpdateIntervalRpc", "setUsageStatsUpdateInterval",
                    (x, s, i) -> x.native_setUsageStatsUpdateInterval(i)),
            tagged("hcallOnVibrateRpc", "onVibrate", (x, s, i) -> x.native_onVibrate(20, s)),
            untagged("hcallOnConsoleModeStateChangedRpc", "onConsoleModeStateChanged",
                    (x, s, i) -> x.native_onConsoleModeStateChanged(false)));

    static final String LAUNCH_OP = "hcallIsAppLaunchAllowedRpc";
    static final String AD_ID_OP = "hcallSetGoogleAdIdRpc";

    static Kind byOp(String op) {
        for (Kind k : KINDS)
            if (k.op.equals(op)) return k;
        return null;
    }
}
