set output 'Timing5.svg
set terminal svg
set multiplot
set grid
set title "Clients duration"
set xlabel "audio cycles"
set ylabel "usec"
plot "/tmp/p2run/prof" using 10 title "pw-play/42" with lines
unset multiplot
unset output
