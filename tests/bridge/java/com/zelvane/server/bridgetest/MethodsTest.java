package com.zelvane.server.bridgetest;

import static com.zelvane.server.bridgetest.Bridge.debug;
import static com.zelvane.server.bridgetest.Bridge.error;
import static com.zelvane.server.bridgetest.Bridge.task;
import static org.junit.jupiter.api.Assertions.assertArrayEquals;
import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertThrows;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.zelvane.server.KivHostCallService;
import java.util.ArrayList;
import java.util.LinkedHashMap;
import java.util.List;
import java.util.Map;
import java.util.function.Function;
import java.util.function.Supplier;
import org.junit.jupiter.api.BeforeEach;
import org.junit.jupiter.api.Test;

/** The 32 methods in a started service with debug lines on: what the host receives, what Java gets, what is logged. */
class MethodsTest {
    static final String E_ACUTE = "caf\u00e9";
    static final String WITH_NUL = "a\u0000b";
    static final String BEYOND_BMP = "smile\uD83D\uDE00";
    /** The host's answers while the table runs. */
    static final int AD_ID_RESULT = -5;
    static final int UNINSTALL_RESULT = -13;

    /** One call: what Java gets back, the request the host receives, the bridge's lines in order. */
    record Row(String name, Supplier<Object> call, Object returns, String request, List<String> lines) {}

    private KivHostCallService s;

    @BeforeEach
    void drainAndReset() {
        s = Bridge.started();
        Bridge.drain(s, true);
        TestNative.configureHost(false, new int[] {28, AD_ID_RESULT, 14, UNINSTALL_RESULT});
    }

    /** A method's name string: "jint name(JNIEnv *, jobject, parameters)". */
    private static String jint(String name, String parameters) {
        return "jint " + name + "(JNIEnv *, jobject" + (parameters.isEmpty() ? "" : ", " + parameters) + ")";
    }

    /**
     * A forwarding method: `first` is its line before the strings are
     * converted (": called", " called" or null), `detail` its line after the
     * check (null: none); its task logs the host's result 0.
     */
    private static Row event(String name, String first, String detail, Supplier<Object> call, Wire request) {
        List<String> lines = new ArrayList<>();
        if (first != null) lines.add(debug(name + first));
        if (detail != null) lines.add(debug(name + detail));
        lines.add(debug(task(name) + ": returning, rval = 0"));
        return new Row(name, call, 0, request.hex(), lines);
    }

    /** A query: its lines are all written on the caller's thread, under the method's own name. */
    private static Row query(String name, String detail, Supplier<Object> call, Object answer, Wire request) {
        int rval = answer instanceof Boolean yes ? (yes ? 1 : 0) : (Integer) answer;
        return new Row(name, call, answer, request.hex(), List.of(debug(name + ": called"), debug(name + detail),
                debug(name + ": returning, rval = " + rval)));
    }

    private List<Row> rows() {
        String appConfig = jint("setAppConfigDbParams", "jstring, jboolean, jboolean, jstring, jboolean");
        String installed =
                jint("onAppInstalled", "jstring, jstring, jstring, jint, jstring, jstring, jstring, jboolean");
        String uninstalled = jint("onAppUninstalled", "jstring");
        return List.of(
                event(jint("initInputDebuggingStatus", "jboolean, jboolean"), null,
                        ": showTouches = 1 showPointerLocation = 0",
                        () -> s.native_initInputDebuggingStatus(true, false), Wire.op(2).bool(true).bool(false)),
                event(jint("initImeStatus", "jstring"), ": called", ": imeName = " + E_ACUTE,
                        () -> s.native_initImeStatus(E_ACUTE), Wire.op(3).str(E_ACUTE)),
                event(jint("syncInstalledApps", "jstring"), ": called", ": jsonData = [" + WITH_NUL + "]",
                        () -> s.native_syncInstalledApps("[" + WITH_NUL + "]"), Wire.op(6).str("[" + WITH_NUL + "]")),
                event(jint("onOrientationChanged", "int"), null, ": orientation = 3",
                        () -> s.native_onOrientationChange(3), Wire.op(7).i32(3)),
                event(jint("onImeChanged", "jstring"), ": called", ": imeName = " + BEYOND_BMP,
                        () -> s.native_onImeChange(BEYOND_BMP), Wire.op(8).str(BEYOND_BMP)),
                event(jint("onTextEditModeChanged", "jboolean"), null, ": isTextEditMode = 1",
                        () -> s.native_onTextEditModeChange(true), Wire.op(9).bool(true)),
                event(jint("onActivityDisplayed", "jstring, jstring"), ": called",
                        ": package = com.pkg, activity = com.pkg.Main",
                        () -> s.native_onActivityDisplayed("com.pkg", "com.pkg.Main"),
                        Wire.op(10).str("com.pkg").str("com.pkg.Main")),
                event(jint("exportFiles", "jstring"), ": called", ": folder = /sdcard",
                        () -> s.native_exportFiles("/sdcard"), Wire.op(15).str("/sdcard")),
                event(jint("startImportFiles", ""), ": called", null, s::native_startImportFiles, Wire.op(16)),
                event(jint("startExportFiles", ""), ": called", null, s::native_startExportFiles, Wire.op(17)),
                event(jint("launchOrx", ""), ": called", null, s::native_launchOrx, Wire.op(29)),
                event(jint("setClipboardText", "jstring"), ": called", ": text = clip",
                        () -> s.native_setClipboardText("clip"), Wire.op(18).str("clip")),
                event(jint("onVolumeChanged", "jboolean, jint"), null, ": mute = 1, volume = 7",
                        () -> s.native_onVolumeChanged(true, 7), Wire.op(19).bool(true).i32(7)),
                event(jint("onGoogleLoginCompleted", "jstring"), ": called", ": emailId = g@x",
                        () -> s.native_onGoogleLoginCompleted("g@x"), Wire.op(20).str("g@x")),
                event(jint("onZelvaneLoginCompleted", "jstring"), ": called", ": emailId = z@x",
                        () -> s.native_onZelvaneLoginCompleted("z@x"), Wire.op(21).str("z@x")),
                // Two rows, so that any two of the three booleans differ in one of them.
                event(appConfig, ": called", ": package = pkg, macrosDisabled = 1, showFeedbackPopup = 0, "
                                + "mouseCursorStyle = arrow, nativeGamepad = 0",
                        () -> s.native_setAppConfigDbParams("pkg", true, false, "arrow", false),
                        Wire.op(22).str("pkg").bool(true).bool(false).str("arrow").bool(false)),
                // The style is not checked: it travels empty.
                event(appConfig, ": called", ": package = pkg, macrosDisabled = 0, showFeedbackPopup = 1, "
                                + "mouseCursorStyle = , nativeGamepad = 0",
                        () -> s.native_setAppConfigDbParams("pkg", false, true, "", false),
                        Wire.op(22).str("pkg").bool(false).bool(true).str("").bool(false)),
                event(jint("googleAccountListUpdated", "jstring, jint"), ": called", ": emailId = a@b, action = -2",
                        () -> s.native_googleAccountListUpdated("a@b", -2), Wire.op(23).str("a@b").i32(-2)),
                query("jboolean isAppLaunchAllowed(JNIEnv *, jobject, jstring)", ": pkg = p" + E_ACUTE,
                        () -> s.native_isAppLaunchAllowed("p" + E_ACUTE), false, Wire.op(24).str("p" + E_ACUTE)),
                query(jint("setGoogleAdId", "jstring"), ": googleAdId = ad", () -> s.native_setGoogleAdId("ad"),
                        AD_ID_RESULT, Wire.op(28).str("ad")),
                event(jint("onCursorLocationChanged", "jint, jint"), null, " called: x = -5, y = 1080",
                        () -> s.native_onCursorLocationChanged(-5, 1080), Wire.op(25).i32(-5).i32(1080)),
                event(jint("onLocaleChanged", "jstring"), ": called", ": locale = fr-FR",
                        () -> s.native_onLocaleChanged("fr-FR"), Wire.op(12).str("fr-FR")),
                event(installed, ": called", ": package = p, activity = p.Main, appLabel = Label, versionCode = 42, "
                                + "versionName = 1.0, iconFileName: icon.png, source: store, isUpdate: 1",
                        () -> s.native_onAppInstalled("p", "p.Main", "Label", 42, "1.0", "icon.png", "store", true),
                        Wire.op(13).str("p").str("p.Main").str("Label").i32(42).str("1.0").str("icon.png")
                                .str("store").bool(true)),
                // The strings it does not check travel empty.
                event(installed, ": called", ": package = p, activity = a, appLabel = , versionCode = 0, "
                                + "versionName = , iconFileName: , source: , isUpdate: 0",
                        () -> s.native_onAppInstalled("p", "a", "", 0, "", "", "", false),
                        Wire.op(13).str("p").str("a").str("").i32(0).str("").str("").str("").bool(false)),
                // A failing host call, and the one task whose returning line has a blank before the comma.
                new Row(uninstalled, () -> s.native_onAppUninstalled("gone"), 0, Wire.op(14).str("gone").hex(),
                        List.of(debug(uninstalled + ": called"), debug(uninstalled + ": pkgName = gone"),
                                error("RPC failed for " + task(uninstalled) + ", error " + UNINSTALL_RESULT),
                                debug(task(uninstalled) + ": returning , rval = " + UNINSTALL_RESULT))),
                event(jint("onScreenshotSaved", "jstring"), ": called", ": fileName = /shot.png",
                        () -> s.native_onScreenshotSaved("/shot.png"), Wire.op(11).str("/shot.png")),
                event(jint("createDesktopShortcut", "jstring"), ": called", ": pkgName = short",
                        () -> s.native_createDesktopShortcut("short"), Wire.op(27).str("short")),
                event(jint("importFilesCompleted", "jint, jstring"), ": called", ": folderString = /import",
                        () -> s.native_importFilesCompleted(-13, "/import"), Wire.op(40).i32(-13).str("/import")),
                event(jint("openUrl", "jstring"), ": called", ": urlString = https://x/",
                        () -> s.native_openUrl("https://x/"), Wire.op(26).str("https://x/")),
                event(jint("initVolume", "jboolean, jint, jint"), null, ": mute = 0, volume = 5, maxVolume = 15",
                        () -> s.native_initVolume(false, 5, 15), Wire.op(4).bool(false).i32(5).i32(15)),
                event(jint("onAppNotificationReceived", "jstring"), ": called", ": notificationJsonString = {}",
                        () -> s.native_onAppNotificationReceived("{}"), Wire.op(41).str("{}")),
                event(jint("setUsageStatsUpdateInterval", "int"), null, ": secs = 60",
                        () -> s.native_setUsageStatsUpdateInterval(60), Wire.op(42).i32(60)),
                event(jint("onVibrate", "jint, jstring"), " called", ": duration = 100, pkg = vib",
                        () -> s.native_onVibrate(100, "vib"), Wire.op(30).i32(100).str("vib")),
                event(jint("onConsoleModeStateChanged", "jboolean"), null, ": called consoleModeState : 0",
                        () -> s.native_onConsoleModeStateChanged(false), Wire.op(43).bool(false)));
    }

    @Test
    void EveryMethod_WhenCalled_ReturnsSendsItsArgumentsInOrderAndLogsItsLines() {
        for (Row row : rows()) {
            int mark = Bridge.lines().size();
            assertEquals(row.returns(), row.call().get(), row.name() + " returns");
            assertEquals(List.of(row.request()), Bridge.drain(s, true), row.name() + " sends exactly this request");
            assertEquals(row.lines(), Bridge.drainedLines(mark), row.name() + " logs these lines, in this order");
            TestNative.configureHost(false, new int[] {28, AD_ID_RESULT, 14, UNINSTALL_RESULT});
        }
        assertEquals(0, TestNative.overlaps(), "host calls never overlap");
    }

    @Test
    void Queries_WhenTheHostSaysYes_ReturnItsAnswer() {
        TestNative.configureHost(true, new int[0]);
        assertEquals(true, s.native_isAppLaunchAllowed("q"), "launch allowed");
        assertEquals(0, s.native_setGoogleAdId("ad"), "success reaches Java as 0");
    }

    /** Each required string of each method, with `value` in its place and the others filled. */
    private Map<String, Function<String, Object>> requiredPlaces() {
        Map<String, Function<String, Object>> m = new LinkedHashMap<>();
        m.put("initImeStatus", v -> s.native_initImeStatus(v));
        m.put("syncInstalledApps", v -> s.native_syncInstalledApps(v));
        m.put("onImeChange", v -> s.native_onImeChange(v));
        m.put("onActivityDisplayed package", v -> s.native_onActivityDisplayed(v, "act"));
        m.put("onActivityDisplayed activity", v -> s.native_onActivityDisplayed("pkg", v));
        m.put("exportFiles", v -> s.native_exportFiles(v));
        m.put("setClipboardText", v -> s.native_setClipboardText(v));
        m.put("onGoogleLoginCompleted", v -> s.native_onGoogleLoginCompleted(v));
        m.put("onZelvaneLoginCompleted", v -> s.native_onZelvaneLoginCompleted(v));
        m.put("setAppConfigDbParams", v -> s.native_setAppConfigDbParams(v, true, true, "x", true));
        m.put("googleAccountListUpdated", v -> s.native_googleAccountListUpdated(v, 1));
        m.put("onLocaleChanged", v -> s.native_onLocaleChanged(v));
        m.put("onAppInstalled package", v -> s.native_onAppInstalled(v, "a", "l", 1, "n", "i", "s", false));
        m.put("onAppInstalled activity", v -> s.native_onAppInstalled("p", v, "l", 1, "n", "i", "s", false));
        m.put("onAppUninstalled", v -> s.native_onAppUninstalled(v));
        m.put("onScreenshotSaved", v -> s.native_onScreenshotSaved(v));
        m.put("createDesktopShortcut", v -> s.native_createDesktopShortcut(v));
        m.put("importFilesCompleted", v -> s.native_importFilesCompleted(0, v));
        m.put("openUrl", v -> s.native_openUrl(v));
        m.put("onAppNotificationReceived", v -> s.native_onAppNotificationReceived(v));
        m.put("onVibrate", v -> s.native_onVibrate(5, v));
        m.put("setGoogleAdId", v -> s.native_setGoogleAdId(v));
        m.put("isAppLaunchAllowed", v -> s.native_isAppLaunchAllowed(v));
        return m;
    }

    /**
     * An empty required string refuses the call; a null one also raises
     * "Null argument", and the strings after it in the same call are not
     * touched while that exception is pending (-Xcheck:jni would report it).
     */
    @Test
    void RequiredStrings_WhenEmptyOrNull_RefuseTheCallAfterItsFirstLine() {
        int mark = Bridge.lines().size();
        for (Map.Entry<String, Function<String, Object>> place : requiredPlaces().entrySet()) {
            Object refused = place.getKey().equals("isAppLaunchAllowed") ? (Object) true : (Object) (-1);
            assertEquals(refused, place.getValue().apply(""), place.getKey() + " refuses an empty string");
            IllegalArgumentException thrown = assertThrows(IllegalArgumentException.class,
                    () -> place.getValue().apply(null), place.getKey() + " raises for null");
            assertEquals("Null argument", thrown.getMessage());
        }
        assertEquals(List.of(), Bridge.drain(s, true), "nothing reaches the host");
        for (String line : Bridge.drainedLines(mark))
            assertTrue(line.endsWith(": called") || line.endsWith(" called"), "only first lines are written: " + line);
    }

    @Test
    void UncheckedStrings_WhenNull_RaiseNullArgumentButTheEventTravelsWithEmptyStrings() {
        Class<IllegalArgumentException> raised = IllegalArgumentException.class;
        assertThrows(raised, () -> s.native_setAppConfigDbParams("pkg", false, true, null, false));
        assertThrows(raised, () -> s.native_onAppInstalled("p", "a", null, 3, null, null, null, true));
        assertEquals(List.of(Wire.op(22).str("pkg").bool(false).bool(true).str("").bool(false).hex(),
                        Wire.op(13).str("p").str("a").str("").i32(3).str("").str("").str("").bool(true).hex()),
                Bridge.drain(s, true));
    }

    /** Regression: the conversion read and gave back a null pointer when the runtime lent nothing. */
    @Test
    void GetStringFromJstring_WhenTheRuntimeLendsNoBytes_YieldsEmptyAndGivesNothingBack() {
        assertArrayEquals(new int[] {0, 0}, TestNative.convertStarved("abc"), "{bytes, releases}");
    }
}
