package com.zelvane.server.bridgetest;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.zelvane.server.KivHostCallService;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.Arrays;
import java.util.List;
import java.util.Map;
import java.util.concurrent.ExecutorService;
import java.util.concurrent.Executors;
import java.util.concurrent.Future;
import org.junit.jupiter.api.Test;

/**
 * The service bridge under load and at exit, with debug lines off as in
 * service. HOSTCALL_SOAK_EVENTS (forwarded events) and HOSTCALL_SOAK_EXITS
 * (child JVMs ended at random points) size it: `make test` runs the short
 * defaults, `make soak` the long run. HOSTCALL_SOAK_SEED repeats a run.
 */
class SoakTest {
    static final int DEFAULT_EVENTS = 20_000;
    static final int DEFAULT_EXITS = 12;
    /**
     * Growth after warm-up that still counts as flat. The JVM's code cache,
     * compiler arenas and thread stacks move the resident size by a few
     * megabytes; the native heap in use moves by about 100 KB, so 1 MB finds
     * a leak of 70 bytes an event in the short run.
     */
    static final long RESIDENT_MARGIN = 24L << 20;
    static final long NATIVE_HEAP_MARGIN = 1L << 20;

    static int size(String variable, int fallback) {
        String value = System.getenv(variable);
        return value == null || value.isEmpty() ? fallback : Integer.parseInt(value);
    }

    @Test
    void Soak_WhenEveryKindIsSentWithQueriesAgainstAnUnreliableHost_AccountsForEveryEventOnce() throws Exception {
        long seed = size("HOSTCALL_SOAK_SEED", (int) (System.nanoTime() % 1000));
        Path trace = Files.createTempFile("soak-trace-", ".txt");
        try {
            KivHostCallService service = Bridge.load();
            TestNative.configureSoakHost(Soak.JITTER_US, Soak.FAILURE_PER_MILLE, seed, trace.toString());
            service.native_init();
            Soak soak = new Soak(service, size("HOSTCALL_SOAK_EVENTS", DEFAULT_EVENTS));
            soak.run(seed);
            TestNative.configureSoakHost(0, 0, 0, null);
            Map<String, Long> expectedLines = soak.verify(trace);
            String summary = "seed " + seed + ", " + soak.eventsPerRound * Soak.PRODUCERS * Soak.ROUNDS + " events: "
                    + soak.delivered + " delivered, " + soak.failed + " failed; resident and native heap after warm-up "
                    + Arrays.toString(soak.afterWarmUp) + ", at the end " + Arrays.toString(soak.atEnd);
            System.out.println(summary);
            assertEquals(List.of(), soak.problems, "every event once, in order; answers as the host's: " + summary);
            assertTrue(soak.failed > 0 && soak.delivered > soak.failed, "the host failed some, not most: " + summary);
            // The last tasks may still be logging when the host has served them.
            Bridge.await("a failure line for each failed event and a first line for each vibration", () -> {
                soak.countLines();
                return soak.lines.equals(expectedLines);
            });
            assertTrue(soak.atEnd[1] - soak.afterWarmUp[1] < NATIVE_HEAP_MARGIN, "the native heap is flat: " + summary);
            // A sanitizer's quarantine and shadow grow the resident size with every allocation, leak or not.
            if (!System.getenv().getOrDefault("LD_PRELOAD", "").contains("asan"))
                assertTrue(soak.atEnd[0] - soak.afterWarmUp[0] < RESIDENT_MARGIN, "resident size is flat: " + summary);
        } finally {
            Files.deleteIfExists(trace);
        }
    }

    /** Exit codes of the three ways a child's JVM ends. */
    static final Map<String, Integer> ENDINGS = Map.of("exit", 3, "end", 0, "throw", 1);

    @Test
    void Exit_AtRandomPointsOfTheSoak_EndsCleanlyEveryTime() throws Exception {
        long base = System.nanoTime() % 100_000;
        ExecutorService pair = Executors.newFixedThreadPool(2);
        try {
            List<Future<String>> outcomes = new ArrayList<>();
            for (int i = 0; i < size("HOSTCALL_SOAK_EXITS", DEFAULT_EXITS); i++) {
                String how = List.of("exit", "end", "throw").get(i % 3);
                String seed = Long.toString(base + i);
                outcomes.add(pair.submit(() -> {
                    ChildJvm child =
                            ChildJvm.run(ENDINGS.get(how), ChildJvm.CLASS_PATH, Map.of(), "soak-exit", how, seed);
                    assertEquals(1, child.reported("RESULT").size(), seed + " reached its end:\n" + child.output);
                    return seed + " " + child.reported("RESULT").get(0) + " in " + child.elapsed.toMillis() + " ms";
                }));
            }
            for (Future<String> outcome : outcomes) System.out.println(outcome.get());
        } finally {
            pair.shutdownNow();
        }
    }
}
