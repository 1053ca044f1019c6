package com.zelvane.server.bridgetest;

import static com.zelvane.server.bridgetest.Bridge.*;
import static org.junit.jupiter.api.Assertions.*;

import com.zelvane.server.KivHostCallService;
import com.zelvane.server.bridgetest.MethodsTest.Row;
import java.io.File;
import java.nio.file.*;
import java.util.*;
import java.util.concurrent.TimeUnit;
import java.util.stream.*;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.api.io.TempDir;
import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.ValueSource;

/** Loading, starting, the debug switch and the exit, each a scenario of {@link #main} in a JVM of its own. */
class ProcessTest {
    static final String ON_LOAD = "4|" + TAG + "|jint JNI_OnLoad(JavaVM *, void *) called";
    static final String INIT = "void native_init(JNIEnv *, jobject)", CLASS_PATH = System.getProperty("java.class.path");

    /** Runs scenario `args` in a JVM like this one; checks its exit code and that nothing complained. */
    static String run(int exitCode, String classPath, Map<String, String> env, String... args) throws Exception {
        List<String> command = new ArrayList<>(List.of(ProcessHandle.current().info().command().orElse("java"),
                "-Xcheck:jni", "-Xmx64m", "-XX:ErrorFile=" + System.getProperty("java.io.tmpdir") + "/hs_err_%p.log",
                "-Dhostcall.lib=" + System.getProperty("hostcall.lib"), "-Dhostcall.testlib="
                + System.getProperty("hostcall.testlib"), "-cp", classPath, ProcessTest.class.getName()));
        command.addAll(List.of(args));
        Path log = Files.createTempFile("bridge-child-", ".out");
        ProcessBuilder builder = new ProcessBuilder(command).redirectErrorStream(true).redirectOutput(log.toFile());
        builder.environment().putAll(env);
        Process process = builder.start();
        boolean ended = process.waitFor(60, TimeUnit.SECONDS);  // far beyond any scenario
        if (!ended) process.destroyForcibly().waitFor();
        String output = Files.readString(log), scenario = String.join(" ", args);
        Files.delete(log);
        assertTrue(ended, scenario + " hung:\n" + output);
        assertEquals(exitCode, process.exitValue(), scenario + " exit code:\n" + output);
        for (String sign : List.of("WARNING in native method", "FATAL ERROR in native method", "SIGSEGV", "SIGABRT",
                "hs_err_pid", "AddressSanitizer", "runtime error:", "terminate called"))
            assertFalse(output.contains(sign), scenario + " reported " + sign + ":\n" + output);
        return output;
    }

    @ParameterizedTest
    @ValueSource(strings = {"-1", " 7", "3x"})
    void NativeInit_WhenRepeatedWithEachDebugValue_StartsOnceAndSwitchesOnForNonZeroNumbers(String onValue,
            @TempDir Path dir) throws Exception {
        run(0, CLASS_PATH, Map.of("HOSTCALL_PROPERTIES_FILE", dir.resolve("p.prop").toString()), "debugSwitch", onValue);
    }

    @Test
    void Start_WhenTheDeviceIsMissing_KeepsEventsRefusesQueriesAndDeliversOnceAStartSucceeds() throws Exception {
        run(0, CLASS_PATH, Map.of("VMSG_DEVICE_FAIL", "open"), "start");
    }

    /** Fault: the exit unmapped the connection under an exchange, or destroyed the pool under its worker. */
    @ParameterizedTest
    @ValueSource(strings = {"exit", "end"})
    void Exit_WhileTheWorkerIsInsideAHostCall_EndsCleanly(String how) throws Exception {
        String output = run(how.equals("exit") ? 5 : 0, CLASS_PATH, Map.of(), "exitBusy", how);
        assertTrue(output.contains("workerLeftHost=true"), "the held call came back during the exit:\n" + output);
    }

    @Test
    void JniOnLoad_WhenTheServiceClassIsMissing_LogsTheFailureAndRefusesTheLoad() throws Exception {
        run(0, String.join(File.pathSeparator, Stream.of(CLASS_PATH.split(File.pathSeparator))
                .filter(entry -> !entry.endsWith("kivhostcall-service.jar")).toList()), Map.of(), "noService");
    }

    public static void main(String[] args) throws Exception {
        switch (args[0]) {
            case "debugSwitch" -> debugSwitch(args[1]);
            case "start" -> start();
            case "exitBusy" -> exitBusy(args[1]);
            default -> noService();
        }
    }

    /** With the property unset, only the lines written whatever the switch says. Then starts again with values that
     *  leave the switch off, `onValue`, then 0: it turns on and stays on; no connection is added. */
    static void debugSwitch(String onValue) throws Exception {
        Path properties = Path.of(System.getenv("HOSTCALL_PROPERTIES_FILE"));
        Files.writeString(properties, "other.key=1\n");
        KivHostCallService s = load();
        // Every forwarded call fails but the drain's; launches are allowed, so the host's answers reach Java.
        List<Row> failing = MethodsTest.ROWS.stream().filter(r -> !r.query() && r.op() != 42).toList();
        configureHost(true, failing.stream().flatMapToInt(r -> IntStream.of(r.op(), -5)).toArray());
        s.native_init();
        for (Row row : MethodsTest.ROWS)
            assertEquals(row.op() == 24 ? true : 0, row.call(s, row.args()), row.function() + " returns");
        drain(s, false);
        List<String> expected = new ArrayList<>(List.of(ON_LOAD, debug(INIT + ": called"),
                debug(INIT + ": returning, rval = 0"), debug("jint onVibrate(JNIEnv *, jobject, jint, jstring) called")));
        failing.forEach(r -> expected.add(error("RPC failed for " + task(r.name()) + ", error -5")));
        List<String> lines = bridgeLines(0);
        assertEquals(expected.subList(0, 3), lines.subList(0, 3), "entry and start lines first");
        assertEquals(expected.stream().sorted().toList(), lines.stream().sorted().toList(), "with the switch off");
        List<String> values = List.of("0", "", "abc", "-0", onValue, "0");
        for (int i = 0; i < values.size(); i++) {
            Files.writeString(properties, "kiv.debug.kivhostcall=" + values.get(i) + "\n");
            s.native_init();
            int mark = lines().size();
            s.native_onOrientationChange(i);
            String detail = debug("jint onOrientationChanged(JNIEnv *, jobject, int): orientation = " + i);
            assertEquals(i >= 4, bridgeLines(mark).contains(detail), "switch on after '" + values.get(i) + "'");
        }
        assertEquals(1, openDevices(), "connections");
        assertEquals(6, lines().stream().filter(("4|" + TAG + "|" + INIT + ": service already started")::equals).count());
    }

    /** Events and queries before native_init, a start that cannot open the device, and a second start that can. */
    static void start() {
        KivHostCallService s = load();
        assertEquals(List.of(0, 0, true, -1), List.of(s.native_onLocaleChanged("en-US"), s.native_onOrientationChange(1),
                s.native_isAppLaunchAllowed("x"), s.native_setGoogleAdId("y")), "before the start");
        s.native_init();
        assertEquals(List.of(0, true, -1, 0), List.of(s.native_setClipboardText("late"), s.native_isAppLaunchAllowed("x"),
                s.native_setGoogleAdId("y"), requests().size()), "after a failed start, nothing sent");
        // No returning line, and the debug switch stays off.
        assertEquals(List.of(ON_LOAD, debug(INIT + ": called"), "6|HCALL|hcallLibInitGuest failed, error -1"), lines()
                .stream().filter(l -> l.contains("|" + TAG + "|") || l.contains("hcallLibInitGuest"))
                .map(l -> l.replaceFirst("HCALL\\|.*hcallLibInit", "HCALL|hcallLibInit")).toList());
        configureHost(true, new int[0]);  // the device opens again
        s.native_init();
        assertEquals(List.of(request(12, "en-US"), request(7, 1), request(18, "late")), drain(s, true),
                "the waiting events reach the host in order once a start connects");
        assertEquals(1, openDevices(), "connections");
    }

    /** Ends the process while the worker is inside a host call that the host answers only after static destructors. */
    static void exitBusy(String how) {
        KivHostCallService s = started();
        holdUntilExit(12);
        s.native_onLocaleChanged("held");
        assertTrue(awaitHeld(WAIT.toMillis()), "the worker reached the host");
        for (int id : new int[] {0, 1, SoakTest.PRODUCERS}) {  // callers that go on through the exit
            SoakTest.Sender sender = new SoakTest.Sender(id, id);
            Thread thread = new Thread(() -> { for (;;) sender.call(s); });
            thread.setDaemon(true);
            thread.start();
        }
        if (how.equals("exit")) System.exit(5);
    }

    static void noService() {
        System.load(System.getProperty("hostcall.testlib"));
        keepLoaded(System.getProperty("hostcall.lib"));
        assertThrows(UnsatisfiedLinkError.class, () -> System.load(System.getProperty("hostcall.lib")), "JNI_OnLoad -1");
        assertEquals(List.of(ON_LOAD, error("ERROR: KivHostCallService native registration failed")), bridgeLines(0));
    }
}
