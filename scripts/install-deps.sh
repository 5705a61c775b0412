#!/usr/bin/env bash
# Installs, from Debian's packages, whatever the build and the tests need and is missing.
#   scripts/install-deps.sh            the default toolchain (g++)
#   scripts/install-deps.sh clang ...  also clang, for the clang preset
#   scripts/install-deps.sh envelope   also gnuplot, which draws the envelope's plots
set -euo pipefail

packages=(
  g++ cmake make pkg-config binutils
  libgtest-dev libgmock-dev libbenchmark-dev nlohmann-json3-dev
  libsndfile1-dev portaudio19-dev libcli11-dev libfftw3-dev
  libsamplerate0-dev
  # spectrogram pictures
  libcairo2-dev libfontconfig-dev fonts-dejavu-core
  # the manual page is made from the help texts; the tests render it with man
  help2man man-db
  # the recording tests make their files with sox; its base formats hold FLAC and Ogg
  sox libsox-fmt-base
  # the frame decoder's test and benchmark speak with espeak-ng; its benchmark plays
  # recorded speech (alsa-utils) and music (lomiri-sounds' ringtones)
  espeak-ng alsa-utils lomiri-sounds
  # The card test runs a private sound server that the card route reaches through
  # ALSA's pulse plug-in.
  pulseaudio libasound2-plugins
)
for preset in "$@"; do
  if [ "$preset" = clang ]; then packages+=(clang); fi
  if [ "$preset" = envelope ]; then packages+=(gnuplot-nox); fi
done

missing=()
for p in "${packages[@]}"; do
  if ! dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q "install ok installed"; then
    missing+=("$p")
  fi
done

if [ ${#missing[@]} -eq 0 ]; then
  exit 0
fi

echo "installing: ${missing[*]}"
sudo=""
if [ "$(id -u)" -ne 0 ]; then
  sudo="sudo"
fi
$sudo apt-get update -qq
DEBIAN_FRONTEND=noninteractive $sudo apt-get install -y -qq --no-install-recommends "${missing[@]}"
