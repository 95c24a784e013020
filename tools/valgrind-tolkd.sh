#!/bin/sh
# Runs tolkd under valgrind memcheck, for `tolk-sim up --tolkd tools/valgrind-tolkd.sh`
# (tools/valgrind-e2e.sh sets that up for the end-to-end tests). One report per
# process in <device root>/log/valgrind.<pid>; any error makes tolkd exit 99.
# TOLKD_BIN names the daemon (default: build/src/tolkd beside this script).
here=$(cd "$(dirname "$0")" && pwd)
bin=${TOLKD_BIN:-$here/../build/src/tolkd}
root=${TOLKD_ROOT:?TOLKD_ROOT is set by tolk-sim}
exec valgrind --tool=memcheck --error-exitcode=99 --leak-check=full --show-leak-kinds=definite \
    --errors-for-leak-kinds=definite --track-fds=no --log-file="$root/log/valgrind.%p" "$bin" "$@"
