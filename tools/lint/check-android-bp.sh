#!/usr/bin/env bash
# Checks the Android build file: it parses, it is formatted as bpfmt writes it,
# and each module lists exactly the sources of its CMake target, as the CMake
# configure step records them in BUILD_DIR/android-bp-sources.txt (one module
# per line: its name, then its sources). A module either build has and the
# other lacks is an error too, so the two builds cannot drift apart.
# Usage: check-android-bp.sh [REPO_ROOT [BUILD_DIR]]
set -euo pipefail
root=${1:-$(cd "$(dirname "$0")/../.." && pwd)}
manifest=${2:-$root/build}/android-bp-sources.txt
bp=$root/Android.bp
[[ -f $manifest ]] || { echo "$manifest missing: configure the CMake build first"; exit 1; }

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

# Every module with a srcs list, in the manifest's form; bpfmt writes a list
# on one line or one quoted entry on each line.
bp_modules() {
    awk '
        function quoted(line, q, n, i) {
            n = split(line, q, "\"")
            for (i = 2; i < n; i += 2) files = files " " q[i]
        }
        /^[a-z_]+ \{/ { name = "" }
        /^    name: "/ { split($0, q, "\""); name = q[2] }
        name != "" && /^    srcs: \[.*\],$/ { files = ""; quoted($0); print name files; next }
        name != "" && /^    srcs: \[/ { inlist = 1; files = ""; next }
        inlist && /^    \],/ { inlist = 0; print name files }
        inlist && /"/ { quoted($0) }' "$bp"
}
normalise() { while read -r module files; do
    echo "$module $(tr ' ' '\n' <<<"$files" | sort | xargs)"
done | sort; }

expected=$(normalise <"$manifest")
actual=$(bp_modules | normalise)
if [[ "$expected" != "$actual" ]]; then
    echo "Android.bp modules differ from CMake (< CMake, > Android.bp):"
    diff <(echo "$expected") <(echo "$actual") || true
    status=1
fi
[[ $status -eq 0 ]] && echo "Android.bp: formatted, $(wc -l <<<"$expected") modules with the sources of CMake"
exit $status
