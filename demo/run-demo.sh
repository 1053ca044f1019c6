#!/usr/bin/env bash
# Plays the demo guest session from a built tree (default: build/).
#   LD_PRELOAD            the device model (/dev/kivvmsg and the host) and the
#                         kernel-log guard, so nothing reaches the real /dev/kmsg
#   HOSTCALL_TEST_KMSG    where the guard sends kernel-log lines (/dev/null)
#   HOSTCALL_PROPERTIES_FILE  system properties (kiv.debug.kivhostcall=1)
#   VMSG_DEVICE_*         the host's behaviour: print each call, refuse launches,
#                         fail operation 14 (app uninstalled) with -13, and
#                         record each call in a trace the demo waits on
set -euo pipefail
build=$(cd "${1:-build}" && pwd)
export LD_PRELOAD="$build/lib/libvmsg_device.so:$build/lib/libkmsg_guard.so"
export HOSTCALL_TEST_KMSG=/dev/null
export HOSTCALL_PROPERTIES_FILE="$build/demo/demo.prop"
export VMSG_DEVICE_PRINT=1
export VMSG_DEVICE_LAUNCH_ALLOWED=0
export VMSG_DEVICE_RESULTS=14=-13
trace="$build/demo/host-calls.trace"
rm -f "$trace"
export VMSG_DEVICE_TRACE="$trace"
exec java -Xcheck:jni \
  -Dhostcall.trace="$trace" \
  -Dhostcall.lib="$build/lib/libhostcall_jni.so" \
  -Dhostcall.demolib="$build/lib/libdemo_logcat.so" \
  -cp "$build/java/kivhostcall-service.jar:$build/java/demo.jar" \
  com.zelvane.server.demo.GuestSession
