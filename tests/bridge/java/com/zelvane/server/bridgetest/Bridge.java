package com.zelvane.server.bridgetest;

import static org.junit.jupiter.api.Assertions.assertTrue;

import com.zelvane.server.KivHostCallService;
import java.io.ByteArrayOutputStream;
import java.io.DataOutputStream;
import java.io.IOException;
import java.io.UncheckedIOException;
import java.nio.ByteBuffer;
import java.nio.ByteOrder;
import java.time.Duration;
import java.util.ArrayList;
import java.util.Arrays;
import java.util.Collections;
import java.util.HexFormat;
import java.util.List;
import java.util.function.BooleanSupplier;

/**
 * The library loaded into this JVM as the Android runtime loads it, with the
 * Android log captured from before JNI_OnLoad; a way to wait until the worker
 * has run everything queued so far; requests as the host must receive them.
 */
final class Bridge {
    /** How long the worker may take to drain what a test queued. */
    static final Duration WAIT = Duration.ofSeconds(30);
    static final String TAG = "KivHostCallService-JNI";

    /** The event whose delivery shows that every event queued before it has run. */
    private static final int SENTINEL_SECS = -424242;
    private static final String SENTINEL = request(42, SENTINEL_SECS);
    private static final String SENTINEL_NAME = "setUsageStatsUpdateInterval(JNIEnv *, jobject, int)";
    private static final String SENTINEL_RETURNING = debug(task("jint " + SENTINEL_NAME) + ": returning, rval = 0");

    private static KivHostCallService service;
    /** Every captured line as "priority|tag|text", in order. */
    private static final List<String> LOG = new ArrayList<>();

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
        if (first) load().native_init();
        return service;
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
        return "auto " + name.substring(name.indexOf(' ') + 1) + "::(anonymous class)::operator()() const";
    }

    static synchronized List<String> lines() {
        LOG.addAll(Arrays.asList(TestNative.takeLogLines()));
        return new ArrayList<>(LOG);
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
        int sent = Collections.frequency(Arrays.asList(TestNative.requests()), SENTINEL);
        int logged = Collections.frequency(lines(), SENTINEL_RETURNING);
        s.native_setUsageStatsUpdateInterval(SENTINEL_SECS);
        await("the sentinel event", () -> Collections.frequency(Arrays.asList(TestNative.requests()), SENTINEL) > sent);
        if (debugOn) await("its returning line", () -> Collections.frequency(lines(), SENTINEL_RETURNING) > logged);
        List<String> received = new ArrayList<>(Arrays.asList(TestNative.requests()));
        received.removeAll(List.of(SENTINEL));
        return received;
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

    /**
     * A request as the host must receive it, as hex: operation code, total
     * length, then each Java value packed: a String as its count, its modified
     * UTF-8 bytes (what Java hands to JNI) and NUL; an int as 4 bytes; a
     * boolean as 4 bytes, first 1 or 0.
     */
    static String request(int op, Object... values) {
        ByteBuffer b = ByteBuffer.allocate(1 << 16).order(ByteOrder.LITTLE_ENDIAN).putInt(op).putInt(0);
        for (Object value : values) {
            if (value instanceof String text) {
                byte[] utf = modifiedUtf8(text);
                b.putInt(utf.length + 1).put(utf).put((byte) 0);
            } else {
                b.putInt(value instanceof Boolean yes ? (yes ? 1 : 0) : (Integer) value);
            }
        }
        return HexFormat.of().formatHex(b.array(), 0, b.putInt(4, b.position()).position());
    }

    private static byte[] modifiedUtf8(String text) {
        try {
            ByteArrayOutputStream bytes = new ByteArrayOutputStream();
            new DataOutputStream(bytes).writeUTF(text);
            return Arrays.copyOfRange(bytes.toByteArray(), 2, bytes.size());
        } catch (IOException e) {
            throw new UncheckedIOException(e);
        }
    }
}
