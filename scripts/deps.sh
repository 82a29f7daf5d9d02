#!/usr/bin/env bash
# Installs the Debian packages the build, the tests and the demo need, when they are missing.
set -euo pipefail

packages=(
  cmake g++ clang clang-format make pkg-config binutils
  libjsoncpp-dev libicu-dev libsqlite3-dev libcrypt-dev libacl1-dev acl
  libfuse3-dev fuse3 fusefat dosfstools fuseiso genisoimage sqlite3
  googletest libgtest-dev libgmock-dev libbenchmark-dev
  lighttpd curl chromium
)
[ "${1:-}" = "--bench" ] && packages+=(hyperfine bfs time plocate)

missing=()
for p in "${packages[@]}"; do
  dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q "install ok installed" || missing+=("$p")
done
[ ${#missing[@]} -eq 0 ] && exit 0

echo "Installing: ${missing[*]}"
sudo=""
[ "$(id -u)" -eq 0 ] || sudo="sudo"
$sudo apt-get update -qq
DEBIAN_FRONTEND=noninteractive $sudo apt-get install -y -qq --no-install-recommends "${missing[@]}" >/dev/null
