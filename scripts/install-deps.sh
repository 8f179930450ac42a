#!/usr/bin/env bash
# Installs the Debian packages that a task needs, and nothing when they are
# all present; uses sudo when not run as root.
#
#   scripts/install-deps.sh run        the libraries, kxacl and the example (scripts/run.sh)
#   scripts/install-deps.sh package    the Debian packages and their checks (scripts/package.sh)
#   scripts/install-deps.sh [test]     all of the above, and what the test suite, the
#                                      benchmarks, fuzzing and static analysis need
set -euo pipefail
run=(build-essential cmake)
package=("${run[@]}" debhelper dpkg-dev lintian libgtest-dev locales nlohmann-json3-dev pkgconf)
test=("${package[@]}" clang libclang-rt-14-dev libgmock-dev libbenchmark-dev valgrind
      cppcheck clang-tidy clang-format gettext-base python3 mandoc)
case "${1:-test}" in
  run) packages=("${run[@]}") ;;
  package) packages=("${package[@]}") ;;
  test) packages=("${test[@]}") ;;
  *) sed -n '2,9p' "$0" | sed 's/^# \{0,1\}//' >&2; exit 2 ;;
esac
missing=()
for p in "${packages[@]}"; do
  dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q 'install ok installed' || missing+=("$p")
done
[ ${#missing[@]} -eq 0 ] && exit 0
sudo=""
[ "$(id -u)" -eq 0 ] || sudo="sudo"
export DEBIAN_FRONTEND=noninteractive
$sudo apt-get update -q
$sudo apt-get install -y -q --no-install-recommends "${missing[@]}"
