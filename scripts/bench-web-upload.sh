#!/usr/bin/env bash
# A 1 GiB upload through the web front: lighttpd with norvo.cgi on 127.0.0.1 in a throwaway
# appliance, curl posting the file as a browser's form does. Prints the CGI process's peak
# resident memory (GNU time's maximum RSS around the program; the aim is below 16 MiB) and the
# upload's time.
#   bench-web-upload.sh [BUILD]     (default build/, configured if missing)
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
build=${1:-$root/build}
bash "$root/scripts/deps.sh" --bench
[ -f "$build/CMakeCache.txt" ] || cmake -S "$root" -B "$build" -DCMAKE_BUILD_TYPE=Release >/dev/null
cmake --build "$build" --target norvo-cgi norvo-sandbox -j2 >/dev/null
build=$(cd "$build" && pwd)

work=$(mktemp -d "$build/bench-web-upload.XXXXXX")
trap 'rm -rf "$work"' EXIT
cat >"$work/appliance" <<'APPLIANCE'
basic
privilege QUIB.TVQ.App.Tovana3.Instance @users
setting filebrowserxferlog=yes
link L1 owner=alice path=/public/dir
dir /volume1/public/dir owner=alice
APPLIANCE
# The program lighttpd runs: norvo.cgi under GNU time, its peak RSS (KiB) appended to a file.
cat >"$work/measured.cgi" <<WRAP
#!/bin/sh
exec /usr/bin/time -a -o $work/rss -f %M "$build/tools/norvo.cgi"
WRAP
chmod 755 "$work/measured.cgi"
cat >"$work/inside.sh" <<'INSIDE'
set -eu
dir=$(mktemp -d /tmp/webfront.XXXXXX) && mkdir "$dir/htdocs"
bash "$SOURCE/tools/cgi/lighttpd-conf.sh" "$dir" 18098 "$CGI" >"$dir/lighttpd.conf"
lighttpd -D -f "$dir/lighttpd.conf" &
while ! curl -s -o /dev/null http://127.0.0.1:18098/; do sleep 0.05; done
url="http://127.0.0.1:18098/cgi-bin/norvo.cgi"
curl -s -o /dev/null -c "$dir/jar" "$url?api=login&FOLDER_SHARING=L1"
head -c 1073741824 /dev/urandom >/volume2/big  # incompressible, allocated
: >"$WORK/rss"
start=$(date +%s.%N)
curl -sS -b "$dir/jar" -F "file=@/volume2/big;filename=big.bin" "$url?api=upload&FOLDER_SHARING=L1"
end=$(date +%s.%N)
cmp /volume2/big /volume1/public/dir/big.bin && echo "the upload arrived whole"
rss=$(tail -n 1 "$WORK/rss")
python3 -c "import sys; r=int(sys.argv[1]); t=float(sys.argv[3])-float(sys.argv[2]); print(f'norvo.cgi peak RSS: {r/1024:.1f} MiB (aim < 16 MiB); 1 GiB in {t:.2f} s ({1/t:.2f} GiB/s)')" "$rss" "$start" "$end"
INSIDE
"$build/tools/sandbox/norvo-sandbox" --no-log "$work/appliance" -- \
    /usr/bin/env SOURCE="$root" CGI="$work/measured.cgi" WORK="$work" /bin/bash "$work/inside.sh"
