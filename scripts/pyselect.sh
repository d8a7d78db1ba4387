# Sourced by the scripts: reads --sanitize and --python PATH from the
# arguments and sets
#   sbc_dir     the build directory (build/, build-asan/, build-pyX.Y[-asan]/)
#   sbc_python  the interpreter given with --python (empty: Python 2.7)
#   sbc_cmake   the cmake arguments these imply
#   sbc_rest    the other arguments, in order
sbc_dir="$root/build"
sbc_python=""
sbc_sanitize=""
sbc_cmake=()
sbc_rest=()
while [ $# -gt 0 ]; do
  case "$1" in
    --sanitize) sbc_sanitize=1 ;;
    --python)
      if [ $# -lt 2 ]; then echo "--python needs the path of an interpreter" >&2; exit 2; fi
      sbc_python="$2"; shift ;;
    --python=*) sbc_python="${1#--python=}" ;;
    *) sbc_rest+=("$1") ;;
  esac
  shift
done
if [ -n "$sbc_python" ]; then
  if [ ! -x "$sbc_python" ]; then echo "No interpreter at $sbc_python" >&2; exit 2; fi
  sbc_version=$("$sbc_python" -c 'import sys; sys.stdout.write("%d.%d" % sys.version_info[:2])') || {
    echo "$sbc_python could not be run" >&2; exit 2; }
  case "$sbc_version" in
    2.7|3.8|3.9|3.10|3.11|3.12|3.13) ;;
    *) echo "$sbc_python is Python $sbc_version; the module builds for 2.7 and 3.8 to 3.13 only." >&2
       exit 2 ;;
  esac
  sbc_python=$(cd "$(dirname "$sbc_python")" && pwd)/$(basename "$sbc_python")
  sbc_dir="$root/build-py$sbc_version"
  sbc_cmake+=(-DPYTHON="$sbc_python")
fi
if [ -n "$sbc_sanitize" ]; then
  if [ -n "$sbc_python" ]; then sbc_dir="$sbc_dir-asan"; else sbc_dir="$root/build-asan"; fi
  sbc_cmake+=(-DSBC_SANITIZE=ON -DCMAKE_BUILD_TYPE=Debug)
fi
