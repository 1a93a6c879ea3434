# The picture of growth in docs/performance.md: on the left the time per operation by the number of
# live blocks, on the right the time to drop all of them.
set terminal svg size 960,420 font "sans,12" background "white"
set output output
set logscale xy
set grid xtics ytics lc rgb "#dddddd"
set xrange [700:14000000]
set xtics ("1k" 1e3, "10k" 1e4, "100k" 1e5, "1M" 1e6, "10M" 1e7)
set format y "%g"
set key top left Left reverse
set multiplot layout 1,2
subjects = "pool-64k glibc mimalloc jemalloc std::pmr"
colours = "#c02020 #303030 #2060c0 #209040 #b08000"
mark(i) = int(word("7 5 9 13 11", i))
set title "Nanoseconds per operation, by live blocks of 32 bytes"
plot for [i=1:5] data index i-1 using 1:2 with linespoints pt mark(i) ps 0.8 lw 1.5 \
    lc rgb word(colours, i) title word(subjects, i)
set title "Milliseconds to drop all blocks"
plot for [i=1:5] data index i-1 using 1:3 with linespoints pt mark(i) ps 0.8 lw 1.5 \
    lc rgb word(colours, i) title word(subjects, i)
unset multiplot
