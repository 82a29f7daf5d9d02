#!/usr/bin/env bash
# The indexed search over a generated share of ENTRIES entries (bench/walk_tree.cc), warm cache,
# inside the appliance sandbox, as alice (a non-administrator), timed with hyperfine against:
#   index    bench/index_query.cc: FILEIDXResultGetAndTableGen of '*report*' into a fresh result
#            database, root's process with alice's effective identity, each row's folder checked
#            with access(2) as alice (once per folder);
#   plocate  plocate -b -i report over a plocate database of the same tree (updatedb -U, its
#            own output file, never the host's);
#   find     find -iname '*report*';
# and end to end: "norvo search --user alice --name report" of the tree (a task, WalkDB and its
# row filter, the hits in the task's database) with the index ("search") and, in a second
# hyperfine run of the same session with the index moved aside, the walk ("walk").
# Checks that all of them count the same hits, and reports the sizes of the two databases and
# the time of "norvo index update" after 1,000 new files against "norvo index build".
#   bench-index.sh [BUILD-DIR] [ENTRIES]   (default build-bench; 1000000 entries)
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
cd "$root"
bash scripts/deps.sh --bench
build=${1:-build-bench}
entries=${2:-1000000}
bash scripts/build.sh "$build" -DCMAKE_BUILD_TYPE=Release -DNORVO_BUILD_BENCH=ON -DNORVO_BUILD_TESTS=OFF >/dev/null
bin=$(cd "$build/bench" && pwd)
norvo=$(cd "$build/tools" && pwd)/norvo
sandbox=$(cd "$build/tools/sandbox" && pwd)/norvo-sandbox

work=$(cd "$build" && pwd)/bench-index
rm -rf "$work" && mkdir -p "$work"
echo "basic" > "$work/index.appliance"

cat > "$work/run.sh" <<'SH'
set -euo pipefail -f  # no globbing: the patterns are passed as they are
bin=$1 work=$2 entries=$3 norvo=$4
tree=/volume1/public/walk
as="setpriv --reuid=alice --regid=users --init-groups"
mkdir -p /volume1/@tmp && chmod 1777 /volume1/@tmp
$as "$bin/walk_tree" "$tree" "$entries"
seconds() { local t0; t0=$(date +%s.%N); "$@" >/dev/null; echo "$(date +%s.%N) - $t0" | bc; }
build=$(seconds "$norvo" index build /volume1)
updatedb -l 0 -U "$tree" -o "$work/plocate.db"
chmod 644 "$work/plocate.db"
names=(index search plocate find)
search="$norvo search --user alice --name report /public/walk"
commands=(
  "$bin/index_query /volume1 alice *report* /volume1/@tmp/hits.db"
  "$search"
  "$as plocate -d $work/plocate.db -b -i report"
  "$as find $tree -iname *report*"
)
counts=()
hits() { "$@" | awk '$1 ~ /^hits/ { print $NF }'; }
for c in "${commands[@]}"; do
  out=$($c)
  case "${c%% *}" in
    "$bin/index_query") counts+=("$out") ;;
    "$norvo") counts+=("$(printf '%s\n' "$out" | awk '$1 ~ /^hits/ { print $NF }')") ;;
    *) counts+=("$(printf '%s\n' "$out" | grep -c .)") ;;
  esac
done
mv /volume1/@fileidx/fileidx.db /volume1/@fileidx/aside.db  # no index: the same command walks
counts+=("$(hits $search)")
echo "hits: index ${counts[0]}, search ${counts[1]}, plocate ${counts[2]}, find ${counts[3]}, walk ${counts[4]}" |
  tee "$work/check.txt"
[ "$(printf '%s\n' "${counts[@]}" | sort -u | wc -l)" = 1 ] || { echo "the counts differ" >&2; exit 1; }
hyperfine -N --style basic --warmup 2 --min-runs 5 --export-json "$work/walk.json" -n walk "$search"
mv /volume1/@fileidx/aside.db /volume1/@fileidx/fileidx.db
args=()
for i in "${!names[@]}"; do args+=(-n "${names[$i]}" "${commands[$i]}"); done
hyperfine -N --style basic --warmup 3 --min-runs 20 --export-json "$work/result.json" "${args[@]}"
echo "$(stat -c %s /volume1/@fileidx/fileidx.db) $(stat -c %s "$work/plocate.db")" > "$work/sizes.txt"
# 1,000 new files in folders picked at random, then an update; then a full build.
find "$tree" -type d -not -path '*@eaDir*' | shuf -n 1000 --random-source=<(yes) | \
  awk '{ printf "%s/changed-%d.txt\n", $0, NR }' | $as xargs -d '\n' touch
update=$(seconds "$norvo" index update /volume1)
rebuild=$(seconds "$norvo" index build /volume1)
echo "$build $update $rebuild" > "$work/upkeep.txt"
SH

"$sandbox" --no-log "$work/index.appliance" -- bash "$work/run.sh" "$bin" "$work" "$entries" "$norvo"

python3 - "$work" "$entries" <<'PY'
import json, sys
work, entries = sys.argv[1], int(sys.argv[2])
results = json.load(open(f"{work}/result.json"))["results"] + json.load(open(f"{work}/walk.json"))["results"]
median = {r["command"]: r["median"] for r in results}
cpu = {r["command"]: r["user"] + r["system"] for r in results}
index, plocate = (int(x) for x in open(f"{work}/sizes.txt").read().split())
build, update, rebuild = (float(x) for x in open(f"{work}/upkeep.txt").read().split())
print(f"{entries} entries, '*report*' as alice: median times {', '.join(f'{k} {v*1000:.1f} ms' for k, v in median.items())}")
for a, b in (("index", "plocate"), ("index", "find"), ("search", "plocate"), ("search", "find"),
             ("search", "index"), ("walk", "find"), ("search", "walk")):
    print(f"  {a} / {b:8} {median[a] / median[b]:7.3f}  (CPU {cpu[a] / cpu[b]:.3f})")
print(f"  index size {index / 2**20:.1f} MiB, plocate's {plocate / 2**20:.1f} MiB: ratio {index / plocate:.2f}")
print(f"  build {build:.1f} s; update after 1,000 new files {update:.2f} s, a build then {rebuild:.1f} s: "
      f"ratio {update / rebuild:.3f}")
PY
