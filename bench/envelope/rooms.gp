# Plots of the envelope in the room and device presets, from rooms-codes.csv and
# rooms-summary.csv in `dir`.
set datafile separator ","
set terminal pngcairo size 1500,900 font "DejaVu Sans,10"
set output dir."/rooms-heard.png"
set multiplot layout 2,3 title "A code heard by the frame decoder in each room and device preset (64 ms tones at the plug-in's level)"
set yrange [0:1.05]
set xrange [-0.5:22.5]
set xlabel "code"
set key bottom left
set grid
rooms = "quiet office kitchen hall street"
devices = "ideal phone laptop cheap-speaker"
do for [r in rooms] {
    set ylabel sprintf("%s: probability heard", r)
    plot for [d in devices] dir."/rooms-codes.csv" using ((strcol(1) eq r && strcol(2) eq d) ? $3 : NaN):8 with linespoints title d
}
unset multiplot

set output dir."/rooms-latency.png"
set terminal pngcairo size 1200,600 font "DejaVu Sans,10"
set title "Latency from the tone's start at the loudspeaker to the code heard (codes each device carries): median and 99th percentile"
set style data histogram
set style histogram cluster gap 1
set style fill solid 0.8 border -1
set yrange [0:*]
set xrange [*:*]
set ylabel "ms"
set xlabel ""
set xtics rotate by -45
set key top left
plot dir."/rooms-summary.csv" using 9:xtic(stringcolumn(1)." ".stringcolumn(2)) title "median", \
     "" using 10 title "99th percentile"
