#!/usr/bin/env bash
# Cost of watching: CPU seconds (user + system) and peak resident memory of 60 s of
# paced 1080i playback to the null outputs, TavoPlayer (tavoplay --headless: the
# viewer and the tavoplayerd service it starts) against
# mpv --no-config --vo=null --ao=null on the same file, in the same run.
#
# CPU comes from /usr/bin/time (a process's own time and that of every child it
# waited for: tavoplay waits for its tavoplayerd). Peak resident memory is the sum of
# each process's VmHWM (its own peak, kept by the kernel) over the process tree,
# sampled from /proc until the end; for mpv, one process, that is its VmHWM.
#
# Each comparison is one line ending "ratio N.NN", above 1 when TavoPlayer costs less
# (mpv's figure over ours). Run from the checkout root after building into build/.
# Environment: BUILD (default build), DURATION (seconds, default 60), KEEP=1.
set -euo pipefail

BUILD=${BUILD:-build}
DURATION=${DURATION:-60}
HERE=$(cd "$(dirname "$0")" && pwd)
TSGEN=$BUILD/apps/tsgen/tsgen
PLAY=$BUILD/apps/tavoplay/tavoplay
for tool in "$TSGEN" "$PLAY" "$BUILD/apps/tavoplayerd/tavoplayerd"; do
    [ -x "$tool" ] || { echo "watch_cost: $tool is missing; build first (README)" >&2; exit 2; }
done
command -v mpv >/dev/null || { echo "watch_cost: mpv is not installed (scripts/setup.sh)" >&2; exit 2; }

WORK=$(mktemp -d /tmp/watch_cost-XXXXXX)
trap '[ "${KEEP:-0}" = 1 ] && echo "watch_cost: kept $WORK" >&2 || rm -rf "$WORK"' EXIT

# 1080i colour bars, AAC LATM stereo and captions: what a viewer watches.
"$TSGEN" -o "$WORK/watch.ts" -d "$DURATION" --caption '5:Olá, boa noite' --caption '30:\fTchau'

# measure NAME COMMAND...: runs COMMAND under time with the sampler on its tree;
# leaves "cpu_s user_s sys_s wall_s hwm_kib" in $WORK/NAME.cost.
measure() {
    local name=$1
    shift
    /usr/bin/time -f "%U %S %e" -o "$WORK/$name.time" "$@" >"$WORK/$name.out" 2>&1 &
    local pid=$!
    python3 "$HERE/proctree.py" peak "$pid" 0.2 --skip-root >"$WORK/$name.mem"
    wait "$pid" || { echo "watch_cost: $name failed:" >&2; tail -5 "$WORK/$name.out" >&2; exit 1; }
    read -r user sys wall <"$WORK/$name.time"
    read -r _ hwm <"$WORK/$name.mem"
    echo "$(awk -v u="$user" -v s="$sys" 'BEGIN { print u + s }') $user $sys $wall $hwm" >"$WORK/$name.cost"
}

echo "load before: $(uptime)"
measure tavoplayer "$PLAY" --headless "$WORK/watch.ts"
echo "load between: $(uptime)"
measure mpv mpv --no-config --vo=null --ao=null --really-quiet "$WORK/watch.ts"
echo "load after: $(uptime)"

read -r ours_cpu ours_user ours_sys ours_wall ours_hwm <"$WORK/tavoplayer.cost"
read -r mpv_cpu mpv_user mpv_sys mpv_wall mpv_hwm <"$WORK/mpv.cost"
parts=$(awk '$1 == "hwm" { printf "%s%s %.1f", sep, $2, $3 / 1024; sep = " + " }' \
    "$WORK/tavoplayer.mem")
awk -v oc="$ours_cpu" -v ou="$ours_user" -v os="$ours_sys" -v ow="$ours_wall" \
    -v mc="$mpv_cpu" -v mu="$mpv_user" -v ms="$mpv_sys" -v mw="$mpv_wall" \
    -v oh="$ours_hwm" -v mh="$mpv_hwm" -v parts="$parts" -v d="$DURATION" 'BEGIN {
    printf "cpu for %d s of 1080i: tavoplayer %.2f s (user %.2f, sys %.2f, wall %.1f s), mpv %.2f s (user %.2f, sys %.2f, wall %.1f s), ratio %.2f\n",
        d, oc, ou, os, ow, mc, mu, ms, mw, mc / oc
    printf "peak rss: tavoplayer %.1f MiB (%s), mpv %.1f MiB, ratio %.2f\n",
        oh / 1024, parts, mh / 1024, mh / oh
    printf "peak rss target 80 MiB: tavoplayer %s\n", (oh / 1024 <= 80 ? "within" : "over")
}'
# Where our CPU time went, by process and thread name (as last sampled, so a little
# below the totals above), and mpv's for comparison.
for name in tavoplayer mpv; do
    awk -v who="$name" '$1 == "cpu" && $4 >= 0.05 { line = line sprintf(" %s/%s %.2f", $2, $3, $4) }
        END { print "threads of " who ":" line }' "$WORK/$name.mem"
done
