#!/usr/bin/env bash
# Checks the libraries the shipped library needs at load (its NEEDED
# entries): exactly those named, in any order; a sanitizer build may add its
# runtimes and the C library parts they pull in. Usage: check_needed.sh
# LIBRARY NEEDED...
set -euo pipefail
lib=$1
shift
needed=$(readelf -d "$lib" | sed -n 's/.*(NEEDED).*\[\(.*\)\]$/\1/p')
extra='^$'
grep -Eq '^lib(a|ub|t)san\.so' <<<"$needed" && extra='^lib((a|ub|t)san|m|dl|pthread|rt)\.so'
actual=$(grep -Ev "$extra" <<<"$needed" | sort)
expected=$(printf '%s\n' "$@" | sort)
if [[ "$actual" != "$expected" ]]; then
    echo "NEEDED entries differ from the list (< listed, > $lib):"
    diff <(echo "$expected") <(echo "$actual") || true
    exit 1
fi
echo "NEEDED: $(echo "$actual" | wc -l) libraries, as listed"
