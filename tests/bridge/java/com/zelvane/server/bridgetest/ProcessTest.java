package com.zelvane.server.bridgetest;

import static com.zelvane.server.bridgetest.Bridge.debug;
import static com.zelvane.server.bridgetest.Bridge.error;
import static com.zelvane.server.bridgetest.Bridge.request;
import static com.zelvane.server.bridgetest.Bridge.task;
import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.zelvane.server.KivHostCallService;
import com.zelvane.server.bridgetest.MethodsTest.Row;
import java.io.File;
import java.io.IOException;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.Arrays;
import java.util.List;
import java.util.Map;
import java.util.SplittableRandom;
import java.util.stream.IntStream;
import java.util.stream.Stream;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.api.io.TempDir;
import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.ValueSource;

/**
 * Loading, starting, the debug switch and the exit, each in a JVM of its own
 * that runs a scenario of {@link #main} and reports on standard output
 * ("RESULT name=value", "LINE line", "REQ hex"); a broken expectation inside
 * one prints "FAILED: ..." and exits 1.
 */
class ProcessTest {
    static final String ON_LOAD = "4|" + Bridge.TAG + "|jint JNI_OnLoad(JavaVM *, void *) called";
    static final String INIT = "void native_init(JNIEnv *, jobject)";
    /** The forwarding methods whose host calls fail in the debug scenario: all but the drain's. */
    static final List<Row> FAILING = MethodsTest.ROWS.stream().filter(r -> !r.query() && r.op() != 42).toList();

    /**
     * With the property unset every method is called once: only the lines
     * written whatever the switch says appear. Then native_init again with
     * values that must leave the switch off, `onValue`, then 0: the switch
     * turns on and stays on; a repeated start starts nothing more.
     */
    @ParameterizedTest
    @ValueSource(strings = {"-1", " 7", "3x"})
    void NativeInit_WhenRepeatedWithEachDebugValue_StartsOnceAndSwitchesOnForNonZeroNumbers(String onValue,
            @TempDir Path dir) {
        ChildJvm child = ChildJvm.run(Map.of("HOSTCALL_PROPERTIES_FILE", dir.resolve("p.prop").toString()),
                "debug", onValue);
        assertEquals(List.of("first=workers 1", "[0]=workers 0 on false", "[]=workers 0 on false",
                        "[abc]=workers 0 on false", "[-0]=workers 0 on false", "[" + onValue + "]=workers 0 on true",
                        "[0]=workers 0 on true", "openDevices=1", "alreadyStarted=6"),
                child.reported("RESULT"), "one worker and one connection whatever the number of starts");
        List<String> expected = new ArrayList<>(List.of(ON_LOAD, debug(INIT + ": called"),
                debug(INIT + ": returning, rval = 0"), debug("jint onVibrate(JNIEnv *, jobject, jint, jstring) called")));
        FAILING.forEach(r -> expected.add(error("RPC failed for " + task(r.name()) + ", error -5")));
        List<String> lines = child.reported("LINE");
        assertEquals(expected.subList(0, 3), lines.subList(0, Math.min(3, lines.size())),
                "entry and start lines first");
        assertEquals(expected.stream().sorted().toList(), lines.stream().sorted().toList(),
                "with the switch off only these lines are written");
    }

    @Test
    void Start_WhenTheDeviceIsMissing_KeepsEventsRefusesQueriesAndDeliversOnceAStartSucceeds() {
        ChildJvm child = ChildJvm.run(Map.of("VMSG_DEVICE_FAIL", "open"), "start");
        assertEquals(List.of("beforeInit=[0, 0, true, -1]", "afterFailedStart=[0, true, -1, 0]", "openDevices=1"),
                child.reported("RESULT"), "events accepted, queries refused without the host, nothing sent");
        List<String> lines = child.reported("LINE");
        assertEquals(List.of(ON_LOAD, debug(INIT + ": called")), lines.subList(0, Math.min(2, lines.size())),
                "a failed start writes no returning line, and leaves the debug switch off");
        assertEquals(3, lines.size(), String.join("\n", lines));
        assertTrue(lines.get(2).matches("6\\|HCALL\\|.*hcallLibInitGuest failed, error -1"),
                "the connection failure goes through the logger at error level: " + lines.get(2));
        assertEquals(List.of(request(12, "en-US"), request(7, 1), request(18, "late")), child.reported("REQ"),
                "the waiting events reach the host in order once a start connects");
    }

    /**
     * Fault: the process could crash at exit when the connection was unmapped
     * under an exchange in progress, or the pool destroyed under its worker.
     */
    @ParameterizedTest
    @ValueSource(strings = {"exit", "end"})
    void Exit_WhileTheWorkerIsInsideAHostCall_EndsCleanly(String how) {
        ChildJvm child = ChildJvm.run(how.equals("exit") ? 5 : 0, ChildJvm.CLASS_PATH, Map.of(), "exit-busy", how);
        assertEquals(List.of("held=true", "workerLeftHost=true"), child.reported("RESULT"),
                "the worker was inside a host call and came out of it during the exit");
    }

    /** HOSTCALL_SOAK_EXITS runs, two at a time; `make soak` raises it. */
    @Test
    void Exit_AtRandomPointsOfASoak_EndsCleanlyEveryTime() {
        long base = System.nanoTime() % 100_000;
        IntStream.range(0, SoakTest.size("HOSTCALL_SOAK_EXITS", 12)).parallel().forEach(i -> {
            String how = List.of("exit", "end", "throw").get(i % 3);
            String seed = Long.toString(base + i);
            // A slow host that fails now and then; debug lines off.
            Map<String, String> env = Map.of("VMSG_DEVICE_DELAY_JITTER_US", "40", "VMSG_DEVICE_FAIL_PER_MILLE", "20",
                    "VMSG_DEVICE_RECORD", "0", "VMSG_DEVICE_SEED", seed, "HOSTCALL_PROPERTIES_FILE", "");
            ChildJvm child = ChildJvm.run(Map.of("exit", 3, "end", 0, "throw", 1).get(how), ChildJvm.CLASS_PATH, env,
                    "soak-exit", how, seed);
            assertEquals(1, child.reported("RESULT").size(), seed + " reached its end:\n" + child.output);
            System.out.println(seed + " " + child.reported("RESULT").get(0) + " in " + child.elapsed.toMillis() + " ms");
        });
    }

    @Test
    void JniOnLoad_WhenTheServiceClassIsMissing_LogsTheFailureAndRefusesTheLoad() {
        String classPath = String.join(File.pathSeparator, Stream.of(ChildJvm.CLASS_PATH.split(File.pathSeparator))
                .filter(entry -> !entry.endsWith("kivhostcall-service.jar")).toList());
        ChildJvm child = ChildJvm.run(0, classPath, Map.of(), "no-service");
        assertEquals(List.of("load=refused"), child.reported("RESULT"), "the JVM sees JNI_OnLoad's -1");
        assertEquals(List.of(ON_LOAD, error("ERROR: KivHostCallService native registration failed")),
                child.reported("LINE"));
    }

    public static void main(String[] args) throws Exception {
        switch (args[0]) {
            case "debug" -> debugSwitch(args[1]);
            case "start" -> start();
            case "exit-busy" -> exitBusy(args[1].equals("exit"));
            case "no-service" -> noService();
            case "soak-exit" -> soakExit(args[1], Long.parseLong(args[2]));
            default -> fail("no scenario " + args[0]);
        }
        System.out.flush();
    }

    static void fail(String why) {
        System.out.println("FAILED: " + why);
        System.out.flush();
        Runtime.getRuntime().halt(1);
    }

    static void result(String name, Object value) {
        System.out.println("RESULT " + name + "=" + value);
    }

    static void reportLines(String... needles) {
        for (String line : Bridge.lines())
            if (Arrays.stream(needles).anyMatch(line::contains)) System.out.println("LINE " + line);
    }

    /** The debug property in the file HOSTCALL_PROPERTIES_FILE names; null: not set. */
    static void writeDebugProperty(String value) throws IOException {
        Files.writeString(Path.of(System.getenv("HOSTCALL_PROPERTIES_FILE")),
                value == null ? "other.key=1\n" : "kiv.debug.kivhostcall=" + value + "\n");
    }

    /** Calls native_init on a thread of its own and counts the threads it started: they inherit its name. */
    static long threadsStartedByInit(KivHostCallService s, String name) throws Exception {
        long[] started = new long[1];
        Thread thread = new Thread(() -> {
            s.native_init();
            started[0] = TestNative.threadsNamed(name) - 1;  // less this one
        }, name);
        thread.start();
        thread.join();
        return started[0];
    }

    static void debugSwitch(String onValue) throws Exception {
        KivHostCallService s = Bridge.load();
        writeDebugProperty(null);
        TestNative.configureHost(true, FAILING.stream().flatMapToInt(r -> Arrays.stream(new int[] {r.op(), -5}))
                .toArray());
        result("first", "workers " + threadsStartedByInit(s, "hc-init"));
        for (Row row : MethodsTest.ROWS) row.call(s, row.args());
        Bridge.drain(s, false);
        reportLines("|" + Bridge.TAG + "|");
        String[] values = {"0", "", "abc", "-0", onValue, "0"};
        for (int i = 0; i < values.length; i++) {
            writeDebugProperty(values[i]);
            long workers = threadsStartedByInit(s, "hc-init-" + i);
            int mark = Bridge.lines().size();
            s.native_onOrientationChange(i);
            String detail = debug("jint onOrientationChanged(JNIEnv *, jobject, int): orientation = " + i);
            result("[" + values[i] + "]", "workers " + workers + " on " + Bridge.bridgeLines(mark).contains(detail));
        }
        result("openDevices", TestNative.openDevices());
        String alreadyStarted = "4|" + Bridge.TAG + "|" + INIT + ": service already started";
        result("alreadyStarted", Bridge.lines().stream().filter(alreadyStarted::equals).count());
    }

    /** Events and queries before native_init, a start that cannot open the device, and a second start that can. */
    static void start() {
        KivHostCallService s = Bridge.load();
        result("beforeInit", List.of(s.native_onLocaleChanged("en-US"), s.native_onOrientationChange(1),
                s.native_isAppLaunchAllowed("x"), s.native_setGoogleAdId("y")));
        s.native_init();
        result("afterFailedStart", List.of(s.native_setClipboardText("late"), s.native_isAppLaunchAllowed("x"),
                s.native_setGoogleAdId("y"), TestNative.requests().length));
        reportLines("|" + Bridge.TAG + "|", "hcallLibInitGuest");
        TestNative.configureHost(true, new int[0]);  // the device opens again
        s.native_init();
        for (String request : Bridge.drain(s, true)) System.out.println("REQ " + request);
        result("openDevices", TestNative.openDevices());
    }

    /**
     * Ends the process (System.exit, or main returning) while the worker is
     * inside a host call that the host answers only once the library's static
     * destructors have run; the helper then reports whether the call came back.
     */
    static void exitBusy(boolean viaSystemExit) {
        KivHostCallService s = Bridge.started();
        TestNative.holdUntilExit(12);
        s.native_onLocaleChanged("held");
        if (!TestNative.awaitHeld(Bridge.WAIT.toMillis())) fail("the worker never reached the host");
        s.native_setClipboardText("queued behind the held call");
        result("held", true);
        System.out.flush();
        if (viaSystemExit) System.exit(5);
    }

    /** Runs without the service class on the class path, so JNI_OnLoad cannot register the methods. */
    static void noService() {
        System.load(System.getProperty("hostcall.testlib"));
        TestNative.startLogCapture();
        TestNative.keepLoaded(System.getProperty("hostcall.lib"));
        try {
            System.load(System.getProperty("hostcall.lib"));
            result("load", "loaded");
        } catch (UnsatisfiedLinkError e) {
            result("load", "refused");
        }
        reportLines("|" + Bridge.TAG + "|");
    }

    /**
     * Three senders and two askers that never stop, a native_init at a random
     * moment (or none), and an end at a random moment: "exit" (System.exit(3)),
     * "end" (main returns) or "throw" (main throws).
     */
    static void soakExit(String how, long seed) throws Exception {
        SplittableRandom random = new SplittableRandom(seed);
        KivHostCallService s = Bridge.load();
        long initAtMs = random.nextLong(100);
        long endAtMs = random.nextLong(400);
        for (int id : new int[] {0, 1, 2, SoakTest.PRODUCERS, SoakTest.PRODUCERS + 1}) {
            SoakTest.Sender sender = new SoakTest.Sender(seed, id);
            Thread thread = new Thread(() -> {
                for (;;) sender.next().send(s);
            });
            thread.setDaemon(true);
            thread.start();
        }
        long started = System.nanoTime();
        if (initAtMs < endAtMs) {
            Thread.sleep(initAtMs);
            s.native_init();
        }
        Thread.sleep(Math.max(0, endAtMs - (System.nanoTime() - started) / 1_000_000));
        result("ending", how + " initAtMs=" + (initAtMs < endAtMs ? initAtMs : "never") + " endAtMs=" + endAtMs
                + " served=" + TestNative.served());
        System.out.flush();
        switch (how) {
            case "exit" -> System.exit(3);
            case "throw" -> throw new IllegalStateException("the soak ends with an uncaught exception");
            default -> { }
        }
    }
}
