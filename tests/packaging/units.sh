#!/bin/bash
# units.sh SOURCE_DIRECTORY BIN: systemd accepts the units, and they give up what they do not need.
if ! command -v systemd-analyze >/dev/null; then
  echo "skipped: systemd-analyze is not installed"
  [[ ${CI:-} == true ]] && exit 1
  exit 77
fi

set -euo pipefail
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
export XDG_RUNTIME_DIR=$work/run MANPATH=$work/man HOME=$work
mkdir -m 700 "$work/run"
for page in "$1"/packaging/man/*; do
  install -D "$page" "$work/man/man${page##*.}/${page##*/}"
done
# The programs are not where the packages have them.
mkdir "$work/units"
for unit in "$1"/packaging/systemd/*.{service,socket}; do
  sed "s|/usr/bin/tallow|$2/tallow|" "$unit" >"$work/units/${unit##*/}"
done

failures=0
complaints=$(SYSTEMD_UNIT_PATH=$work/units: systemd-analyze verify --user "$work"/units/* 2>&1) || failures=1
echo "$complaints"
[[ -z $complaints ]] || failures=1
for unit in "$work"/units/*.service; do
  # In tenths: 4.1 of 10, where 10 is a service that gives up nothing.
  systemd-analyze security --user --offline=true --no-pager --threshold=41 "$unit" | tail -n 1 || failures=1
done
# The service is started by its sockets, not with the session.
! grep -H WantedBy "$work/units/tallowsearchd.service" || failures=1
exit $failures
