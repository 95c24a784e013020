#!/usr/bin/env bash
# Builds the libFuzzer targets under fuzz/ with clang, AddressSanitizer and
# UndefinedBehaviorSanitizer (in build-fuzz/) and runs them.
#
#   tools/fuzz.sh short             every target from its corpus for 8 s (what CI runs);
#                                   fails on any crash, leak, time-out or memory blow-up
#   tools/fuzz.sh long [SECONDS]    a campaign of SECONDS per target (default 300);
#                                   with MERGE=1 new interesting inputs are merged back
#                                   into fuzz/corpus/<target>/
#   tools/fuzz.sh build             only configure and build
#
# TARGETS="reader cit" limits the run to some targets; JOBS (default 2) the build.
# Findings are kept in build-fuzz/findings/<target>/ (crash-*, leak-*, timeout-*),
# each run's log in build-fuzz/logs/<target>.log.
set -euo pipefail
cd "$(dirname "$0")/.."
ROOT=$PWD
BUILD=$ROOT/build-fuzz
JOBS=${JOBS:-2}
TARGETS=${TARGETS:-"attok dispatch reader writer cit"}
mode=${1:-short}

ensure_deps() {
  # clang brings libFuzzer and the sanitizer runtimes in libclang-rt-14-dev.
  local need=()
  command -v clang++ >/dev/null 2>&1 || need+=(clang)
  command -v cmake >/dev/null 2>&1 || need+=(cmake)
  local probe
  probe=$(mktemp -d)
  printf '#include <stddef.h>\n#include <stdint.h>\nextern "C" int LLVMFuzzerTestOneInput(const uint8_t *, size_t) { return 0; }\n' >"$probe/p.cpp"
  if ! clang++ -fsanitize=fuzzer,address,undefined "$probe/p.cpp" -o "$probe/p" >/dev/null 2>&1; then
    need+=(libclang-rt-14-dev)
  fi
  rm -rf "$probe"
  [ ${#need[@]} -eq 0 ] && return 0
  echo "installing: ${need[*]}"
  local sudo=""
  [ "$(id -u)" -eq 0 ] || sudo=sudo
  $sudo apt-get update -qq
  DEBIAN_FRONTEND=noninteractive $sudo apt-get install -y -qq "${need[@]}"
}

build() {
  ensure_deps
  # The stamp follows a configure that succeeded: a failed one is tried again.
  if [ ! -f "$BUILD/.configured" ]; then
    CC=clang CXX=clang++ cmake -S "$ROOT" -B "$BUILD" -DCMAKE_BUILD_TYPE=RelWithDebInfo \
      -DTOLKD_FUZZ=ON -DTOLKD_BUILD_TESTS=OFF -DTOLKD_BUILD_BENCH=OFF >/dev/null
    touch "$BUILD/.configured"
  fi
  cmake --build "$BUILD" --target fuzz_all -j "$JOBS"
}

max_len() {
  # Long enough for a full 6144-byte line plus the framing bytes of each target.
  case $1 in
    reader) echo 16384 ;;
    writer | dispatch) echo 8192 ;;
    cit) echo 4096 ;;
    *) echo 4096 ;;
  esac
}

# run TARGET SECONDS [MERGE_DIR]: runs one target; prints "TARGET EXECS" on success.
run_one() {
  local t=$1 secs=$2 bin="$BUILD/fuzz/fuzz_$t"
  local corpus="$ROOT/fuzz/corpus/$t" findings="$BUILD/findings/$t" work="$BUILD/work/$t"
  local log="$BUILD/logs/$t.log"
  mkdir -p "$findings" "$work" "$BUILD/logs" "$BUILD/tmp"
  # Device roots of runs that died (a crash skips their clean-up) stay in here.
  rm -rf "$BUILD/tmp/$t" && mkdir -p "$BUILD/tmp/$t"
  # New inputs go to a scratch corpus; the checked-in one is only read.
  local rc=0
  # Findings are written with a relative prefix: the targets map absolute paths into
  # their simulated device root while daemon code runs, which is when a crash lands.
  (cd "$findings" && TMPDIR="$BUILD/tmp/$t" "$bin" -max_total_time="$secs" -timeout=5 -rss_limit_mb=2048 -max_len="$(max_len "$t")" \
      -print_final_stats=1 -artifact_prefix=./ "$work" "$corpus") >"$log" 2>&1 || rc=$?
  local execs
  execs=$(sed -n 's/^stat::number_of_executed_units: *//p' "$log" | tail -1)
  if [ $rc -ne 0 ]; then
    echo "FAIL $t (exit $rc); see $log"
    grep -E "ERROR: |SUMMARY: |Test unit written" "$log" | head -5 || true
    return 1
  fi
  echo "$t ${execs:-0} executions in ${secs}s"
  if [ "${MERGE:-0}" = 1 ]; then
    local tmp
    tmp=$(mktemp -d)
    (cd "$work" && "$bin" -merge=1 -max_len="$(max_len "$t")" "$tmp" "$corpus" "$work") >>"$log" 2>&1
    local added=0
    for f in "$tmp"/*; do
      [ -e "$f" ] || continue
      [ -e "$corpus/$(basename "$f")" ] || { cp "$f" "$corpus/"; added=$((added + 1)); }
    done
    rm -rf "$tmp"
    echo "$t: merged $added new inputs into fuzz/corpus/$t"
  fi
}

case $mode in
  build) build ;;
  short | long)
    build
    secs=8
    [ "$mode" = long ] && secs=${2:-300}
    failed=0
    for t in $TARGETS; do run_one "$t" "$secs" || failed=1; done
    if [ $failed -ne 0 ]; then
      echo "fuzz: FAILED"
      exit 1
    fi
    echo "fuzz: all targets clean"
    ;;
  *)
    sed -n '2,16p' "$0"
    exit 2
    ;;
esac
