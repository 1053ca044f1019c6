package com.zelvane.server.bridgetest;

import static com.zelvane.server.bridgetest.Bridge.*;
import static org.junit.jupiter.api.Assertions.*;

import com.zelvane.server.KivHostCallService;
import com.zelvane.server.bridgetest.MethodsTest.Row;
import java.io.BufferedReader;
import java.lang.management.ManagementFactory;
import java.nio.charset.StandardCharsets;
import java.nio.file.*;
import java.util.*;
import java.util.concurrent.CyclicBarrier;
import java.util.regex.*;
import org.junit.jupiter.api.Test;

/**
 * Producers send every kind of event with a value to tag, askers ask the two queries, against a slow host that fails
 * now and then, debug lines off. In rounds (all send a batch, the host catches up), so that memory compares between
 * rounds. HOSTCALL_SOAK_EVENTS sizes it, HOSTCALL_SOAK_SEED repeats a run.
 */
class SoakTest {
    static final int PRODUCERS = 4, ASKERS = 2, ROUNDS = 20;
    // The native heap in use moves by up to 700 KB: 2 MB finds a leak of 150 bytes an event in the short run.
    static final long HEAP_MARGIN = 2L << 20;
    // A call's tag: "S<sender>#<seq>" in its strings, INT_TAG_BASE + sender * MAX_SEQ + seq in its ints.
    static final int MAX_SEQ = 10_000_000, INT_TAG_BASE = 1_000_000_000;
    static final Pattern TAG = Pattern.compile("S(\\d+)#|\\b(1\\d{9})\\b");

    static int size(String variable, int fallback) {
        String value = System.getenv(variable);
        return value == null || value.isEmpty() ? fallback : Integer.parseInt(value);
    }

    /** A sender's calls, events for a producer and queries for an asker, follow from the seed: the check replays them. */
    static final class Sender {
        final int id;
        final SplittableRandom random;
        final List<Row> rows;
        int seq;
        Row row;
        Object[] args;

        Sender(long seed, int id) {
            this.id = id;
            random = new SplittableRandom(seed * 31 + id);
            rows = MethodsTest.ROWS.stream().filter(r -> r.query() == id >= PRODUCERS
                    && Arrays.stream(r.args()).anyMatch(a -> !(a instanceof Boolean))).toList();
        }

        void next() {
            row = rows.get(random.nextInt(rows.size()));
            args = row.args().clone();
            String tag = "S" + id + "#" + seq;
            for (int i = 0; i < args.length; i++) {
                if (args[i] instanceof String)
                    args[i] = random.nextInt(4) == 0 ? tag + "~" + "x".repeat(random.nextInt(200)) : tag;
                else if (args[i] instanceof Integer) args[i] = INT_TAG_BASE + id * MAX_SEQ + seq;
                else args[i] = random.nextBoolean();
            }
            seq = (seq + 1) % MAX_SEQ;
        }

        Object send(KivHostCallService s) {
            next();
            return row.call(s, args);
        }

        String request() {
            return Bridge.request(row.op(), args);
        }
    }

    final long seed = size("HOSTCALL_SOAK_SEED", (int) (System.nanoTime() % 1000));
    final int perRound = Math.max(1, size("HOSTCALL_SOAK_EVENTS", 20_000) / (PRODUCERS * ROUNDS));
    final List<String> problems = new ArrayList<>();
    long delivered, failed;

    /** Askers ask once for every eight events a producer sends. */
    int perRound(int id) {
        return id < PRODUCERS ? perRound : Math.max(1, perRound / 8);
    }

    @Test
    void Soak_WhenEveryKindIsSentWithQueriesAgainstAnUnreliableHost_DeliversEveryEventOnceInOrder() throws Exception {
        Path trace = Path.of(System.getenv("VMSG_DEVICE_TRACE"));
        try {
            Files.write(trace, new byte[0]);  // the host appends
            KivHostCallService s = load();
            s.native_init();
            long[] heap = run(s);
            verify(trace);
            String summary = "seed " + seed + ", " + perRound * PRODUCERS * ROUNDS + " events: " + delivered
                    + " delivered, " + failed + " failed; native heap after warm-up " + Arrays.toString(heap);
            System.out.println(summary);
            assertEquals(List.of(), problems, "every call once, in its sender's order, as sent: " + summary);
            assertEquals(0, overlaps(), "host calls never overlap");
            assertTrue(failed > 0 && delivered > failed, "the host failed some, not most: " + summary);
            assertTrue(heap[1] - heap[0] < HEAP_MARGIN, "the native heap is flat: " + summary);
        } finally {
            Files.deleteIfExists(trace);
        }
    }

    /** Returns the native heap in use after warm-up and at the end, when the host has served everything. */
    long[] run(KivHostCallService s) throws Exception {
        CyclicBarrier barrier = new CyclicBarrier(PRODUCERS + ASKERS + 1);
        List<Thread> threads = new ArrayList<>();
        for (int t = 0; t < PRODUCERS + ASKERS; t++) {
            Sender sender = new Sender(seed, t);
            threads.add(new Thread(() -> {
                try {
                    for (int r = 0; r < ROUNDS; r++) {
                        barrier.await();
                        for (int i = 0; i < perRound(sender.id); i++)
                            if (!sender.send(s).equals(0) && sender.id < PRODUCERS) problem("an event refused");
                        barrier.await();
                    }
                } catch (Exception e) {
                    problem(e.toString());
                }
            }));
        }
        threads.forEach(Thread::start);
        long[] heap = new long[2];
        for (int r = 0, served = 0; r < ROUNDS; r++) {
            barrier.await();
            barrier.await();
            for (int id = 0; id < PRODUCERS + ASKERS; id++) served += perRound(id);
            if (!awaitServed(served, WAIT.toMillis()))
                throw new AssertionError(served() + " exchanges after round " + r + ": events were lost");
            takeLogLines();  // so that the capture does not grow with the run
            if (r == ROUNDS / 4) {
                // HotSpot frees its compilers' arena chunks every 5 s of uptime; from then on the JIT moves little.
                Thread.sleep(Math.max(0, 5500 - ManagementFactory.getRuntimeMXBean().getUptime()));
                heap[0] = heapInUse();
            }
        }
        for (Thread t : threads) t.join();
        heap[1] = heapInUse();
        return heap;
    }

    /** The least of a few samples: the JVM borrows memory for moments. */
    static long heapInUse() throws Exception {
        long least = Long.MAX_VALUE;
        for (int i = 0; i < 5; i++, Thread.sleep(100)) least = Math.min(least, nativeHeapInUse());
        return least;
    }

    /** Each exchange in the host's trace ("req=HEX reply=HEX call -> answer") must be its sender's next call. */
    void verify(Path trace) throws Exception {
        Sender[] replay = new Sender[PRODUCERS + ASKERS];
        for (int id = 0; id < replay.length; id++) replay[id] = new Sender(seed, id);
        try (BufferedReader in = Files.newBufferedReader(trace, StandardCharsets.ISO_8859_1)) {
            for (String line; (line = in.readLine()) != null;) {
                String[] part = line.split(" ", 3);
                Matcher tag = TAG.matcher(part[2]);
                Sender sender = replay[!tag.find() ? 0 : tag.group(2) != null
                        ? (Integer.parseInt(tag.group(2)) - INT_TAG_BASE) / MAX_SEQ : Integer.parseInt(tag.group(1))];
                if (sender.id < PRODUCERS && part[2].endsWith(" -> 0")) delivered++;
                else if (sender.id < PRODUCERS) failed++;
                sender.next();
                if (!sender.request().equals(part[0].substring("req=".length())))
                    problem("S" + sender.id + "#" + (sender.seq - 1) + " expected, the host got " + part[2]);
            }
        }
        for (Sender sender : replay)
            if (sender.seq != ROUNDS * perRound(sender.id)) problem(sender.id + ": the host got " + sender.seq + " of " + ROUNDS * perRound(sender.id));
    }

    synchronized void problem(String what) {
        if (problems.size() < 20) problems.add(what);
    }
}
