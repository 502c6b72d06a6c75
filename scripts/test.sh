#!/usr/bin/env bash
# Installs what is missing, starts a throwaway PostgreSQL cluster, then builds and runs
# the whole test suite twice: a plain build and one under ASan and UBSan.
set -euo pipefail
repo=$(cd "$(dirname "$0")/.." && pwd)
cd "$repo"

scripts/deps.sh

pgdir="$repo/build-test-pg"
# The server runs as "postgres" when we are root; it must be able to reach its directory.
if [ "$(id -u)" -eq 0 ] && ! (cd / && runuser -u postgres -- test -x "$repo"); then
  pgdir="/tmp/torvale-test-pg-$(printf %s "$repo" | cksum | cut -d' ' -f1)"
fi
cleanup() { scripts/pg.sh stop "$pgdir" || true; rm -rf "$pgdir"; }
cleanup
trap cleanup EXIT
scripts/pg.sh start "$pgdir" --fast
eval "$(scripts/pg.sh env "$pgdir")"

jobs=$(nproc)
echo "== plain build"
cmake -S . -B build -G Ninja >/dev/null
cmake --build build -j "$jobs"
(cd build && ctest --output-on-failure)

echo "== ASan + UBSan build"
cmake -S . -B build-san -G Ninja -DTORVALE_SANITIZE=ON -DTORVALE_BENCH=OFF >/dev/null
cmake --build build-san -j "$jobs"
(cd build-san && ASAN_OPTIONS=detect_leaks=1 UBSAN_OPTIONS=print_stacktrace=1 ctest --output-on-failure)
