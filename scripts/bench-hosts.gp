# The picture of whole programs in docs/performance.md: each memory compared with malloc.
set terminal svg size 960,360 font "sans,12" background "white"
set output output
set style data histograms
set style fill solid border rgb "white"
set grid ytics lc rgb "#dddddd"
set datafile separator "\t"
set datafile missing "-"
set key outside bottom center horizontal
set yrange [0:1.2]
set multiplot layout 1,2
colours = "#2060c0 #c02020 #e08080 #90b0e0 #b08000"
titles = "mimalloc|Heap|Heap, FreeAll|mi\\_heap\\_destroy|std::pmr pool"
name(i) = system(sprintf("echo '%s' | cut -d'|' -f%d", titles, i))
set title "Processor time, malloc = 1 (less is better)"
plot for [i=1:5] data index 0 using i+1:xtic(1) lc rgb word(colours, i) title name(i)
set title "Peak memory, malloc = 1"
plot for [i=1:5] data index 1 using i+1:xtic(1) lc rgb word(colours, i) title name(i)
unset multiplot
