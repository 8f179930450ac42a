#!/usr/bin/env bash
# Builds the benchmark suite in Release (-O2) and runs it: every benchmark
# five times, interleaved at random with the others, so that its baseline
# shares the machine's moods. Writes build-bench/results/results.json and
# the ratio table build-bench/results/ratios.md; further arguments go to
# the benchmark program (for example --benchmark_filter=single).
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/install-deps.sh
cmake -S . -B build-bench -DCMAKE_BUILD_TYPE=Release \
  -DCMAKE_CXX_FLAGS_RELEASE="-O2 -DNDEBUG" -DCMAKE_C_FLAGS_RELEASE="-O2 -DNDEBUG" \
  -DBUILD_TESTING=OFF -DKX_BUILD_BENCH=ON >/dev/null
cmake --build build-bench -j"$(nproc)" --target kxacl_bench
out=build-bench/results
mkdir -p "$out"
echo "before: $(uptime)" >"$out/load.txt"
build-bench/bench/kxacl_bench --benchmark_repetitions=5 --benchmark_enable_random_interleaving=true \
  --benchmark_report_aggregates_only=true \
  --benchmark_out="$out/results.json" --benchmark_out_format=json "$@"
echo "after: $(uptime)" >>"$out/load.txt"
cat "$out/load.txt"
python3 bench/ratios.py "$out/results.json" | tee "$out/ratios.md"
