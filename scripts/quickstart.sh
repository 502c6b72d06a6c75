#!/usr/bin/env bash
# Installs what is missing, builds Torvale, starts the embedded database (.pg in the
# project) and runs the main job: store the download configuration, give a user a
# default share, add tasks for it, list the queue and pick the next task.
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
# A user with a default share, two tasks for it, the queue, and what the daemon would
# start next.
$torvale user share set root /volume1/downloads
$torvale task add --user root "magnet:?xt=urn:btih:c9e15763f722f23e98a29decdfae341b98d53056&dn=Example+Linux+ISO&tr=udp%3A%2F%2Ftracker.example.invalid%3A80"
$torvale task add --user root "ftps://mirror.example.invalid/pub/example.iso"
$torvale task list
$torvale task next

echo
echo "The embedded database is running. To use it from a shell:"
echo "  eval \"\$(scripts/pg.sh env)\"; build/torvale --help"
