#!/usr/bin/env bash
# Prints the share of test code: lines of C++ under tests/ against all C++
# lines the repository tracks (tests, benchmarks and fuzz targets included).
# The project keeps it between a quarter and a third.
set -euo pipefail
cd "$(dirname "$0")/.."
count_lines() { git ls-files -z -- "$@" | xargs -0 -r cat | wc -l; }
cxx=('*.cpp' '*.h' '*.inc')
all=$(count_lines "${cxx[@]}")
tests=$(count_lines "${cxx[@]/#/tests/}")
awk -v t="$tests" -v a="$all" 'BEGIN {
  printf "test lines  %d\nall lines   %d\nshare       %.1f %%\n", t, a, (a ? 100 * t / a : 0) }'
