package com.zelvane.server.bridgetest;

import static org.junit.jupiter.api.Assertions.assertEquals;
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
 * A scenario of {@link ProcessTest#main} run in a JVM of its own, with this
 * JVM's -Xcheck:jni, preloads and properties, and what it reported on
 * standard output.
 */
final class ChildJvm {
    /** Longest a scenario may take before it counts as hung. */
    static final Duration TOLERANCE = Duration.ofSeconds(60);
    static final String CLASS_PATH = System.getProperty("java.class.path");

    final String output;
    final Duration elapsed;

    private ChildJvm(String output, Duration elapsed) {
        this.output = output;
        this.elapsed = elapsed;
    }

    /** Runs the scenario `args` with `classPath` and `env` added; checks it ended with `exitCode`, uncomplaining. */
    static ChildJvm run(int exitCode, String classPath, Map<String, String> env, String... args) {
        List<String> command = new ArrayList<>(List.of(ProcessHandle.current().info().command().orElse("java"),
                "-Xcheck:jni", "-Xmx64m", "-XX:ErrorFile=" + System.getProperty("java.io.tmpdir") + "/hs_err_%p.log"));
        for (String property : List.of("hostcall.lib", "hostcall.testlib"))
            command.add("-D" + property + "=" + System.getProperty(property));
        command.addAll(List.of("-cp", classPath, ProcessTest.class.getName()));
        command.addAll(List.of(args));
        String scenario = String.join(" ", args);
        try {
            Path log = Files.createTempFile("bridge-child-", ".out");
            ProcessBuilder builder = new ProcessBuilder(command).redirectErrorStream(true).redirectOutput(log.toFile());
            builder.environment().putAll(env);
            long start = System.nanoTime();
            Process process = builder.start();
            boolean ended = process.waitFor(TOLERANCE.toMillis(), TimeUnit.MILLISECONDS);
            if (!ended) process.destroyForcibly().waitFor();
            ChildJvm child = new ChildJvm(Files.readString(log, StandardCharsets.UTF_8),
                    Duration.ofNanos(System.nanoTime() - start));
            Files.delete(log);
            assertTrue(ended, scenario + " hung:\n" + child.output);
            assertEquals(exitCode, process.exitValue(), scenario + " exit code:\n" + child.output);
            for (String sign : List.of("WARNING in native method", "FATAL ERROR in native method", "SIGSEGV", "SIGABRT",
                    "hs_err_pid", "AddressSanitizer", "runtime error:", "terminate called", "FAILED:"))
                assertFalse(child.output.contains(sign), scenario + " reported " + sign + ":\n" + child.output);
            return child;
        } catch (IOException | InterruptedException e) {
            throw new AssertionError(scenario, e);
        }
    }

    static ChildJvm run(Map<String, String> env, String... args) {
        return run(0, CLASS_PATH, env, args);
    }

    /** The reported values of one kind ("RESULT", "LINE", "REQ"), in order. */
    List<String> reported(String kind) {
        List<String> values = new ArrayList<>();
        for (String line : output.split("\n", -1))
            if (line.startsWith(kind + " ")) values.add(line.substring(kind.length() + 1));
        return values;
    }
}
