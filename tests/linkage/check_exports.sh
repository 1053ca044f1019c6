#!/usr/bin/env bash
# The shipped library's dynamic symbols against the list, nothing besides:
# plain names as they are, decorated ones as c++filt shows them (the list's
# second field, with the library's string type spelt std::string), so a changed
# parameter type shows as a pair of nearly equal lines. Usage: check_exports.sh LIBRARY LIST
set -euo pipefail
export LC_ALL=C # one collation for sort and diff
exported=$(nm -D --defined-only "$1" | awk '{ print $NF }' | c++filt |
    sed 's/std::__cxx11::basic_string<char, std::char_traits<char>, std::allocator<char> >/std::string/g' | sort)
listed=$(grep -v -e '^#' -e '^[[:space:]]*$' "$2" |
    awk 'NF > 1 { sub(/^[^[:space:]]+[[:space:]]+/, "") } { print }' | sort)
if ! diff <(echo "$exported") <(echo "$listed"); then
    echo "Exported symbols differ from the list (< exported, > listed)"
    exit 1
fi
echo "$(echo "$exported" | wc -l) symbols exported, exactly as listed"
