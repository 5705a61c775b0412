#!/usr/bin/env bash
# Installs, from Debian's packages, whatever the build and the tests need and is missing.
#   scripts/install-deps.sh            the default toolchain (g++)
#   scripts/install-deps.sh clang ...  also clang, for the clang preset
#   scripts/install-deps.sh envelope   also gnuplot, which draws the envelope's plots
#   scripts/install-deps.sh arm64      also the arm64 cross compiler, the arm64 libraries
#                                      (multiarch) and qemu-user, which runs the tests
#   scripts/install-deps.sh armhf      the same for armhf
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
# What a cross build needs for an architecture: its compiler, and the libraries the plug-in,
# the platform stand-in and the library's tests link, as the target's own packages.
foreign=()
cross() {
  local arch=$1 triplet=$2
  foreign+=("$arch")
  packages+=("g++-$triplet" qemu-user)
  for lib in libsndfile1-dev portaudio19-dev libsamplerate0-dev libfftw3-dev libgtest-dev libgmock-dev; do
    packages+=("$lib:$arch")
  done
}
for preset in "$@"; do
  if [ "$preset" = clang ]; then packages+=(clang); fi
  if [ "$preset" = envelope ]; then packages+=(gnuplot-nox); fi
  if [ "$preset" = arm64 ]; then cross arm64 aarch64-linux-gnu; fi
  if [ "$preset" = armhf ]; then cross armhf arm-linux-gnueabihf; fi
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
for arch in "${foreign[@]}"; do
  if ! dpkg --print-foreign-architectures | grep -qx "$arch"; then $sudo dpkg --add-architecture "$arch"; fi
done
# A mirror caught mid-sync fails one list now and then: install from what could be fetched.
if ! $sudo apt-get update -qq; then
  echo "install-deps.sh: some package lists could not be fetched; installing from the others" >&2
fi
DEBIAN_FRONTEND=noninteractive $sudo apt-get install -y -qq --no-install-recommends "${missing[@]}"
