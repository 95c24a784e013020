#!/usr/bin/env bash
# Compiles every daemon source (they use libcutils, liblog and libutils) against the
# real Android headers packaged by Debian, so that a stand-in whose signature drifted
# from the real interface is caught on the host. Exit 77 (skipped) without them.
set -u
top=${1:-$(cd "$(dirname "$0")/../.." && pwd)}
# The device is built with clang, which also knows the headers' clang pragmas.
if command -v clang++ >/dev/null 2>&1; then cxx=clang++; extra=(); else cxx=${CXX:-c++}; extra=(-Wno-unknown-pragmas); fi
andr=/usr/include/android
for h in cutils/properties.h cutils/sockets.h log/log.h utils/RefBase.h; do
  if [ ! -f "$andr/$h" ]; then
    echo "SKIPPED: $andr/$h is missing (install android-libcutils-dev android-liblog-dev android-libutils-dev)"
    exit 77
  fi
done
cd "$top" || exit 2
files=$(find src -name '*.cpp' | sort)
status=0; n=0
for f in $files; do
  n=$((n + 1))
  # The real Android headers come first; the platform folder only supplies what
  # Debian does not package (HIDL, vendor libraries).
  if ! "$cxx" -std=c++17 -fsyntax-only -Wall -Wextra -Werror "${extra[@]}" \
      -I tests/build/bionic-shim -I "$andr" -I src -I platform/include "$f"; then
    echo "FAILED against the Android headers: $f"; status=1
  fi
done
echo "$n daemon sources checked against the Android headers"
exit $status
