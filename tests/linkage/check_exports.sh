#!/usr/bin/env bash
# Checks the shipped library's dynamic symbol table against the one list of
# its interface: the same names, plain where the list says plain and decorated
# with exactly the listed parameter types where it gives a signature, and
# nothing besides. Usage: check_exports.sh LIBRARY LIST
set -euo pipefail
export LC_ALL=C  # one collation for sort and diff
lib=$1
list=$2

# Compared as c++filt shows them, with the library's string type spelt as the
# list spells it: a plain name stays as it is and a decorated one becomes its
# signature, the list's second field, so a changed parameter type shows as a
# pair of nearly equal lines.
exported=$(nm -D --defined-only "$lib" | awk '{ print $NF }' | c++filt |
    sed 's/std::__cxx11::basic_string<char, std::char_traits<char>, std::allocator<char> >/std::string/g' | sort)
listed=$(grep -v -e '^#' -e '^[[:space:]]*$' "$list" |
    awk 'NF > 1 { sub(/^[^[:space:]]+[[:space:]]+/, "") } { print }' | sort)
if [[ -z "$exported" ]]; then
    echo "no dynamic symbols read from $lib"
    exit 1
fi
if [[ "$exported" != "$listed" ]]; then
    echo "Exported symbols differ from the list (< exported, > listed):"
    diff <(echo "$exported") <(echo "$listed") | grep '^[<>]' | sed 's/^/    /'
    exit 1
fi
echo "$(echo "$exported" | wc -l) symbols exported, exactly as listed"
