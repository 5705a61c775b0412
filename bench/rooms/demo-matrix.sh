#!/usr/bin/env bash
# `demo --rounds N` in every room and device preset: the README's table of exchanges
# completed and round trips (median and worst).
#   bench/rooms/demo-matrix.sh [ROUNDS]     (100)
set -euo pipefail
cd "$(dirname "$0")/../.."
rounds=${1:-100}
soundmeter=build/bin/soundmeter
[ -x "$soundmeter" ] || { echo "demo-matrix.sh: build first (cmake --build --preset default)" >&2; exit 2; }
devices=(ideal phone laptop cheap-speaker)
printf '| room |'; for d in "${devices[@]}"; do printf ' %s |' "$d"; done; echo
printf '|---|'; for d in "${devices[@]}"; do printf -- '---|'; done; echo
for room in quiet office kitchen hall street; do
  printf '| `%s` |' "$room"
  for d in "${devices[@]}"; do
    # The summary: "N of M exchanges completed, round trip median X ms, worst Y ms".
    summary=$("$soundmeter" demo --room "$room" --devices "$d" --rounds "$rounds" -q 2>&1 | tail -1 || true)
    printf ' %s |' "$(sed -E 's/^([0-9]+) of ([0-9]+) exchanges completed, round trip median ([0-9]+) ms, worst ([0-9]+) ms.*/\1\/\2, \3 ms (worst \4)/' <<<"$summary")"
  done
  echo
done
