package com.zelvane.server.bridgetest;

/**
 * libbridge_test_native.so, loaded before the service library: the Android
 * log, the preloaded device model and the host behind it, an exit gate.
 */
final class TestNative {
    private TestNative() {}

    /** Every captured Android log line as "priority|tag|text". */
    static native void startLogCapture();
    static native String[] logLines();
    /** The lines captured since the last take, which the capture then forgets. */
    static native String[] takeLogLines();

    /** A fresh host: default answers, records cleared; codeResults pairs an operation code with its result. */
    static native void configureHost(boolean launchAllowed, int[] codeResults);
    /** A slow host failing now and then, recording nothing but a trace line per exchange (null: no trace). */
    static native void configureSoakHost(int jitterUs, int failurePerMille, long seed, String tracePath);
    static native void setOpenErrno(int error);
    /** Every request the host has received, as hex. */
    static native String[] requests();
    static native int overlaps();
    static native int openDevices();
    static native long served();
    static native boolean awaitServed(long count, long timeoutMs);

    /** Keeps the library at `path` loaded whatever the JVM unloads. */
    static native void keepLoaded(String path);

    /** Holds the host calls of opCode until the process exits, after the library's static destructors. */
    static native void holdUntilExit(int opCode);
    static native boolean awaitHeld(long timeoutMs);

    /** {bytes, releases} of getStringFromJstring under a runtime that lends no bytes. */
    static native int[] convertStarved(String s);

    /** Bytes the native allocator (a sanitizer's, if there is one) has handed out and not taken back. */
    static native long nativeHeapInUse();
}
