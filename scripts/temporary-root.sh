# Sourced by scripts that run the daemon and its company under a temporary root: starts programs, waits until they
# are ready, and ends them and removes everything when the script ends, however it does.
# shellcheck shell=bash

# make_root: sets `root`, laid out as the daemon expects, without a key and without preferences.
make_root() {
  root=$(mktemp -d "${TMPDIR:-/tmp}/veskreporting.XXXXXX")
  declare -gA processes=()
  trap clean_up EXIT
  trap 'exit 130' INT
  trap 'exit 143' TERM
  mkdir -p "$root"/{etc/veskreporting/preferences,usr/share/veskreporting,run,log}
  cp -r packaging/share/. "$root/usr/share/veskreporting/"
  chmod 0755 "$root"
}

# start NAME COMMAND…: runs it in the background with its output in $root/log/NAME.
start() {
  local name=$1
  shift
  "$@" >"$root/log/$name" 2>&1 </dev/null &
  processes[$name]=$!
}

# wait_for_line NAME TEXT: until the program has written TEXT; fails, with its output, when it ends before that.
wait_for_line() {
  local name=$1 text=$2
  if ! timeout 60 grep -q -m1 -F -- "$text" < <(tail -n +1 -f --pid="${processes[$name]}" "$root/log/$name" 2>/dev/null); then
    echo "$name did not get as far as \"$text\":" >&2
    cat "$root/log/$name" >&2
    return 1
  fi
}

# stop NAME: ends it in order; its exit status.
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
