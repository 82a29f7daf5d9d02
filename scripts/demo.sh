#!/usr/bin/env bash
# Builds the library and tours it on the built-in demo appliance.
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
cd "$root"
bash scripts/deps.sh
bash scripts/build.sh build -DCMAKE_BUILD_TYPE=RelWithDebInfo
exec bash demo/run.sh
