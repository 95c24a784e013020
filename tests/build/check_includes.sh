#!/usr/bin/env bash
# Fails when a daemon source includes anything from sim/ or tests/, or a header that
# exists only on the host. The daemon's sources must build unchanged for the device.
set -u
top=${1:-$(cd "$(dirname "$0")/../.." && pwd)}
cd "$top" || exit 2
# Headers the device provides (Android platform, HIDL, vendor libraries) or that
# the daemon has itself; anything else outside the C/C++ standard and POSIX is host-only.
status=0
while IFS= read -r hit; do
  file=${hit%%:*}
  inc=$(printf '%s' "$hit" | sed -E 's/.*#[[:space:]]*include[[:space:]]*[<"]([^>"]+)[>"].*/\1/')
  case "$inc" in
    */sim/*|sim/*|../*|*tests/*|tolk_platform/*|peers.h|gtest/*|gmock/*|pty.h|utmp.h|*device_root.h|*local_socket.h|*radio_wire.h)
      echo "host-only include in $file: $inc"; status=1;;
  esac
done < <(grep -rnE '^[[:space:]]*#[[:space:]]*include' src --include='*.cpp' --include='*.h')
if grep -rnE 'TOLKD_ROOT|tolk_device_path|tolk_abstract_name|tolk_local_server' src --include='*.cpp' --include='*.h' >/dev/null; then
  echo "host-only code in the daemon (device root lookups):"
  grep -rnE 'TOLKD_ROOT|tolk_device_path|tolk_abstract_name|tolk_local_server' src --include='*.cpp' --include='*.h'
  status=1
fi
[ $status -eq 0 ] && echo "daemon sources include no host-only header"
exit $status
