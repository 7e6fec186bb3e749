#!/bin/bash
# activation.sh BIN: the first call starts a daemon whose sockets somebody else holds, and an idle one ends.
activate=systemd-socket-activate
if ! command -v "$activate" >/dev/null; then
  echo "skipped: $activate is not installed"
  [[ ${CI:-} == true ]] && exit 1
  exit 77
fi

set -euo pipefail
work=$(mktemp -d)
export STATE_DIRECTORY=$work/state RUNTIME_DIRECTORY=$work/run HOME=$work TALLOW_IDLE_EXIT=1
search=com.quill.tallowsearch.SearchService
debug=com.quill.tallow.DebugService
mkdir -m 700 "$work/run"

start() {
  rm -f "$work/run/"com.*
  "$activate" -l "$work/run/$search" -l "$work/run/$debug" --fdname="$search:$debug" \
    -E STATE_DIRECTORY -E RUNTIME_DIRECTORY -E TALLOW_IDLE_EXIT "$1/tallowsearchd" 2>>"$work/log" &
  activator=$!
}
finish() {
  kill "$activator" 2>/dev/null || true
  rm -rf "$work"
}
trap finish EXIT

mkdir -p "$work/Mail/cur"
printf 'Subject: Harbour fees\nMessage-ID: <fees@example.org>\n\nDue on Friday.\n' >"$work/Mail/cur/1"

# Twice, since the second daemon has what the first one indexed.
start "$1"
"$1/tallow" --wait=60 index "$work/Mail"
wait "$activator"
start "$1"
[[ $("$1/tallow" --wait=60 --format=message-ids search 'harbour ') == fees@example.org ]]
wait "$activator"
[[ $(grep -c 'No connection for a while: ending' "$work/log") == 2 ]]
