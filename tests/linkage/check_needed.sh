#!/usr/bin/env bash
# Usage: check_needed.sh LIBRARY NEEDED... The library needs exactly those, in any
# order; a sanitizer build may add its runtimes and the C library parts they use.
set -euo pipefail
needed=$(readelf -d "$1" | sed -n 's/.*(NEEDED).*\[\(.*\)\]$/\1/p')
extra='^$'
grep -Eq '^lib(a|ub|t)san\.so' <<<"$needed" && extra='^lib((a|ub|t)san|m|dl|pthread|rt)\.so'
shift
diff <(printf '%s\n' "$@" | sort) <(grep -Ev "$extra" <<<"$needed" | sort) ||
    { echo "NEEDED entries differ (< listed, > library)"; exit 1; }
