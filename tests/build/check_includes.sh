#!/usr/bin/env bash
# Fails when a daemon source includes anything from sim/ or tests/, or a header that
# exists only on the host (the daemon's sources must build unchanged for the
# device), or a header of a layer above its own.
set -u
top=${1:-$(cd "$(dirname "$0")/../.." && pwd)}
cd "$top" || exit 2
# Headers the device provides (Android platform, HIDL, vendor libraries) or that
# the daemon has itself; anything else outside the C/C++ standard and POSIX is host-only.
status=0
# One pass over the include lines (a loop of sed calls took seconds).
includes=$(grep -rnE '^[[:space:]]*#[[:space:]]*include' src --include='*.cpp' --include='*.h')
hostonly=$(printf '%s\n' "$includes" | awk '
  { inc = $0; sub(/.*#[[:space:]]*include[[:space:]]*[<"]/, "", inc); sub(/[>"].*/, "", inc)
    file = $0; sub(/:.*/, "", file)
    if (inc ~ /(^|\/)sim\// || inc ~ /^\.\.\// || inc ~ /tests\// || inc ~ /^tolk_platform\// || inc ~ /^(gtest|gmock)\// ||
        inc ~ /^(peers\.h|pty\.h|utmp\.h)$/ || inc ~ /(device_root|local_socket|radio_wire)\.h$/)
      print "host-only include in " file ": " inc }')
if [ -n "$hostonly" ]; then echo "$hostonly"; status=1; fi
if grep -rnE 'TOLKD_ROOT|tolk_device_path|tolk_abstract_name|tolk_local_server' src --include='*.cpp' --include='*.h' >/dev/null; then
  echo "host-only code in the daemon (device root lookups):"
  grep -rnE 'TOLKD_ROOT|tolk_device_path|tolk_abstract_name|tolk_local_server' src --include='*.cpp' --include='*.h'
  status=1
fi
# Layers call only down (core, then dispatch and the handlers, then targets, then
# the HAL bridge, then the host links in serial/): a lower layer includes nothing
# of the layers above it and notifies them through what it returns. The log and
# the property number reader in core/ are plain utilities for every layer; the
# target links name their targets by the command types of dispatch/.
allowed_up() {  # layer, included path: 0 when the include is allowed
  case "$2" in core/tolkd_log.h|core/prop_number.h|"$1"/*) return 0;; esac
  case "$1:$2" in
    targets:hal/*|targets:serial/*|targets:dispatch/command_type.h) return 0;;
    hal:*|serial:*|targets:*|attok:*) return 1;;
    dispatch:core/*|handlers:core/*|cit:core/*) return 1;;
  esac
  return 0
}
while IFS= read -r hit; do
  [ -n "$hit" ] || continue
  file=${hit%%:*}
  layer=${file#src/}; layer=${layer%%/*}
  inc=${hit#*\"}; inc=${inc%%\"*}
  if ! allowed_up "$layer" "$inc"; then echo "$file calls up: it includes $inc"; status=1; fi
done < <(printf '%s\n' "$includes" | grep -E '#[[:space:]]*include[[:space:]]*"')
[ $status -eq 0 ] && echo "daemon sources include no host-only header, and no layer includes one above it"
exit $status
