#!/usr/bin/env bash
# Usage: check_exports.sh LIBRARY LIST. The library's dynamic symbols are the
# list's, nothing besides: plain names as they are, decorated ones as c++filt
# shows them (the list's second field), so a changed parameter type shows.
set -euo pipefail
export LC_ALL=C # one collation for sort and diff
exported=$(nm -D --defined-only "$1" | awk '{ print $NF }' | c++filt |
    sed 's/std::__cxx11::basic_string<char, std::char_traits<char>, std::allocator<char> >/std::string/g' | sort)
listed=$(awk '/^#/ || !NF { next } NF > 1 { sub(/^[^[:space:]]+[[:space:]]+/, "") } { print }' "$2" | sort)
diff <(echo "$exported") <(echo "$listed") || { echo "Exports differ (< library, > list)"; exit 1; }
