package com.zelvane.server.bridgetest;

/**
 * Loads the library into a JVM whose class path lacks the service class, so
 * JNI_OnLoad cannot register the methods. Refers to no class of the service,
 * and reports like {@link Scenarios}.
 */
public final class NoServiceClass {
    private NoServiceClass() {}

    public static void main(String[] args) {
        System.load(System.getProperty("hostcall.testlib"));
        TestNative.startLogCapture();
        String outcome;
        try {
            System.load(System.getProperty("hostcall.lib"));
            outcome = "loaded";
        } catch (UnsatisfiedLinkError e) {
            outcome = "refused";
        }
        System.out.println("RESULT load=" + outcome);
        for (String line : TestNative.logLines())
            if (line.contains("|" + Bridge.TAG + "|")) System.out.println("LINE " + line);
    }
}
