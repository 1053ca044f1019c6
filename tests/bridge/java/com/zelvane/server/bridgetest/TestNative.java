package com.zelvane.server.bridgetest;

/** The test-only JNI helper (libbridge_test_native.so): log capture and the device model. */
final class TestNative {
    private TestNative() {}

    static native void startLogCapture();
    /** Every captured Android log line as "priority|tag|text". */
    static native String[] logLines();

    /** Forgets exchanges and restores the host's default answers; connections stay. */
    static native void resetDevice();
    /** codeResults: pairs of operation code and result. */
    static native void configureHost(int defaultResult, boolean launchAllowed, int delayUs, int[] codeResults);
    static native void setOpenErrno(int error);
    static native byte[][] requests();
    static native String[] exchangeTexts();
    static native int overlaps();
    static native int connects();
    static native int openDevices();

    /** Holds every exchange of opCode inside the host until releaseHost. */
    static native void holdHost(int opCode);
    static native boolean awaitHostHeld(long timeoutMs);
    static native void releaseHost();

    /** Bound through the runtime stand-in by {@link #register}. */
    static native int boundLater();
    /** {result, 1 if an exception is left pending} of registering one method. */
    static native int[] register(String className, String methodName, String signature);

    static native byte[] convert(String s);
    /** {bytes converted, releases, releases of null} under a runtime out of memory. */
    static native int[] convertStarved(String s);
}
