#!/usr/bin/env bash
# Installs what is needed, then builds and runs the whole test suite: once
# plainly and once under AddressSanitizer and UndefinedBehaviorSanitizer;
# then the concurrency tests alone under ThreadSanitizer.
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/install-deps.sh
jobs="$(nproc)"

run_tree() {
  local dir="$1"; shift
  cmake -S . -B "$dir" -DCMAKE_BUILD_TYPE=RelWithDebInfo "$@" >/dev/null
  cmake --build "$dir" -j"$jobs"
  (cd "$dir" && ctest --output-on-failure --timeout 300 -j"$jobs")
}

# The plain tree also builds the benchmark suite, so that it keeps
# compiling; scripts/bench.sh runs it.
run_tree build -DKX_BUILD_BENCH=ON
ASAN_OPTIONS=detect_leaks=1:abort_on_error=1 UBSAN_OPTIONS=print_stacktrace=1:halt_on_error=1 \
  run_tree build-asan -DKX_SANITIZE=ON

# Only the concurrency tests: their own executable, and ctest's selection.
cmake -S . -B build-tsan -DCMAKE_BUILD_TYPE=RelWithDebInfo -DKX_TSAN=ON >/dev/null
cmake --build build-tsan -j"$jobs" --target acl_thread_tests
(cd build-tsan && TSAN_OPTIONS=halt_on_error=1 ctest --output-on-failure -j"$jobs" -R 'Threads|threads')
