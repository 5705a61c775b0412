#!/usr/bin/env bash
# Installs what is missing, builds, and runs the two-device demo in a simulated room.
# Arguments go to `soundmeter demo` (for example: scripts/demo.sh --rounds 5 --snr 10).
set -euo pipefail
cd "$(dirname "$0")/.."

scripts/install-deps.sh
cmake --preset default >/dev/null
# The first build takes a few minutes on a small machine: show how far it is, on one line
# that updates on a terminal, a line per quarter elsewhere.
echo "building (the first time takes a few minutes)..." >&2
shown=-1
cmake --build --preset default | while IFS= read -r line; do
  case "$line" in
    "["*"%]"*)
      percent=${line#[}; percent=${percent%%%]*}; percent=$((10#${percent// /}))
      if [ -t 2 ]; then
        printf '\r  %3d%%' "$percent" >&2
      elif [ $((percent / 25)) -gt "$shown" ]; then
        shown=$((percent / 25)); echo "  ${percent}%" >&2
      fi ;;
  esac
done
[ -t 2 ] && printf '\r  done.\n' >&2
exec build/bin/soundmeter demo "$@"
