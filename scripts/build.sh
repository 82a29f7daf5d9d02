#!/usr/bin/env bash
# Configures and builds one configuration: build.sh DIR [cmake options...]. Incremental.
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
dir=$1; shift
if [ ! -f "$dir/CMakeCache.txt" ]; then
  cmake -S "$root" -B "$dir" "$@" >/dev/null
fi
cmake --build "$dir" -j"$(nproc)"
