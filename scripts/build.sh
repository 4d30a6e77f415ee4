#!/usr/bin/env bash
# Configures and builds one flavour: release (default), asan (ASan+UBSan) or tsan.
# Prints the build folder on the last line.
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
flavour=${1:-release}
case "$flavour" in
  release) sanitize="" ;;
  asan)    sanitize=address ;;
  tsan)    sanitize=thread ;;
  *) echo "build: unknown flavour '$flavour' (release, asan, tsan)" >&2; exit 2 ;;
esac
build="$top/build/$flavour"
cmake -S "$top" -B "$build" -DSKYVANE_SANITIZE="$sanitize" >/dev/null
cmake --build "$build" -j2 >&2
echo "$build"
