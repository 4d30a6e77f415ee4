#!/usr/bin/env bash
# The demo: a simulated plant (the runtime stand-in), the local Azure receiver
# azure-local and skyvane-gateway on this machine. The gateway sends the
# plant's values to a Service Bus queue (JSON) and an Event Hub (BOND) of
# azure-local; afterwards the demo shows what arrived.
# Usage: bash scripts/demo.sh [--duration SECONDS]   (default 20)
# Files of the last run stay in build/release/demo/.
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)

duration=20
while (($#)); do
  case "$1" in
    --duration) duration=${2:?--duration needs a number of seconds}; shift 2 ;;
    *) echo "demo: unknown argument '$1' (usage: bash scripts/demo.sh [--duration SECONDS])" >&2; exit 2 ;;
  esac
done
[[ "$duration" =~ ^[0-9]+$ && "$duration" -gt 0 ]] || { echo "demo: --duration needs whole seconds above 0" >&2; exit 2; }

source "$top/scripts/azure-local.sh"
prepare_release_run "$top" demo
demo=$run_folder
trap stop_azure_local EXIT
start_azure_local "$bin" "$demo/azure-local.err" --record "$demo/rows.jsonl" || exit 1
port=$azure_port
connection=$azure_connection

cat > "$demo/settings.ini" <<INI
[Azure]
INTEGRITYPERIOD=5

[VARIABLES]
COUNT=5
NAME_0=Plant#Tank1.Level
NAME_1=Plant#Pump1.Speed
NAME_2=Plant#Pump1.State
NAME_3=Plant#Pump1.Alarm
NAME_4=Utilities#Power.Total

[CONNECTIONS]
COUNT=2
; a Service Bus queue, JSON bodies
CONN_0=$connection
QUEUE_0=values
MODE_0=0
FORMAT_0=1
; an Event Hub, Bond Compact Binary bodies
CONN_1=$connection
QUEUE_1=plant-hub
MODE_1=1
FORMAT_1=2
INI

# The module's log goes to a file; standard error keeps the gateway's own errors.
cat > "$demo/brennic.ini" <<INI
[file]
path = $demo/gateway.log
[stderr]
enabled = no
INI

echo "demo: azure-local listens on 127.0.0.1:$port"
echo "demo: skyvane-gateway sends 5 variables of tarvo/examples/plant.json for $duration s"
echo "demo: to the queue 'values' (JSON) and the Event Hub 'plant-hub' (BOND)"
echo
BRENNIC_CONFIG="$demo/brennic.ini" "$bin/skyvane-gateway" run --ini "$demo/settings.ini" \
  --simulate "$top/tarvo/examples/plant.json" --duration "$duration" --status-interval 5 \
  --metrics-file "$demo/gateway.prom" | tee "$demo/gateway.out"
stop_azure_local  # the receiver writes out its record file as it ends

echo
echo "demo: what arrived at azure-local"
missing=0
for target in "values|Service Bus queue, JSON" "plant-hub|Event Hub, BOND"; do
  entity=${target%%|*}
  count=$(jq -s --arg e "$entity" 'map(select(.entity == $e)) | length' "$demo/rows.jsonl")
  echo "  $entity (${target#*|}): $count rows, the last ones"
  jq -r -s --arg e "$entity" 'map(select(.entity == $e)) | .[-3:][] |
    "    \(.project)#\(.variable) = \(if .isText then .text else .value end)  at \(.time | todate) + \(.milliseconds) ms, status \(.status)"' \
    "$demo/rows.jsonl"
  ((count > 0)) || missing=1
done
echo
echo "demo: the gateway's status lines"
grep ' status: ' "$demo/gateway.out" | sed 's/^/  /'
echo
echo "demo: files in $demo (settings.ini, rows.jsonl, gateway.log, gateway.prom)"
if ((missing)); then
  echo "demo: FAILED: a target received no rows (see $demo/gateway.log)" >&2
  exit 1
fi
