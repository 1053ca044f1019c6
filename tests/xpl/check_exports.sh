#!/bin/sh
# Checks the dynamic symbols of the shipped library against a list: every
# listed symbol is exported with exactly the listed parameter types, and no
# unlisted symbol of a listed family leaks out.
# Usage: check_exports.sh LIBRARY LIST
set -eu
lib=$1
list=$2
# Families whose every export must be on the list.
families='^(g_xerr_|g_xlog|xerr|xlog|xdbg|xmem_|xpl|xstr|xtime[A-Z_(]|xfile)'

actual=$(mktemp)
expected=$(mktemp)
trap 'rm -f "$actual" "$expected"' EXIT

nm -D --defined-only -C "$lib" |
    sed -e 's/^[0-9a-f]* [A-Za-z] //' \
        -e 's/std::__cxx11::basic_string<char, std::char_traits<char>, std::allocator<char> >/std::string/g' |
    sort -u >"$actual"
grep -v -e '^#' -e '^[[:space:]]*$' "$list" | sort -u >"$expected"

status=0
missing=$(comm -13 "$actual" "$expected")
if [ -n "$missing" ]; then
    echo "Not exported (or exported with other types):"
    echo "$missing"
    status=1
fi
stray=$(comm -23 "$actual" "$expected" | grep -E "$families" || true)
if [ -n "$stray" ]; then
    echo "Exported but not listed:"
    echo "$stray"
    status=1
fi
[ $status -eq 0 ] && echo "$(wc -l <"$expected") listed symbols exported"
exit $status
