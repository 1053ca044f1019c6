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
import java.util.regex.*;
import org.junit.jupiter.api.Test;

/** Producers send every kind of event with a value to tag and askers ask the two queries, against a slow host that
 *  fails now and then, debug lines off. HOSTCALL_SOAK_EVENTS sizes it, HOSTCALL_SOAK_SEED repeats a run. */
class SoakTest {
    static final int PRODUCERS = 4, ASKERS = 2;
    // The native heap in use moves by up to 700 KB: 2 MB finds a leak of 150 bytes an event in the short run.
    static final long HEAP_MARGIN = 2L << 20;
    // A call's tag: "S<sender>#<seq>" in its strings, INT_TAG_BASE + sender * MAX_SEQ + seq in its ints.
    static final int MAX_SEQ = 10_000_000, INT_TAG_BASE = 1_000_000_000;
    static final Pattern TAG = Pattern.compile("S(\\d+)#|\\b(1\\d{9})\\b");

    /** A sender's calls (events for a producer, queries for an asker) follow from the seed: the check replays them. */
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

        Object call(KivHostCallService s) { next(); return row.call(s, args); }
    }

    final long seed = Long.parseLong(System.getenv().getOrDefault("HOSTCALL_SOAK_SEED", "" + System.nanoTime() % 1000));
    final int events = Integer.parseInt(System.getenv().getOrDefault("HOSTCALL_SOAK_EVENTS", "20000"));
    final List<String> problems = new ArrayList<>();
    long delivered, failed;

    /** A sender's calls: askers ask once for every eight events a producer sends. */
    int calls(int id) { return events / PRODUCERS / (id < PRODUCERS ? 1 : 8); }

    @Test
    void Soak_WhenEveryKindIsSentWithQueriesAgainstAnUnreliableHost_DeliversEveryEventOnceInOrder() throws Exception {
        Path trace = Path.of(System.getenv("VMSG_DEVICE_TRACE"));
        Files.write(trace, new byte[0]);  // the host appends
        trace.toFile().deleteOnExit();
        KivHostCallService s = started();
        // After a quarter of the calls, when the heap has warmed up, and at the end.
        long[] heap = {send(s, 0, 1), send(s, 1, 4)};
        verify(trace);
        String summary = "seed " + seed + ", " + events + " events: " + delivered + " delivered, " + failed
                + " failed; native heap after warm-up and at the end " + Arrays.toString(heap);
        System.out.println(summary);
        assertEquals(List.of(), problems, "every call once, in its sender's order, as sent: " + summary);
        assertEquals(0, overlaps(), "host calls never overlap");
        assertTrue(failed > 0 && delivered > failed, "the host failed some, not most: " + summary);
        assertTrue(heap[1] - heap[0] < HEAP_MARGIN, "the native heap is flat: " + summary);
    }

    /** Sends the calls from `from` to `to` quarters from all senders; returns the native heap once all are served. */
    long send(KivHostCallService s, int from, int to) throws Exception {
        List<Thread> threads = new ArrayList<>();
        long served = 0;
        for (int id = 0; id < PRODUCERS + ASKERS; id++) {
            Sender sender = new Sender(seed, id);
            int first = calls(id) * from / 4, end = calls(id) * to / 4;
            served += end;
            for (int i = 0; i < first; i++) sender.next();
            threads.add(new Thread(() -> {
                for (int i = first; i < end; i++)
                    if (!sender.call(s).equals(0) && sender.id < PRODUCERS) problem("an event refused");
            }));
        }
        threads.forEach(Thread::start);
        for (Thread t : threads) t.join();
        assertTrue(awaitServed(served, WAIT.toMillis() + served / 10), served + " exchanges: events lost");
        takeLogLines();  // so that the capture does not grow with the run
        // HotSpot frees its compilers' arena chunks every 5 s of uptime; from then on the JIT moves little.
        Thread.sleep(Math.max(0, 5500 - ManagementFactory.getRuntimeMXBean().getUptime()));
        long least = Long.MAX_VALUE;  // of a few samples: the JVM borrows memory for moments
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
                if (!request(sender.row.op(), sender.args).equals(part[0].substring("req=".length())))
                    problem("S" + sender.id + "#" + (sender.seq - 1) + " expected, the host got " + part[2]);
            }
        }
        for (Sender s : replay) if (s.seq != calls(s.id)) problem(s.id + " got " + s.seq + " of " + calls(s.id));
    }

    synchronized void problem(String what) { if (problems.size() < 20) problems.add(what); }
}
