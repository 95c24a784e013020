#!/usr/bin/env bash
# The Makefile's configure step in a throw-away tree: a configure that failed
# (a compiler that does not exist) is retried afresh by the next make instead of
# wedging the tree, and a BUILD_TYPE given after a first build takes effect.
set -u
top=${1:-$(cd "$(dirname "$0")/../.." && pwd)}
tree=$(mktemp -d /tmp/tolk-make.XXXXXX)
trap 'rm -rf "$tree"' EXIT
# Not the jobserver of a make that runs this test, nor the settings it exports
# (make asan runs the suite with BUILD_TYPE=Debug and its own CMAKE_FLAGS).
mk() {
    env -u MAKEFLAGS -u MAKELEVEL -u MFLAGS -u BUILD -u BUILD_TYPE -u CMAKE_FLAGS -u JOBS -u TEST_JOBS \
        make -s -C "$top" configure BUILD="$tree/b" "$@" >>"$tree/out" 2>&1
}
type_is() { grep -qx "CMAKE_BUILD_TYPE:STRING=$1" "$tree/b/CMakeCache.txt" 2>/dev/null; }
mk CMAKE_FLAGS=-DCMAKE_CXX_COMPILER=/nonexistent/c++ && { echo "FAILED: a missing compiler configured"; exit 1; }
mk && [ -f "$tree/b/Makefile" ] && type_is RelWithDebInfo || { echo "FAILED: no recovery from a failed configure"; cat "$tree/out"; exit 1; }
mk BUILD_TYPE=Debug && type_is Debug || { echo "FAILED: BUILD_TYPE=Debug after a first configure was ignored"; cat "$tree/out"; exit 1; }
echo "make configure recovers from a failure and follows BUILD_TYPE"
