#!/usr/bin/env bash
# Shows the settings dialog and the connection dialog under Xvfb, with the
# runtime stand-in running its example project and a settings file of three
# exported variables and two connections, and writes PNGs of them:
# settings.png, settings-sorted.png (variables sorted descending, down arrow)
# and connection.png.
#
#   bash scripts/screenshots.sh [output folder]   (default: build/screenshots)
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
out=${1:-$top/build/screenshots}
build="$top/build/release"

bash "$top/scripts/setup.sh"
cmake -S "$top" -B "$build" -DSKYVANE_SANITIZE= >/dev/null
cmake --build "$build" -j2 --target skyvane-dialog-shots >&2

work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
cat >"$work/skyvane.ini" <<'INI'
[Azure]
INTEGRITYPERIOD=60
PROXY_DOMAIN=
PROXY_USER=
PROXY_PWD=

[VARIABLES]
COUNT=3
NAME_0=Plant#Tank1.Level
NAME_1=Plant#Pump1.Speed
NAME_2=Utilities#Power.Total

[CONNECTIONS]
COUNT=2
CONN_0=Endpoint=sb://plant-demo.servicebus.windows.net/;SharedAccessKeyName=send;SharedAccessKey=REPLACE_ME
QUEUE_0=plant-values
MODE_0=0
FORMAT_0=1
CONN_1=Endpoint=sb://plant-demo.servicebus.windows.net/;SharedAccessKeyName=send;SharedAccessKey=REPLACE_ME
QUEUE_1=plant-hub
MODE_1=1
FORMAT_1=2
INI

mkdir -p "$out"
xvfb-run -a -s "-screen 0 1600x1200x24" env QT_QPA_PLATFORM=xcb \
  "$build/bin/skyvane-dialog-shots" "$top/tarvo/examples/plant.json" "$work/skyvane.ini" "$out"
