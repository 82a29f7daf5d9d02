#!/usr/bin/env bash
# Time and peak memory of `norvo ls` (text and --json) of a 200,000-entry folder, inside the
# appliance sandbox. Each run is a child whose own rusage (wait4) gives its peak resident set
# (ru_maxrss) and CPU time (user + system, steadier than wall time on a busy machine); prints
# the medians of the times and the largest peak of five runs per form.
#   bench-listing-large.sh [BUILD-DIR] [OTHER-NORVO]   (default build-bench, built optimised
#   when missing; OTHER-NORVO, e.g. an older build, is measured the same way for comparison)
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
cd "$root"
bash scripts/deps.sh --bench
build=${1:-build-bench}
other=${2:-}
if [ ! -x "$build/tools/norvo" ] || [ ! -x "$build/tools/sandbox/norvo-sandbox" ]; then
  bash scripts/build.sh "$build" -DCMAKE_BUILD_TYPE=Release -DNORVO_BUILD_BENCH=ON -DNORVO_BUILD_TESTS=OFF
fi
norvo=$(cd "$build/tools" && pwd)/norvo
sandbox=$(cd "$build/tools/sandbox" && pwd)/norvo-sandbox
[ -z "$other" ] || other=$(cd "$(dirname "$other")" && pwd)/$(basename "$other")

work=$(cd "$build" && pwd)/bench-listing-large
rm -rf "$work" && mkdir -p "$work"
printf 'basic\ndir /volume1/public/big owner=alice mode=0755\n' > "$work/big.appliance"

cat > "$work/measure.py" <<'PY'
import os, statistics, subprocess, sys, time

ENTRIES = 200_000
RUNS = 5
big = "/volume1/public/big"
owners = [1026, 1027, 1028, 0]  # several owners, so the name caches are used
for i in range(ENTRIES):
    path = f"{big}/IMG_{20190000 + i} copy.jpg" if i % 20 else f"{big}/Folder {i}"
    if i % 20:
        fd = os.open(path, os.O_CREAT | os.O_WRONLY, 0o644)
        os.ftruncate(fd, i * 37)
        os.fchown(fd, owners[i % 4], 100)
        os.close(fd)
    else:
        os.mkdir(path, 0o755)

def measure(binary, json):
    args = [binary] + (["--json"] if json else []) + ["ls", "--user", "alice", "--sort", "name", "/public/big"]
    times, cpus, peaks = [], [], []
    for _ in range(RUNS):
        with open("/dev/null", "wb") as sink:
            start = time.monotonic()
            child = subprocess.Popen(args, stdout=sink)
            _, status, usage = os.wait4(child.pid, 0)
            times.append(time.monotonic() - start)
        if status != 0:
            sys.exit(f"{' '.join(args)} failed: {status}")
        cpus.append(usage.ru_utime + usage.ru_stime)
        peaks.append(usage.ru_maxrss)  # KiB
    return statistics.median(times), statistics.median(cpus), max(peaks) / 1024

rows = []
for label, binary in (("norvo", sys.argv[1]), ("other", sys.argv[2] if len(sys.argv) > 2 else "")):
    if binary:
        for form, json in (("text", False), ("json", True)):
            rows.append((label, form) + measure(binary, json))
print(f"{'binary':8} {'form':5} {'wall s':>8} {'CPU s':>8} {'peak MiB':>9}   ({ENTRIES} entries, {RUNS} runs)")
for label, form, wall, cpu, mib in rows:
    print(f"{label:8} {form:5} {wall:8.2f} {cpu:8.2f} {mib:9.1f}")
text = {row[0]: row for row in rows if row[1] == "text"}
for label, form, wall, cpu, mib in rows:
    if form == "json":
        t = text[label]
        print(f"{label}: json / text: wall {wall / t[2]:.2f}, CPU {cpu / t[3]:.2f}, peak memory {mib / t[4]:.2f}")
PY

"$sandbox" --no-log "$work/big.appliance" -- python3 "$work/measure.py" "$norvo" ${other:+"$other"}
