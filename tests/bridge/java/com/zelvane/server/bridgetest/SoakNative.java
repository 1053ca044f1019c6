package com.zelvane.server.bridgetest;

/** libbridge_soak_native.so: a log that counts, the device model as a random host, heap figures. */
final class SoakNative {
    private SoakNative() {}

    static void load() {
        System.load(System.getProperty("hostcall.soaklib"));
    }

    /** From now on the Android log is counted, not kept. */
    static native void countLog();
    /** "priority|tag|text\tcount"; lines of other tags than the bridge's have the text "*". */
    static native String[] logCounts();

    static native void configureHost(int jitterUs, int failurePerMille, int sendFailurePerMille,
            int failureResult, long seed, String tracePath);
    static native void closeTrace();
    static native long served();
    /** Waits up to timeoutMs for the host to have served `count` exchanges; true when it has. */
    static native boolean awaitServed(long count, long timeoutMs);
    static native int overlaps();
    /** Bytes the native allocator has handed out and not taken back. */
    static native long nativeHeapInUse();
    /** True under a sanitizer, whose allocator keeps freed blocks in quarantine. */
    static native boolean sanitized();
}
