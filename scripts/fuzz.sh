#!/usr/bin/env bash
# Builds and runs the libFuzzer targets of fuzz/ in a clang tree (build-fuzz/).
#
#   scripts/fuzz.sh build                    configure and build the tree
#   scripts/fuzz.sh check                    build, then every target's short run
#   scripts/fuzz.sh run <target> [seconds]   a long run (default 3600 s); the corpus
#                                            grows in build-fuzz/corpus/<target>
#   scripts/fuzz.sh list                     the targets
#
# A short run (what ctest runs as fuzz.<target>) executes the target a fixed
# number of times with a fixed seed, over a throw-away copy of the seed corpus
# in fuzz/corpus/<target>. Inputs that fail are kept in build-fuzz/artifacts/;
# replay one with build-fuzz/fuzz/<target> <file>.
set -euo pipefail
cd "$(dirname "$0")/.."
root=$PWD
tree="$root/build-fuzz"
artifacts="$tree/artifacts"

usage() { sed -n '2,13p' "$0" | sed 's/^# \{0,1\}//'; exit 2; }

build() {
  CC=clang CXX=clang++ cmake -S "$root" -B "$tree" -DCMAKE_BUILD_TYPE=RelWithDebInfo \
    -DKX_FUZZ=ON -DBUILD_TESTING=OFF -DCMAKE_COMPILE_WARNING_AS_ERROR=ON >/dev/null
  cmake --build "$tree" -j"$(nproc)"
}

# The line "name runs max_len" of a target, from the list the build writes.
target_line() {
  local line
  line=$(grep -E "^$1 " "$tree/fuzz/targets.txt" 2>/dev/null) || {
    echo "unknown fuzz target: $1 (see scripts/fuzz.sh list)" >&2; exit 2; }
  echo "$line"
}

# Options every run shares: the input limit, the dictionary, where failing
# inputs go, and how long one input may run before it counts as a hang
# (the slowest inputs known take half a second; a long run on a busy
# machine gets more room).
common_options() {
  local name=$1 max_len=$2 timeout=$3
  mkdir -p "$artifacts"
  echo "-max_len=$max_len -timeout=$timeout -artifact_prefix=$artifacts/$name- -print_final_stats=1"
  [ -f "$root/fuzz/$name.dict" ] && echo "-dict=$root/fuzz/$name.dict"
  return 0
}

short_run() {
  local name=$1 runs=$2 max_len=$3 binary=$4 work status=0
  work=$(mktemp -d)
  cp -r "$root/fuzz/corpus/$name/." "$work/"
  # shellcheck disable=SC2046
  "$binary" -runs="$runs" -seed=1 $(common_options "$name" "$max_len" 10) "$work" || status=$?
  rm -rf "$work"
  return "$status"
}

long_run() {
  local name=$1 seconds=${2:-3600} runs max_len corpus
  read -r name runs max_len <<<"$(target_line "$name")"
  corpus="$tree/corpus/$name"
  mkdir -p "$corpus"
  cp -rn "$root/fuzz/corpus/$name/." "$corpus/"
  # shellcheck disable=SC2046
  "$tree/fuzz/$name" -max_total_time="$seconds" $(common_options "$name" "$max_len" 60) "$corpus"
}

case "${1:-}" in
  build) build ;;
  check) build; (cd "$tree" && ctest --output-on-failure -L fuzz) ;;
  run) [ $# -ge 2 ] || usage; [ -x "$tree/fuzz/$2" ] || build; long_run "$2" "${3:-}" ;;
  list) cut -d' ' -f1 "$tree/fuzz/targets.txt" ;;
  short) [ $# -eq 5 ] || usage; short_run "$2" "$3" "$4" "$5" ;;
  *) usage ;;
esac
