#!/usr/bin/env bash
# Installs what is missing, builds Torvale, starts the embedded database (.pg in the
# project) and runs the main job: store the download configuration and read it back.
set -euo pipefail
repo=$(cd "$(dirname "$0")/.." && pwd)
cd "$repo"

scripts/deps.sh
cmake -S . -B build -G Ninja -DTORVALE_TESTS=OFF -DTORVALE_BENCH=OFF >/dev/null
cmake --build build
scripts/pg.sh start
eval "$(scripts/pg.sh env)"

torvale=build/torvale
$torvale db init
$torvale conf set --when "00:00-23:59" --order 1 --seeding-ratio 100 --seeding-interval 3600
$torvale conf get --json

echo
echo "The embedded database is running. To use it from a shell:"
echo "  eval \"\$(scripts/pg.sh env)\"; build/torvale --help"
