#!/usr/bin/env bash
# Configures and builds into build/ (or, with --sanitize, build-asan/).
# Extra arguments go to cmake's configure step (e.g. -DPYTHON27=/path/python2.7).
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
dir="$root/build"
args=()
if [ "${1:-}" = "--sanitize" ]; then
  shift
  dir="$root/build-asan"
  args+=(-DSBC_SANITIZE=ON -DCMAKE_BUILD_TYPE=Debug)
fi
cmake -S "$root" -B "$dir" "${args[@]}" "$@" >/dev/null
cmake --build "$dir" -j2 >/dev/null
