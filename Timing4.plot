set output 'Timing4.svg
set terminal svg
set multiplot
set grid
set title "Clients scheduling latency"
set xlabel "audio cycles"
set ylabel "usec"
plot "/tmp/p2run/prof" using 9 title "pw-play/42" with lines
unset multiplot
unset output
