package com.zelvane.server.bridgetest;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.zelvane.server.KivHostCallService;
import java.io.IOException;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.List;
import java.util.Map;
import java.util.concurrent.ExecutorService;
import java.util.concurrent.Executors;
import java.util.concurrent.Future;
import java.util.stream.Stream;
import org.junit.jupiter.api.Test;

/**
 * The service bridge under load and at exit, in the real JVM. Sizes come from
 * HOSTCALL_SOAK_EVENTS (forwarded events) and HOSTCALL_SOAK_EXITS (child JVMs
 * ended at random points); the defaults are the short version CI runs, and
 * `make soak` the long one.
 */
class SoakTest {
    static final int DEFAULT_EVENTS = 40_000;
    static final int DEFAULT_EXITS = 50;
    /**
     * Growth of the resident size after warm-up that still counts as flat: the
     * JVM's code cache, compiler arenas and thread stacks move by a few
     * megabytes; a per-event leak over a long run does not stay under it.
     */
    static final long RESIDENT_MARGIN = 24L << 20;
    /** Growth of the native heap in use after warm-up that still counts as flat. */
    static final long NATIVE_HEAP_MARGIN = 4L << 20;

    static int size(String variable, int fallback) {
        String value = System.getenv(variable);
        return value == null || value.isEmpty() ? fallback : Integer.parseInt(value);
    }

    @Test
    void Soak_WhenEveryKindIsSentWithQueriesAgainstAnUnreliableHost_AccountsForEveryEventOnce() throws Exception {
        // The host's random choices repeat with HOSTCALL_SOAK_SEED (the summary names the seed).
        long seed = size("HOSTCALL_SOAK_SEED", (int) (System.nanoTime() % 1000));
        Soak.Plan plan = Soak.Plan.ofEvents(size("HOSTCALL_SOAK_EVENTS", DEFAULT_EVENTS), seed);
        Path trace = Files.createTempFile("soak-trace-", ".txt");
        try {
            KivHostCallService service = Soak.load();
            Soak.configureHost(plan, trace);
            service.native_init();
            Soak soak = new Soak(plan, service, trace);
            soak.run();
            SoakNative.closeTrace();
            Soak.Verdict v = soak.verify();
            long sentEvents = (long) plan.producers() * plan.rounds() * plan.eventsPerRound();
            String summary = plan + ": " + v.delivered + " delivered, " + v.failed + " failed; memory after warm-up "
                    + soak.afterWarmUp + ", at the end " + soak.atEnd;
            System.out.println(summary);
            assertTrue(v.problems.isEmpty(), "every event once, in order, failures logged:\n"
                    + String.join("\n", v.problems) + "\n" + summary);
            assertEquals(sentEvents, v.delivered + v.failed, "every event reached the host exactly once: " + summary);
            assertTrue(v.failed > 0 && v.delivered > v.failed, "the host failed some but not most: " + summary);

            long heapGrowth = soak.atEnd.nativeHeapBytes() - soak.afterWarmUp.nativeHeapBytes();
            assertTrue(heapGrowth < NATIVE_HEAP_MARGIN, "the native heap stays flat after warm-up: " + summary);
            // A sanitizer's quarantine and shadow memory grow resident size with
            // every allocation, leak or not; its allocator's count above stands.
            if (!SoakNative.sanitized()) {
                long residentGrowth = soak.atEnd.residentBytes() - soak.afterWarmUp.residentBytes();
                assertTrue(residentGrowth < RESIDENT_MARGIN, "resident size stays flat after warm-up: " + summary);
            }
        } finally {
            Files.deleteIfExists(trace);
        }
    }

    /** Exit codes of the three ways the child's JVM ends. */
    static final Map<String, Integer> ENDINGS = Map.of("exit", 3, "end", 0, "throw", 1);
    static final String[] HOW = {"exit", "end", "throw"};

    @Test
    void Exit_AtRandomPointsOfTheSoak_EndsCleanlyEveryTime() throws Exception {
        int runs = size("HOSTCALL_SOAK_EXITS", DEFAULT_EXITS);
        Path errors = Files.createTempDirectory("soak-exit-");
        long base = System.nanoTime() % 100_000;
        ExecutorService pairs = Executors.newFixedThreadPool(2);
        try {
            List<Future<String>> outcomes = new ArrayList<>();
            for (int i = 0; i < runs; i++) {
                String how = HOW[i % HOW.length];
                String scenario = "exit:" + how + ":" + (base + i);
                outcomes.add(pairs.submit(() -> {
                    ChildJvm child = ChildJvm.run(Soak.class.getName(), System.getProperty("java.class.path"), scenario,
                            Map.of(), "-Dhostcall.soaklib=" + System.getProperty("hostcall.soaklib"),
                            "-XX:ErrorFile=" + errors.resolve("hs_err_%p.log"), "-Xmx64m");
                    child.assertClean(ENDINGS.get(how));
                    assertEquals(1, child.reported("RESULT").size(), scenario + " reached its ending point:\n" + child.output);
                    return scenario + " " + child.reported("RESULT").get(0) + " in " + child.elapsed.toMillis() + " ms";
                }));
            }
            for (Future<String> outcome : outcomes) System.out.println(outcome.get());
            try (Stream<Path> left = Files.list(errors)) {
                assertEquals(List.of(), left.toList(), "no JVM crash report");
            }
        } finally {
            pairs.shutdownNow();
            deleteTree(errors);
        }
    }

    static void deleteTree(Path dir) throws IOException {
        try (Stream<Path> files = Files.list(dir)) {
            for (Path f : files.toList()) Files.deleteIfExists(f);
        }
        Files.deleteIfExists(dir);
    }
}
