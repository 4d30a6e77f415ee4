#!/usr/bin/env bash
# Installs what is missing, builds one flavour (release, asan or tsan) and runs every test.
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
flavour=${1:-release}
bash "$top/scripts/setup.sh"
build=$(bash "$top/scripts/build.sh" "$flavour" | tail -n 1)
case "$flavour" in
  asan) export ASAN_OPTIONS=detect_leaks=1:abort_on_error=1 UBSAN_OPTIONS=print_stacktrace=1:halt_on_error=1 ;;
  tsan) export TSAN_OPTIONS=halt_on_error=1:second_deadlock_stack=1 ;;
esac
cd "$build"
ctest --output-on-failure -j2
if [[ "$flavour" == release ]]; then
  # The demo as a smoke step: the whole road from the README's first command, shortened.
  bash "$top/scripts/demo.sh" --duration 5
  # The end-to-end benchmarks as a smoke step: every stage runs, no figure is judged.
  "$build/bin/skyvane_e2e_bench" --smoke
fi
