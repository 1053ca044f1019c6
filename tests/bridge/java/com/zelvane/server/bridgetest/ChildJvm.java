package com.zelvane.server.bridgetest;

import static org.junit.jupiter.api.Assertions.assertFalse;
import static org.junit.jupiter.api.Assertions.assertTrue;

import java.io.IOException;
import java.nio.charset.StandardCharsets;
import java.nio.file.Files;
import java.nio.file.Path;
import java.time.Duration;
import java.util.ArrayList;
import java.util.List;
import java.util.Map;
import java.util.concurrent.TimeUnit;

/**
 * Runs one scenario of {@link Scenarios} in a JVM of its own, with the same
 * -Xcheck:jni, preloads and class path as this one plus `env`, and collects
 * what it reports.
 */
final class ChildJvm {
    /** Longest a scenario may take before it counts as hung. */
    static final Duration CHILD_TOLERANCE = Duration.ofSeconds(120);

    final int exitCode;
    final String output;
    final Duration elapsed;

    private ChildJvm(int exitCode, String output, Duration elapsed) {
        this.exitCode = exitCode;
        this.output = output;
        this.elapsed = elapsed;
    }

    static ChildJvm run(String scenario, Map<String, String> env, String... jvmOptions) {
        return run(Scenarios.class.getName(), System.getProperty("java.class.path"), scenario, env, jvmOptions);
    }

    /** Runs `mainClass` with `classPath` and the single argument `scenario`. */
    static ChildJvm run(String mainClass, String classPath, String scenario, Map<String, String> env,
            String... jvmOptions) {
        List<String> command = new ArrayList<>();
        command.add(ProcessHandle.current().info().command().orElse("java"));
        command.add("-Xcheck:jni");
        command.addAll(List.of(jvmOptions));
        command.add("-Dhostcall.lib=" + System.getProperty("hostcall.lib"));
        command.add("-Dhostcall.testlib=" + System.getProperty("hostcall.testlib"));
        command.add("-Dhostcall.exitgate=" + System.getProperty("hostcall.exitgate"));
        command.add("-cp");
        command.add(classPath);
        command.add(mainClass);
        command.add(scenario);
        try {
            Path log = Files.createTempFile("bridge-child-", ".out");
            ProcessBuilder builder = new ProcessBuilder(command).redirectErrorStream(true)
                    .redirectOutput(log.toFile());
            builder.environment().putAll(env);
            long start = System.nanoTime();
            Process process = builder.start();
            boolean ended = process.waitFor(CHILD_TOLERANCE.toMillis(), TimeUnit.MILLISECONDS);
            Duration elapsed = Duration.ofNanos(System.nanoTime() - start);
            if (!ended) process.destroyForcibly().waitFor();
            String output = Files.readString(log, StandardCharsets.UTF_8);
            Files.deleteIfExists(log);
            assertTrue(ended, "scenario " + scenario + " hung:\n" + output);
            return new ChildJvm(process.exitValue(), output, elapsed);
        } catch (IOException | InterruptedException e) {
            throw new AssertionError(e);
        }
    }

    /** The reported values of one kind ("LINE", "REQ", "RESULT", ...), in order. */
    List<String> reported(String kind) {
        List<String> values = new ArrayList<>();
        for (String line : output.split("\n", -1))
            if (line.startsWith(kind + " ")) values.add(line.substring(kind.length() + 1));
        return values;
    }

    /** A clean run: the expected exit code and nothing the JVM or a sanitizer complained about. */
    ChildJvm assertClean(int expectedExit) {
        assertTrue(exitCode == expectedExit, "exit code " + exitCode + ", expected " + expectedExit + ":\n" + output);
        for (String sign : List.of("WARNING in native method", "FATAL ERROR in native method", "SIGSEGV",
                "SIGABRT", "hs_err_pid", "AddressSanitizer", "runtime error:", "terminate called", "FAILED:"))
            assertFalse(output.contains(sign), "the child reported " + sign + ":\n" + output);
        return this;
    }
}
