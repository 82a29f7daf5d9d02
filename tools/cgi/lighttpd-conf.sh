#!/bin/bash
# Prints a lighttpd configuration that serves the norvo CGI program on 127.0.0.1.
# Usage: lighttpd-conf.sh DIR PORT CGI-PROGRAM [TRUSTED-PROXY-ADDRESS]
# DIR holds the server's pid, logs and an empty document root. The forwarded-address headers
# (X-Forwarded-For, Client-IP) reach the program only from the trusted proxy: from anyone else
# they would let a client choose the address its session and failed logins are kept under.
set -euo pipefail
dir=$1 port=$2 cgi=$3 trusted=${4:-}
case $port in '' | *[!0-9]*) echo "lighttpd-conf.sh: bad port '$port'" >&2; exit 2 ;; esac
strip='setenv.set-request-header = ("X-Forwarded-For" => "", "Client-IP" => "")'
cat <<CONF
server.modules = ("mod_access", "mod_alias", "mod_setenv", "mod_cgi")
server.bind = "127.0.0.1"
server.port = $port
server.document-root = "$dir/htdocs"
# Pages put beside the program (a test's own) are HTML, not downloads.
mimetype.assign = (".html" => "text/html; charset=utf-8")
server.errorlog = "$dir/error.log"
server.pid-file = "$dir/lighttpd.pid"
server.upload-dirs = ("$dir")
# Uploads stream through to the program as they arrive (never whole in the server's memory or
# files); 16 GiB at most, in KiB.
server.stream-request-body = 2
server.max-request-size = 16777216
alias.url = ("/cgi-bin/norvo.cgi" => "$cgi")
\$HTTP["url"] =^ "/cgi-bin/" { cgi.assign = ("" => "") }
CONF
if [[ -n $trusted ]]; then
    printf '$HTTP["remoteip"] != "%s" { %s }\n' "$trusted" "$strip"
else
    printf '%s\n' "$strip"
fi
