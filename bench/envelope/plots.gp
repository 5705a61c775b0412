# Plots of the envelope, from the CSV files korvo_envelope writes into `dir`.
#   gnuplot -e "dir='docs/envelope'" bench/envelope/plots.gp
set datafile separator ','
set terminal pngcairo size 1100,520 font 'sans,10'
set grid
set key outside right top
host(d) = strcol(1) eq 'host'
builtin(d) = strcol(1) eq 'builtin'

# P(heard) against SNR, one line per code, for one grid.
do for [g in 'white-300ms white-40ms speech-300ms'] {
    set output dir.'/heard-'.g.'.png'
    set multiplot layout 1,2 title 'Probability a code is heard, '.g.' (one line per code; dashed: 99 %)'
    set xlabel 'SNR (dB, tone over full-band noise)'
    set ylabel 'probability heard'
    set yrange [0:1.02]
    if (g eq 'speech-300ms') { set xrange [-45:30] } else { set xrange [-20:30] }
    unset key
    set title "host's decision (codes 0..22)"
    plot for [c=0:22] dir.'/heard-'.g.'.csv' using 6:(host(0) && $4==c ? $9 : 1/0) with linespoints pt 7 ps 0.4 lc c, \
         0.99 dt 2 lc 'black', \
         dir.'/codes-'.g.'.csv' using 2:(host(0) ? $5 : 1/0) with lines lw 2 dt 3 lc 'gray40'
    set title "builtin decision, HearFreqIdx (codes 0..17)"
    plot for [c=0:17] dir.'/heard-'.g.'.csv' using 6:(builtin(0) && $4==c ? $9 : 1/0) with linespoints pt 7 ps 0.4 lc c, \
         0.99 dt 2 lc 'black', \
         dir.'/codes-'.g.'.csv' using 2:(builtin(0) ? $5 : 1/0) with lines lw 2 dt 3 lc 'gray40'
    unset multiplot
}

# Per code: the lowest SNR heard in 99 % of trials (300 ms tones).
set output dir.'/threshold-snr.png'
set title 'Lowest SNR at which each code is heard in 99 % of 300 ms tones (lower is better; dashed: target -18 dB)'
set xlabel 'code'
set ylabel 'SNR (dB)'
set xrange [-0.5:22.5]
set yrange [-47:32]
set key outside right top
plot dir.'/summary.csv' using 2:(host(0) ? $4 : 1/0) with linespoints pt 7 lc 'dark-blue' title "host, white noise", \
     dir.'/summary.csv' using 2:(host(0) ? $6 : 1/0) with linespoints pt 5 lc 'dark-cyan' title "host, speech-like", \
     dir.'/summary.csv' using 2:(builtin(0) ? $4 : 1/0) with linespoints pt 7 lc 'dark-red' title "builtin, white noise", \
     dir.'/summary.csv' using 2:(builtin(0) ? $6 : 1/0) with linespoints pt 5 lc 'orange' title "builtin, speech-like", \
     -18 dt 2 lc 'black' notitle

# Latency from the tone's start, 300 ms tones in white noise.
set output dir.'/latency.png'
set title "Latency from the tone's start to the code heard, 300 ms tones (median of the codes' medians; worst code's 99th percentile)"
set xlabel 'SNR (dB)'
set ylabel 'ms'
set xrange [-20:30]
set yrange [0:*]
plot dir.'/codes-white-300ms.csv' using 2:(host(0) && $6 > 0 ? $6 : 1/0) with linespoints pt 7 lc 'dark-blue' title 'host, median', \
     dir.'/codes-white-300ms.csv' using 2:(host(0) && $7 > 0 ? $7 : 1/0) with linespoints pt 5 lc 'dark-cyan' title 'host, 99th percentile', \
     dir.'/codes-white-300ms.csv' using 2:(builtin(0) && $6 > 0 ? $6 : 1/0) with linespoints pt 7 lc 'dark-red' title 'builtin, median', \
     dir.'/codes-white-300ms.csv' using 2:(builtin(0) && $7 > 0 ? $7 : 1/0) with linespoints pt 5 lc 'orange' title 'builtin, 99th percentile', \
     18 dt 2 lc 'black' title 'targets at 10 dB: 18 / 30 ms', 30 dt 2 lc 'black' notitle

# Tone length at 10 dB SNR.
set output dir.'/tone-length.png'
set title 'Tones of each length at 10 dB SNR: worst code and the share of tones some analysed frame holds'
set xlabel 'tone length (ms)'
set ylabel 'probability'
set xrange [15:305]
set yrange [0:1.02]
set logscale x
plot dir.'/codes-tone-length.csv' using 2:(host(0) ? $3 : 1/0) with linespoints pt 7 lc 'dark-blue' title 'host, worst code heard', \
     dir.'/codes-tone-length.csv' using 2:(builtin(0) ? $3 : 1/0) with linespoints pt 7 lc 'dark-red' title 'builtin, worst code heard', \
     dir.'/codes-tone-length.csv' using 2:(host(0) ? $5 : 1/0) with lines lw 2 dt 3 lc 'gray40' title 'an analysed frame a quarter filled by the tone', \
     0.99 dt 2 lc 'black' title '99 %'
unset logscale x

# False codes in noise alone at the calibrated level.
set output dir.'/false-codes.png'
set title 'False codes per 10,000 hearing steps in noise alone at the level --level auto calibrates (0 drawn at 0.001)'
set xlabel 'noise (dBFS RMS)'
set ylabel 'false codes per 10,000 steps'
set xrange [-85:-5]
set yrange [0.0005:*]
set logscale y
shown(v) = v > 0 ? v : 0.001
plot dir.'/false-codes.csv' using 3:(host(0) && strcol(2) eq 'white' ? shown($8) : 1/0) with linespoints pt 7 lc 'dark-blue' title 'host, white', \
     dir.'/false-codes.csv' using 3:(host(0) && strcol(2) eq 'speech' ? shown($8) : 1/0) with linespoints pt 5 lc 'dark-cyan' title 'host, speech-like', \
     dir.'/false-codes.csv' using 3:(builtin(0) && strcol(2) eq 'white' ? shown($8) : 1/0) with linespoints pt 7 lc 'dark-red' title 'builtin, white', \
     dir.'/false-codes.csv' using 3:(builtin(0) && strcol(2) eq 'speech' ? shown($8) : 1/0) with linespoints pt 5 lc 'orange' title 'builtin, speech-like', \
     1 dt 2 lc 'black' title '1 in 10,000'
