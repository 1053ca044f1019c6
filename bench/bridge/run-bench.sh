#!/usr/bin/env bash
# Runs the bridge benchmark from a built tree (default: build/), with the
# device model and the kernel-log guard preloaded, the debug lines off and the
# device keeping no record of the exchanges.
set -euo pipefail
build=$(cd "${1:-build}" && pwd)
export LD_PRELOAD="$build/lib/libvmsg_device.so:$build/lib/libkmsg_guard.so"
export HOSTCALL_TEST_KMSG=/dev/null
export HOSTCALL_PROPERTIES_FILE=/dev/null
export VMSG_DEVICE_RECORD=0
exec java -Xms512m -Xmx2g \
  -Dhostcall.lib="$build/lib/libhostcall_jni.so" \
  -Dhostcall.benchlib="$build/lib/libbridge_bench_native.so" \
  -cp "$build/java/kivhostcall-service.jar:$build/java/bridge-bench.jar" \
  com.zelvane.server.bench.BridgeBench
