# shellcheck shell=bash disable=SC1090,SC2034,SC2154
# Sourced by the tests of doc/fleet.md in a private root, after tests/manual/appliance.sh: the blocks of
# the page, and servers of their own.
page=$checkout/doc/fleet.md

# same WHAT ACTUAL EXPECTED: compares two files.
same() { diff --text --unified "$3" "$2" >&2 || fail "$1"; }

# save_blocks: saves the blocks in this directory.
save_blocks() {
  loaders=$PWD
  blocks "$page" bash 'Feeds' >fleet-feed
  blocks "$page" sh 'PostgreSQL: creating the database' >create.sh
  blocks "$page" sql 'PostgreSQL: creating the database' >create.sql
  blocks "$page" 'sql add' 'PostgreSQL: creating the database' >add.sql
  blocks "$page" bash 'PostgreSQL: loading' >fleet-load-postgresql
  blocks "$page" sh 'PostgreSQL: loading' >load-postgresql.sh
  blocks "$page" sh 'PostgreSQL: backup' >backup-postgresql.sh
  blocks "$page" 'sh restore' 'PostgreSQL: backup' >restore-postgresql.sh
  blocks "$page" 'xml servers' 'ClickHouse: creating the database' >servers.xml
  blocks "$page" 'xml users' 'ClickHouse: creating the database' >users.xml
  blocks "$page" 'sql clickhouse' 'ClickHouse: creating the database' >fleet.sql
  blocks "$page" sh 'ClickHouse: creating the database' >create-clickhouse.sh
  blocks "$page" 'sh add' 'ClickHouse: creating the database' >add-clickhouse.sh
  blocks "$page" 'sql clickhouse check' 'ClickHouse: creating the database' >check.sql
  blocks "$page" bash 'ClickHouse: loading' >fleet-load-clickhouse
  blocks "$page" sh 'ClickHouse: loading' >load-clickhouse.sh
  blocks "$page" 'sh shard' 'ClickHouse: shards' >shard.sh
  blocks "$page" 'sh list' 'ClickHouse: shards' >list.sh
  blocks "$page" 'sh replace' 'ClickHouse: shards' >replace.sh
  blocks "$page" 'sh backup' 'ClickHouse: backup' >backup-clickhouse.sh
  blocks "$page" 'sh restore-shard' 'ClickHouse: backup' >restore-clickhouse.sh
  local section
  for section in Queries 'Watching a fleet'; do
    blocks "$page" sql "$section"
  done >queries.sql
  for section in Queries 'Watching a fleet'; do
    blocks "$page" 'sql clickhouse' "$section"
  done >queries-clickhouse.sql
  blocks "$page" sql 'Removing an appliance' >remove.sql
  blocks "$page" sh 'Removing an appliance' >remove-clickhouse.sh
  [[ $(cat -- * | wc --lines) == "$(awk '/^```/ { inside = !inside; next } inside' "$page" | wc --lines)" ]] ||
    fail "$page has a block that is not saved here, or is saved twice"
}

# The names of the shards. No interface has these addresses: a server takes a shard with its own port and an
# address of the machine for itself. The loaders keep their locks in the home directory.
private_names() {
  printf '%s\n' '127.0.0.1 localhost' '127.0.0.2 shard1' '127.0.0.3 shard2' '127.0.0.4 shard3' >/tmp/hosts
  mount --bind /tmp/hosts /etc/hosts
  export HOME=/tmp/home
  mkdir -p "$HOME"
}

# --- PostgreSQL --------------------------------------------------------------------------------

as_postgres() { setpriv --reuid=postgres --regid=postgres --clear-groups "$@"; }

# make_postgresql [OPTION...]: a new server with these options, not started.
make_postgresql() {
  local installed=(/usr/lib/postgresql/*/bin)
  postgresql=${installed[-1]}
  [[ -x $postgresql/postgres ]] || fail "there is no PostgreSQL server (Debian package postgresql)"
  if ! as_postgres true 2>/tmp/reason; then
    echo "${0##*/}: the server does not run as root, and there is no other user: $(</tmp/reason)" >&2
    exit 77
  fi
  postgresql_options=("$@")
  install --directory --owner=postgres "$servers"
  as_postgres "$postgresql/initdb" --pgdata="$servers/data" --auth=trust --username=postgres \
    --encoding=UTF8 --locale=C.UTF-8 --no-sync >/dev/null
}

start_postgresql() {
  as_postgres "$postgresql/pg_ctl" --pgdata="$servers/data" --log="$servers/log" --wait --silent \
    --options="-c listen_addresses='' -c unix_socket_directories=$servers ${postgresql_options[*]}" start
}

kill_postgresql() {
  local pid
  pid=$(head --lines=1 "$servers/data/postmaster.pid")
  kill -KILL "$pid"
  # Its processes end when they notice this; a new server waits for them.
  await_gone "$pid"
}

stop_postgresql() {
  as_postgres "$postgresql/pg_ctl" --pgdata="$servers/data" --mode=fast --wait --silent stop
  [[ ! -e $servers/data/postmaster.pid ]] || fail "the server still runs"
}

await_gone() { await eval "! kill -0 $1"; }

# Waiting too long for a lock is an error.
servers=${servers:-/tmp/server}
use_postgresql() {
  export PGHOST=$servers PGUSER=postgres PGDATABASE=fleet PGTZ=UTC
  export PGOPTIONS="-c lock_timeout=${deadline}s"
}

# sql ROLE [ARG...]: runs SQL as that role until the first error.
sql() {
  psql --no-psqlrc --quiet --no-align --tuples-only --set ON_ERROR_STOP=1 --username "$@"
}

# --- ClickHouse --------------------------------------------------------------------------------

# make_shard NUMBER: the directory of the server shardNUMBER, with the configuration of the package and the
# page. It listens on its name's address.
make_shard() {
  command -v clickhouse-server >/dev/null ||
    fail "there is no ClickHouse server (Debian package clickhouse-server)"
  local directory=$servers/shard$1
  mkdir -p "$directory"/{config.d,users.d,data,tmp,log}
  sed --expression="s#/var/lib/clickhouse/tmp/#$directory/tmp/#; s#/var/lib/clickhouse/#$directory/data/#" \
    --expression="s#/var/log/clickhouse-server/#$directory/log/#" \
    --expression='/<listen_host>/d' /etc/clickhouse-server/config.xml >"$directory/config.xml"
  cp /etc/clickhouse-server/users.xml "$directory/users.xml"
  cp servers.xml "$directory/config.d/fleet.xml"
  cp users.xml "$directory/users.d/fleet.xml"
  # Several servers share the machine with other tests.
  cat >"$directory/config.d/private.xml" <<XML
<yandex>
  <listen_host>shard$1</listen_host>
  <mark_cache_size>268435456</mark_cache_size>
  <timezone>UTC</timezone>
  <query_log remove="remove"/>
  <part_log remove="remove"/>
</yandex>
XML
  cat >"$directory/users.d/private.xml" <<XML
<yandex><profiles><default><background_pool_size>2</background_pool_size></default></profiles></yandex>
XML
}

# make_test_shard NUMBER: a shard with small blocks: without the settings of the loader, each feed of more than a
# few rows becomes several blocks, as a large one does with the usual settings.
make_test_shard() {
  make_shard "$1"
  cat >"$servers/shard$1/users.d/blocks.xml" <<'END'
<yandex><profiles><default>
  <max_block_size>2</max_block_size>
  <max_insert_block_size>2</max_insert_block_size>
  <min_insert_block_size_rows>2</min_insert_block_size_rows>
  <min_insert_block_size_bytes>2</min_insert_block_size_bytes>
  <group_by_two_level_threshold>1</group_by_two_level_threshold>
</default></profiles></yandex>
END
}

declare -A shards
start_shard() {
  clickhouse-server --config-file="$servers/shard$1/config.xml" >>"$servers/shard$1/output" 2>&1 &
  shards[$1]=$!
  await on_shard "$1" "SELECT 1"
}

# on_shard NUMBER SQL: runs one statement there.
on_shard() { curl --silent --show-error --fail-with-body "http://shard$1:8123/" --data-binary "$2"; }

kill_shard() {
  kill -KILL "${shards[$1]}"
  wait "${shards[$1]}" 2>/dev/null || true
}

stop_shard() {
  kill "${shards[$1]}"
  wait "${shards[$1]}"
}

# is_done NUMBER: whether all mutations of that shard are done.
is_done() { [[ $(on_shard "$1" 'SELECT count() FROM system.mutations WHERE NOT is_done') == 0 ]]; }

# --- What the page does ------------------------------------------------------------------------

# add APPLIANCE SHARD: the blocks of the page, for any appliance.
declare -A shard_of
add() {
  shard_of[$1]=$2
  sql postgres --set appliance="$1" < <(sed '/^\\set/d' add.sql)
  add_to_shard "$1" "$2"
}
add_to_shard() { (appliance=$1 shard=$2 && source <(sed '/^appliance=/d' add-clickhouse.sh)); }
remove_from_shard() { (appliance=$1 shard=$2 && source <(sed '/^appliance=/d' remove-clickhouse.sh)); }

# load DATABASE APPLIANCE COMMAND...
load() {
  case $1 in
  postgresql) PGUSER=fleet_load PGAPPNAME=load "$loaders/fleet-load-postgresql" "${@:2}" ;;
  clickhouse) "$loaders/fleet-load-clickhouse" ${2:+"${shard_of[$2]:-shard1}"} "${@:2}" ;;
  esac
}

# --- The content -------------------------------------------------------------------------------

# exported DATABASE APPLIANCE: its photos in the form and order of an export.
exported() {
  case $1 in
  postgresql)
    sql postgres --set appliance="$2" <<'END'
COPY (SELECT path, volume, to_char(modified, 'YYYY-MM-DD"T"HH24:MI:SS"Z"') AS modified,
             to_char(created, 'YYYY-MM-DD"T"HH24:MI:SS"Z"') AS created
        FROM photos
       WHERE appliance = :'appliance'
       ORDER BY regexp_replace(path, '[^/]*$', ''), path, modified)
  TO STDOUT (FORMAT csv, HEADER, FORCE_QUOTE (path, volume));
END
    ;;
  clickhouse)
    echo path,volume,modified,created
    on_shard 1 "SELECT concat('\"', replaceAll(path, '\"', '\"\"'), '\",\"', volume, '\",', modified, ',', created)
        FROM fleet.photos WHERE appliance = $(sed "s/[\\\\']/\\\\&/g; 1s/^/'/; \$s/\$/'/" <<<"$2")
       GROUP BY path, volume, modified, created, copy HAVING sum(sign) > 0
       ORDER BY replaceRegexpOne(path, '[^/]*\$', ''), path, modified FORMAT TSVRaw"
    ;;
  esac
}
