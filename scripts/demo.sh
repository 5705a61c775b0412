#!/usr/bin/env bash
# Installs what is missing, builds, and runs the two-device demo in a simulated room.
# Arguments go to `soundmeter demo` (for example: scripts/demo.sh --rounds 5 --snr 10).
set -euo pipefail
cd "$(dirname "$0")/.."

scripts/install-deps.sh
cmake --preset default >/dev/null
cmake --build --preset default >/dev/null
exec build/bin/soundmeter demo "$@"
