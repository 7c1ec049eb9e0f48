#!/bin/sh
# exported_symbols.sh LIBRARY LIST: the library exports what the list names.
set -eu
exported=$(nm --dynamic --defined-only --demangle "$1" | cut -d' ' -f3- | LC_ALL=C sort -u)
if ! printf '%s\n' "$exported" | diff -u "$2" -; then
    echo "the interface has changed: if that is meant, change $2 with it" >&2
    exit 1
fi
