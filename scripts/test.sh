#!/usr/bin/env bash
# Installs what is needed, then builds and runs the whole test suite: once
# plainly and again under valgrind memcheck; optimised for release; under
# AddressSanitizer and UndefinedBehaviorSanitizer; the concurrency tests
# alone under ThreadSanitizer; every fuzz target for a short fixed number of
# runs; the static analysis (clang-tidy and cppcheck); and the Debian
# packages, built, installed, used and removed. Every tree treats warnings
# as errors.
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/install-deps.sh
jobs="$(nproc)"
suppressions="$PWD/tests/valgrind.supp"
ours=(-DBUILD_TESTING=ON -DCMAKE_COMPILE_WARNING_AS_ERROR=ON)

run_tree() {
  local dir="$1" type="$2"; shift 2
  cmake -S . -B "$dir" -DCMAKE_BUILD_TYPE="$type" "${ours[@]}" "$@" >/dev/null
  cmake --build "$dir" -j"$jobs"
  (cd "$dir" && ctest --output-on-failure --timeout 300 -j"$jobs")
}

# The plain tree also builds the benchmark suite, so that it keeps
# compiling; scripts/bench.sh runs it.
run_tree build RelWithDebInfo -DKX_BUILD_BENCH=ON

# The plain tree's tests again, each under valgrind memcheck: any error or
# definite leak fails the test. Left out: the tests that replace malloc to
# make it fail or to count allocations, which valgrind's own malloc bypasses.
(cd build && ctest -T memcheck --output-on-failure --timeout 900 -j"$jobs" \
  -E '^(OutOfMemoryTest|ProcessAllocationFailure|EvaluationAllocCount)\.' \
  --overwrite MemoryCheckCommand="$(command -v valgrind)" \
  --overwrite "MemoryCheckCommandOptions=--error-exitcode=1 --leak-check=full --errors-for-leak-kinds=definite,indirect --suppressions=$suppressions")

# Everything at -O3, where the compiler's analyses find more to warn about.
run_tree build-release Release -DKX_BUILD_BENCH=ON

ASAN_OPTIONS=detect_leaks=1:abort_on_error=1 UBSAN_OPTIONS=print_stacktrace=1:halt_on_error=1 \
  run_tree build-asan RelWithDebInfo -DKX_SANITIZE=ON

# Only the concurrency tests: their own executable, and ctest's selection.
cmake -S . -B build-tsan -DCMAKE_BUILD_TYPE=RelWithDebInfo -DKX_TSAN=ON "${ours[@]}" >/dev/null
cmake --build build-tsan -j"$jobs" --target acl_thread_tests
(cd build-tsan && TSAN_OPTIONS=halt_on_error=1 ctest --output-on-failure -j"$jobs" -R 'Threads|threads')

# Each fuzz target's short run (fuzz/CMakeLists.txt sets how many inputs).
scripts/fuzz.sh check

scripts/lint.sh

scripts/package.sh --install
