# Sourced by scripts that run the daemon and a collector under a temporary root. Starts them, waits until they are
# ready, and stops them and removes everything however the script ends. Run from the project's directory.
# shellcheck shell=bash

# make_root: creates a root laid out as the daemon expects, without key and preferences, and sets `root`.
make_root() {
  umask 022 # the daemon refuses files that others can write to
  root=$(mktemp -d "${TMPDIR:-/tmp}/veskreporting.XXXXXX")
  declare -gA processes=()
  trap clean_up EXIT
  trap 'exit 130' INT
  trap 'exit 143' TERM
  chmod 0755 "$root"
  mkdir -p "$root"/{etc/veskreporting/preferences,usr/share,run,log}
  cp -r packaging/share "$root/usr/share/veskreporting"
  chmod -R go-w "$root/usr/share/veskreporting"
}

# start NAME COMMAND…: runs it in the background, with its output in $root/log/NAME.
start() {
  local name=$1
  shift
  "$@" >"$root/log/$name" 2>&1 </dev/null &
  processes[$name]=$!
}

# wait_for NAME TEXT [FILE]: waits until FILE (the program's output by default) contains TEXT. Fails, and shows the
# output, if the program ends first or a minute has passed.
wait_for() {
  local name=$1 text=$2 file=${3:-$root/log/$1}
  if ! timeout 60 grep -q -m1 -F -- "$text" < <(tail -n +1 -F --pid="${processes[$name]}" "$file" 2>/dev/null); then
    echo "$name did not get as far as \"$text\":" >&2
    cat "$root/log/$name" >&2
    return 1
  fi
}

# stop NAME: stops it in order; returns its exit status.
stop() {
  local process=${processes[$1]}
  unset "processes[$1]"
  kill -TERM "$process" 2>/dev/null || true
  wait "$process"
}

clean_up() {
  local status=$? name
  trap - EXIT
  for name in "${!processes[@]}"; do
    kill -TERM "${processes[$name]}" 2>/dev/null || true
  done
  wait
  rm -rf "$root"
  exit "$status"
}

# fact NAME: prints that entry of the collector's ready file.
fact() { sed -n "s/^ *\"$1\": \"\{0,1\}\([^\"]*[^\",]\)\"\{0,1\},\{0,1\}$/\1/p" "$root/ready.json"; }

# start_collector BIN [OPTION…]: starts it on free ports, with the example storebag; the daemon under this root trusts it.
start_collector() {
  local bin=$1
  shift
  start collector "$bin/veskcollector" --directory "$root/collector" --https-port 0 --http-port 0 --udp-port 0 \
    --ready-file "$root/ready.json" "$@"
  wait_for collector '}' "$root/ready.json"
  local events
  events=$(fact eventsURL)
  sed "s|@EVENTS@|$events|" examples/zelko.toml >"$(fact storebags)/zelko.toml"
  cp "$(fact publicKeyFile)" "$root/usr/share/veskreporting/publicKey.der"
  cat >"$root/etc/veskreporting/preferences/com.corvane.veskreporting.toml" <<EOF
environmentType = 4
diagnosticsSubmission = true
veskreporting_storebag_url = "$(fact storebagURL)"
EOF
  cat >"$root/etc/veskreporting/device.toml" <<EOF
DeviceName = "Demonstrator"
ProductType = "Board1,1"
RegionCode = "DE"
EOF
}

# start_daemon BIN [OPTION…]: starts it and waits until it accepts clients.
start_daemon() {
  local bin=$1
  shift
  start daemon env SSL_CERT_FILE="$(fact authorityFile)" "$bin/veskreportingd" --root "$root" "$@"
  wait_for daemon "start loop."
}
