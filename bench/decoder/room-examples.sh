#!/usr/bin/env bash
# Sounds that a listener of read-outs once took for codes, made again with sox and espeak-ng
# and scanned: each line shows the codes heard, which should be exactly the codes said.
#
#   bench/decoder/room-examples.sh [SOUNDMETER]     (default: build/bin/soundmeter)
set -euo pipefail
SM=$(realpath "${1:-build/bin/soundmeter}")
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
cd "$work"

hz() { echo $((86 * (30 + 10 * $1))); }
gen() { sox -n -r 44100 -c 1 -b 16 "$@"; }
line() { printf '%-32s%s\n' "$1" "$2"; }
heard() { "$SM" scan -q "$1" | awk '/heard code/ {for (i = 1; i <= NF; i++) if ($i == "code") printf "%s ", $(i + 1)} END {print ""}'; }
count() { heard "$1" | wc -w; }

# Codes 0 3 8 12 17 20 22 after a 3 s lead-in: 300 ms tones at -13.5 dBFS, 1 s apart, over
# quiet white noise.
parts=()
gen lead.wav synth 3 whitenoise vol 0.003
parts+=(lead.wav)
for c in 0 3 8 12 17 20 22; do
    gen "t$c.wav" synth 0.3 sine "$(hz "$c")" vol 0.3 fade 0.005 0.3 0.005 pad 0 0.7
    parts+=("t$c.wav")
done
sox "${parts[@]}" tones.wav
gen bed.wav synth "$(soxi -D tones.wav)" whitenoise vol 0.003
sox -m tones.wav bed.wav codes.wav
line said "0 3 8 12 17 20 22"
line "as said" "$(heard codes.wav)"
sox codes.wav x.wav overdrive 5 0 2>/dev/null
line "loudspeaker overdrive" "$(heard x.wav)"
sox -v 1.5 codes.wav x.wav 2>/dev/null
line "clipped, 1.5 x full scale" "$(heard x.wav)"
sox -v 1.5 tones.wav -e floating-point x.wav 2>/dev/null
line "float file above 0 dBFS" "$(heard x.wav)"
sox codes.wav x.wav compand 0.15,1 6:-70,-60,-20 -5 -90 0.2 2>/dev/null
line "gain control overshooting" "$(heard x.wav)"
for s in 0.999 0.998 0.995 0.99 0.98; do
    sox codes.wav x.wav speed "$s"
    line "clock x $s" "$(heard x.wav)"
done
sox codes.wav x.wav reverb 90
line "reverb 90" "$(heard x.wav)"
espeak-ng -w voice.wav "The quick brown fox jumps over the lazy dog while the codes are said, and it goes on talking so that every code has speech over it."
sox voice.wav -r 44100 -c 1 -b 16 speech.wav norm -10.5 repeat 3
sox -m codes.wav speech.wav x.wav
line "speech as loud as the codes" "$(heard x.wav)"

parts=(lead.wav)
for c in 2 3 4 5 6 7 8; do
    gen "b$c.wav" synth 0.15 sine "$(hz "$c")" vol 0.3
    parts+=("b$c.wav")
done
sox "${parts[@]}" lead.wav b.wav
sox b.wav x.wav reverb 90
line "2..8 back to back, reverb 90" "$(heard x.wav)"

gen a.wav synth 0.3 sine "$(hz 9)" vol 0.3 pad 0 0.2
gen z.wav synth 0.3 sine "$(hz 9)" vol 0.3 pad 0 1
parts=(lead.wav)
for _ in $(seq 20); do parts+=(a.wav z.wav); done
sox "${parts[@]}" x.wav
line "code 9 twice, 200 ms gap, x 20" "$(count x.wav) of 40 heard"

gen m.wav synth 0.5 pluck C4 pluck E4 pluck G4 synth 0.5 pluck A3 pluck C4 pluck E5 : synth 0.5 square D3 square F4 square A4 : synth 0.5 sawtooth G3 sawtooth B4 sawtooth D5 fade 0.01 0.5 0.1 vol 0.3
sox m.wav x.wav repeat 299
line "synth chords and plucks, 10 min" "$(count x.wav) codes"
sox speech.wav x.wav repeat 60
line "espeak-ng speech alone" "$(count x.wav) codes"
gen x.wav synth 600 pinknoise vol 0.3
line "pink noise, 10 min" "$(count x.wav) codes"
