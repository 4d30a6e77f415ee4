#!/usr/bin/env bash
# Installs what is missing, builds and runs the tests.
#   bash scripts/test.sh                      what CI runs (.ci/run): the format check, every test
#                                             of the release flavour and the demo, then the
#                                             concurrency suites under ASan+UBSan and under TSan
#   bash scripts/test.sh FLAVOUR              every test of one flavour: release, asan or tsan
#   bash scripts/test.sh FLAVOUR concurrency  only the concurrency suites, only their targets built
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
flavour=${1:-ci}
scope=${2:-all}

# --- The whole CI run -------------------------------------------------------
if [[ "$flavour" == ci ]]; then
  bash "$top/scripts/setup.sh"
  bash "$top/scripts/format.sh" --check
  bash "$top/scripts/test.sh" release
  bash "$top/scripts/test.sh" asan concurrency
  bash "$top/scripts/test.sh" tsan concurrency
  exit 0
fi

# --- Concurrency suites: where threads and processes meet --------------------
# The platform's locks, windows and timers; the local-socket transport between
# processes; the runtime link; the cloud object sending through the Azure
# library; the module driven through its exports; the gateway as a library,
# as a process and end to end. Long tests labelled "fault" are left to the
# full runs.
concurrency=(platform_tests automation_local_socket_tests skyvane_runtime_link_tests skyvane_cloud_comm_tests
             skyvane_module_tests host_tests host_process_tests host_end_to_end_tests)
targets=()
selection=()
case "$scope" in
  all) ;;
  concurrency)
    targets=("${concurrency[@]}")
    selection=(-R "^($(IFS='|'; echo "${concurrency[*]}"))\$" -LE fault) ;;
  *) echo "test: unknown scope '$scope' (all, concurrency)" >&2; exit 2 ;;
esac

bash "$top/scripts/setup.sh"
build=$(bash "$top/scripts/build.sh" "$flavour" "${targets[@]}" | tail -n 1)
case "$flavour" in
  asan) export ASAN_OPTIONS=detect_leaks=1:abort_on_error=1 UBSAN_OPTIONS=print_stacktrace=1:halt_on_error=1 ;;
  tsan) export TSAN_OPTIONS=halt_on_error=1:second_deadlock_stack=1 ;;
esac
cd "$build"
ctest --output-on-failure -j2 "${selection[@]}"
if [[ "$flavour" == release ]]; then
  # The demo as a smoke step: the whole road from the README's first command, shortened.
  bash "$top/scripts/demo.sh" --duration 5
  # The end-to-end benchmarks as a smoke step: every stage runs, no figure is judged.
  "$build/bin/skyvane_e2e_bench" --smoke
fi
