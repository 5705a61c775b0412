#!/usr/bin/env bash
# Installs what is missing, builds, and runs the two-device demo in a simulated room.
# Arguments go to `soundmeter demo` (for example: scripts/demo.sh --rounds 5 --snr 10).
set -euo pipefail
cd "$(dirname "$0")/.."

scripts/install-deps.sh
cmake --preset default >/dev/null
# The first build takes a few minutes on a small machine: show how far it is.
echo "building (the first time takes a few minutes)..." >&2
cmake --build --preset default | while IFS= read -r line; do
  case "$line" in
    "["*"%]"*) printf '\r  %s' "${line%%]*}]" >&2 ;;
  esac
done
printf '\r  done.  \n' >&2
exec build/bin/soundmeter demo "$@"
