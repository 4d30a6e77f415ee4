#!/usr/bin/env bash
# Configures and builds one flavour: release (default), asan (ASan+UBSan) or tsan.
# Usage: bash scripts/build.sh [FLAVOUR [TARGET...]]   (targets: only those and what they need)
# Prints the build folder on the last line.
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
flavour=${1:-release}
targets=("${@:2}")
case "$flavour" in
  release) sanitize="" ;;
  asan)    sanitize=address ;;
  tsan)    sanitize=thread ;;
  *) echo "build: unknown flavour '$flavour' (release, asan, tsan)" >&2; exit 2 ;;
esac
build="$top/build/$flavour"
cmake -S "$top" -B "$build" -DSKYVANE_SANITIZE="$sanitize" >/dev/null
if ((${#targets[@]})); then
  cmake --build "$build" -j2 --target "${targets[@]}" >&2
else
  cmake --build "$build" -j2 >&2
fi
echo "$build"
