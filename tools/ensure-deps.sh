#!/usr/bin/env bash
# Installs the Debian packages the build and the tests need, when they are missing.
# Runs before every configure; does nothing (and needs no network) once they are there.
# `ensure-deps.sh arm64` adds the aarch64 cross toolchain and qemu-user (make test-arm64).
set -eu
pkgs=(cmake g++ make libgtest-dev libgmock-dev libbenchmark-dev python3-serial gammu gsm-utils wvdial)
# The real libcutils, liblog and libutils headers: the check build.android_headers
# compiles the daemon against them, so that a stand-in that drifted is caught.
pkgs+=(android-libcutils-dev android-liblog-dev android-libutils-dev)
# checkpolicy (and the m4 its macros go through) compiles the device's SELinux policy.
pkgs+=(checkpolicy m4)
[ "${1:-}" = arm64 ] && pkgs+=(g++-aarch64-linux-gnu qemu-user)
need=()
for pkg in "${pkgs[@]}"; do
  dpkg -s "$pkg" >/dev/null 2>&1 || need+=("$pkg")
done
[ ${#need[@]} -eq 0 ] && exit 0
echo "installing: ${need[*]}"
SUDO=""
[ "$(id -u)" -eq 0 ] || SUDO="sudo"
$SUDO apt-get update -qq
DEBIAN_FRONTEND=noninteractive $SUDO apt-get install -y -qq "${need[@]}"
