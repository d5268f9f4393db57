# shellcheck shell=bash disable=SC2154
# Sourced by tests of documents and packages in a private root. Runs the real programs, which are in
# the directories "$programs" (written like PATH), as an appliance.
if [[ -z ${ORVA_PRIVATE_ROOT:-} ]]; then
  echo "$0: run this with ctest, in a private root" >&2
  exit 2
fi
PATH=$programs:$PATH

# Seconds to wait for an event before the test fails.
deadline=60

fail() {
  echo "FAILED: $*" >&2
  exit 1
}

# await COMMAND...: runs COMMAND until it succeeds.
await() {
  local end=$((SECONDS + deadline))
  until "$@" >/dev/null 2>&1; do
    ((SECONDS < end)) || fail "timeout: $*"
    read -rt 0.05 <> <(:) || true
  done
}

# --- Volumes -----------------------------------------------------------------------------------

# volume NAME SIZE: mounts an empty volume; it uses memory only for its content.
volume() {
  mkdir -p "/shares/$1"
  mount -t tmpfs -o "size=$2" "volume-$1" "/shares/$1"
}

# photo FILE TIME
photo() {
  mkdir -p "$(dirname "$1")"
  touch --date="@$2" "$1"
}

# index NAME STAMP: makes the volume's catalog and sets the stamp of its transcodings.
index() {
  orva-catalog index "/shares/$1" >/dev/null
  sqlite3 "/shares/$1/.orva/orva.db" "UPDATE Transcodings SET lastUpdatedDate = $2"
}

# --- The service and the daemon ----------------------------------------------------------------

service_listens() { orva-notify send --raw /dev/null >/dev/null; }

start_service() {
  orva-notify serve --watch >/tmp/orva-notify.log &
  service=$!
  await service_listens
}

# The daemon gets its own working directory, as from its unit.
start_daemon() {
  mkdir -p /run/zophotodbmerger
  (cd /run/zophotodbmerger && exec zophotodbmerger >/tmp/standard-output) &
  daemon=$!
}

start_appliance() {
  start_service
  start_daemon
  handled
}

# announce EVENT VOLUME
announce() {
  orva-notify send --clients 1 --wait "$deadline" "$1" "/shares/$2" >/dev/null
}

# Waits until the daemon has handled everything sent so far: it reconnects after it has read all of it.
handled() {
  orva-notify drop --clients 1 --wait "$deadline" >/dev/null
  orva-notify send --clients 1 --wait "$deadline" --raw /dev/null >/dev/null
}

# merge VOLUME...: starts the work with the first volume, and merges all of them.
merge() {
  local name
  announce scanned "$1"
  for name in "$@"; do announce transcoded "$name"; done
  handled
}

# Both must end with status 0.
stop_appliance() {
  kill "$service"
  wait "$service"
  wait "$daemon"
}

# --- Documents ---------------------------------------------------------------------------------

# blocks PAGE LANGUAGE [HEADING]: prints the blocks of a language, of the page or of one section.
blocks() {
  awk -v begin="\`\`\`$2" -v heading="${3:+## $3}" '
    /^## / { here = $0 == heading }
    /^```$/ { inside = 0 }
    inside { print; found = 1 }
    $0 == begin && (heading == "" || here) { inside = 1 }
    END { exit !found }' "$1" || fail "no $2 block in $1 ${3:+below \"$3\"}"
}

# answers COMMAND...: reads queries, each of which begins with a comment. Prints the comment and what
# COMMAND answers to the query.
answers() {
  local query
  awk '/^-- / { file = sprintf("/tmp/query-%02d.sql", ++number) } { print >file }'
  for query in /tmp/query-*.sql; do
    head --lines=1 "$query"
    "$@" <"$query"
  done
}
