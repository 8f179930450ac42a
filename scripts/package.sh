#!/usr/bin/env bash
# Builds the Debian packages libkxacl1, libkxacl-dev and kxacl from a copy
# of the sources in build-deb/, where the .deb files land, and checks them
# with lintian, which must find no error and no warning.
#
#   scripts/package.sh            build and check the packages
#   scripts/package.sh --install  also install them, build the consumer test
#                                 program and the example against them, run
#                                 those and the installed kxacl, then remove
#                                 the packages again (what CI does; root or sudo)
#
# DEB_BUILD_OPTIONS=nocheck leaves the test suite out of the package build.
set -euo pipefail
cd "$(dirname "$0")/.."
root=$PWD
out=$root/build-deb
packages=(kxacl libkxacl-dev libkxacl1)
install=0
case "${1:-}" in
  "") ;;
  --install) install=1 ;;
  *) sed -n '2,12p' "$0" | sed 's/^# \{0,1\}//' >&2; exit 2 ;;
esac
scripts/install-deps.sh package
sudo=""
[ "$(id -u)" -eq 0 ] || sudo="sudo"

build() {
  local version src
  version=$(dpkg-parsechangelog -S Version)
  src=$out/kxacl-$version
  rm -rf "$out"
  mkdir -p "$src"
  tar -C "$root" --exclude='./build*' --exclude='./install*' --exclude=./.git -cf - . |
    tar -C "$src" -xf -
  (cd "$src" && dpkg-buildpackage -us -uc -b -J"$(nproc)")
  lintian --fail-on error,warning "$out"/kxacl_"${version}"_*.changes
  echo "lintian: clean"
}

# The package files, without the debug symbols.
debs() {
  local p
  for p in "${packages[@]}"; do
    echo "$out/${p}_"*.deb
  done
}

# The non-directory files that the packages hold.
package_files() {
  local deb
  for deb in $(debs); do
    dpkg-deb --fsys-tarfile "$deb" | tar -t | grep -v '/$' | sed 's|^\./|/|'
  done
}

remove_packages() {
  $sudo dpkg --purge "${packages[@]}" >/dev/null
}

install_and_use() {
  local p
  for p in "${packages[@]}"; do
    if dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q 'install ok installed'; then
      echo "$p is installed on this machine already: not installing the new packages" >&2
      exit 1
    fi
  done
  # shellcheck disable=SC2046 # one word per file
  $sudo dpkg -i $(debs)
  trap remove_packages EXIT
  sh tests/package/install_test.sh cmake pkg-config cc \
    "lib/$(dpkg-architecture -qDEB_HOST_MULTIARCH)" "$out/consumer" --system
  # The example as a project of its own, as the README builds it.
  cmake -S examples -B "$out/example" >/dev/null
  cmake --build "$out/example" >/dev/null
  "$out/example/kxacl_example"
  trap - EXIT
  remove_packages
  local left
  left=$(package_files | while read -r f; do [ ! -e "$f" ] || echo "$f"; done)
  if [ -n "$left" ]; then
    printf 'Left behind after removing the packages:\n%s\n' "$left" >&2
    exit 1
  fi
  echo "packages installed, used and removed cleanly"
}

build
[ "$install" -eq 0 ] || install_and_use
