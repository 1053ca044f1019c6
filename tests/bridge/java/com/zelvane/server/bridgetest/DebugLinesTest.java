package com.zelvane.server.bridgetest;

import static org.junit.jupiter.api.Assertions.assertEquals;

import com.zelvane.server.KivHostCallService;
import java.io.IOException;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.List;
import java.util.Map;
import java.util.stream.Collectors;
import org.junit.jupiter.api.BeforeEach;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.api.io.TempDir;

/** The bridge's Android log lines, with the debug property on (this JVM) and off (child JVMs). */
class DebugLinesTest {
    static final String T = "|" + Bridge.TAG + "|";
    static final String TASK_SUFFIX = "::(anonymous class)::operator()() const";

    private KivHostCallService s;
    private int mark;

    @BeforeEach
    void drainAndReset() {
        s = Bridge.started();
        Bridge.drain(s, true);
        TestNative.resetDevice();
        mark = Bridge.logLines().size();
    }

    private static List<String> bridgeLines(List<String> lines) {
        return lines.stream().filter(l -> l.contains(T)).collect(Collectors.toList());
    }

    /** Lines written on the Java thread, in call order. */
    private static List<String> callerLines(List<String> lines) {
        return bridgeLines(lines).stream().filter(l -> !l.contains(T + "auto ") && !l.contains(T + "RPC failed"))
                .collect(Collectors.toList());
    }

    /** Lines written by the tasks on the worker, in queue order. */
    private static List<String> taskLines(List<String> lines) {
        return bridgeLines(lines).stream().filter(l -> l.contains(T + "auto ") || l.contains(T + "RPC failed"))
                .collect(Collectors.toList());
    }

    @Test
    void LoadAndStart_WhenDebugOn_WriteEntryAndStartLinesFirst() {
        List<String> first = bridgeLines(Bridge.logLines()).subList(0, 3);
        assertEquals(List.of("4" + T + "jint JNI_OnLoad(JavaVM *, void *) called",
                        "3" + T + "void native_init(JNIEnv *, jobject): called",
                        "3" + T + "void native_init(JNIEnv *, jobject): returning, rval = 0"),
                first, "JNI_OnLoad at info, then native_init's two debug lines");
    }

    @Test
    void MethodsOfEachShape_WhenDebugOn_WriteTheirExactLines() {
        s.native_onOrientationChange(2);
        s.native_onActivityDisplayed("pk", "ac");
        s.native_startImportFiles();
        s.native_onVibrate(250, "vib");
        s.native_onAppUninstalled("gone");
        s.native_importFilesCompleted(-2, "/in");
        s.native_onCursorLocationChanged(3, 4);
        s.native_setAppConfigDbParams("pkg", true, false, "cur", true);
        s.native_onConsoleModeStateChanged(true);
        s.native_initImeStatus("");
        Bridge.drain(s, true);
        List<String> lines = Bridge.linesSince(mark);
        assertEquals(List.of(
                "3" + T + "jint onOrientationChanged(JNIEnv *, jobject, int): orientation = 2",
                "3" + T + "jint onActivityDisplayed(JNIEnv *, jobject, jstring, jstring): called",
                "3" + T + "jint onActivityDisplayed(JNIEnv *, jobject, jstring, jstring): package = pk, activity = ac",
                "3" + T + "jint startImportFiles(JNIEnv *, jobject): called",
                "3" + T + "jint onVibrate(JNIEnv *, jobject, jint, jstring) called",
                "3" + T + "jint onVibrate(JNIEnv *, jobject, jint, jstring): duration = 250, pkg = vib",
                "3" + T + "jint onAppUninstalled(JNIEnv *, jobject, jstring): called",
                "3" + T + "jint onAppUninstalled(JNIEnv *, jobject, jstring): pkgName = gone",
                "3" + T + "jint importFilesCompleted(JNIEnv *, jobject, jint, jstring): called",
                "3" + T + "jint importFilesCompleted(JNIEnv *, jobject, jint, jstring): folderString = /in",
                "3" + T + "jint onCursorLocationChanged(JNIEnv *, jobject, jint, jint) called: x = 3, y = 4",
                "3" + T + "jint setAppConfigDbParams(JNIEnv *, jobject, jstring, jboolean, jboolean, jstring, jboolean): called",
                "3" + T + "jint setAppConfigDbParams(JNIEnv *, jobject, jstring, jboolean, jboolean, jstring, jboolean): "
                        + "package = pkg, macrosDisabled = 1, showFeedbackPopup = 0, mouseCursorStyle = cur, nativeGamepad = 1",
                "3" + T + "jint onConsoleModeStateChanged(JNIEnv *, jobject, jboolean): called consoleModeState : 1",
                "3" + T + "jint initImeStatus(JNIEnv *, jobject, jstring): called"),
                callerLines(lines), "first and detail lines, in call order; an empty required string stops after the first");
        assertEquals(List.of(
                "3" + T + "auto onOrientationChanged(JNIEnv *, jobject, int)" + TASK_SUFFIX + ": returning, rval = 0",
                "3" + T + "auto onActivityDisplayed(JNIEnv *, jobject, jstring, jstring)" + TASK_SUFFIX + ": returning, rval = 0",
                "3" + T + "auto startImportFiles(JNIEnv *, jobject)" + TASK_SUFFIX + ": returning, rval = 0",
                "3" + T + "auto onVibrate(JNIEnv *, jobject, jint, jstring)" + TASK_SUFFIX + ": returning, rval = 0",
                "3" + T + "auto onAppUninstalled(JNIEnv *, jobject, jstring)" + TASK_SUFFIX + ": returning , rval = 0",
                "3" + T + "auto importFilesCompleted(JNIEnv *, jobject, jint, jstring)" + TASK_SUFFIX + ": returning, rval = 0",
                "3" + T + "auto onCursorLocationChanged(JNIEnv *, jobject, jint, jint)" + TASK_SUFFIX + ": returning, rval = 0",
                "3" + T + "auto setAppConfigDbParams(JNIEnv *, jobject, jstring, jboolean, jboolean, jstring, jboolean)"
                        + TASK_SUFFIX + ": returning, rval = 0",
                "3" + T + "auto onConsoleModeStateChanged(JNIEnv *, jobject, jboolean)" + TASK_SUFFIX + ": returning, rval = 0"),
                taskLines(lines), "each task's returning line under its task name");
    }

    @Test
    void Queries_WhenDebugOn_WriteCalledDetailAndReturningLines() {
        TestNative.configureHost(0, false, 0, new int[] {28, -7});
        s.native_isAppLaunchAllowed("app");
        s.native_setGoogleAdId("ad");
        s.native_setGoogleAdId("");
        assertEquals(List.of(
                "3" + T + "jboolean isAppLaunchAllowed(JNIEnv *, jobject, jstring): called",
                "3" + T + "jboolean isAppLaunchAllowed(JNIEnv *, jobject, jstring): pkg = app",
                "3" + T + "jboolean isAppLaunchAllowed(JNIEnv *, jobject, jstring): returning, rval = 0",
                "3" + T + "jint setGoogleAdId(JNIEnv *, jobject, jstring): called",
                "3" + T + "jint setGoogleAdId(JNIEnv *, jobject, jstring): googleAdId = ad",
                "3" + T + "jint setGoogleAdId(JNIEnv *, jobject, jstring): returning, rval = -7",
                "3" + T + "jint setGoogleAdId(JNIEnv *, jobject, jstring): called"),
                bridgeLines(Bridge.linesSince(mark)), "queries log their answer under the method's own name");
    }

    @Test
    void FailedHostCall_WhenDebugOn_WritesRpcFailedThenReturningWithTheSameResult() {
        TestNative.configureHost(0, true, 0, new int[] {12, -5});
        s.native_onLocaleChanged("de-DE");
        Bridge.drain(s, true);
        String task = "auto onLocaleChanged(JNIEnv *, jobject, jstring)" + TASK_SUFFIX;
        assertEquals(List.of("6" + T + "RPC failed for " + task + ", error -5",
                        "3" + T + task + ": returning, rval = -5"),
                taskLines(Bridge.linesSince(mark)), "the failure at error priority, then the result line");
    }

    @Test
    void Lines_WhenDebugPropertyOff_AreOnlyTheAlwaysWrittenOnes(@TempDir Path dir) {
        ChildJvm child = ChildJvm.run("debug-off", Map.of("HOSTCALL_PROPERTIES_FILE", dir.resolve("p.prop").toString()))
                .assertClean(0);
        List<String> expected = new ArrayList<>(List.of(
                "4" + T + "jint JNI_OnLoad(JavaVM *, void *) called",
                "3" + T + "void native_init(JNIEnv *, jobject): called",
                "3" + T + "void native_init(JNIEnv *, jobject): returning, rval = 0",
                "3" + T + "jint onVibrate(JNIEnv *, jobject, jint, jstring) called",
                "6" + T + "RPC failed for auto onLocaleChanged(JNIEnv *, jobject, jstring)" + TASK_SUFFIX + ", error -5"));
        List<String> actual = child.reported("LINE");
        expected.sort(null);
        actual.sort(null);
        assertEquals(expected, actual, "without the switch only the entry, start, onVibrate and failure lines remain");
    }

    @Test
    void DebugSwitch_WhenPropertyIsNotANonZeroNumber_StaysOff(@TempDir Path dir) {
        ChildJvm child = ChildJvm.run("debug-values", Map.of("HOSTCALL_PROPERTIES_FILE", dir.resolve("p.prop").toString()))
                .assertClean(0);
        assertEquals(List.of("on[null]=false", "on[0]=false", "on[]=false", "on[abc]=false", "on[-0]=false"),
                child.reported("RESULT"), "unset, 0, empty, text and -0 leave debugging off");
    }

    @Test
    void DebugSwitch_WhenPropertyStartsWithANonZeroNumber_TurnsOnAndStaysOn(@TempDir Path dir) throws IOException {
        for (String value : List.of("-1", " 7", "3x")) {
            Path file = dir.resolve("p.prop");
            Files.deleteIfExists(file);
            ChildJvm child = ChildJvm.run("debug-on-value",
                    Map.of("HOSTCALL_PROPERTIES_FILE", file.toString(), "BRIDGE_DEBUG_VALUE", value)).assertClean(0);
            assertEquals(List.of("on[" + value + "]=true", "stillOnAfterZero=true"), child.reported("RESULT"),
                    "'" + value + "' switches debugging on, and a later 0 does not switch it off");
        }
    }
}
