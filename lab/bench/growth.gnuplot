# SPDX-License-Identifier: BSD-2-Clause
# $icu_last and its like hold lines of size, instructions, calls and kB.
set terminal svg size 1040,460 dynamic enhanced font 'sans-serif,13' background '#ffffff'
set format xy '%.0s %c'
set xrange [0:*]
set yrange [0:*]
set key top left
set grid back
set tics nomirror
set border 3 back
set multiplot layout 1,2
set title 'Entries in the ICU directory of an update'
set xlabel 'entries (for the tree: directories)'
set ylabel 'instructions'
# The first two differ by a thousandth, so the one is drawn wide below the other.
plot $icu_last using 1:2 with linespoints lc rgb '#f2b48f' lw 8 pt 5 ps 1.5 title 'match listed last', \
  $icu_absent using 1:2 with linespoints lc rgb '#0b5fa5' lw 2 pt 7 ps 0.6 title 'no match', \
  $icu_first using 1:2 with linespoints lc rgb '#2e7d32' lw 2 pt 9 ps 0.7 title 'match listed first', \
  $icu_tree using 1:2 with linespoints lc rgb '#6a4c93' lw 2 pt 13 ps 0.9 title 'a match and a tree below'
set format y '%.1s %c'
set title 'Length of the system version text'
set xlabel 'bytes'
set ylabel 'instructions, bytes of memory'
plot $version using 1:2 with linespoints lc rgb '#0b5fa5' lw 2 pt 7 ps 0.6 title 'instructions', \
  $version using 1:($4*1024) with linespoints lc rgb '#c8511b' lw 2 pt 5 ps 0.6 title 'peak memory (bytes)'
