#!/usr/bin/env bash
# Builds the library and tours it on the built-in demo appliance; with --serve, serves the
# appliance's sharing links over HTTP instead (lighttpd on 127.0.0.1:8080, Ctrl-C stops).
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
cd "$root"
bash scripts/deps.sh
bash scripts/build.sh build -DCMAKE_BUILD_TYPE=RelWithDebInfo
exec bash demo/run.sh "$@"
