#!/usr/bin/env bash
# Compares the dynamic symbols that the library defines with the committed list.
set -euo pipefail
lib=$1 list=$2
actual=$(nm -D --defined-only "$lib" | awk '{print $NF}' | grep -v -E '^(_init|_fini|_edata|_end|__bss_start)$' | sort -u)
expected=$(grep -v -E '^\s*(#|$)' "$list" | sort -u)
if [ "$actual" != "$expected" ]; then
  echo "exported symbols differ from $list (< built, > list):"
  diff <(echo "$actual") <(echo "$expected") || true
  exit 1
fi
echo "$(echo "$actual" | wc -l) symbols, as listed"
