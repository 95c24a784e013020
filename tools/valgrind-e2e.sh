#!/bin/sh
# The end-to-end tests with tolkd under valgrind memcheck, then a summary of the
# reports. Usage: tools/valgrind-e2e.sh [BUILD_DIR] [gtest filter]
# Every e2e binary runs, the transcript runner once per table under
# tests/transcripts/. Each test keeps its device root (TOLK_E2E_KEEP) so the
# reports survive; they are collected into BUILD_DIR/valgrind/ and the roots
# removed afterwards. Exit status 0 only when every test passed and the reports
# hold no error and no definitely lost byte; 2 when valgrind is missing.
set -u
here=$(cd "$(dirname "$0")" && pwd)
tables="$here/../tests/transcripts"
build=$(cd "${1:-$here/../build}" && pwd) || exit 2
filter=${2:-*}
command -v valgrind >/dev/null || { echo "valgrind is not installed (apt-get install valgrind)" >&2; exit 2; }
[ -x "$build/src/tolkd" ] || { echo "no tolkd in $build (make build first)" >&2; exit 2; }
export TOLKD_BIN="$build/src/tolkd"
export TOLK_E2E_TOLKD="$here/valgrind-tolkd.sh"
export TOLK_E2E_KEEP=1
# The soak runs a reduced count under valgrind.
export TOLK_SOAK_COMMANDS=${TOLK_SOAK_COMMANDS:-5000}
out="$build/valgrind"
rm -rf "$out"; mkdir -p "$out"
status=0
failed=""

# run NAME COMMAND...: one test binary (or one table), its log and its reports.
run() {
    name=$1; shift
    echo "== $name"
    "$@" --gtest_filter="$filter" >"$out/$name.log" 2>&1 || {
        status=1; failed="$failed $name"; echo "   FAILED (see $out/$name.log)"; }
    grep -o 'device root kept: .*' "$out/$name.log" | cut -d' ' -f4 | while read -r root; do
        for f in "$root"/log/valgrind.*; do [ -f "$f" ] && cp "$f" "$out/$name.$(basename "$f")"; done
        rm -rf "$root"
    done
}

for t in "$build"/tests/e2e_*; do
    [ -x "$t" ] || continue
    name=$(basename "$t")
    if [ "$name" = e2e_transcripts ]; then
        for tx in "$tables"/*.tx; do run "tx.$(basename "$tx" .tx)" "$t" "$tx"; done
    else
        run "$name" "$t"
    fi
done
reports=$(ls "$out" | grep -c '\.valgrind\.')
errors=$(cat "$out"/*.valgrind.* 2>/dev/null | grep "ERROR SUMMARY" | awk '{s+=$4} END {print s+0}')
definite=$(cat "$out"/*.valgrind.* 2>/dev/null | grep "definitely lost:" | awk '{gsub(",","",$4); s+=$4} END {print s+0}')
indirect=$(cat "$out"/*.valgrind.* 2>/dev/null | grep "indirectly lost:" | awk '{gsub(",","",$4); s+=$4} END {print s+0}')
possible=$(cat "$out"/*.valgrind.* 2>/dev/null | grep "possibly lost:" | awk '{gsub(",","",$4); s+=$4} END {print s+0}')
echo "valgrind reports (tolkd processes): $reports, errors: $errors, definitely lost bytes: $definite," \
     "indirectly lost: $indirect, possibly lost: $possible"
[ -n "$failed" ] && echo "tests that failed under valgrind:$failed"
[ "$reports" -gt 0 ] || { echo "no valgrind report was written" >&2; status=1; }
[ "$errors" = 0 ] && [ "$definite" = 0 ] || status=1
exit $status
