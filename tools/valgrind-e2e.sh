#!/bin/sh
# The end-to-end tests with tolkd under valgrind memcheck, then a summary of the
# reports. Usage: tools/valgrind-e2e.sh [BUILD_DIR] [gtest filter]
# Each test keeps its device root (TOLK_E2E_KEEP) so the reports survive; they
# are collected into BUILD_DIR/valgrind/ and the roots removed afterwards.
set -u
here=$(cd "$(dirname "$0")" && pwd)
build=$(cd "${1:-$here/../build}" && pwd)
filter=${2:-*}
command -v valgrind >/dev/null || { echo "valgrind is not installed (apt-get install valgrind)" >&2; exit 2; }
export TOLKD_BIN="$build/src/tolkd"
export TOLK_E2E_TOLKD="$here/valgrind-tolkd.sh"
export TOLK_E2E_KEEP=1
# The soak runs a reduced count under valgrind.
export TOLK_SOAK_COMMANDS=${TOLK_SOAK_COMMANDS:-5000}
out="$build/valgrind"
rm -rf "$out"; mkdir -p "$out"
status=0
for t in "$build"/tests/e2e_*; do
    [ -x "$t" ] || continue
    name=$(basename "$t")
    echo "== $name"
    "$t" --gtest_filter="$filter" >"$out/$name.log" 2>&1 || { status=1; echo "   FAILED (see $out/$name.log)"; }
    grep -o 'device root kept: .*' "$out/$name.log" | cut -d' ' -f4 | while read -r root; do
        for f in "$root"/log/valgrind.*; do [ -f "$f" ] && cp "$f" "$out/$name.$(basename "$f")"; done
        rm -rf "$root"
    done
done
reports=$(ls "$out"/*.valgrind.* 2>/dev/null | wc -l)
errors=$(grep -h "ERROR SUMMARY" "$out"/*.valgrind.* 2>/dev/null | awk '{s+=$4} END {print s+0}')
definite=$(grep -h "definitely lost:" "$out"/*.valgrind.* 2>/dev/null | awk '{gsub(",","",$4); s+=$4} END {print s+0}')
echo "valgrind reports: $reports, errors: $errors, definitely lost bytes: $definite"
[ "$errors" = 0 ] && [ "$definite" = 0 ] || status=1
exit $status
