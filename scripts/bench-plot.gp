# The picture of single operations in docs/performance.md: time compared with glibc, a row of marks
# for each piece of work.
set terminal svg size 960,560 font "sans,12" background "white"
set output output
set title "Time per operation, glibc's malloc = 1 (less is better)"
set logscale x 2
set xrange [0.03125:16]
set xtics ("1/32" 0.03125, "1/16" 0.0625, "1/8" 0.125, "1/4" 0.25, "1/2" 0.5, "1" 1, "2" 2, "4" 4, "8" 8, "16" 16)
set grid xtics ytics lc rgb "#dddddd"
set arrow from 1, graph 0 to 1, graph 1 nohead lc rgb "#888888"
set key outside bottom center horizontal
set datafile separator "\t"
set datafile missing "-"
set offsets 0, 0, 0.5, 0
set yrange [-0.5:*] reverse
set lmargin 34
plot data using 2:0:ytic(1) title "pool, default" with points pt 7 ps 1.2 lc rgb "#c02020", \
     data using 3:0 title "pool, best setting" with points pt 6 ps 1.5 lc rgb "#c02020", \
     data using 4:0 title "mimalloc" with points pt 9 ps 1 lc rgb "#2060c0", \
     data using 5:0 title "jemalloc" with points pt 5 ps 0.8 lc rgb "#209040", \
     data using 6:0 title "tcmalloc" with points pt 13 ps 1 lc rgb "#b08000", \
     data using 7:0 title "std::pmr" with points pt 2 ps 1 lc rgb "#606060"
