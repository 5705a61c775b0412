#!/usr/bin/env bash
# The processor time a device process of `demo` takes in each room preset, as a share of
# one core over its life: both devices of `demo --room R --devices D --rounds N` are read
# from /proc until they end.
#   bench/rooms/device-cpu.sh [ROUNDS] [DEVICE]     (60 rounds, cheap-speaker: the most work)
set -euo pipefail
cd "$(dirname "$0")/../.."
rounds=${1:-60}
device=${2:-cheap-speaker}
soundmeter=build/bin/soundmeter
[ -x "$soundmeter" ] || { echo "device-cpu.sh: build first (cmake --build --preset default)" >&2; exit 2; }
tick=$(getconf CLK_TCK)
boot_ticks() { awk '{print int($1 * '"$tick"')}' /proc/uptime; }

echo "| room | device | rounds | processor time per device (share of one core) |"
echo "|---|---|---|---|"
for room in quiet office kitchen hall street; do
  "$soundmeter" demo --room "$room" --devices "$device" --rounds "$rounds" -q >/dev/null 2>&1 &
  demo=$!
  declare -A cpu=() life=()
  while kill -0 "$demo" 2>/dev/null; do
    for pid in $(pgrep -P "$demo" || true); do
      read -r -a f < "/proc/$pid/stat" 2>/dev/null || continue
      # Fields 14 and 15: user and system ticks; 22: start, in ticks since boot.
      cpu[$pid]=$(( f[13] + f[14] ))
      life[$pid]=$(( $(boot_ticks) - f[21] ))
    done
    sleep 0.2
  done
  wait "$demo" || true
  shares=""
  for pid in "${!cpu[@]}"; do
    shares+=$(awk -v c="${cpu[$pid]}" -v l="${life[$pid]}" 'BEGIN { printf "%.1f %% ", (l > 0 ? 100 * c / l : 0) }')
  done
  echo "| $room | $device | $rounds | $shares|"
  unset cpu life
done
