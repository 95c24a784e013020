#!/usr/bin/env bash
# make test-arm64: tolkd as the phone runs it, 64-bit Arm, on this x86-64 machine.
#
#   build-arm64/       tolkd, the unit tests and the platform tests, cross-built with
#                      Debian's aarch64 toolchain (static), plus GoogleTest for aarch64
#   build/             the x86-64 tolk-sim, its peers and the end-to-end tests: the
#                      tree make test builds (configured the same way), so CI builds
#                      them once
#
# The unit and platform tests run under qemu-aarch64; then the end-to-end suite
# (label e2e, transcripts included) runs against the arm64 daemon, started by the
# x86-64 tolk-sim through a qemu wrapper. See docs/ARM64.md.
set -euo pipefail
cd "$(dirname "$0")/.."
src=$(pwd)
cross=${ARM64_BUILD:-build-arm64}
host=${ARM64_HOST_BUILD:-build}
jobs=${JOBS:-2}
toolchain=$src/cmake/aarch64-linux-gnu.cmake
started=$(date +%s)

tools/ensure-deps.sh arm64
mkdir -p "$cross"
cross=$(cd "$cross" && pwd)

# GoogleTest for aarch64, from the sources libgtest-dev ships.
gtest=$cross/googletest
if [ ! -f "$gtest/lib/cmake/GTest/GTestConfig.cmake" ]; then
    cmake -S /usr/src/googletest -B "$cross/googletest-build" -DCMAKE_TOOLCHAIN_FILE="$toolchain" \
        -DCMAKE_BUILD_TYPE=Release -DCMAKE_INSTALL_PREFIX="$gtest" -DINSTALL_GTEST=ON >/dev/null
    cmake --build "$cross/googletest-build" -j "$jobs"
    cmake --install "$cross/googletest-build" >/dev/null
fi

echo "== cross build (aarch64): tolkd, unit and platform tests in $cross"
# Configured every time, so that the target lists below match the tree as it is now.
cmake -S . -B "$cross" -DCMAKE_TOOLCHAIN_FILE="$toolchain" -DCMAKE_BUILD_TYPE=RelWithDebInfo \
    -DTOLKD_BUILD_BENCH=OFF -DGTest_DIR="$gtest/lib/cmake/GTest" >/dev/null
# Every unit test program and the platform tests; tolk-sim and the end-to-end tests stay x86-64.
mapfile -t cross_targets < <(cmake --build "$cross" --target help | sed -n 's/^\.\.\. \(unit_[A-Za-z0-9_]*\|platform_tests\)$/\1/p')
cmake --build "$cross" -j "$jobs" --target tolkd "${cross_targets[@]}"
case $(readelf -h "$cross/src/tolkd") in
*AArch64*) ;;
*) echo "$cross/src/tolkd is not an aarch64 program" >&2; exit 1 ;;
esac

echo "== host build (x86-64): tolk-sim, peers, end-to-end tests in $host"
cmake -S . -B "$host" -DCMAKE_BUILD_TYPE=RelWithDebInfo -DTOLKD_BUILD_BENCH=OFF >/dev/null
mapfile -t host_targets < <(cmake --build "$host" --target help | sed -n 's/^\.\.\. \(e2e_[A-Za-z0-9_]*\)$/\1/p')
cmake --build "$host" -j "$jobs" --target tolk-sim "${host_targets[@]}"

# tolk-sim starts the daemon it is given with the device's environment and
# arguments; exec keeps the pid it records, so the harness's /proc checks (the
# select wait that means "serving", descriptor counts) see the emulated daemon.
wrapper=$cross/tolkd-qemu
cat >"$wrapper" <<EOF
#!/bin/sh
exec qemu-aarch64 "$cross/src/tolkd" "\$@"
EOF
chmod +x "$wrapper"

status=0
echo "== unit and platform tests under qemu-aarch64"
if ! (cd "$cross" && ctest -L 'unit|platform' -j "$jobs" --timeout 120 --output-on-failure); then
    # A "threadsafe" death test re-executes its own program, which the kernel
    # cannot run without binfmt_misc. Each failed case runs once more alone: one
    # whose child could not be executed is left to make test, which runs it
    # natively; any other failure counts.
    failed=()
    list=$cross/Testing/Temporary/LastTestsFailed.log
    [ -s "$list" ] && mapfile -t failed < <(cut -d: -f2- "$list")
    [ ${#failed[@]} -gt 0 ] || status=1
    for name in "${failed[@]}"; do
        out=$(cd "$cross" && ctest -R "^${name}\$" --output-on-failure 2>&1) || true
        if grep -q 'failed: Exec format error' <<<"$out"; then
            echo "not run under qemu-user (its death test re-executes the program): $name"
        else
            echo "FAILED under qemu-user: $name"
            status=1
        fi
    done
fi

echo "== end-to-end tests: x86-64 tolk-sim and peers, aarch64 tolkd under qemu"
# Each test has its own timeout (120 s); under qemu the slowest takes about 10 s.
# The soak is registered for its own ctest configuration only and is left out.
(cd "$host" && TOLK_E2E_TOLKD="$wrapper" ctest -L e2e -j "$jobs" --output-on-failure) || status=1

echo "make test-arm64: $(( $(date +%s) - started )) s, $([ $status = 0 ] && echo passed || echo FAILED)"
exit $status
