#!/usr/bin/env bash
# The Makefile's configure step in a throw-away tree: a configure that failed
# (here: a compiler that does not exist) is retried afresh by the next make
# instead of wedging the tree, and a BUILD_TYPE given after a first build takes
# effect instead of being ignored.
set -u
top=${1:-$(cd "$(dirname "$0")/../.." && pwd)}
tree=$(mktemp -d /tmp/tolk-make.XXXXXX)
trap 'rm -rf "$tree"' EXIT
# Not the jobserver of a make that runs this test.
mk() { env -u MAKEFLAGS -u MAKELEVEL -u MFLAGS make -s -C "$top" configure BUILD="$tree/b" "$@" >"$tree/out" 2>&1; }
cache_type() { sed -n 's/^CMAKE_BUILD_TYPE:STRING=//p' "$tree/b/CMakeCache.txt" 2>/dev/null; }
status=0
fail() { echo "FAILED: $*"; cat "$tree/out"; status=1; }

mk CMAKE_FLAGS=-DCMAKE_CXX_COMPILER=/nonexistent/c++ && fail "a configure with a missing compiler succeeded"
mk || fail "the configure after a failed one did not recover"
[ -f "$tree/b/Makefile" ] || fail "no build files after the second configure"
[ "$(cache_type)" = RelWithDebInfo ] || fail "default build type: '$(cache_type)'"
mk BUILD_TYPE=Debug || fail "configure with BUILD_TYPE=Debug"
[ "$(cache_type)" = Debug ] || fail "BUILD_TYPE=Debug after a first configure was ignored: '$(cache_type)'"
[ $status = 0 ] && echo "make configure recovers from a failure and follows BUILD_TYPE"
exit $status
