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

# Task creation, field writes and the trigger.
q() { psql -qAt -U admin -d download -c "$1"; }
q "TRUNCATE download_queue, user_setting RESTART IDENTITY" >/dev/null
q "INSERT INTO user_setting(username, uid, share_folder) VALUES ('cli''user', 1, '/volume1/cli')" >/dev/null
check "task add magnet" '[{"destination":"/volume1/cli","filename":"Show.S01","flags":"4","source":"magnet:?xt=urn:btih:AB&dn=Show.S01&tr=x","task_id":"1"}]' \
  "$("$tv" task add 'magnet:?xt=urn:btih:AB&dn=Show.S01&tr=x' --user "cli'user" --json | tr -d ' \n')"
torrent=$(mktemp)
printf 'd4:infod4:name3:abcee' >"$torrent"
check "task add-file torrent" "2 $(basename "$torrent") 4 /dst" \
  "$("$tv" task add-file "$torrent" --user "cli'user" --dest /dst --extra x | awk 'NR==2 {print $1, $3, $4, $5}')"
check "task add-file kind" 0 "$(status "$tv" task add-file "$torrent" --user "cli'user" --kind 1)"
check "task add-file to the share" "2|/volume1/cli" "$(q "SELECT task_flags || '|' || destination FROM download_queue WHERE task_id=3")"
rm -f "$torrent"
check "stored bytes" "21" "$(q "SELECT length(torrent) FROM download_queue WHERE task_id=2")"
check "task add for a user without share fails" 1 "$(status "$tv" task add http://h/f --user nobody)"
check "task add needs a link" 2 "$(status "$tv" task add --user "cli'user")"
check "task set status and flags" 0 "$(status "$tv" task set 1 --status 3 --flags +0x30)"
check "task set flags clear" '{"flags":48,"task_id":1}' "$("$tv" task set 1 --flags -4 --json | tr -d ' \n')"
check "task set stored" "3|48" "$(q "SELECT status || '|' || task_flags FROM download_queue WHERE task_id=1")"
check "task set unknown task" 1 "$(status "$tv" task set 99 --status 3)"
check "task set bad flags" 2 "$(status "$tv" task set 1 --flags 4)"
check "task set started 0 fails" 1 "$(status "$tv" task set 1 --started 0)"
check "task progress forced" 0 "$(status "$tv" task progress 1 --size 500 --peers 3 --force)"
check "task progress stored" "500|3" "$(q "SELECT current_size || '|' || total_peers FROM download_queue WHERE task_id=1")"
check "trigger" 0 "$(status "$tv" trigger)"
check "trigger --progress" 0 "$(status "$tv" trigger --progress)"

# Next-task selection and task control.
q "TRUNCATE download_queue, user_setting RESTART IDENTITY" >/dev/null
q "INSERT INTO user_setting(username) VALUES ('ann'), ('Bob'), ('off')" >/dev/null
q "UPDATE user_setting SET user_disabled=true WHERE username='off'" >/dev/null
q "INSERT INTO download_queue(username, status, pid, url) VALUES ('ann', 1, -1, 'http://h/1'),
   ('ann', 1, -1, 'http://h/2'), ('bob', 1, -1, 'ftp://f/3'), ('off', 1, -1, 'http://h/4'),
   ('bob', 2, 1, 'ftp://f/5')" >/dev/null
check "task next" "task_id    1" "$("$tv" task next | head -1)"
check "task next --rotate after ann" '{"last_user":"bob","task_id":3}' \
  "$("$tv" task next --rotate --after ann --json | tr -d ' \n')"
check "task next --rotate wraps" '{"last_user":"ann","task_id":1}' \
  "$("$tv" task next --rotate --after bob --json | tr -d ' \n')"
check "task pause" "task_ids  1 2" "$("$tv" task pause 1 2 | tail -1)"
check "task next skips paused" "task_id    3" "$("$tv" task next | head -1)"
check "task next --ftp-limit" "task_id    0" "$("$tv" task next --ftp-limit 1 | head -1)"
check "task continue" '{"done":"continue","task_ids":[2]}' "$("$tv" task continue 2 --json | tr -d ' \n')"
check "task pause negative id" 2 "$(status "$tv" task pause -1)"
check "task seeding" 0 "$(status "$tv" task seeding 2 --ratio 150 --interval 600)"
check "task seeding stored" "150|600" "$(q "SELECT seeding_ratio || '|' || seeding_interval FROM download_queue WHERE task_id=2")"
check "task seeding unknown task" 1 "$(status "$tv" task seeding 99 --ratio 1 --interval 1)"
q "UPDATE download_queue SET status=5 WHERE task_id IN (2, 3)" >/dev/null
check "task clear --user" 0 "$(status "$tv" task clear --user ANN)"
check "task clear kept the others" "1:3 3:5 4:1 5:2" \
  "$(q "SELECT string_agg(task_id || ':' || status, ' ' ORDER BY task_id) FROM download_queue")"
check "task resume-all" 0 "$(status "$tv" task resume-all)"
check "task pause-all --user" 0 "$(status "$tv" task pause-all --user bob)"
check "task bulk results" "1:1 3:5 4:1 5:3" \
  "$(q "SELECT string_agg(task_id || ':' || status, ' ' ORDER BY task_id) FROM download_queue")"
check "task delete" '{"deleted":1}' "$("$tv" task delete 4 44 --json | tr -d ' \n')"
check "task delete-all asks for --yes" 2 "$(status "$tv" task delete-all)"
check "task delete-all" 0 "$(status "$tv" task delete-all --yes)"
check "task next on an empty queue" "task_id    0" "$("$tv" task next | head -1)"
q "INSERT INTO download_queue(username, status, pid) VALUES ('ann', 2, $$), ('ann', 6, -1),
   ('ann', 8, $$), ('ann', 7, $$)" >/dev/null
check "task count --downloading" "count  1" "$("$tv" task count --downloading)"
check "task count --downloading repairs" "101" "$(q "SELECT status FROM download_queue WHERE status=101")"
check "task count --seeding" '{"count":2}' "$("$tv" task count --seeding --json | tr -d ' \n')"
check "task count --seeding --user is usage" 2 "$(status "$tv" task count --seeding --user ann)"

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
