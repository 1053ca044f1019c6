#!/usr/bin/env bash
# Checks the Android build file: it parses, it is formatted as bpfmt writes it,
# and its library sources are exactly the sources of the four archives the
# CMake build whole-archives into libhostcall_jni.so, so the two builds cannot
# drift apart. Usage: check-android-bp.sh [REPO_ROOT]
set -euo pipefail
root=${1:-$(cd "$(dirname "$0")/../.." && pwd)}
bp=$root/Android.bp
archives=(Source/xpl Source/vmsg/guest Source/hcall/guest server/native)

status=0
# bpfmt exits nonzero on a parse error and prints a diff when the layout differs.
if ! layout=$(bpfmt -d "$bp"); then
    echo "Android.bp does not parse"
    exit 1
fi
if [[ -n "$layout" ]]; then
    echo "Android.bp is not formatted (bpfmt -w Android.bp):"
    echo "$layout"
    status=1
fi

# The .cpp entries of each archive's add_library(... STATIC ...) list and of
# any target_sources(...), with the folder in front.
cmake_sources() {
    local dir
    for dir in "${archives[@]}"; do
        awk -v dir="$dir" '
            /add_library\([A-Za-z_]+ STATIC|target_sources\(/ { inlist = 1 }
            inlist {
                for (i = 1; i <= NF; i++)
                    if ($i ~ /\.cpp\)?$/) { f = $i; sub(/\)$/, "", f); print dir "/" f }
            }
            inlist && /\)/ { inlist = 0 }' "$root/$dir/CMakeLists.txt"
    done
}

# The quoted entries of the srcs list; bpfmt has put one on each line.
bp_sources() {
    awk '
        /^[[:space:]]*srcs: \[/ { inlist = 1; next }
        inlist && /^[[:space:]]*\],/ { inlist = 0 }
        inlist && /"/ { split($0, q, "\""); print q[2] }' "$bp"
}

expected=$(cmake_sources | sort)
actual=$(bp_sources | sort)
if [[ -z "$expected" ]]; then
    echo "no sources found in the archives' CMakeLists.txt"
    exit 1
fi
if [[ "$expected" != "$actual" ]]; then
    echo "Android.bp srcs differ from the archives' CMakeLists.txt (< CMake, > Android.bp):"
    diff <(echo "$expected") <(echo "$actual") || true
    status=1
fi
[[ $status -eq 0 ]] && echo "Android.bp: formatted, $(echo "$expected" | wc -l) sources as in CMake"
exit $status
