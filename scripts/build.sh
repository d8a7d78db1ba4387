#!/usr/bin/env bash
# Configures and builds into build/ (or, with --sanitize, build-asan/).
# With --python PATH, builds against that interpreter (2.7 or 3.8 to 3.13)
# into build-pyX.Y/ (build-pyX.Y-asan/ with --sanitize).
# Extra arguments go to cmake's configure step (e.g. -DPYTHON27=/path/python2.7).
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
. "$root/scripts/pyselect.sh"
cmake -S "$root" -B "$sbc_dir" "${sbc_cmake[@]}" "${sbc_rest[@]}" >/dev/null
cmake --build "$sbc_dir" -j2 >/dev/null
