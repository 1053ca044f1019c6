#!/usr/bin/env bash
# Checks the shipped library's dynamic symbol table against the one list of
# its interface: the same names, plain where the list says plain and decorated
# where it gives a signature, with exactly the listed parameter types, and
# nothing besides. Usage: check_exports.sh LIBRARY LIST
set -euo pipefail
export LC_ALL=C  # one collation for sort and comm
lib=$1
list=$2
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT

# c++filt's spelling of the library's string type, as the list writes it.
readable() {
    c++filt | sed 's/std::__cxx11::basic_string<char, std::char_traits<char>, std::allocator<char> >/std::string/g'
}

status=0
fail() {
    echo "$1"
    sed 's/^/    /' "$2"
    status=1
}

# The list: plain names stand alone; decorated names carry their signature.
grep -v -e '^#' -e '^[[:space:]]*$' "$list" >"$work/entries"
awk 'NF == 1' "$work/entries" >"$work/plain"
awk 'NF > 1 { sub(/[[:space:]]+/, "\t"); print }' "$work/entries" >"$work/decorated"
grep '^_Z' "$work/plain" >"$work/bad" || true
[[ -s "$work/bad" ]] && fail "Listed as plain but decorated:" "$work/bad"
cut -f1 "$work/decorated" | grep -v '^_Z' >"$work/bad" || true
[[ -s "$work/bad" ]] && fail "Listed with a signature but not a decorated name:" "$work/bad"

# Each listed signature must be what its listed name means.
cut -f1 "$work/decorated" | readable | paste "$work/decorated" - |
    awk -F'\t' '$2 != $3 { print $1 ": listed " $2 ", means " $3 }' >"$work/bad"
[[ -s "$work/bad" ]] && fail "List entries whose signature does not match the name:" "$work/bad"

# Names: a type changed in the source changes the decorated name.
{ cat "$work/plain"; cut -f1 "$work/decorated"; } | sort >"$work/listed"
nm -D --defined-only "$lib" | awk '{ print $NF }' | sort -u >"$work/exported"
if [[ ! -s "$work/exported" ]]; then
    echo "no dynamic symbols read from $lib"
    exit 1
fi
comm -13 "$work/exported" "$work/listed" >"$work/missing"
comm -23 "$work/exported" "$work/listed" >"$work/stray"

# Signatures, for the reader: the same comparison as c++filt shows it, so a
# changed parameter type appears as a pair of nearly equal lines.
{ cat "$work/plain"; cut -f2 "$work/decorated"; } | sort >"$work/listed.sig"
readable <"$work/exported" | sort >"$work/exported.sig"
if [[ -s "$work/missing" || -s "$work/stray" ]] ||
    ! cmp -s "$work/listed.sig" "$work/exported.sig"; then
    [[ -s "$work/missing" ]] && fail "Listed but not exported:" "$work/missing"
    [[ -s "$work/stray" ]] && fail "Exported but not listed:" "$work/stray"
    echo "Signatures (< exported, > listed):"
    diff "$work/exported.sig" "$work/listed.sig" | grep '^[<>]' | sed 's/^/    /' || true
    status=1
fi

[[ $status -eq 0 ]] &&
    echo "$(wc -l <"$work/listed") symbols exported, exactly as listed ($(wc -l <"$work/plain") plain)"
exit $status
