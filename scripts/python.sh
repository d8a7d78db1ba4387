#!/usr/bin/env bash
# The Python 2.7 interpreter the project builds against, on build/python;
# with --python PATH (first), that interpreter on build-pyX.Y/python.
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
if [ "${1:-}" = "--python" ]; then
  . "$root/scripts/pyselect.sh" --python "${2:-}"
  shift 2
  export PYTHONPATH="$sbc_dir/python${PYTHONPATH:+:$PYTHONPATH}"
  exec "$sbc_python" "$@"
fi
export PYTHONPATH="$root/build/python${PYTHONPATH:+:$PYTHONPATH}"
if [ -n "${PYTHON27:-}" ]; then exec "$PYTHON27" "$@"; fi
for p in "$(pyenv root 2>/dev/null)/versions/2.7.18/bin/python2.7" "$HOME/.pyenv/versions/2.7.18/bin/python2.7"; do
  if [ -x "$p" ]; then exec "$p" "$@"; fi
done
if command -v python2.7 >/dev/null; then exec python2.7 "$@"; fi
echo "No Python 2.7 interpreter found: install 2.7.18 with pyenv or set PYTHON27." >&2
exit 1
