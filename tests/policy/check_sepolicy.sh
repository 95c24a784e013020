#!/usr/bin/env bash
# The device's SELinux policy (device/sepolicy) compiled with checkpolicy against
# the platform stub fixture, whose neverallow rules and the policy's own are
# checked by the compile; every type the contexts files name declared; what the
# service definition creates labelled; and each rule of forbidden_rules.txt,
# added to the policy, refused by a neverallow rule.
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
    } >"$work/policy.conf" && checkpolicy -M -c 30 -o "$work/sepolicy" "$work/policy.conf" >"$work/out" 2>&1
}

compile || { cat "$work/out"; echo "FAIL: the device policy does not compile"; exit 1; }
echo "the device policy compiles and meets its neverallow rules"

for t in $(cat "$sepolicy"/*_contexts | grep -v '^#' | grep -oE 'u:object_r:[a-z0-9_]+:s0|(domain|type)=[a-z0-9_]+' |
           sed -E 's/^u:object_r:(.*):s0$/\1/; s/^[a-z]+=//' | sort -u); do
    grep -qE "^type $t[,;]" "$work/policy.conf" || fail "the contexts files name $t, which no policy declares"
done

labelled() {
    local re
    while read -r re _; do [[ $re != \#* && $1 =~ ^$re$ ]] && return 0; done <"$sepolicy/file_contexts"
    return 1
}
for path in $(awk '$1 == "socket" { print "/dev/socket/" $2 } $1 == "mkdir" { print $2 }' "$top/device/tolkd.rc"); do
    labelled "$path" || fail "$path of tolkd.rc has no file_contexts label"
done

n=0
while IFS= read -r line; do
    rule=${line%%#*}
    [[ -z ${rule// } ]] && continue
    n=$((n + 1))
    printf '%s\n' "$rule" >"$work/forbidden.te"
    if compile "$work/forbidden.te"; then fail "accepted: $rule"
    elif ! grep -q neverallow "$work/out"; then fail "refused, but not by a neverallow rule: $rule"; cat "$work/out"
    fi
done <"$here/forbidden_rules.txt"
echo "$n forbidden rules refused"
exit $status
