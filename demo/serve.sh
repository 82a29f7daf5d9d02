#!/bin/sh
# Serves the demo appliance's sharing links over HTTP: lighttpd on 127.0.0.1 with norvo.cgi
# behind it, until interrupted. Run it through demo/run.sh --serve, inside the appliance.
#   NORVO_PORT (default 8080), NORVO_TRUSTED_PROXY (default none: forwarded addresses are stripped)
set -eu
if [ "${NORVO_IN_SANDBOX:-}" != 1 ]; then
    echo "serve.sh: run demo/run.sh --serve, which starts this inside the demo appliance" >&2
    exit 2
fi
port=${NORVO_PORT:-8080}
dir=$(mktemp -d /tmp/webfront.XXXXXX)
mkdir "$dir/htdocs"
bash "$NORVO_SOURCE/tools/cgi/lighttpd-conf.sh" "$dir" "$port" "$NORVO_CGI" "${NORVO_TRUSTED_PROXY:-}" >"$dir/lighttpd.conf"
url="http://127.0.0.1:$port/cgi-bin/norvo.cgi"
cat <<TEXT
Serving the links "photos" and "readme" of the link database at $url (Ctrl-C stops). Try:
  curl '$url?api=page&FOLDER_SHARING=photos'      (the landing page)
  curl -c jar '$url?api=login&FOLDER_SHARING=photos'
  curl -b jar '$url?api=list&FOLDER_SHARING=photos&sort=size'
A login takes a second. The library's log lines follow as syslog.err.
TEXT
exec lighttpd -D -f "$dir/lighttpd.conf"
