#!/usr/bin/env bash
# Builds the benchmarks (optimised) and runs them: bench.sh [FILTER]. Figures are ratios against
# the reference each benchmark names, measured in the same run.
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
cd "$root"
bash scripts/deps.sh --bench
bash scripts/build.sh build-bench -DCMAKE_BUILD_TYPE=Release -DNORVO_BUILD_BENCH=ON -DNORVO_BUILD_TESTS=OFF
for exe in build-bench/bench/*_bench; do
  case "$(basename "$exe")" in *${1:-}*) "$exe" ;; esac
done
