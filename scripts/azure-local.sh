# Sourced by the scripts that run azure-local beside the gateway (demo, soak).
#
# prepare_release_run TOP NAME installs what is missing, builds the release
# flavour and sets bin (its programs) and run_folder (build/release/NAME,
# emptied for this run).
prepare_release_run() {
  local top=$1 build
  bash "$top/scripts/setup.sh"
  build=$(bash "$top/scripts/build.sh" release | tail -n 1)
  bin="$build/bin"
  run_folder="$build/$2"
  rm -rf "$run_folder"
  mkdir -p "$run_folder"
}

# start_azure_local BIN_DIR ERROR_FILE [OPTION...] starts it as a coprocess on
# a free port of 127.0.0.1 and sets azure_port and azure_connection (a
# connection string with the receiver's own key, which exists only on
# loopback, for this run). The script holds the receiver's standard input and
# --quit-on-eof ends the receiver when the script closes it or ends in any way.
# stop_azure_local closes it and waits for the receiver to end (it writes out
# its record file as it ends).
start_azure_local() {
  local bin=$1 errors=$2 first
  shift 2
  coproc AZURE { exec "$bin/azure-local" --port 0 --quit-on-eof "$@" 2>"$errors"; }
  azure_pid=$AZURE_PID
  azure_in=${AZURE[1]}
  read -r -t 10 -u "${AZURE[0]}" first || { echo "$(basename "$0" .sh): azure-local did not start (see $errors)" >&2; return 1; }
  [[ "$first" == PORT\ * ]] || { echo "$(basename "$0" .sh): azure-local said '$first' instead of its port" >&2; return 1; }
  azure_port=${first#PORT }
  azure_connection="Endpoint=sb://127.0.0.1:$azure_port/;SharedAccessKeyName=RootManageSharedAccessKey;SharedAccessKey=azure-local-key;UseDevelopmentEmulator=true"
}

stop_azure_local() {
  if [[ -n "${azure_in:-}" ]]; then
    exec {azure_in}>&-
    azure_in=
  fi
  [[ -z "${azure_pid:-}" ]] || wait "$azure_pid" 2>/dev/null || true
}
