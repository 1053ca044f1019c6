package com.zelvane.server.bridgetest;

import com.zelvane.server.KivHostCallService;
import java.io.IOException;
import java.io.UncheckedIOException;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.Arrays;
import java.util.List;
import java.util.SplittableRandom;

/**
 * Scenarios that need a process of their own, run by {@link ChildJvm}. Each
 * reports on standard output ("RESULT name=value", "LINE line", "REQ hex");
 * a broken expectation inside one prints "FAILED: ..." and exits 1.
 */
public final class Scenarios {
    private Scenarios() {}

    public static void main(String[] args) throws Exception {
        switch (args[0]) {
            case "debug" -> debug(args[1]);
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

    /** Calls native_init on a thread of its own and counts the other threads of its name: the workers it started. */
    static long threadsStartedByInit(KivHostCallService s, String name) throws Exception {
        Path[] caller = new Path[1];
        Thread thread = new Thread(() -> {
            s.native_init();
            try {
                caller[0] = Files.readSymbolicLink(Path.of("/proc/thread-self")).getFileName();
            } catch (IOException e) {
                throw new UncheckedIOException(e);
            }
        }, name);
        thread.start();
        thread.join();
        try (var tasks = Files.list(Path.of("/proc/self/task"))) {
            return tasks.filter(t -> !t.getFileName().equals(caller[0])).filter(t -> {
                try {
                    return Files.readString(t.resolve("comm")).trim().equals(name);
                } catch (IOException e) {
                    return false;  // the thread ended meanwhile
                }
            }).count();
        }
    }

    /**
     * The lines written with the debug property unset; then native_init again
     * with values that must leave the switch off, then `onValue`, then 0,
     * each time noting whether a detail line appears and how many threads the
     * repeated start began.
     */
    static void debug(String onValue) throws Exception {
        KivHostCallService s = Bridge.load();
        writeDebugProperty(null);
        TestNative.configureHost(true, new int[] {12, -5});
        result("first", "workers " + threadsStartedByInit(s, "hc-init"));
        s.native_onLocaleChanged("de-DE");
        s.native_onVibrate(1, "v");
        s.native_onOrientationChange(1);
        s.native_initImeStatus("");
        s.native_isAppLaunchAllowed("x");
        s.native_setGoogleAdId("y");
        Bridge.drain(s, false);
        reportLines("|" + Bridge.TAG + "|");
        String[] values = {"0", "", "abc", "-0", onValue, "0"};
        for (int i = 0; i < values.length; i++) {
            writeDebugProperty(values[i]);
            long workers = threadsStartedByInit(s, "hc-init-" + i);
            int mark = Bridge.lines().size();
            s.native_onOrientationChange(i);
            Bridge.drain(s, false);
            String detail = Bridge.debug("jint onOrientationChanged(JNIEnv *, jobject, int): orientation = " + i);
            result("[" + values[i] + "]", "workers " + workers + " on " + Bridge.bridgeLines(mark).contains(detail));
        }
        result("openDevices", TestNative.openDevices());
        String alreadyStarted = "4|" + Bridge.TAG + "|void native_init(JNIEnv *, jobject): service already started";
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
        TestNative.setOpenErrno(0);
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
     * Senders and askers that never stop, a native_init at a random moment (or
     * none), and an end at a random moment: "exit" (System.exit(3)), "end"
     * (main returns) or "throw" (main throws).
     */
    static void soakExit(String how, long seed) throws Exception {
        SplittableRandom random = new SplittableRandom(seed);
        KivHostCallService s = Bridge.load();
        TestNative.configureSoakHost(40, 20, seed, null);
        long initAtMs = random.nextLong(100);
        long endAtMs = random.nextLong(400);
        for (int t = 0; t < 5; t++) {
            int id = t;
            Thread thread = new Thread(() -> {
                SplittableRandom r = new SplittableRandom(seed * 31 + id);
                for (int seq = 0;; seq = (seq + 1) % Soak.MAX_SEQ) {
                    if (id < 3) Soak.send(s, r, id, seq);
                    else Soak.ask(s, r, id - 3, seq);
                }
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
