#!/usr/bin/env bash
# Measures the operating envelope of the link and writes its CSV files and plots into
# docs/envelope (about 40 minutes on two cores). Arguments go to korvo_envelope
# (--trials N, --quick, --no-realtime, --realtime-only, --rooms: the room and device presets).
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/install-deps.sh envelope
cmake --preset default >/dev/null
cmake --build --preset default --target korvo_envelope soundmeter
mkdir -p docs/envelope
build/bin/korvo_envelope --out docs/envelope "$@"
