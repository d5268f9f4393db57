# Plots the time of a first merge against size, one panel per shape. Run it in the folder of
# performance.dat.
set terminal pngcairo size 1200, 800 font "sans,11"
set output "performance.png"
set logscale xy
set xlabel "files"
set ylabel "seconds"
set format x "10^{%T}"
set key top left
set grid
set style data linespoints
shapes = system("sed -n 's/^# //p' performance.dat")
set multiplot layout 2, 3
do for [shape in shapes] {
  set title shape
  plot "performance.dat" index shape using 1:2 title "daemon" linewidth 2, \
       "" index shape using 1:4 title "floor", \
       "" index shape using 1:3 title "horizon"
}
unset multiplot
