#!/usr/bin/env bash
# Builds and runs every test suite; with --sanitize, under ASan and UBSan.
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
"$root/scripts/build.sh" "$@"
dir="$root/build"
if [ "${1:-}" = "--sanitize" ]; then dir="$root/build-asan"; fi
cd "$dir"
ctest --output-on-failure
