#!/usr/bin/env bash
# The directory walker (Walk_TopDown with a callback that tests a name pattern) over a generated
# share of ENTRIES entries, as alice, warm cache, inside the appliance sandbox, timed with
# hyperfine against:
#   floor   bench/walk_floor.cc: getdents64 and one statx per entry relative to the directory's
#           descriptor, fnmatch: only the calls the walker's callback can't do without;
#   naive   the same program walking the classic way (chdir and opendir by
#           absolute path, a stat of each entry's absolute path);
#   bfs, find (-name, no stat needed), and find printing a stat field of every entry.
# Checks that all of them count the same matches; prints the ratios of the medians, and the peak
# memory of each (one run apart) and the walker's descriptors at its deepest level; time ratios
# of the medians and, steadier on a busy machine, of the mean CPU times.
#   bench-walk.sh [BUILD-DIR] [ENTRIES]   (default build-bench, built optimised and brought up to date;
#                                         1000000 entries)
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
cd "$root"
bash scripts/deps.sh --bench
build=${1:-build-bench}
entries=${2:-1000000}
# Always brought up to date (incremental): a stale library would be measured otherwise.
bash scripts/build.sh "$build" -DCMAKE_BUILD_TYPE=Release -DNORVO_BUILD_BENCH=ON -DNORVO_BUILD_TESTS=OFF >/dev/null
bin=$(cd "$build/bench" && pwd)
sandbox=$(cd "$build/tools/sandbox" && pwd)/norvo-sandbox
command -v hyperfine >/dev/null || { echo "bench-walk.sh: hyperfine is missing" >&2; exit 1; }

# Inside the sandbox /tmp is private and the host read-only: the results go beside the build.
work=$(cd "$build" && pwd)/bench-walk
rm -rf "$work" && mkdir -p "$work"
echo "basic" > "$work/walk.appliance"

cat > "$work/run.sh" <<'SH'
set -euo pipefail
bin=$1 work=$2 entries=$3
tree=/volume1/public/walk
pattern='*2019*.jpg'
as="setpriv --reuid=alice --regid=users --init-groups"
$as "$bin/walk_tree" "$tree" "$entries"
# Each reference spelt once: its hyperfine name and its command (a hyperfine -N command line).
names=(walker floor naive bfs find "find -printf")
commands=(
  "$as $bin/walk_norvo $tree /public/walk '$pattern'"
  "$as $bin/walk_floor $tree '$pattern'"
  "$as $bin/walk_floor --naive $tree '$pattern'"
  "$as bfs $tree -name @eaDir -prune -o -name '$pattern' -print"
  "$as find $tree -name @eaDir -prune -o -name '$pattern' -print"
  "$as find $tree -name @eaDir -prune -o -printf '%s\n' -name '$pattern' -printf 'm\n'"
)
python3 "$work/check.py" "${names[@]}" -- "${commands[@]}" | tee "$work/check.txt"
args=()
for i in "${!names[@]}"; do
  args+=(-n "${names[$i]}" "${commands[$i]}")
done
hyperfine -N --style basic --warmup 2 --min-runs 10 --export-json "$work/result.json" "${args[@]}"
SH

# Runs each command once: the counts must agree (ours print the count; bfs and find print one
# line per match, "find -printf" one "m" line per match). GNU time gives each peak memory: a
# child of this Python would carry Python's own peak over its exec.
cat > "$work/check.py" <<'PY'
import shlex, subprocess, sys, tempfile
cut = sys.argv.index("--")
names, commands = sys.argv[1:cut], sys.argv[cut + 1:]

def run(command):
    with tempfile.NamedTemporaryFile("r") as peak:
        out = subprocess.run(["/usr/bin/time", "-f", "%M", "-o", peak.name] + shlex.split(command),
                             stdout=subprocess.PIPE, check=True).stdout.decode(errors="replace")
        return out.splitlines(), int(peak.read().split()[-1]) / 1024

counts = {}
for name, command in zip(names, commands):
    lines, mib = run(command)
    counts[name] = (int(lines[0]) if name in ("walker", "floor", "naive")
                    else lines.count("m") if name == "find -printf" else len(lines))
    print(f"{name:13} {counts[name]:8} matches, peak memory {mib:6.1f} MiB")
if len(set(counts.values())) != 1:
    sys.exit(f"the counts differ: {counts}")
lines, _ = run(commands[0].replace("/walk_norvo ", "/walk_norvo --diag ", 1))
print(f"walker: {lines[1]}")
PY

"$sandbox" --no-log "$work/walk.appliance" -- bash "$work/run.sh" "$bin" "$work" "$entries"

python3 - "$work/result.json" "$entries" <<'PY'
import json, sys
median = {r["command"]: r["median"] for r in json.load(open(sys.argv[1]))["results"]}
cpu = {r["command"]: r["user"] + r["system"] for r in json.load(open(sys.argv[1]))["results"]}
print(f"{int(sys.argv[2])} entries: ratios of the median times (and of the mean CPU times, user + system)")
for a, b in (("walker", "floor"), ("walker", "bfs"), ("walker", "find"), ("walker", "find -printf"),
             ("naive", "floor")):
    print(f"  {a + ' / ' + b:22} {median[a] / median[b]:5.2f}  (CPU {cpu[a] / cpu[b]:.2f})")
PY
