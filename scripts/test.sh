#!/usr/bin/env bash
# Installs what is missing, builds and runs the whole suite: the default
# (RelWithDebInfo) build, then the ASan+UBSan and TSan builds, then the cross builds for
# arm64 and armhf, whose tests run under qemu-user.
#   scripts/test.sh             all five
#   scripts/test.sh default     one preset (default, asan, tsan, clang, arm64 or armhf)
set -euo pipefail
cd "$(dirname "$0")/.."

presets=("$@")
if [ ${#presets[@]} -eq 0 ]; then
  presets=(default asan tsan arm64 armhf)
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
  case "$preset" in
    arm64 | armhf)
      echo "${preset}: not built: the soundmeter host and its tests, and the benchmarks (the host's" \
        "sound cards, pictures and timing are the build machine's; see the README's Processors)" ;;
  esac
done
exit $status
