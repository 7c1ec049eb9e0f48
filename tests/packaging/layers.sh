#!/bin/sh
# layers.sh COMPILER HEADER yes|no INCLUDE_FOLDER...: whether a folder that sees
# these include folders can include the header.
set -eu
compiler=$1 header=$2 allowed=$3
shift 3
for folder in "$@"; do
    set -- "$@" "-I$folder"
    shift
done
if printf '#include <%s>\n' "$header" | "$compiler" -std=c++17 -x c++ -fsyntax-only "$@" - 2>/dev/null; then
    answer=yes
else
    answer=no
fi
[ "$answer" = "$allowed" ]
