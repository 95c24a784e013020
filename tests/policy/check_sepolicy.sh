#!/usr/bin/env bash
# The device's SELinux policy (device/sepolicy) compiled with checkpolicy against
# the platform stub fixture, whose neverallow rules and the policy's own are
# checked by the compile; every type the contexts files name declared; the
# service definition's socket and folder labelled; and each rule of
# forbidden_rules.txt, added to the policy, refused.
set -u
here=$(cd "$(dirname "$0")" && pwd)
top=${1:-$(cd "$here/../.." && pwd)}
sepolicy=$top/device/sepolicy
fixture=$here/platform_stub_fixture
for tool in checkpolicy m4; do
    command -v "$tool" >/dev/null || { echo "$tool is missing (tools/ensure-deps.sh installs it)"; exit 1; }
done
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
status=0
fail() { echo "FAIL: $*"; status=1; }

# policy.conf from the fixture, the device policy and any extra .te files given.
compile() {
    { cat "$fixture/classes"
      m4 --fatal-warnings -s "$fixture/te_macros" "$fixture/platform.te" "$sepolicy"/*.te "$@"
      cat "$fixture/roles_users"
    } >"$work/policy.conf" || return 2
    checkpolicy -M -c 30 -o "$work/sepolicy" "$work/policy.conf" >"$work/out" 2>&1
}

if compile; then
    echo "device policy compiles and meets its neverallow rules"
else
    fail "device policy does not compile:"; cat "$work/out"
    exit 1
fi

# Types named by the contexts files must exist in the compiled policy.
declared() { grep -qE "^type $1[,;]" "$work/policy.conf"; }
for f in file_contexts property_contexts hwservice_contexts; do
    for t in $(grep -v '^#' "$sepolicy/$f" | grep -oE 'u:object_r:[a-z0-9_]+:s0' | cut -d: -f3); do
        declared "$t" || fail "$f names $t, which no policy declares"
    done
done
for t in $(grep -v '^#' "$sepolicy/seapp_contexts" | grep -oE '(domain|type)=[a-z0-9_]+' | cut -d= -f2); do
    declared "$t" || fail "seapp_contexts names $t, which no policy declares"
done

# What the service definition creates must carry the policy's labels.
labelled() {
    local path=$1 re
    while read -r re _; do
        [[ -z $re || $re == \#* ]] && continue
        [[ $path =~ ^$re$ ]] && return 0
    done <"$sepolicy/file_contexts"
    return 1
}
rc=$top/device/tolkd.rc
for s in $(awk '$1 == "socket" { print $2 }' "$rc"); do
    labelled "/dev/socket/$s" || fail "socket $s of tolkd.rc has no file_contexts label"
done
for d in $(awk '$1 == "mkdir" { print $2 }' "$rc"); do
    labelled "$d" || fail "folder $d of tolkd.rc has no file_contexts label"
done
for n in $(awk '$1 ~ /^\// { print $1 }' "$top/device/ueventd.rc"); do
    [[ $n == /dev/ttyGS0 ]] && continue  # the platform labels the gadget serial ports
    labelled "$n" || fail "device $n of ueventd.rc has no file_contexts label"
done

# Each forbidden rule alone must make the compile fail on a neverallow.
n=0
while IFS= read -r line; do
    rule=${line%%#*}
    [[ -z ${rule// } ]] && continue
    n=$((n + 1))
    printf '%s\n' "$rule" >"$work/forbidden.te"
    if compile "$work/forbidden.te"; then
        fail "accepted: $rule"
    elif ! grep -q 'neverallow' "$work/out"; then
        fail "refused, but not by a neverallow: $rule"; cat "$work/out"
    fi
done <"$here/forbidden_rules.txt"
echo "$n forbidden rules checked"
exit $status
