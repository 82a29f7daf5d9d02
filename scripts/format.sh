#!/usr/bin/env bash
# Formats every C and C++ file of the checkout with .clang-format: format.sh fixes them,
# format.sh --check only lists the ones that differ and fails if any does.
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
cd "$root"
format=$(command -v clang-format-14 || command -v clang-format)
mapfile -t files < <(git ls-files '*.c' '*.cc' '*.h')
if [ "${1:-}" = "--check" ]; then
  bad=()
  for f in "${files[@]}"; do
    "$format" --dry-run --Werror "$f" >/dev/null 2>&1 || bad+=("$f")
  done
  if [ ${#bad[@]} -gt 0 ]; then
    printf 'not formatted (bash scripts/format.sh fixes them):\n' >&2
    printf '  %s\n' "${bad[@]}" >&2
    exit 1
  fi
  echo "formatting: ${#files[@]} files as .clang-format says"
else
  "$format" -i "${files[@]}"
fi
