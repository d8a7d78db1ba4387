#!/usr/bin/env bash
# Builds and runs every test suite; with --sanitize, under ASan and UBSan.
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
dir=$("$root/scripts/build.sh" "$@")
cd "$dir"
ctest --output-on-failure
