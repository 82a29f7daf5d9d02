#!/usr/bin/env bash
# The whole-process time of `norvo ls` on a 1,000-entry directory against GNU `ls -l` of it,
# inside the appliance sandbox with hyperfine: ls -l as alice (through setpriv) and as root;
# prints the ratios of the medians.
#   bench-listing.sh [BUILD-DIR]   (default build-bench; built optimised when missing)
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
cd "$root"
bash scripts/deps.sh --bench
build=${1:-build-bench}
if [ ! -x "$build/tools/norvo" ] || [ ! -x "$build/tools/sandbox/norvo-sandbox" ]; then
  bash scripts/build.sh "$build" -DCMAKE_BUILD_TYPE=Release -DNORVO_BUILD_BENCH=ON -DNORVO_BUILD_TESTS=OFF
fi
norvo=$(cd "$build/tools" && pwd)/norvo
sandbox=$(cd "$build/tools/sandbox" && pwd)/norvo-sandbox
command -v hyperfine >/dev/null || { echo "bench-listing.sh: hyperfine is missing" >&2; exit 1; }

# Inside the sandbox /tmp is private and the host read-only: the results go beside the build,
# the one place the sandboxed command writes to the host.
work=$(cd "$build" && pwd)/bench-listing
rm -rf "$work" && mkdir -p "$work"
# 1,000 entries: 950 files and 50 folders, several owners and modes.
{
  echo "basic"
  echo "user carol"
  echo "dir /volume1/public/thousand owner=root mode=0777"
  owners=(alice bob carol root admin)
  for i in $(seq 0 999); do
    owner=${owners[$((i % 5))]}
    if [ "$i" -lt 50 ]; then
      echo "dir \"/volume1/public/thousand/Folder $i\" owner=$owner mode=0755"
    else
      echo "file \"/volume1/public/thousand/IMG_$((20190000 + i)) copy.jpg\" owner=$owner mode=0644 size=$((i * 37))"
    fi
  done
} > "$work/thousand.appliance"

"$sandbox" --no-log "$work/thousand.appliance" -- \
  hyperfine -N --style basic --warmup 5 --min-runs 100 --export-json "$work/result.json" \
  -n "norvo ls" "$norvo ls --user alice --sort name --limit 100 --info real_path,size,owner,time,perm,type,mount_point_type /public/thousand" \
  -n "ls -l" "setpriv --reuid=alice --regid=users --init-groups ls -l /volume1/public/thousand" \
  -n "ls -l (as root)" "ls -l /volume1/public/thousand"

python3 - "$work/result.json" <<'PY'
import json, sys
results = {r["command"]: r for r in json.load(open(sys.argv[1]))["results"]}
norvo = results["norvo ls"]["median"]
for name in ("ls -l", "ls -l (as root)"):
    print(f"norvo ls / {name}: {norvo / results[name]['median']:.2f} (medians)")
PY
