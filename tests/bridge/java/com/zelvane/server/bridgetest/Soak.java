package com.zelvane.server.bridgetest;

import com.zelvane.server.KivHostCallService;
import java.io.BufferedReader;
import java.io.IOException;
import java.nio.charset.StandardCharsets;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.Arrays;
import java.util.List;
import java.util.Map;
import java.util.SplittableRandom;
import java.util.TreeMap;
import java.util.concurrent.BrokenBarrierException;
import java.util.concurrent.CyclicBarrier;
import java.util.regex.Matcher;
import java.util.regex.Pattern;

/**
 * Producers send every kind of forwarding event while askers ask the two
 * queries, against a host that answers late and now and then fails. The run
 * goes in rounds: everyone sends a batch, then the host catches up, so the
 * queue reaches the same depth each round and memory can be compared between
 * rounds. The host writes a trace line per exchange, from which every event
 * is accounted for.
 */
final class Soak {
    static final int PRODUCERS = 4;
    static final int ASKERS = 2;
    static final int ROUNDS = 20;
    static final int JITTER_US = 40;
    static final int FAILURE_PER_MILLE = 20;
    /** An event's tag: "T<producer>#<seq>" in a string, else INT_TAG_BASE + producer * MAX_SEQ + seq in an int. */
    static final int MAX_SEQ = 10_000_000;
    static final int INT_TAG_BASE = 1_000_000_000;

    interface Send {
        int call(KivHostCallService s, String tag, int intTag);
    }

    /** A forwarding method: its host call, its name, whether its arguments carry the tag. */
    record Kind(String op, String method, boolean tagged, Send send) {}

    static Kind tagged(String method, Send send) {
        String op = "hcall" + Character.toUpperCase(method.charAt(0)) + method.substring(1) + "Rpc";
        return new Kind(op, method, true, send);
    }

    static Kind untagged(String method, Send send) {
        return new Kind(tagged(method, send).op, method, false, send);
    }

    static final List<Kind> KINDS = List.of(
            untagged("initInputDebuggingStatus", (x, s, i) -> x.native_initInputDebuggingStatus(true, false)),
            tagged("initImeStatus", (x, s, i) -> x.native_initImeStatus(s)),
            tagged("syncInstalledApps", (x, s, i) -> x.native_syncInstalledApps("{\"apps\":[\"" + s + "\"]}")),
            tagged("onOrientationChanged", (x, s, i) -> x.native_onOrientationChange(i)),
            tagged("onImeChanged", (x, s, i) -> x.native_onImeChange(s)),
            untagged("onTextEditModeChanged", (x, s, i) -> x.native_onTextEditModeChange(true)),
            tagged("onActivityDisplayed", (x, s, i) -> x.native_onActivityDisplayed(s, "com.example.Main")),
            tagged("exportFiles", (x, s, i) -> x.native_exportFiles("/sdcard/" + s)),
            untagged("startImportFiles", (x, s, i) -> x.native_startImportFiles()),
            untagged("startExportFiles", (x, s, i) -> x.native_startExportFiles()),
            untagged("launchOrx", (x, s, i) -> x.native_launchOrx()),
            tagged("setClipboardText", (x, s, i) -> x.native_setClipboardText("clip " + s)),
            tagged("onVolumeChanged", (x, s, i) -> x.native_onVolumeChanged(false, i)),
            tagged("onGoogleLoginCompleted", (x, s, i) -> x.native_onGoogleLoginCompleted(s + "@example.com")),
            tagged("onZelvaneLoginCompleted", (x, s, i) -> x.native_onZelvaneLoginCompleted(s + "@example.org")),
            tagged("setAppConfigDbParams", (x, s, i) -> x.native_setAppConfigDbParams(s, true, false, "", true)),
            tagged("googleAccountListUpdated", (x, s, i) -> x.native_googleAccountListUpdated(s, 2)),
            tagged("onCursorLocationChanged", (x, s, i) -> x.native_onCursorLocationChanged(i, 17)),
            tagged("onLocaleChanged", (x, s, i) -> x.native_onLocaleChanged(s)),
            tagged("onAppInstalled",
                    (x, s, i) -> x.native_onAppInstalled(s, "Main", "Label \u00e9", 3, "1.0", "", "store", false)),
            tagged("onAppUninstalled", (x, s, i) -> x.native_onAppUninstalled(s)),
            tagged("onScreenshotSaved", (x, s, i) -> x.native_onScreenshotSaved(s + ".png")),
            tagged("createDesktopShortcut", (x, s, i) -> x.native_createDesktopShortcut(s)),
            new Kind("hcallOnImportFilesCompletedRpc", "importFilesCompleted", true,
                    (x, s, i) -> x.native_importFilesCompleted(0, s)),
            tagged("openUrl", (x, s, i) -> x.native_openUrl("https://example.com/" + s)),
            tagged("initVolume", (x, s, i) -> x.native_initVolume(true, i, 15)),
            tagged("onAppNotificationReceived",
                    (x, s, i) -> x.native_onAppNotificationReceived("{\"id\":\"" + s + "\"}")),
            tagged("setUsageStatsUpdateInterval", (x, s, i) -> x.native_setUsageStatsUpdateInterval(i)),
            tagged("onVibrate", (x, s, i) -> x.native_onVibrate(20, s)),
            untagged("onConsoleModeStateChanged", (x, s, i) -> x.native_onConsoleModeStateChanged(false)));

    final KivHostCallService service;
    final int eventsPerRound;
    final int queriesPerRound;
    /** Kind index of each event, by producer and sequence number. */
    final byte[][] sent;
    /** Each query's answer as Java saw it (launch as 1 or 0), by asker and sequence number. */
    final int[][] answers;
    final List<String> problems = new ArrayList<>();
    /** Bridge lines counted as the rounds went, by "failed <method>", "vibrate called" or the line itself. */
    final Map<String, Long> lines = new TreeMap<>();
    long delivered;
    long failed;
    /** Resident size and native heap in use after warm-up and at the end, in bytes. */
    long[] afterWarmUp;
    long[] atEnd;

    Soak(KivHostCallService service, int events) {
        this.service = service;
        eventsPerRound = Math.max(1, events / (PRODUCERS * ROUNDS));
        queriesPerRound = Math.max(1, eventsPerRound / 8);
        sent = new byte[PRODUCERS][ROUNDS * eventsPerRound];
        answers = new int[ASKERS][ROUNDS * queriesPerRound];
    }

    /** The tag, and now and then some length. */
    static String text(SplittableRandom random, String tag) {
        return random.nextInt(4) == 0 ? tag + "~" + "x".repeat(random.nextInt(200)) : tag;
    }

    /** Sends one random event as `producer`'s number `seq`; returns its kind index, or -1 when it was refused. */
    static int send(KivHostCallService s, SplittableRandom random, int producer, int seq) {
        int kind = random.nextInt(KINDS.size());
        String tag = text(random, "T" + producer + "#" + seq);
        int result = KINDS.get(kind).send.call(s, tag, INT_TAG_BASE + producer * MAX_SEQ + seq);
        return result == 0 ? kind : -1;
    }

    /** Asks `asker`'s query number `seq`; returns the answer (launch as 1 or 0). */
    static int ask(KivHostCallService s, SplittableRandom random, int asker, int seq) {
        String tag = text(random, "Q" + asker + "#" + seq);
        return (seq + asker) % 2 == 0 ? (s.native_isAppLaunchAllowed(tag) ? 1 : 0) : s.native_setGoogleAdId(tag);
    }

    /** The least of a few samples: the JVM borrows native memory for moments, a leak stays. */
    static long[] memory() throws IOException, InterruptedException {
        long[] least = {Long.MAX_VALUE, Long.MAX_VALUE};
        for (int i = 0; i < 5; i++) {
            Thread.sleep(i == 0 ? 0 : 100);
            String rss = Files.readAllLines(Path.of("/proc/self/status")).stream()
                    .filter(l -> l.startsWith("VmRSS:")).findFirst().orElseThrow();
            least[0] = Math.min(least[0], Long.parseLong(rss.replaceAll("[^0-9]", "")) * 1024);
            least[1] = Math.min(least[1], TestNative.nativeHeapInUse());
        }
        return least;
    }

    /** Runs the rounds; every event and query has reached the host when it returns. */
    void run(long seed) throws IOException, InterruptedException {
        CyclicBarrier barrier = new CyclicBarrier(PRODUCERS + ASKERS + 1);
        List<Thread> threads = new ArrayList<>();
        for (int t = 0; t < PRODUCERS + ASKERS; t++) {
            int id = t;
            threads.add(new Thread(() -> {
                SplittableRandom random = new SplittableRandom(seed * 31 + id);
                for (int r = 0, seq = 0; r < ROUNDS; r++) {
                    await(barrier);
                    if (id < PRODUCERS) {
                        for (int i = 0; i < eventsPerRound; i++, seq++)
                            sent[id][seq] = (byte) send(service, random, id, seq);
                    } else {
                        for (int i = 0; i < queriesPerRound; i++, seq++)
                            answers[id - PRODUCERS][seq] = ask(service, random, id - PRODUCERS, seq);
                    }
                    await(barrier);
                }
            }));
        }
        threads.forEach(Thread::start);
        long perRound = (long) PRODUCERS * eventsPerRound + (long) ASKERS * queriesPerRound;
        for (int r = 0; r < ROUNDS; r++) {
            await(barrier);
            await(barrier);
            if (!TestNative.awaitServed((r + 1) * perRound, Bridge.WAIT.toMillis()))
                throw new AssertionError(TestNative.served() + " exchanges after round " + r + ": events were lost");
            countLines();
            if (r == ROUNDS / 4) afterWarmUp = memory();
        }
        for (Thread t : threads) t.join();
        atEnd = memory();
    }

    private static void await(CyclicBarrier barrier) {
        try {
            barrier.await();
        } catch (InterruptedException | BrokenBarrierException e) {
            throw new AssertionError(e);
        }
    }

    private static final Pattern FAILURE =
            Pattern.compile(Pattern.quote(Bridge.error("RPC failed for auto ")) + "(\\w+)\\(.*"
                    + Pattern.quote(Bridge.TASK_SUFFIX) + ", error 5");
    private static final String VIBRATE = Bridge.debug("jint onVibrate(JNIEnv *, jobject, jint, jstring) called");

    /** Counts the bridge's lines logged since the last count; the capture forgets them. */
    void countLines() {
        for (String line : TestNative.takeLogLines()) {
            // The start-up lines come once, before the first round.
            boolean startUp = line.contains("JNI_OnLoad(") || line.contains("native_init(");
            if (!line.contains("|" + Bridge.TAG + "|") || startUp) continue;
            Matcher m = FAILURE.matcher(line);
            String key = m.matches() ? "failed " + m.group(1) : line.equals(VIBRATE) ? "vibrate called" : line;
            lines.merge(key, 1L, Long::sum);
        }
    }

    private static final Pattern TAG = Pattern.compile("([TQ])(\\d+)#(\\d+)|\\b(1\\d{9})\\b");
    private static final String LAUNCH_OP = "hcallIsAppLaunchAllowedRpc";
    private static final String AD_ID_OP = "hcallSetGoogleAdIdRpc";

    /**
     * Accounts for every exchange in the host's trace: how many of each kind,
     * each tagged event and query in its sender's order (so none twice) and
     * as its sender sent it, each query's answer as the host gave it.
     * Returns the bridge lines to expect, by the keys of {@link #lines}.
     */
    Map<String, Long> verify(Path trace) throws IOException {
        List<String> ops = KINDS.stream().map(Kind::op).toList();
        // By kind, the two queries together last.
        long[] atHost = new long[KINDS.size() + 1];
        long[] sentCount = new long[KINDS.size() + 1];
        // By producer, then asker: the last sequence number seen.
        int[] last = new int[PRODUCERS + ASKERS];
        Arrays.fill(last, -1);
        Map<String, Long> expected = new TreeMap<>();
        try (BufferedReader in = Files.newBufferedReader(trace, StandardCharsets.ISO_8859_1)) {
            for (String line; (line = in.readLine()) != null;) {
                String call = line.split(" ", 3)[2];
                String op = call.substring(0, call.indexOf('('));
                String answer = call.substring(call.lastIndexOf(" -> ") + 4);
                boolean query = op.equals(LAUNCH_OP) || op.equals(AD_ID_OP);
                int kind = query ? KINDS.size() : ops.indexOf(op);
                if (kind < 0) {
                    problem("an operation the soak never sends: " + call);
                    continue;
                }
                atHost[kind]++;
                Matcher tag = TAG.matcher(call);
                if (!query && !KINDS.get(kind).tagged) {
                    // counted only
                } else if (!tag.find() || query != (tag.group(1) != null && tag.group(1).equals("Q"))) {
                    problem("without its tag: " + call);
                } else {
                    int intTag = tag.group(4) == null ? 0 : Integer.parseInt(tag.group(4)) - INT_TAG_BASE;
                    int id = tag.group(4) != null ? intTag / MAX_SEQ
                                                  : Integer.parseInt(tag.group(2)) + (query ? PRODUCERS : 0);
                    int seq = tag.group(4) != null ? intTag % MAX_SEQ : Integer.parseInt(tag.group(3));
                    if (seq <= last[id]) problem(call + " came after #" + last[id] + " of its sender");
                    last[id] = seq;
                    int javaSaw = query ? answers[id - PRODUCERS][seq] : sent[id][seq];
                    int host = !query ? kind
                            : op.equals(LAUNCH_OP) ? (answer.equals("true") ? 1 : 0) : Integer.parseInt(answer);
                    if (javaSaw != host) problem(call + ": Java " + (query ? "saw " : "sent kind ") + javaSaw);
                }
                if (query) continue;
                if (answer.equals("0")) {
                    delivered++;
                } else {
                    failed++;
                    expected.merge("failed " + KINDS.get(kind).method, 1L, Long::sum);
                }
            }
        }
        for (byte[] events : sent) {
            for (byte kind : events) {
                if (kind < 0) problem("a forwarding method refused an event");
                else sentCount[kind]++;
            }
        }
        sentCount[KINDS.size()] = (long) ASKERS * answers[0].length;
        long vibrations = sentCount[ops.indexOf("hcallOnVibrateRpc")];
        if (vibrations > 0) expected.put("vibrate called", vibrations);
        if (!Arrays.equals(atHost, sentCount))
            problem("by kind: sent " + Arrays.toString(sentCount) + ", at the host " + Arrays.toString(atHost));
        if (TestNative.overlaps() != 0) problem(TestNative.overlaps() + " exchanges overlapped");
        return expected;
    }

    void problem(String what) {
        if (problems.size() < 20) problems.add(what);
    }
}
