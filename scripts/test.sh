#!/usr/bin/env bash
# Builds and runs every test twice: with gcc as it ships, and with clang under AddressSanitizer
# and UndefinedBehaviorSanitizer. Both builds treat warnings as errors.
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
cd "$root"
bash scripts/deps.sh

if [ "$(id -u)" -ne 0 ]; then
  echo "The tests build a throwaway appliance in a private mount namespace: run them as root." >&2
  exit 1
fi

status=0
echo "== plain build (gcc)"
bash scripts/build.sh build -DNORVO_WERROR=ON -DCMAKE_BUILD_TYPE=RelWithDebInfo
(cd build && ctest -j"$(nproc)" --output-on-failure) || status=1

echo "== sanitized build (clang, ASan+UBSan)"
bash scripts/build.sh build-asan -DNORVO_WERROR=ON -DNORVO_SANITIZE=ON -DCMAKE_BUILD_TYPE=Debug \
  -DCMAKE_C_COMPILER=clang -DCMAKE_CXX_COMPILER=clang++
(cd build-asan && ASAN_OPTIONS=detect_leaks=1:abort_on_error=0 UBSAN_OPTIONS=print_stacktrace=1 \
  ctest -j"$(nproc)" --output-on-failure) || status=1

exit $status
