package com.zelvane.server.bridgetest;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertFalse;
import static org.junit.jupiter.api.Assertions.assertThrows;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.zelvane.server.KivHostCallService;
import java.util.ArrayList;
import java.util.LinkedHashMap;
import java.util.List;
import java.util.Map;
import java.util.function.Function;
import java.util.function.IntSupplier;
import org.junit.jupiter.api.BeforeEach;
import org.junit.jupiter.api.Test;

/** What each method hands the host, and what Java gets back, in a started service. */
class ForwardingTest {
    static final String E_ACUTE = "caf\u00e9";
    static final String WITH_NUL = "a\u0000b";
    static final String BEYOND_BMP = "smile\uD83D\uDE00";

    private KivHostCallService s;

    @BeforeEach
    void drainAndReset() {
        s = Bridge.started();
        Bridge.drain(s, true);
        TestNative.resetDevice();
    }

    private static void expect(Map<String, byte[]> wire, String label, byte[] request) {
        wire.put(label, request);
    }

    @Test
    void ForwardingMethods_WhenCalled_HostReceivesEachArgumentInParameterOrderWithExactBytes() {
        Map<String, IntSupplier> calls = new LinkedHashMap<>();
        Map<String, byte[]> wire = new LinkedHashMap<>();
        calls.put("initInputDebuggingStatus", () -> s.native_initInputDebuggingStatus(true, false));
        expect(wire, "initInputDebuggingStatus", Wire.op(2).bool(true).bool(false).bytes());
        calls.put("initImeStatus", () -> s.native_initImeStatus(E_ACUTE));
        expect(wire, "initImeStatus", Wire.op(3).str(E_ACUTE).bytes());
        calls.put("syncInstalledApps", () -> s.native_syncInstalledApps("[\"" + WITH_NUL + "\"]"));
        expect(wire, "syncInstalledApps", Wire.op(6).str("[\"" + WITH_NUL + "\"]").bytes());
        calls.put("onOrientationChange", () -> s.native_onOrientationChange(3));
        expect(wire, "onOrientationChange", Wire.op(7).i32(3).bytes());
        calls.put("onImeChange", () -> s.native_onImeChange(BEYOND_BMP));
        expect(wire, "onImeChange", Wire.op(8).str(BEYOND_BMP).bytes());
        calls.put("onTextEditModeChange", () -> s.native_onTextEditModeChange(true));
        expect(wire, "onTextEditModeChange", Wire.op(9).bool(true).bytes());
        calls.put("onActivityDisplayed", () -> s.native_onActivityDisplayed("com.pkg", "com.pkg.Main"));
        expect(wire, "onActivityDisplayed", Wire.op(10).str("com.pkg").str("com.pkg.Main").bytes());
        calls.put("exportFiles", () -> s.native_exportFiles("/sdcard/" + E_ACUTE));
        expect(wire, "exportFiles", Wire.op(15).str("/sdcard/" + E_ACUTE).bytes());
        calls.put("startImportFiles", s::native_startImportFiles);
        expect(wire, "startImportFiles", Wire.op(16).bytes());
        calls.put("startExportFiles", s::native_startExportFiles);
        expect(wire, "startExportFiles", Wire.op(17).bytes());
        calls.put("launchOrx", s::native_launchOrx);
        expect(wire, "launchOrx", Wire.op(29).bytes());
        calls.put("setClipboardText", () -> s.native_setClipboardText(WITH_NUL + BEYOND_BMP));
        expect(wire, "setClipboardText", Wire.op(18).str(WITH_NUL + BEYOND_BMP).bytes());
        calls.put("onVolumeChanged", () -> s.native_onVolumeChanged(true, 7));
        expect(wire, "onVolumeChanged", Wire.op(19).bool(true).i32(7).bytes());
        calls.put("onGoogleLoginCompleted", () -> s.native_onGoogleLoginCompleted("g@example.com"));
        expect(wire, "onGoogleLoginCompleted", Wire.op(20).str("g@example.com").bytes());
        calls.put("onZelvaneLoginCompleted", () -> s.native_onZelvaneLoginCompleted("z@example.com"));
        expect(wire, "onZelvaneLoginCompleted", Wire.op(21).str("z@example.com").bytes());
        calls.put("setAppConfigDbParams", () -> s.native_setAppConfigDbParams("pkg", true, false, "arrow", true));
        expect(wire, "setAppConfigDbParams",
                Wire.op(22).str("pkg").bool(true).bool(false).str("arrow").bool(true).bytes());
        calls.put("googleAccountListUpdated", () -> s.native_googleAccountListUpdated("a@b", -2));
        expect(wire, "googleAccountListUpdated", Wire.op(23).str("a@b").i32(-2).bytes());
        calls.put("onCursorLocationChanged", () -> s.native_onCursorLocationChanged(-5, 1080));
        expect(wire, "onCursorLocationChanged", Wire.op(25).i32(-5).i32(1080).bytes());
        calls.put("onLocaleChanged", () -> s.native_onLocaleChanged("fr-FR"));
        expect(wire, "onLocaleChanged", Wire.op(12).str("fr-FR").bytes());
        calls.put("onAppInstalled", () -> s.native_onAppInstalled(
                "p", "p.Main", "Label " + E_ACUTE, 42, "1.0", "icon.png", "store", true));
        expect(wire, "onAppInstalled", Wire.op(13).str("p").str("p.Main").str("Label " + E_ACUTE)
                .i32(42).str("1.0").str("icon.png").str("store").bool(true).bytes());
        calls.put("onAppUninstalled", () -> s.native_onAppUninstalled("gone"));
        expect(wire, "onAppUninstalled", Wire.op(14).str("gone").bytes());
        calls.put("onScreenshotSaved", () -> s.native_onScreenshotSaved("/shot.png"));
        expect(wire, "onScreenshotSaved", Wire.op(11).str("/shot.png").bytes());
        calls.put("createDesktopShortcut", () -> s.native_createDesktopShortcut("short"));
        expect(wire, "createDesktopShortcut", Wire.op(27).str("short").bytes());
        calls.put("importFilesCompleted", () -> s.native_importFilesCompleted(-13, "/import"));
        expect(wire, "importFilesCompleted", Wire.op(40).i32(-13).str("/import").bytes());
        calls.put("openUrl", () -> s.native_openUrl("https://x/?q=" + E_ACUTE));
        expect(wire, "openUrl", Wire.op(26).str("https://x/?q=" + E_ACUTE).bytes());
        calls.put("initVolume", () -> s.native_initVolume(false, 5, 15));
        expect(wire, "initVolume", Wire.op(4).bool(false).i32(5).i32(15).bytes());
        calls.put("onAppNotificationReceived", () -> s.native_onAppNotificationReceived("{}"));
        expect(wire, "onAppNotificationReceived", Wire.op(41).str("{}").bytes());
        calls.put("setUsageStatsUpdateInterval", () -> s.native_setUsageStatsUpdateInterval(60));
        expect(wire, "setUsageStatsUpdateInterval", Wire.op(42).i32(60).bytes());
        calls.put("onVibrate", () -> s.native_onVibrate(100, "a"));
        expect(wire, "onVibrate", Wire.op(30).i32(100).str("a").bytes());
        calls.put("onConsoleModeStateChanged", () -> s.native_onConsoleModeStateChanged(false));
        expect(wire, "onConsoleModeStateChanged", Wire.op(43).bool(false).bytes());
        assertEquals(30, calls.size(), "every forwarding method is covered");

        List<String> expected = new ArrayList<>();
        for (Map.Entry<String, IntSupplier> call : calls.entrySet()) {
            assertEquals(0, call.getValue().getAsInt(), call.getKey() + " accepts its event");
            expected.add(call.getKey() + " " + Wire.hex(wire.get(call.getKey())));
        }
        List<String> received = Bridge.hex(Bridge.drain(s, true));
        List<String> labelled = new ArrayList<>();
        List<String> labels = new ArrayList<>(calls.keySet());
        for (int i = 0; i < received.size(); i++)
            labelled.add((i < labels.size() ? labels.get(i) : "extra") + " " + received.get(i));
        assertEquals(expected, labelled, "each event reaches the host once, in call order, byte for byte");
        assertEquals(0, TestNative.overlaps(), "host calls never overlap");
    }

    @Test
    void Queries_WhenHostAnswers_ReturnTheHostsAnswerAndSendTheirString() {
        TestNative.configureHost(0, false, 0, new int[] {28, -5});
        assertFalse(s.native_isAppLaunchAllowed("p" + E_ACUTE), "the host said no");
        assertEquals(-5, s.native_setGoogleAdId("ad-" + BEYOND_BMP), "the host's result reaches Java");
        TestNative.configureHost(0, true, 0, new int[0]);
        assertTrue(s.native_isAppLaunchAllowed("q"), "the host said yes");
        assertEquals(0, s.native_setGoogleAdId("ad-2"), "success reaches Java as 0");
        assertEquals(List.of(Wire.hex(Wire.op(24).str("p" + E_ACUTE).bytes()),
                        Wire.hex(Wire.op(28).str("ad-" + BEYOND_BMP).bytes()),
                        Wire.hex(Wire.op(24).str("q").bytes()),
                        Wire.hex(Wire.op(28).str("ad-2").bytes())),
                Bridge.hex(Bridge.drain(s, true)), "queries send their string on the caller's thread");
    }

    /** Each method with a required string, calling it with `value` in one required place. */
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

    @Test
    void RequiredStrings_WhenEmpty_RefuseTheCallAndSendNothing() {
        for (Map.Entry<String, Function<String, Object>> place : requiredPlaces().entrySet()) {
            Object expected = place.getKey().equals("isAppLaunchAllowed") ? (Object) true : (Object) (-1);
            assertEquals(expected, place.getValue().apply(""), place.getKey() + " refuses an empty string");
        }
        assertEquals(List.of(), Bridge.hex(Bridge.drain(s, true)), "nothing reaches the host");
    }

    @Test
    void RequiredStrings_WhenNull_RaiseNullArgumentAndSendNothing() {
        for (Map.Entry<String, Function<String, Object>> place : requiredPlaces().entrySet()) {
            IllegalArgumentException thrown = assertThrows(IllegalArgumentException.class,
                    () -> place.getValue().apply(null), place.getKey() + " raises for null");
            assertEquals("Null argument", thrown.getMessage());
        }
        assertEquals(List.of(), Bridge.hex(Bridge.drain(s, true)), "nothing reaches the host");
    }

    @Test
    void UncheckedStrings_WhenEmptyOrNull_AreForwardedAsEmptyStrings() {
        assertEquals(0, s.native_setAppConfigDbParams("pkg", false, true, "", false));
        assertThrows(IllegalArgumentException.class,
                () -> s.native_setAppConfigDbParams("pkg", false, true, null, false));
        assertEquals(0, s.native_onAppInstalled("p", "a", "", 3, "", "", "", false));
        assertThrows(IllegalArgumentException.class,
                () -> s.native_onAppInstalled("p", "a", null, 3, null, null, null, false));
        byte[] config = Wire.op(22).str("pkg").bool(false).bool(true).str("").bool(false).bytes();
        byte[] install = Wire.op(13).str("p").str("a").str("").i32(3).str("").str("").str("").bool(false).bytes();
        assertEquals(Bridge.hex(List.of(config, config, install, install)), Bridge.hex(Bridge.drain(s, true)),
                "an empty or null string the method does not check still travels, as an empty string");
    }
}
