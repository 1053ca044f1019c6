#!/usr/bin/env bash
# Runs every benchmark from a built tree (default: build/) and prints one
# Markdown table of their figures, under a note of the machine and its load.
# Figures only: nothing here passes or fails on time.
set -euo pipefail
build=$(cd "${1:-build}" && pwd)
here=$(cd "$(dirname "$0")" && pwd)

cpu=$(sed -n 's/^model name[[:space:]]*: //p' /proc/cpuinfo | head -1)
echo "machine: $(nproc) processors, ${cpu:-unknown CPU}"
echo "load average before: $(cut -d' ' -f1-3 /proc/loadavg)"
echo
{
  HOSTCALL_TEST_KMSG=/dev/null "$build/bin/hcall_bench"
  HOSTCALL_TEST_KMSG=/dev/null "$build/bin/pool_bench"
  "$here/bridge/run-bench.sh" "$build"
} | awk -f "$here/table.awk"
echo
echo "load average after: $(cut -d' ' -f1-3 /proc/loadavg)"
echo "ratio: value / beside value, each pair measured in interleaved rounds of one run (medians)"
