package com.zelvane.server.bench;

import com.zelvane.server.KivHostCallService;
import java.util.ArrayList;
import java.util.Arrays;
import java.util.List;
import java.util.function.IntUnaryOperator;
import java.util.function.LongSupplier;

/**
 * Java-side cost of the forwarding methods beside two floors measured in the
 * same run, and events per second end to end through the device model.
 * Prints rows of the merged table (bench/common/BenchRow.h); it asserts
 * nothing.
 */
public final class BridgeBench {
    // Short rounds, many of them: a round that lost the processor to another
    // process on this shared machine is an outlier the median ignores.
    static final int CALLS = 2_000;
    static final int WARM_ROUNDS = 10;
    static final int ROUNDS = 61;
    static final int END_TO_END_EVENTS = 40_000;

    static final String PKG = "com.example.notes";
    static final String ACTIVITY = "com.example.notes.MainActivity";
    static final String LOCALE = "fr-FR";

    private BridgeBench() {}

    /** One way of making a call, and how to tell that its consumer has caught up. */
    static final class Contender {
        final IntUnaryOperator call;
        final LongSupplier consumed;  // null: nothing is queued
        final double[] rounds = new double[ROUNDS];
        long queued;

        Contender(IntUnaryOperator call, LongSupplier consumed) {
            this.call = call;
            this.consumed = consumed;
            this.queued = consumed == null ? 0 : consumed.getAsLong();
        }

        /**
         * One round of CALLS calls with the consumers parked (each push meets
         * an idle lock and an empty-handed notification, for the bridge and
         * the floor alike), then the queue drained before the next round.
         */
        double round() throws InterruptedException {
            BenchNative.holdConsumers(true);
            int sink = 0;
            long start = System.nanoTime();
            for (int i = 0; i < CALLS; i++) sink += call.applyAsInt(i);
            double ns = (System.nanoTime() - start) / (double) CALLS;
            BenchNative.holdConsumers(false);
            if (sink != 0) throw new IllegalStateException("a call was refused");
            if (consumed != null) {
                queued += CALLS;
                while (consumed.getAsLong() < queued) Thread.sleep(1);
            }
            return ns;
        }

        double median() {
            double[] sorted = rounds.clone();
            Arrays.sort(sorted);
            return sorted[ROUNDS / 2];
        }
    }

    /** One line of the merged table (bench/common/BenchRow.h describes the fields). */
    static void printRow(String area, String figure, double value, String unit, String beside, double besideValue,
            String target) {
        boolean compared = !beside.equals("-") && besideValue > 0;
        System.out.printf("row\t%s\t%s\t%.6g\t%s\t%s\t%s\t%s\t%s%n", area, figure, value, unit, beside,
                compared ? String.format("%.6g", besideValue) : "-",
                compared ? String.format("%.2f", value / besideValue) : "-", target);
    }

    /** Medians of interleaved rounds, each round started by another contender. */
    static void interleave(List<Contender> all) throws InterruptedException {
        for (int r = 0; r < WARM_ROUNDS + ROUNDS; r++) {
            for (int k = 0; k < all.size(); k++) {
                double ns = all.get((r + k) % all.size()).round();
                if (r >= WARM_ROUNDS) all.get((r + k) % all.size()).rounds[r - WARM_ROUNDS] = ns;
            }
        }
    }

    /**
     * The bridge beside the bare call and the design floor; `tupleFloor`, when
     * not null, is the floor keeping its copies as the bridge does.
     */
    static void row(String name, IntUnaryOperator bridge, IntUnaryOperator bare, IntUnaryOperator floor,
            IntUnaryOperator tupleFloor) throws InterruptedException {
        Contender b = new Contender(bridge, BenchNative::hostCalls);
        Contender c = new Contender(bare, null);
        Contender f = new Contender(floor, BenchNative::floorDone);
        Contender t = tupleFloor == null ? null : new Contender(tupleFloor, BenchNative::floorDone);
        // Drift in the machine affects every contender alike.
        interleave(t == null ? List.of(b, c, f) : List.of(b, c, f, t));
        printRow("JNI layer", name + ", Java side", b.median(), "ns", "design floor", f.median(), "<=1.20");
        printRow("JNI layer", name + ", Java side", b.median(), "ns", "bare JNI, same conversions", c.median(), "-");
        if (t != null) {
            printRow("JNI layer", name + ", Java side", b.median(), "ns", "design floor, copies in a std::tuple",
                    t.median(), "-");
        }
    }

    static double eventsPerSecond(KivHostCallService s, int threads) throws InterruptedException {
        long target = BenchNative.hostCalls() + END_TO_END_EVENTS;
        List<Thread> senders = new ArrayList<>();
        for (int t = 0; t < threads; t++) {
            senders.add(new Thread(() -> {
                for (int i = 0; i < END_TO_END_EVENTS / threads; i++) s.native_onLocaleChanged(LOCALE);
            }));
        }
        long start = System.nanoTime();
        senders.forEach(Thread::start);
        for (Thread t : senders) t.join();
        while (BenchNative.hostCalls() < target) Thread.onSpinWait();
        return END_TO_END_EVENTS / ((System.nanoTime() - start) / 1e9);
    }

    public static void main(String[] args) throws InterruptedException {
        System.load(System.getProperty("hostcall.benchlib"));
        BenchNative.countHostCalls();
        System.load(System.getProperty("hostcall.lib"));
        KivHostCallService s = new KivHostCallService();
        s.native_init();

        row("onOrientationChange", i -> s.native_onOrientationChange(i), BenchNative::bareInt, BenchNative::floorInt,
                BenchNative::floorIntTuple);
        row("onLocaleChanged", i -> s.native_onLocaleChanged(LOCALE), i -> BenchNative.bareString(LOCALE),
                i -> BenchNative.floorString(LOCALE), null);
        row("onAppInstalled", i -> s.native_onAppInstalled(PKG, ACTIVITY, "Notes", i, "4.2", "icon.png", "store", false),
                i -> BenchNative.bareInstall(PKG, ACTIVITY, "Notes", i, "4.2", "icon.png", "store", false),
                i -> BenchNative.floorInstall(PKG, ACTIVITY, "Notes", i, "4.2", "icon.png", "store", false), null);
        // Measured once the calls above have warmed the compiler.
        Contender empty = new Contender(i -> BenchNative.bareInt(i), null);
        interleave(List.of(empty));
        printRow("floors", "bare empty JNI call", empty.median(), "ns", "-", 0, "-");
        for (int threads : new int[] {1, 4}) {
            double[] runs = new double[5];
            for (int r = 0; r < runs.length; r++) runs[r] = eventsPerSecond(s, threads);
            Arrays.sort(runs);
            printRow("JNI layer", "events end to end, " + threads + " Java thread(s)", runs[runs.length / 2],
                    "events/s", "-", 0, "-");
        }
    }
}
