#!/usr/bin/env bash
# Requests per second through the web front: lighttpd with norvo.cgi on 127.0.0.1 in a throwaway
# appliance, one sharing-link session among 1,000 live ones, curl asking for the shared folder's
# listing 500 times (one at a time, then 8 at once), timed by hyperfine. Also one login's time.
# First, one authorisation in a fresh process (bench/login_once) with 100, 1,000 and 10,000 live
# sessions against its floor in a fresh process (bench/login_floor), and the price of merely
# starting a program that links the library (login_once load).
#   bench-login.sh [BUILD]     (default build/, configured if missing)
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
build=${1:-$root/build}
bash "$root/scripts/deps.sh" --bench
[ -f "$build/CMakeCache.txt" ] || cmake -S "$root" -B "$build" -DCMAKE_BUILD_TYPE=Release >/dev/null
cmake -S "$root" -B "$build" -DNORVO_BUILD_BENCH=ON >/dev/null
cmake --build "$build" --target norvo-cgi norvo-sandbox login_once login_floor -j2 >/dev/null
build=$(cd "$build" && pwd)

work=$(mktemp -d "$build/bench-login.XXXXXX")
trap 'rm -rf "$work"' EXIT
cat >"$work/appliance" <<'APPLIANCE'
basic
privilege QUIB.TVQ.App.Tovana3.Instance @users
link L1 owner=alice path=/public/dir
file /volume1/public/dir/a.txt owner=alice size=100
file /volume1/public/dir/b.txt owner=bob size=200
dir /volume1/public/dir/sub owner=alice
APPLIANCE
cat >"$work/inside.sh" <<'INSIDE'
set -eu
dir=$(mktemp -d /tmp/webfront.XXXXXX) && mkdir "$dir/htdocs"
up=$(cut -d. -f1 /proc/uptime)
for n in 100 1000 10000; do
    for i in $(seq "$n"); do
        [ "$i" = $((n / 2)) ] && id=SESSION0000000 || id=$(printf 'other%09d' "$i")
        printf '192.0.2.1,alice,%s,%s,%s,2,0,L\n' "$id" "$up" "$up"
    done >/tmp/foldersharing.current.users
    chmod 600 /tmp/foldersharing.current.users
    REQUEST_METHOD=GET REMOTE_ADDR=192.0.2.1 hyperfine -N --warmup 20 --runs 300 --export-json "$dir/once$n.json" \
        "$BENCH/login_floor" "$BENCH/login_once load" "$BENCH/login_once authorize" >/dev/null
    python3 -c "import json,sys; f,l,a=(r['mean']*1e6 for r in json.load(open(sys.argv[1]))['results']); print(f'{sys.argv[2]:>6} sessions, fresh process: floor {f:.0f} us, library loaded only {l:.0f} us, authorisation {a:.0f} us ({a/f:.2f} x floor; {a-l:.0f} us over loading)')" "$dir/once$n.json" "$n"
done
rm /tmp/foldersharing.current.users
bash "$SOURCE/tools/cgi/lighttpd-conf.sh" "$dir" 18099 "$CGI" >"$dir/lighttpd.conf"
lighttpd -D -f "$dir/lighttpd.conf" &
while ! curl -s -o /dev/null http://127.0.0.1:18099/; do sleep 0.05; done
url="http://127.0.0.1:18099/cgi-bin/norvo.cgi"
hyperfine -N --runs 3 --export-json "$dir/login.json" "curl -s -o /dev/null -c $dir/jar '$url?api=login&FOLDER_SHARING=L1'"
# 1,000 other live sessions beside ours.
up=$(cut -d. -f1 /proc/uptime)
for i in $(seq 1000); do printf '192.0.2.9,bob,other%08d,%s,%s,2,0,L1\n' "$i" "$up" "$up"; done >>/tmp/foldersharing.current.users
urls=$(for i in $(seq 500); do printf '%s ' "$url?api=list&FOLDER_SHARING=L1"; done)
for n in 1 8; do
    hyperfine -N --warmup 1 --runs 5 --export-json "$dir/list$n.json" \
        "curl -s -Z --parallel-max $n -o /dev/null -b $dir/jar $urls" >/dev/null
    python3 -c "import json,sys; m=json.load(open(sys.argv[1]))['results'][0]['mean']; print(f'authorised listings, {sys.argv[2]} at once: {500/m:.0f} requests/s')" "$dir/list$n.json" "$n"
done
python3 -c "import json,sys; m=json.load(open(sys.argv[1]))['results'][0]['mean']; print(f'one login: {m:.2f} s')" "$dir/login.json"
grep -c . /tmp/foldersharing.current.users | sed 's/^/session lines after the run: /'
INSIDE
"$build/tools/sandbox/norvo-sandbox" --no-log "$work/appliance" -- \
    /usr/bin/env SOURCE="$root" CGI="$build/tools/norvo.cgi" BENCH="$build/bench" /bin/bash "$work/inside.sh"
