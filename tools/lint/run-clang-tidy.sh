#!/usr/bin/env bash
# Runs clang-tidy with the repository's .clang-tidy over the shipped library's
# sources (Source/, server/native/), using the compile database of a build
# directory configured with CMAKE_EXPORT_COMPILE_COMMANDS=ON. Any finding fails.
# Usage: run-clang-tidy.sh BUILD_DIR [JOBS]
set -euo pipefail
build=$1
jobs=${2:-2}
root=$(cd "$(dirname "$0")/../.." && pwd)
db=$build/compile_commands.json
if [[ ! -f "$db" ]]; then
    echo "no $db: configure with -DCMAKE_EXPORT_COMPILE_COMMANDS=ON"
    exit 1
fi
# Only the library's own translation units; their headers come in through
# the configuration's header filter.
files=$(grep -o "\"file\": \"$root/\(Source\|server/native\)/[^\"]*\.cpp\"" "$db" |
    sed 's/^"file": "//; s/"$//' | sort -u)
if [[ -z "$files" ]]; then
    echo "no library sources in $db"
    exit 1
fi
echo "clang-tidy: $(echo "$files" | wc -l) library sources"
# run-clang-tidy takes regular expressions; the paths hold no special characters
# but dots, which match themselves as well.
log=$(mktemp)
trap 'rm -f "$log"' EXIT
status=0
# shellcheck disable=SC2086
run-clang-tidy -quiet -j "$jobs" -p "$build" $files >"$log" 2>&1 || status=$?
# Keep the findings; drop the per-file command lines and tallies.
grep -v -e '^[0-9]* warnings\? generated\.$' -e '^Suppressed [0-9]* warnings' \
    -e '^Use -header-filter=' -e '^clang-tidy-[0-9]* .* -quiet ' "$log" || true
[[ $status -eq 0 ]] && echo "clang-tidy: clean"
exit $status
