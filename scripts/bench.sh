#!/usr/bin/env bash
# Builds the release flavour and runs the end-to-end benchmarks, printing one
# table (also kept in build/release/bench/e2e.md with the machine's details).
#   bash scripts/bench.sh           the whole run (about 7 minutes on 2 cores)
#   bash scripts/bench.sh --smoke   every stage briefly (seconds); figures mean nothing
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
mode=${1:-}
case "$mode" in
  ""|--smoke) ;;
  *) echo "bench: unknown option '$mode' (--smoke)" >&2; exit 2 ;;
esac
build=$(bash "$top/scripts/build.sh" release | tail -n 1)
mkdir -p "$build/bench"
out="$build/bench/e2e${mode:+-smoke}.md"
{
  echo "machine: $(nproc) cores, $(grep -m1 'model name' /proc/cpuinfo | cut -d: -f2 | sed 's/^ //'), $(free -g | awk '/Mem:/ {print $2}') GB"
  echo "started: $(date -u '+%Y-%m-%d %H:%M UTC'), load average $(cut -d' ' -f1-3 /proc/loadavg)"
  echo
} >"$out"
start=$(date +%s)
status=0
"$build/bin/skyvane_e2e_bench" $mode >>"$out" || status=$?
echo "" >>"$out"
echo "finished after $(( $(date +%s) - start )) s, load average $(cut -d' ' -f1-3 /proc/loadavg)" >>"$out"
cat "$out"
exit "$status"
