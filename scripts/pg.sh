#!/usr/bin/env bash
# A project-local PostgreSQL 15 cluster: unix socket only, role "admin" trusted on the
# socket, database "download" with the schema loaded.
#
#   scripts/pg.sh start [DIR] [--fast]   create if needed, start (harmless when running)
#   scripts/pg.sh stop  [DIR]            stop
#   scripts/pg.sh env   [DIR]            print PGHOST/PGPORT for a shell: eval "$(...)"
#
# DIR defaults to .pg in the project. --fast turns durability off (throwaway clusters).
# As root the server runs as the "postgres" user, since it refuses to run as root.
set -euo pipefail

repo=$(cd "$(dirname "$0")/.." && pwd)
cmd=${1:-}
shift || true
dir="$repo/.pg"
fast=0
for a in "$@"; do
  case $a in
    --fast) fast=1 ;;
    *) dir=$a ;;
  esac
done
# As root the server runs as "postgres", which must be able to reach the directory. A
# project under a private home cannot host it: the default then moves to /tmp, under a
# name derived from the project's path, so start, env and stop agree.
if [ "$(id -u)" -eq 0 ] && [ "$dir" = "$repo/.pg" ] && ! (cd / && runuser -u postgres -- test -x "$repo"); then
  dir="/tmp/torvale-pg-$(printf %s "$repo" | cksum | cut -d' ' -f1)"
fi
mkdir -p "$dir"
dir=$(cd "$dir" && pwd)
port=${TORVALE_PGPORT:-5432}
bin=/usr/lib/postgresql/15/bin
data="$dir/data"
sock="$dir/run"

as_server() {
  if [ "$(id -u)" -eq 0 ]; then (cd / && runuser -u postgres -- "$@"); else "$@"; fi
}

# The pid file names a live server only if that process is a postgres that has not
# died (a killed server can linger as a zombie where nothing reaps it, and its pid can
# be reused by another program).
running() {
  local pid state
  pid=$(head -n 1 "$data/postmaster.pid" 2>/dev/null) || return 1
  [ -n "$pid" ] && [ -r "/proc/$pid/stat" ] || return 1
  state=$(sed 's/.*) //' "/proc/$pid/stat" | cut -d' ' -f1)
  [ "$state" != Z ] && tr '\0' ' ' <"/proc/$pid/cmdline" | grep -q postgres
}

case $cmd in
  env)
    echo "export PGHOST='$sock' PGPORT='$port'"
    ;;
  stop)
    if running; then as_server "$bin/pg_ctl" -D "$data" -m fast -w stop >/dev/null; fi
    ;;
  start)
    if [ "$(id -u)" -eq 0 ]; then
      chown postgres: "$dir"
      if ! runuser -u postgres -- test -w "$dir"; then
        echo "pg.sh: the postgres user cannot reach $dir; choose a DIR it can reach" >&2
        exit 1
      fi
    fi
    if [ ! -f "$data/PG_VERSION" ]; then
      as_server "$bin/initdb" -D "$data" -U admin --auth=trust -E UTF8 --locale=C.UTF-8 >/dev/null
      as_server mkdir -p "$sock"
      {
        echo "listen_addresses = ''"
        echo "unix_socket_directories = '$sock'"
        echo "port = $port"
        if [ $fast -eq 1 ]; then
          echo "fsync = off"
          echo "synchronous_commit = off"
          echo "full_page_writes = off"
        fi
      } | as_server tee -a "$data/postgresql.conf" >/dev/null
    fi
    if ! running; then
      # A pid file left by a server that is gone would stop pg_ctl from starting.
      as_server rm -f "$data/postmaster.pid"
      # Workers of a killed server hold its shared memory until they notice and exit.
      for try in 1 2 3 4 5 6 7 8 9 10; do
        as_server "$bin/pg_ctl" -D "$data" -l "$dir/server.log" -w start >/dev/null && break
        [ $try -lt 10 ] || { tail -n 5 "$dir/server.log" >&2; exit 1; }
        sleep 1
      done
    fi
    export PGHOST=$sock PGPORT=$port PGOPTIONS="-c client_min_messages=warning"
    if [ -z "$(psql -U admin -d postgres -tAc "SELECT 1 FROM pg_database WHERE datname='download'")" ]; then
      psql -q -U admin -d postgres -c "CREATE DATABASE download ENCODING 'UTF8' TEMPLATE template0" >/dev/null
    fi
    psql -q -U admin -d download -v ON_ERROR_STOP=1 -f "$repo/db/schema.sql" >/dev/null
    ;;
  *)
    echo "usage: $0 start|stop|env [DIR] [--fast]" >&2
    exit 2
    ;;
esac
