package com.zelvane.server.bridgetest;

import static org.junit.jupiter.api.Assertions.assertTrue;

import com.zelvane.server.KivHostCallService;
import java.io.*;
import java.nio.*;
import java.time.Duration;
import java.util.*;

/** The library loaded as the Android runtime loads it, after libbridge_test_native.so (log capture, host). */
final class Bridge {
    static final Duration WAIT = Duration.ofSeconds(30);
    static final String TAG = "KivHostCallService-JNI";
    // Its delivery shows that every event queued before it has run.
    private static final String SENTINEL_NAME = "jint setUsageStatsUpdateInterval(JNIEnv *, jobject, int)";
    private static final String SENTINEL = request(42, -424242);
    private static final String SENTINEL_RETURNING = debug(task(SENTINEL_NAME) + ": returning, rval = 0");
    private static final List<String> LOG = new ArrayList<>();  // "priority|tag|text"
    private static KivHostCallService service;

    static native String takeLogLines();  // each ended by U+0001; the capture forgets them
    static native void configureHost(boolean launchAllowed, int[] codeResults);  // a fresh host; code, result pairs
    static native String exchanges();  // the requests as hex, each ended by a blank
    static native int overlaps();
    static native int openDevices();
    static native boolean awaitServed(long count, long timeoutMs);
    static native void keepLoaded(String path);  // whatever the JVM unloads
    static native void holdUntilExit(int opCode);  // the host answers after the library's static destructors
    static native boolean awaitHeld(long timeoutMs);
    static native String convertStarved(String s);  // where GetStringUTFChars lends nothing
    static native long nativeHeapInUse();

    /** JNI_OnLoad runs here; native_init does not. */
    static synchronized KivHostCallService load() {
        if (service == null) {
            System.load(System.getProperty("hostcall.testlib"));
            System.load(System.getProperty("hostcall.lib"));
            service = new KivHostCallService();
        }
        return service;
    }

    static synchronized KivHostCallService started() { if (service == null) load().native_init(); return service; }

    static String debug(String text) { return "3|" + TAG + "|" + text; }

    static String error(String text) { return "6|" + TAG + "|" + text; }

    /** The name a method's task logs under. */
    static String task(String name) {
        return "auto " + name.substring(name.indexOf(' ') + 1) + "::(anonymous class)::operator()() const";
    }

    static synchronized List<String> lines() {
        for (String line : takeLogLines().split("\u0001")) if (!line.isEmpty()) LOG.add(line);
        return new ArrayList<>(LOG);
    }

    static List<String> bridgeLines(int from) {
        return new ArrayList<>(lines().stream().skip(from).filter(l -> l.contains("|" + TAG + "|")).toList());
    }

    static List<String> requests() { return Arrays.stream(exchanges().split(" ")).filter(h -> !h.isEmpty()).toList(); }

    /** Waits for the sentinel (and its returning line if debugOn); returns what the host got but it. */
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
        return requests().stream().filter(request -> !request.equals(SENTINEL)).toList();
    }

    static List<String> drainedLines(int from) {
        List<String> lines = bridgeLines(from);
        lines.remove(debug(SENTINEL_NAME + ": secs = -424242"));
        // Another task of its method may log the same text before the sentinel's.
        lines.remove(lines.lastIndexOf(SENTINEL_RETURNING));
        return lines;
    }

    /** As the host must get it: a String as count, modified UTF-8 and NUL; an int or a boolean as 4 bytes. */
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
