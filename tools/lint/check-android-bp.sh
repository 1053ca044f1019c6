#!/usr/bin/env bash
# Checks the Android build file: it parses, it is formatted as bpfmt writes it,
# and each module's sources are exactly those of its CMake archives (for
# libhostcall_jni, the four the CMake build whole-archives into
# libhostcall_jni.so), so the two builds cannot drift apart.
# Usage: check-android-bp.sh [REPO_ROOT]
set -euo pipefail
root=${1:-$(cd "$(dirname "$0")/../.." && pwd)}
bp=$root/Android.bp
# Android.bp module: the folders of its CMake archives.
declare -A modules=(
    [libhostcall_jni]="Source/xpl Source/vmsg/guest Source/hcall/guest server/native"
    [libhcall_host]="Source/hcall/host"
)

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
    for dir in $1; do
        awk -v dir="$dir" '
            /add_library\([A-Za-z_]+ STATIC|target_sources\(/ { inlist = 1 }
            inlist {
                for (i = 1; i <= NF; i++)
                    if ($i ~ /\.cpp\)?$/) { f = $i; sub(/\)$/, "", f); print dir "/" f }
            }
            inlist && /\)/ { inlist = 0 }' "$root/$dir/CMakeLists.txt"
    done
}

# The quoted entries of one module's srcs list; bpfmt has put one on each line.
bp_sources() {
    awk -v module="$1" '
        /^[a-z_]+ \{/ { name = "" }
        /^    name: "/ { split($0, q, "\""); name = q[2] }
        name == module && /^[[:space:]]*srcs: \[/ { inlist = 1; next }
        inlist && /^[[:space:]]*\],/ { inlist = 0 }
        inlist && /"/ { split($0, q, "\""); print q[2] }' "$bp"
}

total=0
for module in "${!modules[@]}"; do
    expected=$(cmake_sources "${modules[$module]}" | sort)
    actual=$(bp_sources "$module" | sort)
    if [[ -z "$expected" ]]; then
        echo "$module: no sources found in its archives' CMakeLists.txt"
        exit 1
    fi
    if [[ "$expected" != "$actual" ]]; then
        echo "$module: Android.bp srcs differ from CMake (< CMake, > Android.bp):"
        diff <(echo "$expected") <(echo "$actual") || true
        status=1
    fi
    total=$((total + $(echo "$expected" | wc -l)))
done
[[ $status -eq 0 ]] && echo "Android.bp: formatted, ${#modules[@]} modules, $total sources as in CMake"
exit $status
