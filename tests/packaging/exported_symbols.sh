#!/bin/sh
# exported_symbols.sh NM LIBRARY LIST: the library exports what the list names.
set -eu
exported=$("$1" --dynamic --defined-only --demangle "$2" | cut -d' ' -f3- | LC_ALL=C sort -u)
if ! printf '%s\n' "$exported" | diff -u "$3" -; then
    echo "the interface has changed: if that is meant, change $3 with it" >&2
    exit 1
fi
