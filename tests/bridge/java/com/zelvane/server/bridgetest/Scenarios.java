package com.zelvane.server.bridgetest;

import com.zelvane.server.KivHostCallService;
import java.io.IOException;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.List;

/**
 * Scenarios that need a process of their own: the start states, the debug
 * switch, the exit. Each reports on standard output with lines "LINE <android
 * log line>", "REQ <request hex>", "RESULT <name>=<value>"; a broken
 * expectation inside the scenario prints "FAILED: ..." and exits 1.
 */
public final class Scenarios {
    private Scenarios() {}

    public static void main(String[] args) throws Exception {
        String name = args[0];
        switch (name) {
            case "before-init": beforeInit(); break;
            case "failed-start": failedStart(); break;
            case "second-init": secondInit(); break;
            case "debug-off": debugOff(); break;
            case "debug-values": debugValues(); break;
            case "debug-on-value": debugOnValue(System.getenv("BRIDGE_DEBUG_VALUE")); break;
            case "null-then-strings": nullThenStrings(); break;
            case "exit-idle": exit(false, true); break;
            case "exit-busy": exit(true, true); break;
            case "end-idle": exit(false, false); break;
            case "end-busy": exit(true, false); break;
            default: fail("no scenario " + name);
        }
        System.out.flush();
    }

    static void fail(String why) {
        System.out.println("FAILED: " + why);
        System.out.flush();
        Runtime.getRuntime().halt(1);
    }

    static void check(boolean condition, String what) {
        if (!condition) fail(what);
    }

    static void result(String name, Object value) {
        System.out.println("RESULT " + name + "=" + value);
    }

    static void reportRequests(List<byte[]> requests) {
        for (byte[] request : requests) System.out.println("REQ " + Wire.hex(request));
    }

    /** Every captured line of the bridge's tag and of the logger's HCALL module. */
    static void reportLines() {
        for (String line : Bridge.logLines())
            if (line.contains("|" + Bridge.TAG + "|") || line.contains("hcallLibInitGuest")) System.out.println("LINE " + line);
    }

    static void writeDebugProperty(String value) throws IOException {
        Path file = Path.of(System.getenv("HOSTCALL_PROPERTIES_FILE"));
        Files.writeString(file, value == null ? "# nothing set\nother.key=1\n"
                : "# debug switch\nkiv.debug.kivhostcall=" + value + "\n");
    }

    static void beforeInit() {
        KivHostCallService s = Bridge.load();
        result("locale", s.native_onLocaleChanged("en-US"));
        result("orientation", s.native_onOrientationChange(1));
        result("clipboard", s.native_setClipboardText("early"));
        result("launchAllowedBeforeConnect", s.native_isAppLaunchAllowed("x"));
        result("adIdBeforeConnect", s.native_setGoogleAdId("y"));
        result("exchangesBeforeInit", TestNative.requests().length);
        s.native_init();
        reportRequests(Bridge.drain(s, true));
    }

    static void failedStart() {
        KivHostCallService s = Bridge.load();
        s.native_init();
        result("locale", s.native_onLocaleChanged("en-GB"));
        result("orientation", s.native_onOrientationChange(2));
        result("launchAllowed", s.native_isAppLaunchAllowed("x"));
        result("adId", s.native_setGoogleAdId("y"));
        result("exchangesAfterFailedStart", TestNative.requests().length);
        result("connectsAfterFailedStart", TestNative.connects());
        reportLines();
        // The device appears; a second native_init retries the connection and
        // starts the worker, which delivers what waited.
        TestNative.setOpenErrno(0);
        s.native_init();
        reportRequests(Bridge.drain(s, true));
        result("openDevices", TestNative.openDevices());
    }

    /** Threads other than `except` whose name (inherited from their creator) is `name`. */
    static long threadsNamed(String name, Path except) throws IOException {
        try (var tasks = Files.list(Path.of("/proc/self/task"))) {
            return tasks.filter(t -> {
                try {
                    return !t.getFileName().equals(except.getFileName())
                            && Files.readString(t.resolve("comm")).trim().equals(name);
                } catch (IOException e) {
                    return false;  // the thread ended meanwhile
                }
            }).count();
        }
    }

    /**
     * Calls native_init on a new thread named `threadName` and counts the
     * threads it started, which carry its name, while it is still alive.
     */
    static long threadsStartedByInit(KivHostCallService s, String threadName) throws Exception {
        java.util.concurrent.CountDownLatch counted = new java.util.concurrent.CountDownLatch(1);
        java.util.concurrent.CompletableFuture<Path> caller = new java.util.concurrent.CompletableFuture<>();
        Thread thread = new Thread(() -> {
            s.native_init();
            try {
                caller.complete(Files.readSymbolicLink(Path.of("/proc/thread-self")));
                counted.await();
            } catch (IOException | InterruptedException e) {
                caller.completeExceptionally(e);
            }
        }, threadName);
        thread.start();
        long started = threadsNamed(threadName, caller.get());
        counted.countDown();
        thread.join();
        return started;
    }

    static void secondInit() throws Exception {
        writeDebugProperty("0");
        KivHostCallService s = Bridge.load();
        result("workersFromFirstInit", threadsStartedByInit(s, "hcinit-first"));
        writeDebugProperty("1");
        result("workersFromSecondInit", threadsStartedByInit(s, "hcinit-second"));
        result("connects", TestNative.connects());
        result("openDevices", TestNative.openDevices());
        result("orientation", s.native_onOrientationChange(4));
        reportRequests(Bridge.drain(s, true));
        reportLines();
    }

    static void debugOff() throws Exception {
        writeDebugProperty("0");
        KivHostCallService s = Bridge.load();
        s.native_init();
        TestNative.configureHost(0, true, 0, new int[] {12, -5});
        s.native_onLocaleChanged("de-DE");
        s.native_onVibrate(1, "v");
        s.native_onOrientationChange(1);
        s.native_initImeStatus("");
        s.native_isAppLaunchAllowed("x");
        s.native_setGoogleAdId("y");
        Bridge.drain(s, false);
        reportLines();
    }

    /** A detail line appears for the orientation sent after native_init read `value`. */
    static boolean debugLineAfterInit(KivHostCallService s, String value, int orientation) throws IOException {
        writeDebugProperty(value);
        s.native_init();
        s.native_onOrientationChange(orientation);
        Bridge.drain(s, false);
        String detail = "3|" + Bridge.TAG + "|jint onOrientationChanged(JNIEnv *, jobject, int): orientation = "
                + orientation;
        return Bridge.logLines().contains(detail);
    }

    /** Values that leave the switch off, each read by a repeated native_init. */
    static void debugValues() throws Exception {
        KivHostCallService s = Bridge.load();
        String[] off = {null, "0", "", "abc", "-0"};
        for (int i = 0; i < off.length; i++)
            result("on[" + off[i] + "]", debugLineAfterInit(s, off[i], 100 + i));
    }

    static void debugOnValue(String value) throws Exception {
        KivHostCallService s = Bridge.load();
        result("on[" + value + "]", debugLineAfterInit(s, value, 7));
        result("stillOnAfterZero", debugLineAfterInit(s, "0", 8));
    }

    static void nullThenStrings() {
        KivHostCallService s = Bridge.started();
        String[] outcomes = new String[3];
        Runnable[] calls = {
            () -> s.native_onActivityDisplayed(null, "act"),
            () -> s.native_onAppInstalled("p", "a", null, 1, "v", "icon", "src", true),
            () -> s.native_setAppConfigDbParams(null, true, true, "cursor", true),
        };
        for (int i = 0; i < calls.length; i++) {
            try {
                calls[i].run();
                outcomes[i] = "returned";
            } catch (IllegalArgumentException e) {
                outcomes[i] = e.getMessage();
            }
            result("call" + i, outcomes[i]);
        }
        reportRequests(Bridge.drain(s, true));
    }

    static void exit(boolean busy, boolean viaSystemExit) {
        ExitGate.load();
        KivHostCallService s = Bridge.started();
        s.native_onOrientationChange(1);
        Bridge.drain(s, true);
        if (busy) {
            ExitGate.holdUntilExit(12);
            s.native_onLocaleChanged("held");
            check(ExitGate.awaitHeld(Bridge.WORKER_TOLERANCE.toMillis()), "the worker reached the host");
            s.native_setClipboardText("queued behind the held call");
            result("held", true);
        }
        System.out.flush();
        if (viaSystemExit) System.exit(busy ? 5 : 7);
    }
}
