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
 * Prints figures only; it asserts nothing.
 */
public final class BridgeBench {
    static final int CALLS = 20_000;
    static final int WARM_ROUNDS = 5;
    static final int ROUNDS = 15;
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

    static void row(String name, IntUnaryOperator bridge, IntUnaryOperator bare, IntUnaryOperator floor)
            throws InterruptedException {
        Contender b = new Contender(bridge, BenchNative::hostCalls);
        Contender c = new Contender(bare, null);
        Contender f = new Contender(floor, BenchNative::floorDone);
        // Interleaved rounds, so drift in the machine affects all three alike.
        for (int r = 0; r < WARM_ROUNDS + ROUNDS; r++) {
            for (Contender k : List.of(b, c, f)) {
                double ns = k.round();
                if (r >= WARM_ROUNDS) k.rounds[r - WARM_ROUNDS] = ns;
            }
        }
        System.out.printf("%-22s %10.0f %12.0f %14.0f %12.2fx %12.2fx%n", name, b.median(), c.median(), f.median(),
                b.median() / c.median(), b.median() / f.median());
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

        System.out.println("Java-side cost of a forwarding call, ns per call (median of " + ROUNDS + " rounds of "
                + CALLS + " calls)");
        System.out.printf("%-22s %10s %12s %14s %13s %13s%n", "method", "bridge", "bare JNI", "design floor",
                "vs bare", "vs floor");
        row("onOrientationChange", i -> s.native_onOrientationChange(i), BenchNative::bareInt, BenchNative::floorInt);
        row("onLocaleChanged", i -> s.native_onLocaleChanged(LOCALE), i -> BenchNative.bareString(LOCALE),
                i -> BenchNative.floorString(LOCALE));
        row("onAppInstalled", i -> s.native_onAppInstalled(PKG, ACTIVITY, "Notes", i, "4.2", "icon.png", "store", false),
                i -> BenchNative.bareInstall(PKG, ACTIVITY, "Notes", i, "4.2", "icon.png", "store", false),
                i -> BenchNative.floorInstall(PKG, ACTIVITY, "Notes", i, "4.2", "icon.png", "store", false));
        System.out.println("bare JNI: the same call converting its strings and nothing else;");
        System.out.println("design floor: conversions, one std::function holding the copies, one locked push and");
        System.out.println("its notification. Target: the bridge at most 1.20x the design floor.");
        System.out.println();
        System.out.printf("end to end through the device model: %.0f events/s with 1 Java thread%n",
                eventsPerSecond(s, 1));
        System.out.printf("end to end through the device model: %.0f events/s with 4 Java threads%n",
                eventsPerSecond(s, 4));
    }
}
