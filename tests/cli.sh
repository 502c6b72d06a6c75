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

[ $fails -eq 0 ] && echo "CLI checks passed"
exit $fails
