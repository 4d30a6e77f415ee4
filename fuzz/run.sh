#!/usr/bin/env bash
# Builds and runs a libFuzzer target with clang (ASan + UBSan):
#   bash fuzz/run.sh [target] [seconds]      e.g. bash fuzz/run.sh ini 60 (targets: ini, wire)
# Needs clang and the libFuzzer runtime (Debian: clang, libclang-rt-14-dev).
# Builds into build/fuzz; the normal build and the tests do not use it.
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
target=${1:-ini}
seconds=${2:-60}
if ! command -v clang++ >/dev/null; then
  echo "fuzz: clang++ is missing (Debian: apt-get install clang libclang-rt-14-dev)" >&2
  exit 2
fi
build="$top/build/fuzz"
cmake -S "$top" -B "$build" -DCMAKE_C_COMPILER=clang -DCMAKE_CXX_COMPILER=clang++ \
  -DSKYVANE_FUZZ=ON -DSKYVANE_BUILD_TESTS=OFF -DSKYVANE_BUILD_BENCH=OFF >/dev/null
cmake --build "$build" --target "${target}_fuzz" -j2 >&2
corpus="$build/corpus-$target"
mkdir -p "$corpus"
seeds=("$top/fuzz/seeds/$target")
[[ -d "$top/../shared/samples" ]] && seeds+=("$top/../shared/samples")
export ASAN_OPTIONS=detect_leaks=1 UBSAN_OPTIONS=print_stacktrace=1:halt_on_error=1
cd "$build"
exec "$build/bin/${target}_fuzz" -max_total_time="$seconds" -max_len=4096 -print_final_stats=1 \
  "$corpus" "${seeds[@]}"
