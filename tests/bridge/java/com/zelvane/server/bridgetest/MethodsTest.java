package com.zelvane.server.bridgetest;

import static com.zelvane.server.bridgetest.Bridge.*;
import static org.junit.jupiter.api.Assertions.*;

import com.zelvane.server.KivHostCallService;
import java.lang.reflect.Method;
import java.util.*;
import org.junit.jupiter.api.*;

/** The 32 methods in a started service with debug lines on: what the host receives, what Java gets, what is logged. */
class MethodsTest {
    static final String CALLED = ": called", E_ACUTE = "caf\u00e9", WITH_NUL = "[a\u0000b]";
    static final String BEYOND_BMP = "smile\uD83D\uDE00";
    static final int[] HOST_RESULTS = {28, -5, 14, 13};  // operation code, result; launches refused

    /** A method: its function's name and parameters as its name string gives them, its operation code, its lines
     *  before and after the strings are converted, how many strings (from the first) it checks, its arguments. */
    record Row(String function, String params, int op, String first, String detail, int checked, Object... args) {
        Method method() {
            // Three Java names lack the final "d" of their function's (native_onImeChange: onImeChanged).
            for (String name : List.of(function, function.substring(0, function.length() - 1)))
                for (Method m : KivHostCallService.class.getDeclaredMethods())
                    if (m.getName().equals("native_" + name)) return m;
            throw new AssertionError("no Java method for " + function);
        }

        String name() {
            String type = method().getReturnType() == boolean.class ? "jboolean " : "jint ";
            return type + function + "(JNIEnv *, jobject" + (params.isEmpty() ? "" : ", " + params) + ")";
        }

        boolean query() { return op == 24 || op == 28; }

        Object call(KivHostCallService s, Object... values) {
            try {
                return method().invoke(s, values);
            } catch (ReflectiveOperationException e) {
                if (e.getCause() instanceof RuntimeException r) throw r;
                throw new AssertionError(e);
            }
        }

        List<String> lines(int result) {
            List<String> lines = new ArrayList<>();
            if (first != null) lines.add(debug(name() + first));
            if (detail != null) lines.add(debug(name() + detail));
            if (query()) return List.of(lines.get(0), lines.get(1), debug(name() + ": returning, rval = " + result));
            if (result != 0) lines.add(error("RPC failed for " + task(name()) + ", error " + result));
            // onAppUninstalled's task alone writes a blank before the comma.
            lines.add(debug(task(name()) + (op == 14 ? ": returning , rval = " : ": returning, rval = ") + result));
            return lines;
        }
    }

    static Row row(String function, String params, int op, String first, String detail, Object... args) {
        return new Row(function, params, op, first, detail, args.length, args);
    }

    static final List<Row> ROWS = List.of(
            row("initInputDebuggingStatus", "jboolean, jboolean", 2, null, ": showTouches = 1 showPointerLocation = 0",
                    true, false),
            row("initImeStatus", "jstring", 3, CALLED, ": imeName = " + E_ACUTE, E_ACUTE),
            row("syncInstalledApps", "jstring", 6, CALLED, ": jsonData = " + WITH_NUL, WITH_NUL),
            row("onOrientationChanged", "int", 7, null, ": orientation = 3", 3),
            row("onImeChanged", "jstring", 8, CALLED, ": imeName = " + BEYOND_BMP, BEYOND_BMP),
            row("onTextEditModeChanged", "jboolean", 9, null, ": isTextEditMode = 1", true),
            row("onActivityDisplayed", "jstring, jstring", 10, CALLED, ": package = p, activity = p.M", "p", "p.M"),
            row("exportFiles", "jstring", 15, CALLED, ": folder = /sdcard", "/sdcard"),
            row("startImportFiles", "", 16, CALLED, null),
            row("startExportFiles", "", 17, CALLED, null),
            row("launchOrx", "", 29, CALLED, null),
            row("setClipboardText", "jstring", 18, CALLED, ": text = clip", "clip"),
            row("onVolumeChanged", "jboolean, jint", 19, null, ": mute = 1, volume = 7", true, 7),
            row("onGoogleLoginCompleted", "jstring", 20, CALLED, ": emailId = g@x", "g@x"),
            row("onZelvaneLoginCompleted", "jstring", 21, CALLED, ": emailId = z@x", "z@x"),
            new Row("setAppConfigDbParams", "jstring, jboolean, jboolean, jstring, jboolean", 22, CALLED, ": package = "
                    + "pkg, macrosDisabled = 1, showFeedbackPopup = 0, mouseCursorStyle = arrow, nativeGamepad = 0", 1,
                    "pkg", true, false, "arrow", false),
            row("googleAccountListUpdated", "jstring, jint", 23, CALLED, ": emailId = a@b, action = -2", "a@b", -2),
            row("isAppLaunchAllowed", "jstring", 24, CALLED, ": pkg = p" + E_ACUTE, "p" + E_ACUTE),
            row("setGoogleAdId", "jstring", 28, CALLED, ": googleAdId = ad", "ad"),
            row("onCursorLocationChanged", "jint, jint", 25, null, " called: x = -5, y = 1080", -5, 1080),
            row("onLocaleChanged", "jstring", 12, CALLED, ": locale = fr-FR", "fr-FR"),
            new Row("onAppInstalled", "jstring, jstring, jstring, jint, jstring, jstring, jstring, jboolean", 13,
                    CALLED, ": package = p, activity = p.M, appLabel = L, versionCode = 42, versionName = 1.0, "
                    + "iconFileName: i.png, source: s, isUpdate: 1", 2, "p", "p.M", "L", 42, "1.0", "i.png", "s", true),
            row("onAppUninstalled", "jstring", 14, CALLED, ": pkgName = gone", "gone"),
            row("onScreenshotSaved", "jstring", 11, CALLED, ": fileName = /shot.png", "/shot.png"),
            row("createDesktopShortcut", "jstring", 27, CALLED, ": pkgName = short", "short"),
            row("importFilesCompleted", "jint, jstring", 40, CALLED, ": folderString = /import", -13, "/import"),
            row("openUrl", "jstring", 26, CALLED, ": urlString = https://x/", "https://x/"),
            row("initVolume", "jboolean, jint, jint", 4, null, ": mute = 0, volume = 5, maxVolume = 15", false, 5, 15),
            row("onAppNotificationReceived", "jstring", 41, CALLED, ": notificationJsonString = {}", "{}"),
            row("setUsageStatsUpdateInterval", "int", 42, null, ": secs = 60", 60),
            row("onVibrate", "jint, jstring", 30, " called", ": duration = 100, pkg = vib", 100, "vib"),
            row("onConsoleModeStateChanged", "jboolean", 43, null, ": called consoleModeState : 0", false));

    private final KivHostCallService s = started();  // every test leaves no event behind

    @Test
    void EveryMethod_WhenCalled_ReturnsSendsItsArgumentsInOrderAndLogsItsLines() {
        for (Row row : ROWS) {
            configureHost(false, HOST_RESULTS);
            int mark = lines().size();
            int result = row.op() == 28 ? -5 : row.op() == 14 ? 13 : 0;
            assertEquals(row.op() == 24 ? false : row.query() ? result : 0, row.call(s, row.args()), row.function());
            assertEquals(List.of(request(row.op(), row.args())), drain(s, true), row.function() + " sends");
            assertEquals(row.lines(result), drainedLines(mark), row.function() + " logs");
        }
    }

    /** A checked string refuses the call when empty or null; an unchecked one travels empty. */
    @Test
    void Strings_WhenEmptyOrNull_RefuseTheCallWhereCheckedAndTravelEmptyElsewhere() {
        configureHost(false, HOST_RESULTS);
        List<String> expected = new ArrayList<>();
        for (Row row : ROWS) {
            for (int i = 0, strings = 0; i < row.args().length; i++) {
                if (!(row.args()[i] instanceof String)) continue;
                boolean checked = strings++ < row.checked();
                for (String value : Arrays.asList("", null)) {
                    String where = row.function() + " string " + strings + " '" + value + "'";
                    Object[] call = row.args().clone(), sent = row.args().clone();
                    call[i] = value;
                    // A null raises "Null argument"; the later strings are not touched with it pending.
                    for (int j = i; j < sent.length; j++)
                        if (sent[j] instanceof String && (j == i || value == null)) sent[j] = "";
                    int mark = lines().size();
                    if (value != null) assertEquals(checked ? row.op() == 24 ? true : -1 : 0, row.call(s, call), where);
                    else assertEquals("Null argument", assertThrows(IllegalArgumentException.class,
                            () -> row.call(s, call), where).getMessage(), where);
                    if (!checked) expected.add(request(row.op(), sent));
                    else assertEquals(List.of(debug(row.name() + row.first())), bridgeLines(mark).stream()
                            .filter(l -> !l.contains("|auto ")).toList(), where + " logs its first line alone");
                }
            }
        }
        assertEquals(expected, drain(s, true), "only the unchecked strings' events reach the host");
    }

    /** Regression: the conversion read and gave back a null pointer when the runtime lent nothing. */
    @Test
    void GetStringFromJstring_WhenTheRuntimeLendsNoBytes_YieldsEmptyAndGivesNothingBack() {
        assertEquals("bytes=0 releases=0", convertStarved("abc"));
    }
}
