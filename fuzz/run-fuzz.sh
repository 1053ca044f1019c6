#!/usr/bin/env bash
# Runs each fuzz target for a bounded time on a copy of its seeds; fails on a crash, a failed
# expectation or a hang. Corpus and crashing inputs stay in BUILD_DIR/fuzz-work/TARGET/.
# Usage: fuzz/run-fuzz.sh BUILD_DIR [SECONDS_PER_TARGET]
set -euo pipefail
build=${1:?usage: run-fuzz.sh BUILD_DIR [SECONDS_PER_TARGET]}
seconds=${2:-60}
failed=0
for target in fuzz_hcall_decode fuzz_level_split fuzz_guest; do
  work=$build/fuzz-work/$target
  mkdir -p "$work/corpus" "$work/artifacts"
  cp -n "$(dirname "$0")/corpus/$target"/* "$work/corpus/" || true  # seeds join earlier finds
  echo "== $target: ${seconds}s from $(ls "$work/corpus" | wc -l) inputs"
  if HOSTCALL_TEST_KMSG=/dev/null UBSAN_OPTIONS=print_stacktrace=1:halt_on_error=1 \
    "$build/bin/$target" -max_total_time="$seconds" -timeout=10 -rss_limit_mb=2048 \
    -max_len=4096 -use_value_profile=1 -print_final_stats=1 -artifact_prefix="$work/artifacts/" \
    "$work/corpus" >"$work/log" 2>&1; then
    grep -E '^(Done|stat::number_of_executed_units|stat::peak_rss_mb)' "$work/log" || true
  else
    tail -n 60 "$work/log"
    echo "!! $target failed; input kept in $work/artifacts/"
    failed=1
  fi
done
exit $failed
