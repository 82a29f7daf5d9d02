#!/usr/bin/env bash
# Installs the build into a scratch prefix and builds a small program against it twice: with
# the CMake package and with pkg-config.
set -euo pipefail
build=$1; source_dir=$2; compiler=$3
scratch=$(mktemp -d)
trap 'rm -rf "$scratch"' EXIT
cmake --install "$build" --prefix "$scratch/prefix" >/dev/null
libdir=$(ls -d "$scratch"/prefix/lib*)
expect="418 error:error_reserved_name"

cmake -S "$source_dir" -B "$scratch/cmake" -DCMAKE_PREFIX_PATH="$scratch/prefix" \
  -DCMAKE_CXX_COMPILER="$compiler" >/dev/null
cmake --build "$scratch/cmake" >/dev/null
got=$(LD_LIBRARY_PATH="$libdir" "$scratch/cmake/consumer")
[ "$got" = "$expect" ] || { echo "CMake consumer printed '$got', expected '$expect'"; exit 1; }

flags=$(PKG_CONFIG_PATH="$libdir/pkgconfig" pkg-config --cflags --libs norvo)
# shellcheck disable=SC2086
"$compiler" -std=c++17 "$source_dir/consumer.cc" -o "$scratch/pc-consumer" $flags
got=$(LD_LIBRARY_PATH="$libdir" "$scratch/pc-consumer")
[ "$got" = "$expect" ] || { echo "pkg-config consumer printed '$got', expected '$expect'"; exit 1; }
echo "installed tree works with the CMake package and with pkg-config"
