package com.zelvane.server.bench;

/** The benchmark's floors and host-call counter (libbridge_bench_native.so). */
final class BenchNative {
    private BenchNative() {}

    static native int bareInt(int v);
    static native int bareString(String s);
    static native int bareInstall(String p, String a, String l, int vc, String vn, String i, String s, boolean u);

    static native int floorInt(int v);
    /** floorInt keeping its copy in a std::tuple, as the bridge does. */
    static native int floorIntTuple(int v);
    static native int floorString(String s);
    static native int floorInstall(String p, String a, String l, int vc, String vn, String i, String s, boolean u);

    static native void countHostCalls();
    /** Parks the bridge's worker in the host and the floor's consumer before its task. */
    static native void holdConsumers(boolean hold);
    static native long hostCalls();
    /** Tasks the floor's consumer has run. */
    static native long floorDone();
}
