package com.zelvane.server.bridgetest;

import static org.junit.jupiter.api.Assertions.assertEquals;

import com.zelvane.server.KivHostCallService;
import java.nio.ByteBuffer;
import java.nio.ByteOrder;
import java.nio.charset.StandardCharsets;
import java.util.ArrayList;
import java.util.List;
import java.util.concurrent.ConcurrentLinkedQueue;
import java.util.concurrent.CountDownLatch;
import java.util.concurrent.atomic.AtomicBoolean;
import java.util.concurrent.atomic.AtomicInteger;
import org.junit.jupiter.api.Test;

/** Several Java threads sending events while others ask both queries. */
class LoadOrderTest {
    static final int SENDERS = 4;
    static final int EVENTS_PER_SENDER = 300;
    static final int ASKERS = 2;

    @Test
    void EventsFromManyThreads_WhileQueriesRun_ReachTheHostOnceEachInPerThreadOrderWithoutOverlap()
            throws InterruptedException {
        KivHostCallService s = Bridge.started();
        Bridge.drain(s, true);
        TestNative.resetDevice();
        TestNative.configureHost(0, false, 0, new int[] {28, -3});

        CountDownLatch gate = new CountDownLatch(1);
        AtomicBoolean sending = new AtomicBoolean(true);
        AtomicInteger queries = new AtomicInteger();
        ConcurrentLinkedQueue<String> wrongAnswers = new ConcurrentLinkedQueue<>();
        List<Thread> threads = new ArrayList<>();
        for (int t = 0; t < SENDERS; t++) {
            final int sender = t;
            threads.add(new Thread(() -> {
                awaitGate(gate);
                for (int i = 0; i < EVENTS_PER_SENDER; i++) {
                    int accepted = i % 2 == 0 ? s.native_setClipboardText("t" + sender + "-" + i)
                                              : s.native_onCursorLocationChanged(sender, i);
                    if (accepted != 0) wrongAnswers.add("event " + sender + "-" + i + " refused");
                }
            }));
        }
        for (int a = 0; a < ASKERS; a++) {
            threads.add(new Thread(() -> {
                awaitGate(gate);
                while (sending.get()) {
                    if (s.native_isAppLaunchAllowed("q")) wrongAnswers.add("launch allowed");
                    if (s.native_setGoogleAdId("ad") != -3) wrongAnswers.add("ad id result");
                    queries.addAndGet(2);
                }
            }));
        }
        threads.forEach(Thread::start);
        gate.countDown();
        for (Thread thread : threads.subList(0, SENDERS)) thread.join();
        sending.set(false);
        for (Thread thread : threads) thread.join();

        List<byte[]> delivered = Bridge.drain(s, true);
        assertEquals(List.of(), new ArrayList<>(wrongAnswers), "every call got its proper answer");
        List<List<Integer>> perSender = new ArrayList<>();
        for (int t = 0; t < SENDERS; t++) perSender.add(new ArrayList<>());
        int queryRequests = 0;
        for (byte[] request : delivered) {
            ByteBuffer b = ByteBuffer.wrap(request).order(ByteOrder.LITTLE_ENDIAN);
            int op = b.getInt(0);
            if (op == 24 || op == 28) {
                queryRequests++;
            } else if (op == 18) {
                String text = new String(request, 12, b.getInt(8) - 1, StandardCharsets.UTF_8);
                String[] parts = text.substring(1).split("-");
                perSender.get(Integer.parseInt(parts[0])).add(Integer.parseInt(parts[1]));
            } else if (op == 25) {
                perSender.get(b.getInt(8)).add(b.getInt(12));
            } else {
                throw new AssertionError("unexpected operation " + op);
            }
        }
        List<Integer> inOrder = new ArrayList<>();
        for (int i = 0; i < EVENTS_PER_SENDER; i++) inOrder.add(i);
        for (int t = 0; t < SENDERS; t++)
            assertEquals(inOrder, perSender.get(t), "sender " + t + "'s events arrive once each, in its order");
        assertEquals(queries.get(), queryRequests, "each query reached the host exactly once");
        assertEquals(0, TestNative.overlaps(), "no exchange began while another was in flight");
    }

    private static void awaitGate(CountDownLatch gate) {
        try {
            gate.await();
        } catch (InterruptedException e) {
            Thread.currentThread().interrupt();
        }
    }
}
