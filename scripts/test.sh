#!/usr/bin/env bash
# Installs what is missing, builds and runs the whole suite: the default
# (RelWithDebInfo) build, then the ASan+UBSan and TSan builds.
#   scripts/test.sh             all three
#   scripts/test.sh default     one preset (default, asan, tsan or clang)
set -euo pipefail
cd "$(dirname "$0")/.."

presets=("$@")
if [ ${#presets[@]} -eq 0 ]; then
  presets=(default asan tsan)
fi
scripts/install-deps.sh "${presets[@]}"

status=0
for preset in "${presets[@]}"; do
  echo "==== ${preset}: configure and build"
  cmake --preset "$preset" >/dev/null
  cmake --build --preset "$preset"
  echo "==== ${preset}: test"
  if ! ctest --preset "$preset"; then
    status=1
  fi
  # CTest names the skipped tests; this says why each was skipped.
  if [ "$preset" = default ]; then dir=build; else dir="build-$preset"; fi
  scripts/skip-reasons.sh "$dir"
done
exit $status
