#!/usr/bin/env bash
# Time and peak memory of `norvo ls` (text and --json) of a 200,000-entry folder, inside the
# appliance sandbox. Each run is a child whose own ru_maxrss (wait4) is its peak resident set;
# prints the median wall time and the largest peak of five runs per form.
#   bench-listing-large.sh [BUILD-DIR] [OTHER-NORVO]   (default build-bench, built optimised
#   when missing; OTHER-NORVO, e.g. an older build, is measured the same way for comparison)
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
cd "$root"
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
    times, peaks = [], []
    for _ in range(RUNS):
        with open("/dev/null", "wb") as sink:
            start = time.monotonic()
            child = subprocess.Popen(args, stdout=sink)
            _, status, usage = os.wait4(child.pid, 0)
            times.append(time.monotonic() - start)
        if status != 0:
            sys.exit(f"{' '.join(args)} failed: {status}")
        peaks.append(usage.ru_maxrss)  # KiB
    return statistics.median(times), max(peaks) / 1024

rows = []
for label, binary in (("norvo", sys.argv[1]), ("other", sys.argv[2] if len(sys.argv) > 2 else "")):
    if binary:
        for form, json in (("text", False), ("json", True)):
            seconds, mib = measure(binary, json)
            rows.append((label, form, seconds, mib))
print(f"{'binary':8} {'form':5} {'median s':>9} {'peak MiB':>9}   ({ENTRIES} entries, {RUNS} runs)")
for label, form, seconds, mib in rows:
    print(f"{label:8} {form:5} {seconds:9.2f} {mib:9.1f}")
text = {label: (s, m) for label, form, s, m in rows if form == "text"}
for label, form, seconds, mib in rows:
    if form == "json":
        print(f"{label}: json / text: time {seconds / text[label][0]:.2f}, peak memory {mib / text[label][1]:.2f}")
PY

"$sandbox" --no-log "$work/big.appliance" -- python3 "$work/measure.py" "$norvo" ${other:+"$other"}
