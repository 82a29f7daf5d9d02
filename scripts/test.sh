#!/usr/bin/env bash
# Builds and runs every test twice: with gcc as it ships, and with clang under AddressSanitizer
# and UndefinedBehaviorSanitizer; then runs each fuzzer a short while (NORVO_FUZZ_SECONDS).
# Every build treats warnings as errors.
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
cd "$root"
bash scripts/deps.sh

if [ "$(id -u)" -ne 0 ]; then
  echo "The tests build a throwaway appliance in a private mount namespace: run them as root." >&2
  exit 1
fi

status=0
echo "== formatting"
bash scripts/format.sh --check || status=1

echo "== plain build (gcc)"
bash scripts/build.sh build -DNORVO_WERROR=ON -DCMAKE_BUILD_TYPE=RelWithDebInfo
(cd build && ctest -j"$(nproc)" --output-on-failure) || status=1

echo "== sanitized build (clang, ASan+UBSan)"
bash scripts/build.sh build-asan -DNORVO_WERROR=ON -DNORVO_SANITIZE=ON -DCMAKE_BUILD_TYPE=Debug \
  -DCMAKE_C_COMPILER=clang -DCMAKE_CXX_COMPILER=clang++
(cd build-asan && ASAN_OPTIONS=detect_leaks=1:abort_on_error=0 UBSAN_OPTIONS=print_stacktrace=1 \
  ctest -j"$(nproc)" --output-on-failure) || status=1

echo "== fuzzers (clang, libFuzzer, ASan+UBSan): each over its corpus for ${NORVO_FUZZ_SECONDS:=20} s"
bash scripts/build.sh build-fuzz -DNORVO_WERROR=ON -DNORVO_BUILD_FUZZERS=ON -DNORVO_BUILD_TESTS=OFF \
  -DCMAKE_BUILD_TYPE=RelWithDebInfo -DCMAKE_C_COMPILER=clang -DCMAKE_CXX_COMPILER=clang++
# New inputs go to build-fuzz/corpus (kept between runs); the committed seeds are only read.
# A failing input is left in build-fuzz/artifacts.
mkdir -p build-fuzz/artifacts
for source in fuzz/*_fuzz.cc; do
  name=$(basename "$source" .cc)
  mkdir -p "build-fuzz/corpus/$name"
  seeds=()
  [ -d "fuzz/corpus/$name" ] && seeds=("fuzz/corpus/$name")
  if ! "build-fuzz/fuzz/$name" -max_total_time="$NORVO_FUZZ_SECONDS" -timeout=10 -print_final_stats=0 \
      -artifact_prefix="build-fuzz/artifacts/$name-" "build-fuzz/corpus/$name" "${seeds[@]}" \
      >"build-fuzz/artifacts/$name.log" 2>&1; then
    echo "$name FAILED (build-fuzz/artifacts/$name.log):"
    grep -E '^(SUMMARY|artifact_prefix|==[0-9]+== ERROR)' "build-fuzz/artifacts/$name.log" || tail -5 "build-fuzz/artifacts/$name.log"
    status=1
  else
    echo "$name: ok ($(grep -Eo 'Done [0-9]+ runs' "build-fuzz/artifacts/$name.log" || echo 'no summary'))"
  fi
done

exit $status
