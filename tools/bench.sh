#!/bin/sh
# Measures tolkd against its floors: builds the RelWithDebInfo daemon, tolk-sim and
# tolkd-bench in build-bench/ (or $BUILD) and runs the benchmark, which starts
# fresh simulated devices under /tmp and prints one table. Arguments go to
# tolkd-bench (--quick for a short smoke run). Takes about two minutes.
set -e
cd "$(dirname "$0")/.."
BUILD=${BUILD:-build-bench}
JOBS=${JOBS:-$(nproc 2>/dev/null || echo 2)}
# The stamp follows a configure that succeeded: a failed one is tried again.
if [ ! -f "$BUILD/.configured" ]; then
  cmake -S . -B "$BUILD" -DCMAKE_BUILD_TYPE=RelWithDebInfo -DTOLKD_BUILD_TESTS=OFF -DTOLKD_BUILD_BENCH=ON >/dev/null
  touch "$BUILD/.configured"
fi
cmake --build "$BUILD" --target tolkd-bench -j "$JOBS" >/dev/null

echo "Machine: $(lscpu | sed -n 's/^Model name: *//p' | head -1), $(nproc) CPUs, load $(cut -d' ' -f1-3 /proc/loadavg)"
echo "Kernel: $(uname -sr)"
echo "Compiler: $(sed -n 's/^CMAKE_CXX_COMPILER:[A-Z]*=//p' "$BUILD/CMakeCache.txt") ($("$(sed -n 's/^CMAKE_CXX_COMPILER:[A-Z]*=//p' "$BUILD/CMakeCache.txt")" -dumpfullversion)), build type $(sed -n 's/^CMAKE_BUILD_TYPE:[A-Z]*=//p' "$BUILD/CMakeCache.txt")"
echo
exec "$BUILD/bench/tolkd-bench" "$@"
