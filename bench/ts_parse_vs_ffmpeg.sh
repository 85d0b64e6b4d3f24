#!/bin/sh
# Time to parse a whole TS file with the four chains' TS parsers (bench_TsChains
# --ts) against FFmpeg demuxing and copying every stream of the same file
# (ffmpeg -v quiet -i FILE -map 0 -c copy -f null -), measured in the same run.
# Both are timed as whole processes (start, file read, parse); each runs RUNS times
# alternately; the best and the median of each are compared. Target: at least 3.
#
#   bench/ts_parse_vs_ffmpeg.sh [FILE] [BUILD_DIR]   (RUNS=5 by default)
#
# Without FILE, the 1080i 18 Mbit/s stream of the TS parser benchmarks is used
# (made with FFmpeg in BUILD_DIR on first use).
set -eu
here=$(cd "$(dirname "$0")" && pwd)
file=${1:-}
build=${2:-$here/../build}
runs=${RUNS:-5}
bin=$build/bench/bench_TsChains
[ -x "$bin" ] || { echo "build bench_TsChains first (missing $bin)" >&2; exit 1; }
command -v ffmpeg >/dev/null || { echo "ffmpeg not installed" >&2; exit 1; }

# The first pass names the file (and makes the default one if needed).
first=$("$bin" --ts="$file")
file=$(echo "$first" | sed -n 's/^file=//p')
echo "$first" | grep -E '^(file|pids|packets)='

now() { date +%s.%N; }
ours_all=""
ffmpeg_all=""
i=0
while [ $i -lt "$runs" ]; do
    t0=$(now); "$bin" --ts="$file" >/dev/null; t1=$(now)
    ffmpeg -v quiet -i "$file" -map 0 -c copy -f null -; t2=$(now)
    ours=$(awk "BEGIN { print $t1 - $t0 }")
    theirs=$(awk "BEGIN { print $t2 - $t1 }")
    ours_all="$ours_all $ours"
    ffmpeg_all="$ffmpeg_all $theirs"
    printf 'run %d: tavo %.3f s, ffmpeg %.3f s\n' $((i + 1)) "$ours" "$theirs"
    i=$((i + 1))
done
best() { printf '%s\n' $1 | sort -g | head -n 1; }
median() { printf '%s\n' $1 | sort -g | awk '{ v[NR] = $1 } END { print v[int((NR + 1) / 2)] }'; }
best_ours=$(best "$ours_all")
best_ffmpeg=$(best "$ffmpeg_all")
median_ours=$(median "$ours_all")
median_ffmpeg=$(median "$ffmpeg_all")
printf 'best:   tavo %.3f s, ffmpeg %.3f s, ratio ffmpeg/tavo = %.2f\n' \
    "$best_ours" "$best_ffmpeg" "$(awk "BEGIN { print $best_ffmpeg / $best_ours }")"
printf 'median: tavo %.3f s, ffmpeg %.3f s, ratio ffmpeg/tavo = %.2f (target >= 3)\n' \
    "$median_ours" "$median_ffmpeg" "$(awk "BEGIN { print $median_ffmpeg / $median_ours }")"
