#!/usr/bin/env bash
# What a `soundmeter listen` process costs over a long run: every minute, the share of one
# core it used since the last sample (its user + system time from /proc over the wall time)
# and its resident memory.
#
#   scripts/listen-cost.sh [SECONDS] [listen arguments...]
#
# Default: 1800 s in a simulated room with white noise at -40 dBFS (the host's decoder at
# a calibrated level). Needs a build (cmake --build --preset default).
set -euo pipefail
cd "$(dirname "$0")/.."
seconds=${1:-1800}
shift || true
args=("$@")
if [ ${#args[@]} -eq 0 ]; then
    export KORVO_SIM_NOISE=-40
    args=(--mic "sim:cost-$$" --level auto)
fi
build/bin/soundmeter -q listen --seconds "$seconds" "${args[@]}" >/dev/null &
pid=$!
trap 'kill $pid 2>/dev/null || true' EXIT
ticks=$(getconf CLK_TCK)
cpu() { awk '{print $14 + $15}' "/proc/$pid/stat"; }
rss() { awk '/VmRSS/ {print $2}' "/proc/$pid/status"; }
printf '%8s %10s %10s\n' "minute" "core_%" "rss_kB"
sleep 5  # past the start-up and the calibration
last_cpu=$(cpu)
last_t=$(date +%s.%N)
minute=0
while kill -0 $pid 2>/dev/null; do
    sleep 60 || break
    kill -0 $pid 2>/dev/null || break
    now_cpu=$(cpu) now_t=$(date +%s.%N) now_rss=$(rss)
    minute=$((minute + 1))
    awk -v m=$minute -v c=$((now_cpu - last_cpu)) -v t0="$last_t" -v t1="$now_t" -v hz="$ticks" -v r="$now_rss" \
        'BEGIN { printf "%8d %10.2f %10d\n", m, 100 * c / hz / (t1 - t0), r }'
    last_cpu=$now_cpu last_t=$now_t
done
wait $pid || true
trap - EXIT
