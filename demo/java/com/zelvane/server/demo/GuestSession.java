package com.zelvane.server.demo;

import com.zelvane.server.KivHostCallService;
import java.io.IOException;
import java.nio.file.Files;
import java.nio.file.Path;

/**
 * A short guest session played against the device model: what the Java
 * service hands the library, the library's own log lines ("log"), and each
 * host call as the host decoded it (the bare lines, printed by the device).
 */
public final class GuestSession {
    /** Longest the demo waits for the worker to deliver a step's events. */
    private static final long STEP_TIMEOUT_MS = 10_000;

    private static int tasksQueued;
    /** Tasks queued once native_init had switched the debug lines on: each logs its result. */
    private static int tasksReporting;
    private static int queries;
    private static boolean started;

    private GuestSession() {}

    private static void say(String text) {
        System.err.println();
        System.err.println("== " + text);
        System.err.flush();
    }

    private static void java(String call, Object result) {
        System.err.println("  java " + call + " -> " + result);
        System.err.flush();
    }

    /** A forwarding call: its task will report one result. */
    private static void event(String call, int result) {
        if (result == 0) tasksQueued++;
        if (result == 0 && started) tasksReporting++;
        java(call, result);
    }

    private static void query(String call, Object result) {
        queries++;
        java(call, result);
    }

    private static long hostCalls() {
        try {
            Path trace = Path.of(System.getProperty("hostcall.trace"));
            return Files.exists(trace) ? Files.readAllLines(trace).size() : 0;
        } catch (IOException e) {
            return 0;
        }
    }

    /**
     * Waits until the host has received every event so far and, once the
     * debug switch is on, each task has logged its result.
     */
    private static void settle() throws InterruptedException {
        long deadline = System.currentTimeMillis() + STEP_TIMEOUT_MS;
        while (hostCalls() < tasksQueued + queries && System.currentTimeMillis() < deadline) Thread.sleep(5);
        boolean logged = Logcat.awaitTaskResults(tasksReporting, STEP_TIMEOUT_MS);
        if (hostCalls() < tasksQueued + queries || !logged) {
            System.err.println("demo: the host did not receive every event in time");
            System.exit(1);
        }
    }

    public static void main(String[] args) throws InterruptedException {
        System.err.println("Legend: 'java' = a call into the service, 'log' = the service's Android log line,");
        System.err.println("        bare lines = the host-call the host received, decoded, and its result.");
        System.load(System.getProperty("hostcall.demolib"));
        Logcat.start();
        System.load(System.getProperty("hostcall.lib"));
        KivHostCallService service = new KivHostCallService();

        say("Boot: the guest reports its initial state before the service has started (queued, no worker yet)");
        event("native_initInputDebuggingStatus(false, false)", service.native_initInputDebuggingStatus(false, false));
        event("native_initImeStatus(\"com.android.inputmethod.latin/.LatinIME\")",
                service.native_initImeStatus("com.android.inputmethod.latin/.LatinIME"));
        event("native_initVolume(false, 8, 15)", service.native_initVolume(false, 8, 15));
        String apps = "[{\"package\":\"com.android.chrome\",\"label\":\"Chrome\"},"
                + "{\"package\":\"com.zelvane.store\",\"label\":\"Store\"}]";
        event("native_syncInstalledApps(" + apps + ")", service.native_syncInstalledApps(apps));

        say("native_init: support library, connection to the host, one worker; the queued reports go out in order");
        service.native_init();
        started = true;
        settle();

        say("An app is installed from the store and its activity is shown");
        event("native_onAppInstalled(\"com.example.notes\", ...)", service.native_onAppInstalled(
                "com.example.notes", "com.example.notes.MainActivity", "Notes", 42, "4.2",
                "/data/system/icons/com.example.notes.png", "com.zelvane.store", false));
        event("native_onActivityDisplayed(\"com.example.notes\", \"com.example.notes.MainActivity\")",
                service.native_onActivityDisplayed("com.example.notes", "com.example.notes.MainActivity"));
        settle();

        say("The user copies text, switches the locale and rotates the screen");
        event("native_setClipboardText(\"Caf\u00e9 at 10:30\")", service.native_setClipboardText("Caf\u00e9 at 10:30"));
        event("native_onLocaleChanged(\"fr-FR\")", service.native_onLocaleChanged("fr-FR"));
        event("native_onOrientationChange(1)", service.native_onOrientationChange(1));
        settle();

        say("A launch the host does not allow (asked on the caller's thread)");
        query("native_isAppLaunchAllowed(\"com.example.game\")", service.native_isAppLaunchAllowed("com.example.game"));

        say("An uninstall report the host fails: the task logs \"RPC failed\"");
        event("native_onAppUninstalled(\"com.example.notes\")", service.native_onAppUninstalled("com.example.notes"));
        settle();

        say("Done: " + tasksQueued + " events delivered, one at a time, in the order they were sent");
    }
}
