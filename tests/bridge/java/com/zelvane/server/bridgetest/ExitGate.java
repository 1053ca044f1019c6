package com.zelvane.server.bridgetest;

/** libbridge_exit_gate.so: holds a host call until the process exits, then releases it. */
final class ExitGate {
    private ExitGate() {}

    /** Must run before the service library is loaded. */
    static void load() {
        System.load(System.getProperty("hostcall.exitgate"));
    }

    static native void holdUntilExit(int opCode);
    static native boolean awaitHeld(long timeoutMs);
}
