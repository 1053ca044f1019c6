#!/usr/bin/env bash
# Checks the shipped library's host-call and message-client exports against a
# list: each listed symbol is exported with exactly the listed parameter types,
# and nothing else of these families leaks out (the catalogue's helpers stay
# hidden). Usage: check_exports.sh LIBRARY LIST
set -eu
actual=$(nm -D --defined-only -C "$1" | sed 's/^[0-9a-f]* [A-Za-z] //' |
    grep -E '^(g_hcall|hcall|HcallGuestGlobals|VmsgGuestClient|typeinfo.*Vmsg)' | sort -u)
expected=$(grep -v -e '^#' -e '^[[:space:]]*$' "$2" | sort -u)
if [ "$actual" != "$expected" ]; then
    echo "Exports differ from $2 (< exported, > listed):"
    diff <(echo "$actual") <(echo "$expected") || true
    exit 1
fi
echo "$(echo "$expected" | wc -l) listed symbols exported"
