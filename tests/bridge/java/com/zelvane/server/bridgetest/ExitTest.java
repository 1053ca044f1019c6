package com.zelvane.server.bridgetest;

import static org.junit.jupiter.api.Assertions.assertTrue;

import java.time.Duration;
import java.util.List;
import java.util.Map;
import org.junit.jupiter.api.Test;

/**
 * Fault: the process could crash at exit when the host-call connection was
 * unmapped under an exchange in progress, or the pool destroyed under its
 * worker. Exit must be prompt and clean with the worker idle, or inside a
 * host call that answers only once the library's static destructors have run
 * (the worker then finishes the exchange and returns to the pool while the
 * process is ending).
 */
class ExitTest {
    /** Far longer than a clean JVM exit takes, far shorter than the child tolerance. */
    static final Duration EXIT_TOLERANCE = Duration.ofSeconds(60);

    private static void assertPromptCleanExit(String scenario, int exitCode, boolean busy) {
        ChildJvm child = ChildJvm.run(scenario, Map.of()).assertClean(exitCode);
        assertTrue(child.elapsed.compareTo(EXIT_TOLERANCE) < 0, scenario + " took " + child.elapsed);
        if (busy)
            assertTrue(child.reported("RESULT").equals(List.of("held=true", "workerLeftHost=true")),
                    "the worker was inside a host call and came out of it during the exit:\n" + child.output);
    }

    @Test
    void SystemExit_WhenWorkerIdle_EndsCleanly() {
        assertPromptCleanExit("exit-idle", 7, false);
    }

    @Test
    void SystemExit_WhenWorkerInsideAHostCall_EndsPromptlyAndCleanly() {
        assertPromptCleanExit("exit-busy", 5, true);
    }

    @Test
    void NormalEnd_WhenWorkerIdle_EndsCleanly() {
        assertPromptCleanExit("end-idle", 0, false);
    }

    @Test
    void NormalEnd_WhenWorkerInsideAHostCall_EndsPromptlyAndCleanly() {
        assertPromptCleanExit("end-busy", 0, true);
    }
}
