#!/usr/bin/env bash
# The torvale CLI end to end against the test database: output, JSON and exit codes.
set -uo pipefail
tv=$1
fails=0
check() { # name, expected, actual
  if [ "$2" != "$3" ]; then echo "FAIL $1: expected [$2], got [$3]"; fails=$((fails + 1)); fi
}
status() { "$@" >/dev/null 2>&1; echo $?; }

psql -q -U admin -d download -c "TRUNCATE sysconf" >/dev/null

check "db init" 0 "$(status "$tv" db init)"
check "conf get on an empty table fails" 1 "$(status "$tv" conf get)"
check "unknown verb is usage" 2 "$(status "$tv" conf frobnicate)"
check "no family is usage" 2 "$(status "$tv")"
check "help" 0 "$(status "$tv" conf set --help)"
check "bad number is usage" 2 "$(status "$tv" conf set --order x)"
check "too long a schedule fails" 1 "$(status "$tv" conf set --when 0123456789ab)"

"$tv" conf set --when "00:00-06:00" --order 2 --seeding-ratio 150 --seeding-interval 60 >/dev/null
"$tv" conf set --order 3 >/dev/null
check "conf get --json" '{"download_order":3,"download_when":"00:00-06:00","enabled":1,"seeding_interval":60,"seeding_ratio":150}' \
  "$("$tv" conf get --json | tr -d ' \n')"
check "conf get table" "download_when     00:00-06:00" "$("$tv" conf get | grep download_when)"

# torvale user / util
psql -q -U admin -d download -c "TRUNCATE user_setting" >/dev/null
cliuser="tvcli$$"
useradd -M -N "$cliuser" >/dev/null 2>&1
check "user show without settings fails" 1 "$(status "$tv" user show "$cliuser")"
check "share set for an unknown user fails" 1 "$(status "$tv" user share set "nouser$$" video)"
check "watch set needs FOLDER or --off" 2 "$(status "$tv" user watch set "$cliuser")"
check "watch set FOLDER --off is usage" 2 "$(status "$tv" user watch set "$cliuser" /w --off)"
"$tv" user share set "$cliuser" video >/dev/null
"$tv" user watch set "$(echo "$cliuser" | tr a-z A-Z)" /volume1/watch --delete-torrent >/dev/null
check "user show --json" "{\"delete_torrent\":1,\"disabled\":0,\"share\":\"video\",\"user\":\"$cliuser\",\"watch_enabled\":1,\"watch_folder\":\"/volume1/watch\"}" \
  "$("$tv" user show "$cliuser" --json | tr -d ' \n')"
check "watch check taken" "free    false" "$("$tv" user watch check other /volume1/watch | grep free)"
check "watch check own folder" "free    true" "$("$tv" user watch check "$cliuser" /volume1/watch | grep free)"
"$tv" user disable "$cliuser" >/dev/null
check "disable switches watching off" "watch_enabled   0" "$("$tv" user show "$cliuser" | grep watch_enabled)"
check "disabled user" "disabled        1" "$("$tv" user show "$cliuser" | grep '^disabled')"
"$tv" user enable "$cliuser" >/dev/null
check "enabled user" "disabled        0" "$("$tv" user show "$cliuser" | grep '^disabled')"
"$tv" user watch set "$cliuser" --off >/dev/null
check "watch off keeps the folder" "watch_folder    /volume1/watch" "$("$tv" user show "$cliuser" | grep watch_folder)"
userdel "$cliuser" >/dev/null 2>&1
check "link-kind magnet" '{"kind":"magnet"}' "$("$tv" util link-kind 'MAGNET:?xt=1' --json | tr -d ' \n')"
check "link-kind sftp" "kind  sftp" "$("$tv" util link-kind SFTP://host/f)"
check "link-kind other" "kind  other" "$("$tv" util link-kind ftp://host/f)"
freedir=$(mktemp -d)
touch "$freedir/a.tar.gz"
check "free-name numbers before the extension" "path  $freedir/a.tar1.gz" "$("$tv" util free-name "$freedir" a.tar.gz)"
check "free-name of a free name" "path  $freedir/b" "$("$tv" util free-name "$freedir" b)"
rm -rf "$freedir"

# task list / show / count / rate: 450 tasks, more than one page of the listing.
psql -q -U admin -d download -v ON_ERROR_STOP=1 >/dev/null <<'SQL'
TRUNCATE download_queue RESTART IDENTITY;
INSERT INTO download_queue(username, pid, url, filename, status, total_size, current_size,
                           current_rate, destination, extra_info)
SELECT 'u' || (i % 7), -1, 'http://h/' || i, 'f' || i, (ARRAY[1, 2, 3, 8])[1 + i % 4],
       CASE WHEN i % 5 = 0 THEN 0 ELSE 1000 * i END, 10 * i, (i % 3) * 400, 'd' || i, 'x' || i
FROM generate_series(1, 450) AS i;
SQL
ids() { "$tv" task list --json "$@" | grep -o '"id":[0-9]*' | cut -d: -f2 | tr '\n' ' '; }
distinct() { "$tv" task list --json "$@" | grep -o '"id":[0-9]*' | sort -u | wc -l; }
check "task list pages through every task" 450 "$(distinct)"
check "task list by user name, descending" 450 "$(distinct --sort username --desc)"
check "task list by progress" 450 "$(distinct --by-progress)"
check "task list by time left" 450 "$(distinct --by-time-left --desc)"
check "task list of one user" 64 "$(distinct --user U3)"
check "task list with a condition" 225 "$(distinct --where 'status=1 or status=3')"
check "task list limit and offset" "3 4 5 " "$(ids --limit 3 --offset 2)"
check "task list by time left puts estimates first" "17 " "$(ids --by-time-left --limit 1)"
check "task list table" "1       u1            downloading  1000 B     1.0%   400 B/s      -         f1" \
  "$("$tv" task list --limit 1 | tail -1)"
check "task show" "extra_info         x7" "$("$tv" task show 7 | grep extra_info)"
check "task show --json status" '"status_name":"paused",' "$("$tv" task show 2 --json | tr -d ' \n' | grep -o '"status_name":"[a-z]*",')"
check "task show of a missing task fails" 1 "$(status "$tv" task show 451)"
check "task count" '{"count":450}' "$("$tv" task count --json | tr -d ' \n')"
check "task count of one user" "count  64" "$("$tv" task count --user u3)"
check "task list with a hostile sort column fails" 1 "$(status "$tv" task list --sort 'task_id;')"
check "task list with a bad condition fails" 1 "$(status "$tv" task list --where 'status=1;')"
check "task list --by-progress --sort is usage" 2 "$(status "$tv" task list --by-progress --sort pid)"
check "task list --limit -1 is usage" 2 "$(status "$tv" task list --limit -1)"
check "task rate of an unknown user fails" 1 "$(status "$tv" task rate "nouser$$")"
check "task rate" 0 "$(status "$tv" task rate root)"

[ $fails -eq 0 ] && echo "CLI checks passed"
exit $fails
