#!/bin/sh
# Inside the appliance sandbox (scripts/bench-upload.sh starts it): a 1 GiB upload moved into
# photo by `norvo upload` (CheckFile, MoveFile, the transfer record) within /volume1 and from
# /volume2, against `cp` of the same file across the same volumes (and `mv`, which removes the
# source too, as a move does). Prints hyperfine's table, whether the move within the volume was a rename (same inode), and the throughput ratios.
#   upload_move.sh NORVO WORK-DIR
set -eu
norvo=$1
work=$2
alice=$(id -u alice)
head -c 1073741824 /dev/urandom > /volume2/master  # incompressible, allocated: no sparse shortcut
for dir in /volume1/up /volume2/up; do mkdir -p "$dir" && chown "$alice" "$dir"; done
fresh() { cp /volume2/master "$1/f" && chown "$alice" "$1/f" && rm -f /volume1/public/f; }

fresh /volume1/up
before=$(stat -c %i /volume1/up/f)
"$norvo" upload --user alice /volume1/up/f /public/f > /dev/null
after=$(stat -c %i /volume1/public/f)
[ "$before" = "$after" ] && echo "within /volume1: a rename (inode $after kept)" || echo "within /volume1: NOT a rename"

hyperfine -N --warmup 1 --runs 15 --export-json "$work/upload.json" \
    --command-name "norvo upload, same volume" --prepare "$(command -v sh) -c 'cp /volume2/master /volume1/up/f && chown $alice /volume1/up/f && rm -f /volume1/public/f'" \
    "$norvo upload --user alice /volume1/up/f /public/f" \
    --command-name "norvo upload, across volumes" --prepare "$(command -v sh) -c 'cp /volume2/master /volume2/up/f && chown $alice /volume2/up/f && rm -f /volume1/public/f'" \
    "$norvo upload --user alice /volume2/up/f /public/f" \
    --command-name "cp, across volumes" --prepare "$(command -v sh) -c 'cp /volume2/master /volume2/up/f && rm -f /volume1/public/f'" \
    "cp /volume2/up/f /volume1/public/f" \
    --command-name "mv, across volumes" --prepare "$(command -v sh) -c 'cp /volume2/master /volume2/up/f && rm -f /volume1/public/f'" \
    "mv /volume2/up/f /volume1/public/f"

python3 - "$work/upload.json" <<'PY'
import json, sys
r = {x["command"]: x for x in json.load(open(sys.argv[1]))["results"]}
same, across, cp, mv = (r[k]["median"] for k in ("norvo upload, same volume", "norvo upload, across volumes",
                                                  "cp, across volumes", "mv, across volumes"))
gib = 1.0
print(f"median: same volume {same*1000:.1f} ms; across {across:.3f} s ({gib/across:.2f} GiB/s); cp {cp:.3f} s ({gib/cp:.2f} GiB/s)")
print(f"throughput across volumes, norvo upload / cp: {cp/across:.2f} (aim >= 0.9); / mv (copy and remove, as a move does): {mv/across:.2f}")
PY
