#!/usr/bin/env bash
# Builds and runs libFuzzer targets with clang (ASan + UBSan):
#   bash fuzz/run.sh TARGET [seconds]   one target, e.g. bash fuzz/run.sh ini 60
#   bash fuzz/run.sh all [seconds]      every target in turn, one at a time
# Targets: ini wire connection aescrypt bulkchange decode. Each runs for the
# given seconds (default 60) or 1,000,000 executions, whichever comes first,
# starting from fuzz/seeds/TARGET; its corpus grows in build/fuzz/corpus-TARGET,
# inputs that break it land in build/fuzz/artifacts, its log in build/fuzz/TARGET.log.
# Needs clang and the libFuzzer runtime (Debian: clang, libclang-rt-14-dev).
# Builds into build/fuzz; the normal build and the tests do not use it.
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
all_targets=(ini wire connection aescrypt bulkchange decode)
target=${1:-ini}
seconds=${2:-60}
runs=1000000
if ! command -v clang++ >/dev/null; then
  echo "fuzz: clang++ is missing (Debian: apt-get install clang libclang-rt-14-dev)" >&2
  exit 2
fi
if [[ "$target" == all ]]; then
  targets=("${all_targets[@]}")
elif [[ " ${all_targets[*]} " == *" $target "* ]]; then
  targets=("$target")
else
  echo "fuzz: unknown target '$target' (${all_targets[*]} or all)" >&2
  exit 2
fi
build="$top/build/fuzz"
cmake -S "$top" -B "$build" -DCMAKE_C_COMPILER=clang -DCMAKE_CXX_COMPILER=clang++ \
  -DSKYVANE_FUZZ=ON -DSKYVANE_BUILD_TESTS=OFF -DSKYVANE_BUILD_BENCH=OFF >/dev/null
if ! cmake --build "$build" --target "${targets[@]/%/_fuzz}" -j2 >&2; then
  echo "fuzz: the build failed; without the libFuzzer runtime (libclang-rt-14-dev) linking fails" >&2
  exit 2
fi
export ASAN_OPTIONS=detect_leaks=1 UBSAN_OPTIONS=print_stacktrace=1:halt_on_error=1 QT_QPA_PLATFORM=offscreen
mkdir -p "$build/artifacts"
cd "$build"

# Runs one target; prints its figures on one line.
run_one() {
  local name=$1 corpus="$build/corpus-$1" log="$build/$1.log"
  local seeds=("$top/fuzz/seeds/$name")
  [[ "$name" == ini && -d "$top/../shared/samples" ]] && seeds+=("$top/../shared/samples")
  mkdir -p "$corpus"
  local start=$SECONDS status=0
  "$build/bin/${name}_fuzz" -runs="$runs" -max_total_time="$seconds" -max_len=4096 -print_final_stats=1 \
    -artifact_prefix="$build/artifacts/$name-" "$corpus" "${seeds[@]}" >"$log" 2>&1 || status=$?
  local execs cov
  execs=$(sed -n 's/^stat::number_of_executed_units: *//p' "$log" | tail -n 1)
  cov=$(grep -Eo 'cov: [0-9]+ ft: [0-9]+ corp: [0-9]+/[0-9a-zA-Z]+' "$log" | tail -n 1)
  printf '%-11s %s  executions %s  %ss  corpus files %s  %s\n' "$name" \
    "$([[ $status == 0 ]] && echo ok || echo "FAILED ($status, see $log)")" "${execs:-?}" "$((SECONDS - start))" \
    "$(find "$corpus" -type f | wc -l)" "${cov:-}"
  return "$status"
}

failed=0
for name in "${targets[@]}"; do
  run_one "$name" || failed=1
done
exit "$failed"
