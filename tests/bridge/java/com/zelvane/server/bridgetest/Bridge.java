package com.zelvane.server.bridgetest;

import static org.junit.jupiter.api.Assertions.assertTrue;

import com.zelvane.server.KivHostCallService;
import java.time.Duration;
import java.util.ArrayList;
import java.util.Arrays;
import java.util.Collections;
import java.util.List;
import java.util.function.BooleanSupplier;

/**
 * The library loaded into this JVM as the Android runtime loads it, with the
 * Android log captured from before JNI_OnLoad, and a way to wait until the
 * worker has finished everything queued so far.
 */
final class Bridge {
    /** How long the worker may take to drain what a test queued. */
    static final Duration WAIT = Duration.ofSeconds(30);
    static final String TAG = "KivHostCallService-JNI";
    static final String TASK_SUFFIX = "::(anonymous class)::operator()() const";

    /** The event whose delivery shows that every event queued before it has run. */
    private static final int SENTINEL_SECS = -424242;
    private static final String SENTINEL = Wire.op(42).i32(SENTINEL_SECS).hex();
    private static final String SENTINEL_NAME = "setUsageStatsUpdateInterval(JNIEnv *, jobject, int)";
    private static final String SENTINEL_RETURNING =
            "3|" + TAG + "|auto " + SENTINEL_NAME + TASK_SUFFIX + ": returning, rval = 0";

    private static KivHostCallService service;

    private Bridge() {}

    /** Loads the helper and the library (JNI_OnLoad runs here), without native_init. */
    static synchronized KivHostCallService load() {
        if (service == null) {
            System.load(System.getProperty("hostcall.testlib"));
            TestNative.startLogCapture();
            System.load(System.getProperty("hostcall.lib"));
            service = new KivHostCallService();
        }
        return service;
    }

    /** Loaded and started once for the whole JVM. */
    static synchronized KivHostCallService started() {
        boolean first = service == null;
        KivHostCallService s = load();
        if (first) s.native_init();
        return s;
    }

    static void await(String what, BooleanSupplier condition) {
        long deadline = System.nanoTime() + WAIT.toNanos();
        while (!condition.getAsBoolean()) {
            assertTrue(System.nanoTime() < deadline, "timed out waiting for " + what);
            Thread.yield();
        }
    }

    static String debug(String text) {
        return "3|" + TAG + "|" + text;
    }

    static String error(String text) {
        return "6|" + TAG + "|" + text;
    }

    /** The name a method's task logs under, from the method's name string. */
    static String task(String name) {
        return "auto " + name.substring(name.indexOf(' ') + 1) + TASK_SUFFIX;
    }

    static List<String> lines() {
        return new ArrayList<>(Arrays.asList(TestNative.logLines()));
    }

    /** The bridge's own lines from index `from` of {@link #lines} on. */
    static List<String> bridgeLines(int from) {
        List<String> all = lines();
        List<String> lines = new ArrayList<>(all.subList(from, all.size()));
        lines.removeIf(l -> !l.contains("|" + TAG + "|"));
        return lines;
    }

    /**
     * Queues the sentinel and waits until the host has received it (and, with
     * debug lines on, until its task has logged). Returns the requests the
     * host has received before it, as hex.
     */
    static List<String> drain(KivHostCallService s, boolean debugOn) {
        int sent = count(TestNative.requests(), SENTINEL);
        int logged = count(TestNative.logLines(), SENTINEL_RETURNING);
        s.native_setUsageStatsUpdateInterval(SENTINEL_SECS);
        await("the sentinel event", () -> count(TestNative.requests(), SENTINEL) > sent);
        if (debugOn) await("its returning line", () -> count(TestNative.logLines(), SENTINEL_RETURNING) > logged);
        List<String> received = new ArrayList<>(Arrays.asList(TestNative.requests()));
        received.removeAll(List.of(SENTINEL));
        return received;
    }

    private static int count(String[] items, String item) {
        return Collections.frequency(Arrays.asList(items), item);
    }

    /** The bridge's lines from index `from` on, less the sentinel's, after a drain. */
    static List<String> drainedLines(int from) {
        List<String> lines = bridgeLines(from);
        lines.remove(debug("jint " + SENTINEL_NAME + ": secs = " + SENTINEL_SECS));
        // The sentinel's task logs last; another task of its method may log the same text before.
        int last = lines.lastIndexOf(SENTINEL_RETURNING);
        if (last >= 0) lines.remove(last);
        return lines;
    }
}
