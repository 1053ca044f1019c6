package com.zelvane.server.bridgetest;

/**
 * libbridge_test_native.so, loaded before the service library: the Android
 * log, the preloaded device model and the host behind it, an exit gate.
 */
final class TestNative {
    private TestNative() {}

    static native void startLogCapture();
    /** The lines captured since the last take, as "priority|tag|text" each ended by U+0001; the capture forgets them. */
    static native String takeLogLines();

    /** A fresh host: default answers, records cleared; codeResults pairs an operation code with its result. */
    static native void configureHost(boolean launchAllowed, int[] codeResults);
    /** Every request the host has received, as hex, each ended by a blank. */
    static native String requests();
    static native int overlaps();
    static native int openDevices();
    static native long served();
    static native boolean awaitServed(long count, long timeoutMs);
    static native int threadsNamed(String name);

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
