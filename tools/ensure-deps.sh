#!/usr/bin/env bash
# Installs the Debian packages the build and the tests need, when they are missing.
# Runs before every configure; does nothing (and needs no network) once they are there.
set -eu
need=()
for pkg in cmake g++ make libgtest-dev libgmock-dev libbenchmark-dev python3-serial gammu gsm-utils wvdial; do
  dpkg -s "$pkg" >/dev/null 2>&1 || need+=("$pkg")
done
[ ${#need[@]} -eq 0 ] && exit 0
echo "installing: ${need[*]}"
SUDO=""
[ "$(id -u)" -eq 0 ] || SUDO="sudo"
$SUDO apt-get update -qq
DEBIAN_FRONTEND=noninteractive $SUDO apt-get install -y -qq "${need[@]}"
