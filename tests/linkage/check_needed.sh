#!/usr/bin/env bash
# Checks the libraries the shipped library needs at load (its NEEDED
# entries): exactly those named, in any order; the runtimes of a sanitizer
# build may stand beside them. Usage: check_needed.sh LIBRARY NEEDED...
set -euo pipefail
lib=$1
shift
actual=$(readelf -d "$lib" | sed -n 's/.*(NEEDED).*\[\(.*\)\]$/\1/p' |
    grep -Ev '^lib(a|ub|t)san\.so' | sort)
expected=$(printf '%s\n' "$@" | sort)
if [[ "$actual" != "$expected" ]]; then
    echo "NEEDED entries differ from the list (< listed, > $lib):"
    diff <(echo "$expected") <(echo "$actual") || true
    exit 1
fi
echo "NEEDED: $(echo "$actual" | wc -l) libraries, as listed"
