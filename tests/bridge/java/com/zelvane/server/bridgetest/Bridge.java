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
    private static final String SENTINEL_NAME = "jint setUsageStatsUpdateInterval(JNIEnv *, jobject, int)";
    private static final String SENTINEL = request(42, -424242);
    private static final String SENTINEL_RETURNING = debug(task(SENTINEL_NAME) + ": returning, rval = 0");

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
        if (service == null) load().native_init();
        return service;
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
        for (String line : TestNative.takeLogLines().split("\u0001")) if (!line.isEmpty()) LOG.add(line);
        return new ArrayList<>(LOG);
    }

    /** The bridge's own lines from index `from` of {@link #lines} on. */
    static List<String> bridgeLines(int from) {
        List<String> all = lines();
        List<String> lines = new ArrayList<>(all.subList(from, all.size()));
        lines.removeIf(l -> !l.contains("|" + TAG + "|"));
        return lines;
    }

    /** Every request the host has received, as hex. */
    static List<String> requests() {
        List<String> hex = new ArrayList<>(Arrays.asList(TestNative.requests().split(" ")));
        hex.remove("");
        return hex;
    }

    /**
     * Queues the sentinel and waits until the host has received it (and, with
     * debug lines on, until its task has logged). Returns the requests the
     * host has received before it, as hex.
     */
    static List<String> drain(KivHostCallService s, boolean debugOn) {
        int sent = Collections.frequency(requests(), SENTINEL);
        int logged = Collections.frequency(lines(), SENTINEL_RETURNING);
        s.native_setUsageStatsUpdateInterval(-424242);
        long deadline = System.nanoTime() + WAIT.toNanos();
        while (Collections.frequency(requests(), SENTINEL) == sent
                || debugOn && Collections.frequency(lines(), SENTINEL_RETURNING) == logged) {
            assertTrue(System.nanoTime() < deadline, "timed out waiting for the sentinel event");
            Thread.yield();
        }
        List<String> received = requests();
        received.removeAll(List.of(SENTINEL));
        return received;
    }

    /** The bridge's lines from index `from` on, less the sentinel's, after a drain. */
    static List<String> drainedLines(int from) {
        List<String> lines = bridgeLines(from);
        lines.remove(debug(SENTINEL_NAME + ": secs = -424242"));
        // The sentinel's task logs last; another task of its method may log the same text before.
        lines.remove(lines.lastIndexOf(SENTINEL_RETURNING));
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
        try {
            for (Object value : values) {
                if (value instanceof String text) {
                    ByteArrayOutputStream utf = new ByteArrayOutputStream();
                    new DataOutputStream(utf).writeUTF(text);
                    b.putInt(utf.size() - 1).put(utf.toByteArray(), 2, utf.size() - 2).put((byte) 0);
                } else {
                    b.putInt(value instanceof Boolean yes ? (yes ? 1 : 0) : (Integer) value);
                }
            }
        } catch (IOException e) {
            throw new UncheckedIOException(e);
        }
        return HexFormat.of().formatHex(b.array(), 0, b.putInt(4, b.position()).position());
    }
}
