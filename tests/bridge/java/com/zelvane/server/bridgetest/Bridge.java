package com.zelvane.server.bridgetest;

import static org.junit.jupiter.api.Assertions.assertTrue;

import com.zelvane.server.KivHostCallService;
import java.time.Duration;
import java.util.ArrayList;
import java.util.Arrays;
import java.util.List;
import java.util.function.BooleanSupplier;

/**
 * The library loaded into this JVM the way the Android runtime loads it, with
 * the Android log captured from before JNI_OnLoad, and a way to wait for the
 * worker to have finished everything queued so far.
 */
final class Bridge {
    /** How long the worker may take to drain what a test queued. */
    static final Duration WORKER_TOLERANCE = Duration.ofSeconds(30);

    static final String TAG = "KivHostCallService-JNI";
    /** The event whose delivery proves that every earlier event was delivered. */
    static final int SENTINEL_SECS = -424242;
    static final byte[] SENTINEL = Wire.op(42).i32(SENTINEL_SECS).bytes();
    static final String SENTINEL_TASK =
            "auto setUsageStatsUpdateInterval(JNIEnv *, jobject, int)::(anonymous class)::operator()() const";

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
        long deadline = System.nanoTime() + WORKER_TOLERANCE.toNanos();
        while (!condition.getAsBoolean()) {
            assertTrue(System.nanoTime() < deadline, "timed out waiting for " + what);
            Thread.onSpinWait();
            Thread.yield();
        }
    }

    static List<byte[]> requests() {
        return new ArrayList<>(Arrays.asList(TestNative.requests()));
    }

    static List<String> logLines() {
        return new ArrayList<>(Arrays.asList(TestNative.logLines()));
    }

    /**
     * Queues the sentinel and waits until the host has received it, so every
     * event queued before has run completely (host call and lines). Returns
     * the requests before the sentinel.
     */
    static List<byte[]> drain(KivHostCallService s, boolean debugOn) {
        int before = logLines().size();
        s.native_setUsageStatsUpdateInterval(SENTINEL_SECS);
        await("the sentinel event", () -> {
            List<byte[]> all = requests();
            return all.stream().anyMatch(r -> Arrays.equals(r, SENTINEL));
        });
        if (debugOn) {
            String returning = "3|" + TAG + "|" + SENTINEL_TASK + ": returning, rval = 0";
            await("the sentinel's returning line", () -> {
                List<String> lines = logLines();
                return lines.subList(before, lines.size()).contains(returning);
            });
        }
        List<byte[]> delivered = requests();
        delivered.removeIf(r -> Arrays.equals(r, SENTINEL));
        return delivered;
    }

    /** Lines from index `from` on, without the sentinel's own. */
    static List<String> linesSince(int from) {
        List<String> lines = logLines();
        List<String> since = new ArrayList<>(lines.subList(Math.min(from, lines.size()), lines.size()));
        since.remove("3|" + TAG + "|jint setUsageStatsUpdateInterval(JNIEnv *, jobject, int): secs = " + SENTINEL_SECS);
        for (int i = since.size() - 1; i >= 0; i--) {
            if (since.get(i).equals("3|" + TAG + "|" + SENTINEL_TASK + ": returning, rval = 0")) {
                since.remove(i);
                break;
            }
        }
        return since;
    }

    static List<String> hex(List<byte[]> requests) {
        List<String> out = new ArrayList<>();
        for (byte[] r : requests) out.add(Wire.hex(r));
        return out;
    }
}
