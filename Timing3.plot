set output 'Timing3.svg
set terminal svg
set multiplot
set grid
set title "Clients end date"
set xlabel "audio cycles"
set ylabel "usec"
plot "/tmp/p2run/prof" using 1 title "Audio period" with lines, "/tmp/p2run/prof" using 8 title "pw-play/42" with lines
unset multiplot
unset output
