#!/bin/sh
# install_consumer.sh CMAKE BUILD_FOLDER SOURCE_FOLDER COMPILER: an application and
# one in C are built from the install tree alone, with pkg-config and with CMake, and
# all run.
set -eu
cmake=$1 build=$2 source=$3 compiler=$4
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT

"$cmake" --install "$build" --prefix "$work/tree" >"$work/install.log" || { cat "$work/install.log"; exit 1; }
pc=$(find "$work/tree" -name marubackup-si.pc)
libraries=$(dirname "$(dirname "$pc")")

check() {
    answer=$(LD_LIBRARY_PATH=$libraries "$1")
    if [ "$answer" != "$2" ]; then
        echo "$1 printed: $answer" >&2
        exit 1
    fi
}
job='503 {"action":1,"backend":"tarbackup","param":{"source":"/volume1/photos"},"status":0,"unique":""}'
version='0 0'

PKG_CONFIG_PATH=$(dirname "$pc")
export PKG_CONFIG_PATH
# Unquoted on purpose: the flags are several words.
# shellcheck disable=SC2046
"$compiler" -std=c++17 -Wall -Wextra -Wpedantic -Werror "$source/consumer.cpp" "$source/signatures.cpp" \
    $(pkg-config --cflags marubackup-si) -o "$work/by-pkg-config" $(pkg-config --libs marubackup-si)
check "$work/by-pkg-config" "$job"
# shellcheck disable=SC2046
"$compiler" -x c -std=c11 -Wall -Wextra -Wpedantic -Werror "$source/consumer_in_c.c" -x none \
    $(pkg-config --cflags marubackup-si) -o "$work/by-pkg-config-in-c" $(pkg-config --libs marubackup-si)
check "$work/by-pkg-config-in-c" "$version"

"$cmake" -G Ninja -S "$source" -B "$work/by-cmake" -DCMAKE_PREFIX_PATH="$work/tree" -DCMAKE_CXX_COMPILER="$compiler" \
    -DCMAKE_CXX_STANDARD=17 >"$work/cmake.log" || { cat "$work/cmake.log"; exit 1; }
"$cmake" --build "$work/by-cmake" >"$work/cmake.log" || { cat "$work/cmake.log"; exit 1; }
check "$work/by-cmake/consumer" "$job"
check "$work/by-cmake/consumer_in_c" "$version"
