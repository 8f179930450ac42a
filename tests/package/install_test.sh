#!/bin/sh
# Builds a small C program against an installed tree twice, with pkg-config
# and with find_package, and runs both and the installed kxacl.
#
#   install_test.sh CMAKE PKG_CONFIG CC LIBDIR WORK BUILD RPATH
#       installs the build tree BUILD into WORK/prefix first; RPATH is 1 when
#       the installed programs carry their run path, 0 when they do not
#   install_test.sh CMAKE PKG_CONFIG CC LIBDIR WORK --system
#       uses the tree installed in /usr (the Debian packages), as programs
#       of the system find it: with no search path set
set -eu
cmake=$1 pkg_config=$2 cc=$3 libdir=$4 work=$5 build=$6 rpath=${7:-0}
consumer=$(cd "$(dirname "$0")/consumer" && pwd)

rm -rf "$work"
mkdir -p "$work"
if [ "$build" = --system ]; then
    prefix=/usr
    run_env=""
else
    prefix=$work/prefix
    "$cmake" --install "$build" --prefix "$prefix" >/dev/null
    PKG_CONFIG_PATH="$prefix/$libdir/pkgconfig" CMAKE_PREFIX_PATH="$prefix"
    # The catalogue search path that the installation notes give for a
    # prefix of its own.
    NLSPATH="$prefix/share/locale/%L/LC_MESSAGES/%N"
    export PKG_CONFIG_PATH CMAKE_PREFIX_PATH NLSPATH
    run_env="LD_LIBRARY_PATH=$prefix/$libdir"
fi

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

flags=$("$pkg_config" --cflags --libs kxacl)
# shellcheck disable=SC2086 # the flags are separate words
"$cc" -std=c99 -Wall -Wextra -Werror -o "$work/with_pkg_config" "$consumer/consumer.c" $flags
out=$(env $run_env "$work/with_pkg_config")
check pkg-config "$out"

# From here on the installed libraries find each other, and the tool finds
# them, through their own run paths, if they have them.
[ "$rpath" = 1 ] && run_env=""

"$cmake" -S "$consumer" -B "$work/with_find_package" -DCMAKE_C_COMPILER="$cc" >/dev/null
"$cmake" --build "$work/with_find_package" >/dev/null
# Its build-tree run path leads to the installed libraries.
out=$(env $run_env "$work/with_find_package/consumer")
check find_package "$out"

out=$(env $run_env "$prefix/bin/kxacl" perms rwx)
if [ "$out" != "rwx 0x0000000b" ]; then
    printf 'The installed kxacl printed:\n%s\n' "$out"
    exit 1
fi
# Debian packages hold their manual pages compressed.
man=$prefix/share/man/man1/kxacl.1
if [ ! -f "$man" ] && [ ! -f "$man.gz" ]; then
    echo "kxacl's manual page is not installed"
    exit 1
fi
echo "pkg-config and find_package consumers and the installed tool passed"
