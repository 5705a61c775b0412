#!/usr/bin/env bash
# Prints why each test of the last CTest run in BUILD_DIR was skipped, one line per test:
# CTest lists skipped tests without the reason their GTEST_SKIP() gave.
#   scripts/skip-reasons.sh BUILD_DIR
set -euo pipefail
log="${1:?usage: scripts/skip-reasons.sh BUILD_DIR}/Testing/Temporary/LastTest.log"
[ -f "$log" ] || exit 0
awk '
  /^[0-9]+\/[0-9]+ Test: / { name = $3; reason = ""; want = 0; next }
  want { reason = $0; want = 0; next }
  /: Skipped$/ { want = 1; next }
  /^Skip regular expression found/ { printf "skipped: %s: %s\n", name, reason == "" ? "(no reason given)" : reason }
' "$log"
