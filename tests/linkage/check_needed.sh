#!/usr/bin/env bash
# The shipped library's NEEDED entries are exactly those named, in any order; a
# sanitizer build may add its runtimes and the C library parts they pull in.
# Usage: check_needed.sh LIBRARY NEEDED...
set -euo pipefail
needed=$(readelf -d "$1" | sed -n 's/.*(NEEDED).*\[\(.*\)\]$/\1/p')
extra='^$'
grep -Eq '^lib(a|ub|t)san\.so' <<<"$needed" && extra='^lib((a|ub|t)san|m|dl|pthread|rt)\.so'
shift
if ! diff <(printf '%s\n' "$@" | sort) <(grep -Ev "$extra" <<<"$needed" | sort); then
    echo "NEEDED entries differ from the list (< listed, > library)"
    exit 1
fi
echo "NEEDED: $# libraries, as listed"
