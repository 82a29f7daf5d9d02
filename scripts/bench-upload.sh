#!/usr/bin/env bash
# Moving a 1 GiB upload into place (bench/upload_move.sh) inside the appliance sandbox: within
# one volume (must be a rename) and across volumes against cp.
#   bench-upload.sh [BUILD-DIR]   (default build-bench, built optimised when missing)
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
cd "$root"
bash scripts/deps.sh --bench
build=${1:-build-bench}
if [ ! -x "$build/tools/norvo" ] || [ ! -x "$build/tools/sandbox/norvo-sandbox" ]; then
  bash scripts/build.sh "$build" -DCMAKE_BUILD_TYPE=Release -DNORVO_BUILD_BENCH=ON -DNORVO_BUILD_TESTS=OFF
fi
cmake --build "$build" --target norvo-cli norvo-sandbox -j2 >/dev/null
work=$(cd "$build" && pwd)/bench-upload
rm -rf "$work" && mkdir -p "$work"
printf 'basic\nsetting filebrowserxferlog=yes\n' > "$work/upload.appliance"
"$build/tools/sandbox/norvo-sandbox" --no-log "$work/upload.appliance" -- \
  "$root/bench/upload_move.sh" "$(cd "$build/tools" && pwd)/norvo" "$work"
