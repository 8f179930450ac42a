#!/bin/sh
# Installs a build tree into a fresh prefix, then builds a small C program
# against that prefix twice, with pkg-config and with find_package, and runs
# both. Arguments: cmake, pkg-config, build tree, work directory, C compiler,
# library directory under the prefix.
set -eu
cmake=$1 pkg_config=$2 build=$3 work=$4 cc=$5 libdir=$6
consumer=$(cd "$(dirname "$0")/consumer" && pwd)
prefix=$work/prefix

rm -rf "$work"
mkdir -p "$work"
"$cmake" --install "$build" --prefix "$prefix" >/dev/null

# The catalogue search path that the installation notes give for a prefix
# of its own.
NLSPATH="$prefix/share/locale/%L/LC_MESSAGES/%N"
export NLSPATH

expected="rwx 0xb
rwz 36
2650-146 Failure: One of the characters in the ACLE's
catalogue holds it"

check() {
    if [ "$2" != "$expected" ]; then
        printf 'The %s consumer printed:\n%s\nExpected:\n%s\n' "$1" "$2" "$expected"
        exit 1
    fi
}

flags=$(PKG_CONFIG_PATH="$prefix/$libdir/pkgconfig" "$pkg_config" --cflags --libs kxacl)
# shellcheck disable=SC2086 # the flags are separate words
"$cc" -std=c99 -Wall -Wextra -Werror -o "$work/with_pkg_config" "$consumer/consumer.c" $flags
out=$(LD_LIBRARY_PATH="$prefix/$libdir" "$work/with_pkg_config")
check pkg-config "$out"

"$cmake" -S "$consumer" -B "$work/with_find_package" -DCMAKE_PREFIX_PATH="$prefix" \
    -DCMAKE_C_COMPILER="$cc" >/dev/null
"$cmake" --build "$work/with_find_package" >/dev/null
# Its build-tree run path leads to the installed libraries.
out=$("$work/with_find_package/consumer")
check find_package "$out"
# The tool finds the installed libraries through its own run path.
out=$("$prefix/bin/kxacl" perms rwx)
if [ "$out" != "rwx 0x0000000b" ] || [ ! -f "$prefix/share/man/man1/kxacl.1" ]; then
    printf 'The installed kxacl printed:\n%s\n' "$out"
    exit 1
fi
echo "pkg-config and find_package consumers and the installed tool passed"
