#!/usr/bin/env bash
# Installs what is needed, builds the libraries and the kxacl tool, and runs
# an administrator's session on the example ACL file: compile and cache it,
# list it, check requesters, edit a compiled copy. Then runs the example
# program, a daemon's view of the same file. Builds only what it runs: the
# test suite needs more (scripts/test.sh).
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/install-deps.sh run
cmake -S . -B build -DCMAKE_BUILD_TYPE=RelWithDebInfo >/dev/null
cmake --build build -j"$(nproc)" --target kxacl kxacl_example kx_catalogue

kxacl=build/tool/kxacl
work="$(mktemp -d)"
trap 'rm -rf "$work"' EXIT
cp examples/resource.acl "$work/"
touch -d '-2 seconds' "$work/resource.acl" # a cache written in the text's second is not used
acl="$work/resource.acl"

show() { printf '\n$ kxacl %s\n' "$*"; "$kxacl" "$@" || printf '(exit status %d)\n' "$?"; }
show compile "$acl" --cache
show list "$acl"
show check "$acl" --user unix root@node2.cluster.example
show check "$acl" --user unix mallory@node9.cluster.example
show check "$acl" --group auditors clusterops
show compile "$acl" -o "$work/resource.buf"
show add "$work/resource.buf" --group backup --perms rl
show del "$work/resource.buf" --user unix root@node3.cluster.example
show list "$work/resource.buf" --type group --json
show perms rwx

printf '\n$ kxacl_example %s\n' "$acl"
build/examples/kxacl_example "$acl"
