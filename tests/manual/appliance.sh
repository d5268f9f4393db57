# shellcheck shell=bash disable=SC2154
# Sourced by the tests of the manual, in a private root: an appliance of the real programs, whose
# directories are "$programs" (as PATH has them).
if [[ -z ${ORVA_PRIVATE_ROOT:-} ]]; then
  echo "$0: this is run by ctest, in a private root" >&2
  exit 2
fi
PATH=$programs:$PATH

# A broken product makes a test wait this long, and nothing else does.
deadline=60

# await COMMAND...: until it succeeds.
await() {
  local end=$((SECONDS + deadline))
  until "$@" 2>/dev/null; do
    if ((SECONDS >= end)); then
      echo "waited in vain for: $*" >&2
      exit 1
    fi
    read -rt 0.05 <> <(:) || true
  done
}

# volume NAME SIZE: takes memory only for what it holds.
volume() {
  mkdir -p "/shares/$1"
  mount -t tmpfs -o "size=$2" "volume-$1" "/shares/$1"
}

# photo FILE TIME
photo() {
  mkdir -p "$(dirname "$1")"
  touch --date="@$2" "$1"
}

# index NAME STAMP: its catalog, with transcodings of that time.
index() {
  orva-catalog index "/shares/$1" >/dev/null
  sqlite3 "/shares/$1/.orva/orva.db" "UPDATE Transcodings SET lastUpdatedDate = $2"
}

service_listens() { orva-notify send --raw /dev/null >/dev/null; }

start_service() {
  orva-notify serve --watch >/tmp/orva-notify.log &
  service=$!
  await service_listens
}

# The daemon with a working directory of its own, as its unit gives it one.
start_daemon() {
  mkdir -p /run/zophotodbmerger
  (cd /run/zophotodbmerger && exec zophotodbmerger >/tmp/standard-output) &
  daemon=$!
}

# announce EVENT NAME
announce() {
  orva-notify send --clients 1 --wait "$deadline" "$1" "/shares/$2" >/dev/null
}

# Until the daemon has handled all that was sent: it connects again when it has read the last of it.
handled() {
  orva-notify drop --clients 1 --wait "$deadline" >/dev/null
  orva-notify send --clients 1 --wait "$deadline" --raw /dev/null >/dev/null
}

# Both must end well.
stop_appliance() {
  kill "$service"
  wait "$service"
  wait "$daemon"
}
