# The second picture of docs/performance.md: how cost grows with work. Left the time of an operation
# by the blocks that are live, right the time to drop all of them.
set terminal svg size 960,420 font "sans,12" background "white"
set output output
set logscale xy
set grid xtics ytics lc rgb "#dddddd"
set format x "10^{%T}"
set key top left
set multiplot layout 1,2
subjects = "pool glibc mimalloc jemalloc std::pmr"
colours = "#c02020 #888888 #2060c0 #209040 #606060"
set title "Nanoseconds an operation, by live blocks of 32 bytes"
plot for [i=1:5] data index i-1 using 1:2 with linespoints pt i+3 ps 0.7 lw 1.5 \
    lc rgb word(colours, i) title word(subjects, i)
set title "Milliseconds to drop all blocks"
plot for [i=1:5] data index i-1 using 1:3 with linespoints pt i+3 ps 0.7 lw 1.5 \
    lc rgb word(colours, i) title word(subjects, i)
unset multiplot
