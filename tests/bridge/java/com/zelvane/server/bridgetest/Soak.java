package com.zelvane.server.bridgetest;

import com.zelvane.server.KivHostCallService;
import java.io.BufferedReader;
import java.io.IOException;
import java.nio.charset.StandardCharsets;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.BitSet;
import java.util.Collections;
import java.util.List;
import java.util.Map;
import java.util.SplittableRandom;
import java.util.TreeMap;
import java.util.concurrent.BrokenBarrierException;
import java.util.concurrent.CyclicBarrier;
import java.util.regex.Matcher;
import java.util.regex.Pattern;

/**
 * Several Java threads send every kind of forwarding event while two threads
 * ask the two queries, against the device model as a host that answers late
 * and now and then fails. The run goes in rounds: everyone sends a batch, then
 * the host is let to catch up, so the queue reaches the same depth each round
 * and memory can be compared between rounds. The host keeps one trace line per
 * exchange in a file, from which {@link #verify} accounts for every event.
 */
final class Soak {
    /** The size and the host's manners. */
    record Plan(int producers, int rounds, int eventsPerRound, int queriesPerRound, int jitterUs,
            int failurePerMille, int sendFailurePerMille, int failureResult, long seed) {
        static final int QUERY_THREADS = 2;

        long exchangesPerRound() {
            return (long) producers * eventsPerRound + (long) QUERY_THREADS * queriesPerRound;
        }

        /** About `events` forwarded events in all, in 20 rounds. */
        static Plan ofEvents(int events, long seed) {
            int producers = 4;
            int rounds = 20;
            int perRound = Math.max(1, events / (producers * rounds));
            return new Plan(producers, rounds, perRound, Math.max(1, perRound / 8), 40, 20, 5, 5, seed);
        }
    }

    /** Resident and native-heap figures at one point, in bytes. */
    record Memory(long residentBytes, long nativeHeapBytes) {
        /** Spacing of the samples that {@link #settled} takes. */
        static final long SAMPLE_SPACING_MS = 100;

        /**
         * The least of a few samples: the JVM's compiler threads borrow native
         * memory for a moment and give it back, the library's growth stays.
         */
        static Memory settled() throws InterruptedException {
            long resident = Long.MAX_VALUE;
            long heap = Long.MAX_VALUE;
            for (int i = 0; i < 5; i++) {
                if (i > 0) Thread.sleep(SAMPLE_SPACING_MS);
                resident = Math.min(resident, Soak.residentBytes());
                heap = Math.min(heap, SoakNative.nativeHeapInUse());
            }
            return new Memory(resident, heap);
        }
    }

    final Plan plan;
    final KivHostCallService service;
    final Path trace;
    /** Kind index of every event, by producer and sequence number. */
    final byte[][] sent;
    /** Every query's answer as Java saw it (launch: 1 or 0), by query thread and sequence number. */
    final int[][] answers;
    /** Results other than 0 that the forwarding methods returned: none expected. */
    final List<String> refused = Collections.synchronizedList(new ArrayList<>());
    Memory afterWarmUp;
    Memory atEnd;

    Soak(Plan plan, KivHostCallService service, Path trace) {
        this.plan = plan;
        this.service = service;
        this.trace = trace;
        int events = plan.rounds * plan.eventsPerRound;
        if (events >= SoakEvents.MAX_SEQ) throw new IllegalArgumentException("too many events per thread");
        sent = new byte[plan.producers][events];
        answers = new int[Plan.QUERY_THREADS][plan.rounds * plan.queriesPerRound];
    }

    /** Loads the library as the runtime would, with the log counted from before JNI_OnLoad. */
    static KivHostCallService load() {
        SoakNative.load();
        SoakNative.countLog();
        System.load(System.getProperty("hostcall.lib"));
        return new KivHostCallService();
    }

    static void configureHost(Plan plan, Path trace) {
        SoakNative.configureHost(plan.jitterUs, plan.failurePerMille, plan.sendFailurePerMille, plan.failureResult,
                plan.seed, trace == null ? "" : trace.toString());
    }

    static long residentBytes() {
        try {
            for (String line : Files.readAllLines(Path.of("/proc/self/status")))
                if (line.startsWith("VmRSS:")) return Long.parseLong(line.replaceAll("[^0-9]", "")) * 1024;
        } catch (IOException e) {
            throw new AssertionError(e);
        }
        throw new AssertionError("no VmRSS in /proc/self/status");
    }

    /** The string argument of an event: the tag, and now and then some length. */
    static String text(SplittableRandom random, String tag) {
        int pad = random.nextInt(4) == 0 ? random.nextInt(200) : 0;
        return pad == 0 ? tag : tag + "~" + "x".repeat(pad);
    }

    /** Sends one random event of `producer` with sequence number `seq`; returns its kind index. */
    static int sendOne(KivHostCallService service, SplittableRandom random, int producer, int seq, List<String> refused) {
        int kind = random.nextInt(SoakEvents.KINDS.size());
        SoakEvents.Kind k = SoakEvents.KINDS.get(kind);
        int result = k.send().call(service, text(random, SoakEvents.tag(producer, seq)),
                SoakEvents.intTag(producer, seq));
        if (result != 0 && refused != null) refused.add(k.method() + " returned " + result);
        return kind;
    }

    /** Asks query number `seq` of query thread `q`; returns the answer (launch as 1 or 0). */
    static int askOne(KivHostCallService service, SplittableRandom random, int q, int seq) {
        String tag = text(random, "Q" + q + "#" + seq);
        return (seq + q) % 2 == 0 ? (service.native_isAppLaunchAllowed(tag) ? 1 : 0) : service.native_setGoogleAdId(tag);
    }

    private static void await(CyclicBarrier barrier) {
        try {
            barrier.await();
        } catch (InterruptedException | BrokenBarrierException e) {
            throw new AssertionError(e);
        }
    }

    /** Waits until the host has served `count` exchanges since the host was configured. */
    static void awaitServed(long count) {
        if (!SoakNative.awaitServed(count, Bridge.WORKER_TOLERANCE.toMillis()))
            throw new AssertionError("timed out waiting for " + count + " exchanges at the host, "
                    + SoakNative.served() + " served: events were lost");
    }

    /** Runs every round; the worker has delivered everything when it returns. */
    void run() throws InterruptedException {
        CyclicBarrier barrier = new CyclicBarrier(plan.producers + Plan.QUERY_THREADS + 1);
        List<Thread> threads = new ArrayList<>();
        for (int p = 0; p < plan.producers; p++) {
            int producer = p;
            threads.add(new Thread(() -> {
                SplittableRandom random = new SplittableRandom(plan.seed * 31 + producer);
                for (int r = 0, seq = 0; r < plan.rounds; r++) {
                    await(barrier);
                    for (int i = 0; i < plan.eventsPerRound; i++, seq++)
                        sent[producer][seq] = (byte) sendOne(service, random, producer, seq, refused);
                    await(barrier);
                }
            }, "soak-producer-" + p));
        }
        for (int q = 0; q < Plan.QUERY_THREADS; q++) {
            int thread = q;
            threads.add(new Thread(() -> {
                SplittableRandom random = new SplittableRandom(plan.seed * 37 + thread);
                for (int r = 0, seq = 0; r < plan.rounds; r++) {
                    await(barrier);
                    for (int i = 0; i < plan.queriesPerRound; i++, seq++)
                        answers[thread][seq] = askOne(service, random, thread, seq);
                    await(barrier);
                }
            }, "soak-query-" + q));
        }
        threads.forEach(Thread::start);
        int warmUpRounds = Math.max(1, plan.rounds / 4);
        for (int r = 0; r < plan.rounds; r++) {
            await(barrier);
            await(barrier);
            awaitServed((r + 1) * plan.exchangesPerRound());
            if (r + 1 == warmUpRounds) afterWarmUp = Memory.settled();
        }
        for (Thread t : threads) t.join();
        atEnd = Memory.settled();
    }

    private static final Pattern STRING_TAG = Pattern.compile("([TQ])(\\d+)#(\\d+)");
    private static final Pattern INT_TAG = Pattern.compile("\\b(1\\d{9})\\b");

    /** What the host's trace, the log and the answers say; problems() is empty when all is well. */
    static final class Verdict {
        final List<String> problems = new ArrayList<>();
        /** "method|error" to count: failures the host's trace calls for, and the log's failure lines. */
        final Map<String, Long> failuresAtHost = new TreeMap<>();
        final Map<String, Long> failureLines = new TreeMap<>();
        long delivered;
        long failed;

        void problem(String what) {
            if (problems.size() < 20) problems.add(what);
        }
    }

    /** The host's answer in a trace line: null for success, the error the caller sees otherwise. */
    private static Integer failure(String answer, boolean flag) {
        if (answer.startsWith("!failed")) return flag ? null : -1;  // a host that cannot be asked allows
        if (flag) return answer.equals("true") ? null : 0;
        int result = Integer.parseInt(answer);
        return result == 0 ? null : result;
    }

    Verdict verify() throws IOException {
        Verdict v = new Verdict();
        BitSet[] seen = new BitSet[plan.producers];
        int[] last = new int[plan.producers];
        for (int p = 0; p < plan.producers; p++) {
            seen[p] = new BitSet();
            last[p] = -1;
        }
        int[] lastQuery = {-1, -1};
        long[] untaggedAtHost = new long[SoakEvents.KINDS.size()];
        try (BufferedReader in = Files.newBufferedReader(trace, StandardCharsets.ISO_8859_1)) {
            for (String line; (line = in.readLine()) != null;)
                account(line, v, seen, last, lastQuery, untaggedAtHost);
        }
        long[] untaggedSent = new long[SoakEvents.KINDS.size()];
        for (int p = 0; p < plan.producers; p++) {
            int tagged = 0;
            for (byte kind : sent[p]) {
                if (SoakEvents.KINDS.get(kind).tagged()) tagged++;
                else untaggedSent[kind]++;
            }
            if (seen[p].cardinality() != tagged)
                v.problem("producer " + p + ": " + tagged + " tagged events sent, " + seen[p].cardinality() + " reached the host");
        }
        for (int k = 0; k < untaggedSent.length; k++)
            if (untaggedSent[k] != untaggedAtHost[k])
                v.problem(SoakEvents.KINDS.get(k).op() + ": " + untaggedSent[k] + " sent, " + untaggedAtHost[k] + " at the host");
        for (int q = 0; q < Plan.QUERY_THREADS; q++)
            if (lastQuery[q] != answers[q].length - 1)
                v.problem("query thread " + q + ": last query at the host " + lastQuery[q] + " of " + answers[q].length);
        readFailureLines(v);
        if (!v.failuresAtHost.equals(v.failureLines))
            v.problem("failed events and \"RPC failed\" lines differ: at the host " + v.failuresAtHost + ", in the log "
                    + v.failureLines);
        if (!refused.isEmpty()) v.problem("forwarding methods refused events: " + refused.subList(0, Math.min(5, refused.size())));
        int overlaps = SoakNative.overlaps();
        if (overlaps != 0) v.problem(overlaps + " exchanges overlapped");
        return v;
    }

    private void account(String line, Verdict v, BitSet[] seen, int[] last, int[] lastQuery, long[] untaggedAtHost) {
        String[] parts = line.split(" ", 3);
        String call = parts.length == 3 ? parts[2] : "";
        if (call.endsWith(" !overlap")) call = call.substring(0, call.length() - " !overlap".length());
        int paren = call.indexOf('(');
        int arrow = call.lastIndexOf(" -> ");
        if (paren < 0 || arrow < 0) {
            v.problem("unreadable trace line: " + line);
            return;
        }
        String op = call.substring(0, paren);
        String answer = call.substring(arrow + 4);
        Matcher s = STRING_TAG.matcher(call);
        boolean hasStringTag = s.find();
        if (op.equals(SoakEvents.LAUNCH_OP) || op.equals(SoakEvents.AD_ID_OP)) {
            boolean flag = op.equals(SoakEvents.LAUNCH_OP);
            if (!hasStringTag || !s.group(1).equals("Q")) {
                v.problem("query without its tag: " + call);
                return;
            }
            int q = Integer.parseInt(s.group(2));
            int seq = Integer.parseInt(s.group(3));
            if (seq <= lastQuery[q]) v.problem("query " + q + "#" + seq + " came after #" + lastQuery[q]);
            lastQuery[q] = Math.max(lastQuery[q], seq);
            Integer error = failure(answer, flag);
            int expected = flag ? (error == null ? 1 : 0) : (error == null ? 0 : error);
            if (answers[q][seq] != expected)
                v.problem("query " + q + "#" + seq + ": Java saw " + answers[q][seq] + ", the host answered " + answer);
            return;
        }
        SoakEvents.Kind kind = SoakEvents.byOp(op);
        if (kind == null) {
            v.problem("an operation the soak never sends: " + call);
            return;
        }
        int kindIndex = SoakEvents.KINDS.indexOf(kind);
        if (kind.tagged()) {
            int producer;
            int seq;
            Matcher i = INT_TAG.matcher(call);
            if (hasStringTag && s.group(1).equals("T")) {
                producer = Integer.parseInt(s.group(2));
                seq = Integer.parseInt(s.group(3));
            } else if (i.find()) {
                int tag = Integer.parseInt(i.group(1)) - SoakEvents.INT_TAG_BASE;
                producer = tag / SoakEvents.MAX_SEQ;
                seq = tag % SoakEvents.MAX_SEQ;
            } else {
                v.problem("event without its tag: " + call);
                return;
            }
            if (producer >= plan.producers || seq >= sent[producer].length) {
                v.problem("a tag no producer sent: " + call);
                return;
            }
            if (seen[producer].get(seq)) v.problem("delivered twice: " + call);
            if (sent[producer][seq] != kindIndex) v.problem("T" + producer + "#" + seq + " arrived as another kind: " + call);
            if (seq <= last[producer]) v.problem("T" + producer + "#" + seq + " arrived after #" + last[producer]);
            seen[producer].set(seq);
            last[producer] = Math.max(last[producer], seq);
        } else {
            untaggedAtHost[kindIndex]++;
        }
        Integer error = failure(answer, false);
        if (error == null) {
            v.delivered++;
        } else {
            v.failed++;
            v.failuresAtHost.merge(kind.method() + "|" + error, 1L, Long::sum);
        }
    }

    private static final Pattern FAILURE_LINE =
            Pattern.compile("6\\|" + Bridge.TAG + "\\|RPC failed for auto (\\w+)\\(.*\\)::\\(anonymous class\\)::operator\\(\\)\\(\\) const, error (-?\\d+)");

    private void readFailureLines(Verdict v) {
        long vibrateLines = 0;
        for (String item : SoakNative.logCounts()) {
            int tab = item.lastIndexOf('\t');
            String key = item.substring(0, tab);
            long count = Long.parseLong(item.substring(tab + 1));
            if (!key.contains("|" + Bridge.TAG + "|")) continue;
            Matcher m = FAILURE_LINE.matcher(key);
            if (m.matches()) v.failureLines.merge(m.group(1) + "|" + m.group(2), count, Long::sum);
            else if (key.equals("3|" + Bridge.TAG + "|jint onVibrate(JNIEnv *, jobject, jint, jstring) called"))
                vibrateLines = count;
            else if (!key.contains("JNI_OnLoad(") && !key.contains("native_init("))  // start-up, once
                v.problem("an unexpected line of the bridge (" + count + "x): " + key);
        }
        int vibrate = SoakEvents.KINDS.indexOf(SoakEvents.byOp("hcallOnVibrateRpc"));
        long vibrateSent = 0;
        for (byte[] events : sent)
            for (byte kind : events)
                if (kind == vibrate) vibrateSent++;
        if (vibrateLines != vibrateSent)
            v.problem(vibrateSent + " vibrate events sent, " + vibrateLines + " \"called\" lines");
    }

    /**
     * A child JVM's soak that ends at a random point: "exit:<how>:<seed>" with
     * how one of exit (System.exit(3)), end (main returns) or throw (main
     * throws). Senders are daemon threads that never stop on their own.
     */
    public static void main(String[] args) throws Exception {
        String[] parts = args[0].split(":");
        String how = parts[1];
        long seed = Long.parseLong(parts[2]);
        SplittableRandom random = new SplittableRandom(seed);
        Plan plan = Plan.ofEvents(1, seed);
        KivHostCallService service = load();
        configureHost(plan, null);
        // Events may start before native_init (they wait in the queue) and the
        // end may come before it too.
        long initAtMs = random.nextLong(100);
        long endAtMs = random.nextLong(400);
        for (int p = 0; p < 3; p++) {
            int producer = p;
            Thread t = new Thread(() -> {
                SplittableRandom r = new SplittableRandom(seed * 31 + producer);
                for (int seq = 0;; seq = (seq + 1) % SoakEvents.MAX_SEQ) sendOne(service, r, producer, seq, null);
            }, "exit-producer-" + p);
            t.setDaemon(true);
            t.start();
        }
        for (int q = 0; q < Plan.QUERY_THREADS; q++) {
            int thread = q;
            Thread t = new Thread(() -> {
                SplittableRandom r = new SplittableRandom(seed * 37 + thread);
                for (int seq = 0;; seq = (seq + 1) % SoakEvents.MAX_SEQ) askOne(service, r, thread, seq);
            }, "exit-query-" + q);
            t.setDaemon(true);
            t.start();
        }
        long started = System.nanoTime();
        if (initAtMs < endAtMs) {
            Thread.sleep(initAtMs);
            service.native_init();
        }
        Thread.sleep(Math.max(0, endAtMs - (System.nanoTime() - started) / 1_000_000));
        System.out.println("RESULT ending=" + how + " initAtMs=" + (initAtMs < endAtMs ? initAtMs : "never")
                + " endAtMs=" + endAtMs + " served=" + SoakNative.served());
        System.out.flush();
        switch (how) {
            case "exit": System.exit(3); break;
            case "end": return;
            case "throw": throw new IllegalStateException("the soak ends with an uncaught exception");
            default: throw new IllegalArgumentException(how);
        }
    }
}
