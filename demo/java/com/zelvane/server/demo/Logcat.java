package com.zelvane.server.demo;

/** The demo's log sink (libdemo_logcat.so). */
final class Logcat {
    private Logcat() {}

    static native void start();

    static native boolean awaitTaskResults(int count, long timeoutMs);
}
