#!/bin/sh
# Builds norvo and the sandbox when needed, then runs the guided tour inside the demo appliance.
#   demo/run.sh          build directory: $NORVO_BUILD_DIR, default build/ in the repository
#   demo/run.sh --serve  instead of the tour, serves the sharing links over HTTP (demo/serve.sh)
# Needs root: the sandbox builds the appliance in private namespaces; the host is not changed.
set -eu
root=$(cd "$(dirname "$0")/.." && pwd)
build=${NORVO_BUILD_DIR:-$root/build}

# The build's chatter only when it fails, so the tour stays readable.
log=$(mktemp)
trap 'rm -f "$log"' EXIT
if ! { [ -f "$build/CMakeCache.txt" ] || cmake -S "$root" -B "$build" -DCMAKE_BUILD_TYPE=RelWithDebInfo; } >"$log" 2>&1 ||
   ! cmake --build "$build" --target norvo-cli norvo-sandbox norvo-cgi -j2 >>"$log" 2>&1; then
    cat "$log" >&2
    echo "run.sh: the build failed" >&2
    exit 1
fi

build=$(cd "$build" && pwd)  # the sandbox may start the tour elsewhere

if [ "${1:-}" = --serve ]; then
    exec "$build/tools/sandbox/norvo-sandbox" "$root/demo/appliance.conf" -- \
        /usr/bin/env NORVO_IN_SANDBOX=1 NORVO_SOURCE="$root" NORVO_CGI="$build/tools/norvo.cgi" \
        NORVO_PORT="${NORVO_PORT:-8080}" NORVO_TRUSTED_PROXY="${NORVO_TRUSTED_PROXY:-}" /bin/sh "$root/demo/serve.sh"
fi

# --no-log: the library's syslog lines would mix with the tour.
"$build/tools/sandbox/norvo-sandbox" --no-log "$root/demo/appliance.conf" -- \
    /usr/bin/env NORVO_IN_SANDBOX=1 NORVO="$build/tools/norvo" NORVO_CGI="$build/tools/norvo.cgi" /bin/sh "$root/demo/tour.sh"
