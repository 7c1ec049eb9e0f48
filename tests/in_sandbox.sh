#!/bin/sh
# in_sandbox.sh LAUNCHER TEST [ARGUMENT...]: how CTest starts a test executable. To
# list its tests no sandbox is needed, so a machine without one still knows what
# it has to skip.
launcher=$1
shift
case " $* " in
*" --gtest_list_tests "*) exec "$@" ;;
*) exec "$launcher" "$@" ;;
esac
