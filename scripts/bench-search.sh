#!/usr/bin/env bash
# The walking search (NvoSearchWalker, name terms "report": names containing it in any case,
# hits stored in the task's database) over the generated share of bench-walk.sh (ENTRIES
# entries), as alice, warm cache, in the appliance sandbox, timed with hyperfine against the
# stat-per-entry floor (bench/walk_floor.cc --icase '*report*'), find -iname and bfs -iname
# with the same exclusions. Checks that search, bfs and find count the same hits; prints the ratios of the
# medians (and of the mean CPU times).
#   bench-search.sh [BUILD-DIR] [ENTRIES]   (default build-bench, built optimised; 1000000)
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
cd "$root"
bash scripts/deps.sh --bench
build=${1:-build-bench}
entries=${2:-1000000}
bash scripts/build.sh "$build" -DCMAKE_BUILD_TYPE=Release -DNORVO_BUILD_BENCH=ON -DNORVO_BUILD_TESTS=OFF >/dev/null
bin=$(cd "$build/bench" && pwd)
sandbox=$(cd "$build/tools/sandbox" && pwd)/norvo-sandbox
command -v hyperfine >/dev/null || { echo "bench-search.sh: hyperfine is missing" >&2; exit 1; }
work=$(cd "$build" && pwd)/bench-search
rm -rf "$work" && mkdir -p "$work"
echo "basic" > "$work/search.appliance"

cat > "$work/run.sh" <<'SH'
set -euo pipefail
bin=$1 work=$2 entries=$3
tree=/volume1/public/walk
as="setpriv --reuid=alice --regid=users --init-groups"
$as "$bin/walk_tree" "$tree" "$entries"
"$bin/search_walk" --prepare alice /volume1
prune="-name @eaDir -prune -o -name @tmp -prune -o -name .DS_Store -prune"
# A search tests regular files and folders only.
test="\\( -type f -o -type d \\) -iname '*report*' -print"
names=(search floor bfs find)
commands=(
  "$as $bin/search_walk alice /public/walk report"
  "$as $bin/walk_floor --icase $tree '*report*'"
  "$as bfs $tree $prune -o $test"
  "$as find $tree $prune -o $test"
)
for i in "${!names[@]}"; do
  count=$(eval "${commands[$i]}" | { [ "$i" -lt 2 ] && cat || wc -l; })
  echo "${names[$i]}: $count hits"
  # The floor counts links named so too; a search tests files and folders only.
  [ "${names[$i]}" = floor ] || echo "$count" >> "$work/counts"
done
[ "$(sort -u "$work/counts" | wc -l)" = 1 ] || { echo "the counts differ" >&2; exit 1; }
args=()
for i in "${!names[@]}"; do
  args+=(-n "${names[$i]}" "${commands[$i]}")
done
hyperfine -N --style basic --warmup 2 --min-runs 10 --export-json "$work/result.json" "${args[@]}"
SH

"$sandbox" --no-log "$work/search.appliance" -- bash "$work/run.sh" "$bin" "$work" "$entries"

python3 - "$work/result.json" "$entries" <<'PY'
import json, sys
results = json.load(open(sys.argv[1]))["results"]
median = {r["command"]: r["median"] for r in results}
cpu = {r["command"]: r["user"] + r["system"] for r in results}
print(f"{int(sys.argv[2])} entries: ratios of the median times (and of the mean CPU times, user + system)")
for b in ("floor", "bfs", "find"):
    print(f"  search / {b:6} {median['search'] / median[b]:5.2f}  (CPU {cpu['search'] / cpu[b]:.2f})")
PY
