#!/usr/bin/env bash
# Installs the Debian packages that building and testing need. Does nothing
# when they are all present; uses sudo when not run as root.
set -euo pipefail
packages=(build-essential cmake g++ clang libclang-rt-14-dev libgtest-dev libgmock-dev
          libbenchmark-dev locales valgrind cppcheck clang-tidy clang-format gettext-base
          nlohmann-json3-dev pkgconf libc-dev-bin python3 mandoc)
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
