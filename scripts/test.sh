#!/usr/bin/env bash
# Builds and runs every test suite; with --sanitize, under ASan and UBSan;
# with --python PATH, against that interpreter (see build.sh).
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
"$root/scripts/build.sh" "$@"
. "$root/scripts/pyselect.sh"
cd "$sbc_dir"
ctest --output-on-failure
