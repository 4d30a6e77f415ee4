#!/usr/bin/env bash
# Soak: runs skyvane-gateway for MINUTES at ten times a nominal load and fails
# when its memory, open files or threads grow.
#
# Usage: bash scripts/soak.sh MINUTES      (at least 2; 30 for a real soak)
#
# The load: a generated project of 10,000 number variables, each changing
# every 500 ms, spread over the ticks (20,000 changes/s in all), every one of
# them exported to a Service Bus queue (JSON) and an Event Hub (BOND) of
# azure-local on loopback, which keeps only 1,000 rows and records nothing, so
# that the receiver stays small. The runtime stand-in runs inside the gateway
# (--simulate), so the gateway's figures include it.
#
# Faults, one every 60 s from 30 s on, in turn: 20 requests answered 503, a
# request never answered (the client's time-out, the queue filling up and
# giving way), 5 connections closed while a request is read, and SIGHUP (the
# module reloads its settings and restarts its export).
#
# Every 10 s one line: the gateway's resident memory (VmRSS), open files
# (/proc/PID/fd), threads (/proc/PID/task), rows sent (its metrics) and rows
# azure-local received.
#
# The rule for "grew": only samples taken after the first minute count (the
# queues, the allocator's arenas and the connections settle in that minute).
# Those are cut in thirds; a figure grew when the median of the last third is
# above the highest sample of the first third by more than its tolerance:
# 4 MiB or 5 % (the larger) for memory, 2 for open files, 1 for threads. The
# highest early sample is the working set once every kind of fault has been
# seen (the faults come round every 4 minutes); the median of the late
# samples is not moved by a fault or a reload that happens to coincide with one
# sample, but a leak lifts all of them. Runs shorter than about 15 minutes
# do not see every fault in the first third; they are for trying the script.
#
# At the end the gateway is stopped with SIGTERM and must exit 0, and every
# row it reports as sent must have arrived: its rows sent (summed over both
# targets) must not exceed the rows azure-local received (faults are injected
# before the receiver counts a request's rows). The receiver may have more:
# the Azure library reports a batch as sent only when all of its messages
# arrived, so the module counts the rows of a batch with one failed message
# as failed although the other messages' rows arrived.
#
# Files stay in build/release/soak/: samples.txt, gateway.out, gateway.err,
# gateway.log (the module's errors), gateway.prom, settings.ini, project.json.
# Not part of CI.
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)

minutes=${1:-}
[[ "$minutes" =~ ^[0-9]+$ && "$minutes" -ge 2 ]] || {
  echo "soak: usage: bash scripts/soak.sh MINUTES (a whole number, at least 2)" >&2
  exit 2
}

source "$top/scripts/azure-local.sh"
prepare_release_run "$top" soak
work=$run_folder

variables=10000
rate=20000  # changes per second in all: each variable every 500 ms

# The project: the counters share the rate, spread evenly over the 100 ms ticks.
jq -n --argjson variables "$variables" --argjson rate "$rate" '{
  tick_ms: 100,
  projects: [{ name: "Soak", variables: [{
    name: "Value{n}", repeat: $variables, rate: $rate, generator: { kind: "counter" } }] }]
}' > "$work/project.json"

gateway_pid=
stop_all() {
  if [[ -n "$gateway_pid" ]]; then
    kill -KILL "$gateway_pid" 2>/dev/null || true
    wait "$gateway_pid" 2>/dev/null || true
  fi
  stop_azure_local
}
trap stop_all EXIT
start_azure_local "$bin" "$work/azure-local.err" --keep-rows 1000 || exit 1
port=$azure_port
connection=$azure_connection
control="http://127.0.0.1:$port/_control"

{
  printf '[Azure]\nINTEGRITYPERIOD=5\n\n[VARIABLES]\nCOUNT=%d\n' "$variables"
  for ((n = 1; n <= variables; n++)); do
    printf 'NAME_%d=Soak#Value%d\n' $((n - 1)) "$n"
  done
  printf '\n[CONNECTIONS]\nCOUNT=2\n'
  printf 'CONN_0=%s\nQUEUE_0=values\nMODE_0=0\nFORMAT_0=1\n' "$connection"
  printf 'CONN_1=%s\nQUEUE_1=soak-hub\nMODE_1=1\nFORMAT_1=2\n' "$connection"
} > "$work/settings.ini"
chmod 600 "$work/settings.ini"

# The module writes only its errors, to a file that rotates.
cat > "$work/brennic.ini" <<INI
[levels]
19 = 1
[file]
path = $work/gateway.log
max_size = 20M
keep = 1
[stderr]
enabled = no
INI

duration=$((minutes * 60))
echo "soak: $variables variables, $rate changes/s, to 'values' (JSON) and 'soak-hub' (BOND) of azure-local on 127.0.0.1:$port"
echo "soak: $minutes minutes; samples every 10 s; files in $work"
BRENNIC_CONFIG="$work/brennic.ini" "$bin/skyvane-gateway" run --ini "$work/settings.ini" \
  --simulate "$work/project.json" --status-interval 10 --metrics-file "$work/gateway.prom" \
  >"$work/gateway.out" 2>"$work/gateway.err" &
gateway_pid=$!

# One figure of the gateway's metrics file (0 while there is none).
metric() { awk -v name="$1" '$1 == name { printf "%d", $2; found = 1 } END { if (!found) print 0 }' "$work/gateway.prom" 2>/dev/null || echo 0; }
received() { curl -sf --noproxy '*' --max-time 5 "$control/stats" | jq -r '.rows' 2>/dev/null || echo "?"; }
fault() { curl -sf --noproxy '*' --max-time 5 -X POST "$control/fault?$1" >/dev/null || echo "soak: azure-local refused the fault '$1'" >&2; }

faults=("status: 20 requests answered 503" "stall: one request never answered" "close: 5 connections closed" "SIGHUP: reload")
next_fault=0
printf '%6s %10s %6s %8s %12s %12s  %s\n' "time_s" "rss_kib" "files" "threads" "rows_sent" "received" "event" | tee "$work/samples.txt"
start=$SECONDS
for ((t = 10; t <= duration; t += 10)); do
  # Sleep to the next multiple of 10 s from the start, so the samples do not drift.
  left=$((start + t - SECONDS))
  ((left > 0)) && sleep "$left"
  if [[ ! -d /proc/$gateway_pid ]]; then
    echo "soak: FAILED: the gateway ended after $t s (see $work/gateway.err)" >&2
    exit 1
  fi
  event=""
  if ((t >= 30 && (t - 30) % 60 == 0)); then
    event=${faults[next_fault]}
    case $next_fault in
      0) fault "kind=status&status=503&count=20" ;;
      1) fault "kind=stall&count=1" ;;
      2) fault "kind=close&count=5" ;;
      3) kill -HUP "$gateway_pid" ;;
    esac
    next_fault=$(((next_fault + 1) % ${#faults[@]}))
  fi
  rss=$(awk '/^VmRSS:/ { print $2 }' "/proc/$gateway_pid/status")
  files=$(find "/proc/$gateway_pid/fd" -mindepth 1 -maxdepth 1 | wc -l)
  threads=$(find "/proc/$gateway_pid/task" -mindepth 1 -maxdepth 1 | wc -l)
  printf '%6d %10d %6d %8d %12d %12s  %s\n' "$t" "$rss" "$files" "$threads" "$(metric skyvane_gateway_rows_sent_total)" \
    "$(received)" "$event" | tee -a "$work/samples.txt"
done

kill -TERM "$gateway_pid"
status=0
wait "$gateway_pid" || status=$?
gateway_pid=
failed=0
if ((status != 0)); then
  echo "soak: FAILED: the gateway exited with $status on SIGTERM (see $work/gateway.err)" >&2
  failed=1
fi

sent=$(metric skyvane_gateway_rows_sent_total)
got=$(received)
# Each change that a full queue turned away is one error record; the log keeps two files and
# gives way itself when flooded, so this is a lower bound.
lost=$(cat "$work"/gateway.log* 2>/dev/null | grep -c 'Value change queue full' || true)
echo "soak: rows sent $sent (both targets), received by azure-local $got; changes turned away by a full queue: at least ${lost:-0}"
if [[ ! "$got" =~ ^[0-9]+$ ]] || ((sent > got)); then
  echo "soak: FAILED: the gateway reports $sent rows sent but azure-local received $got" >&2
  failed=1
elif ((got > sent)); then
  echo "soak: $((got - sent)) rows arrived in batches that the module counted as failed (another message of the batch failed)"
fi

# The growth rule of the header, on the samples after the first minute.
awk '
  NR > 1 && $1 > 60 { n++; rss[n] = $2; files[n] = $3; threads[n] = $4 }
  function median(a, from, to,   k, m, i, j, v, s) {
    m = 0; for (i = from; i <= to; i++) s[++m] = a[i]
    for (i = 2; i <= m; i++) { v = s[i]; for (j = i - 1; j >= 1 && s[j] > v; j--) s[j + 1] = s[j]; s[j + 1] = v }
    return m % 2 ? s[(m + 1) / 2] : (s[m / 2] + s[m / 2 + 1]) / 2
  }
  function maximum(a, from, to,   i, v) { v = a[from]; for (i = from + 1; i <= to; i++) if (a[i] > v) v = a[i]; return v }
  function check(name, a, tolerance, unit,   early, late) {
    early = maximum(a, 1, third); late = median(a, n - third + 1, n)
    printf "soak: %-8s first third (after minute 1) highest %d %s, last third median %d %s, tolerance %d\n", name, early, unit, late, unit, tolerance
    if (late > early + tolerance) { printf "soak: FAILED: %s grew from %d to %d %s\n", name, early, late, unit; grew = 1 }
    return early
  }
  END {
    if (n < 3) { print "soak: FAILED: fewer than 3 samples after the first minute"; exit 1 }
    third = int(n / 3)
    early = maximum(rss, 1, third)
    tolerance = early * 0.05 > 4096 ? early * 0.05 : 4096
    check("memory", rss, tolerance, "KiB")
    check("files", files, 2, "")
    check("threads", threads, 1, "")
    exit grew
  }' "$work/samples.txt" || failed=1

if ((failed)); then
  echo "soak: FAILED (files in $work)" >&2
  exit 1
fi
echo "soak: passed: nothing grew after the first minute, every row reported as sent arrived"
