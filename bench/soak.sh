#!/usr/bin/env bash
# Soak: looped playback of a lip-sync mark stream (tsgen --sync-marks, 1080i, AAC LATM)
# from a file:...?loop=1 demux source through tavoplayerd, to the null video sink and
# the WAV audio sink, for 10 minutes. Every 10 s the resident memory of the service
# (VmRSS, the process and its children) is sampled, next to the mean A/V offset of the
# marks shown in those 10 s (from the video show log, the audio timing log and the WAV,
# as bench/av_sync.sh pairs them). Prints the growth of resident memory after the first
# minute (target at most 1 MiB) and whether the A/V offset drifts (first minute against
# last minute, and the least-squares slope over the run).
#
# Run from the checkout root after building into build/ (README). Environment: BUILD
# (default build), MINUTES (default 10), LOOP_SECONDS (length of the looped file,
# default 30), KEEP=1 keeps the work folder.
set -euo pipefail

BUILD=${BUILD:-build}
MINUTES=${MINUTES:-10}
LOOP_SECONDS=${LOOP_SECONDS:-30}
HERE=$(cd "$(dirname "$0")" && pwd)
# shellcheck source=bench/logging_service.sh
. "$HERE/logging_service.sh"
find_programs soak

WORK=$(mktemp -d /tmp/soak-XXXXXX)
DAEMON_PID=
SAMPLER_PID=
cleanup() {
    for pid in $SAMPLER_PID $DAEMON_PID; do
        kill "$pid" 2>/dev/null || true
        wait "$pid" 2>/dev/null || true
    done
    if [ "${KEEP:-0}" = 1 ]; then
        echo "soak: kept $WORK" >&2
    else
        rm -rf "$WORK"
    fi
}
trap cleanup EXIT

SECONDS_TOTAL=$((MINUTES * 60))
echo "load before: $(uptime)"
"$TSGEN" -o "$WORK/loop.ts" -d "$LOOP_SECONDS" --sync-marks
URI=$("$PLAY" --probe "$WORK/loop.ts" | tail -n 1)
start_logging_service "file:$(realpath "$WORK/loop.ts")?loop=1"
# The client stays connected for the whole run: a client that goes away is a viewer
# gone, and the service cleans up after it.
"$CTL" --service-dir "$SVC" "open 5 $URI" start "wait $((SECONDS_TOTAL + 2))" stop close \
    >"$WORK/tavoctl.log" 2>&1 &
CTL_PID=$!
python3 "$HERE/proctree.py" every "$DAEMON_PID" 10 $((SECONDS_TOTAL / 10 + 1)) >"$WORK/rss.txt" &
SAMPLER_PID=$!
wait "$SAMPLER_PID" || true
SAMPLER_PID=
wait "$CTL_PID" || { cat "$WORK/tavoctl.log" >&2; exit 1; }
kill "$DAEMON_PID" 2>/dev/null || true
wait "$DAEMON_PID" 2>/dev/null || true
DAEMON_PID=
echo "load after: $(uptime)"

python3 "$HERE/avsync.py" play --marks "$WORK/video.log" "$WORK/audio.log" "$WORK/audio.wav" \
    >"$WORK/marks.txt"
python3 - "$WORK/rss.txt" "$WORK/marks.txt" <<'EOF'
import sys
rows = [line.split() for line in open(sys.argv[1])]
rss = [(float(r[0]), int(r[1]), int(r[2])) for r in rows]
split = [(int(r[3]), int(r[4]), int(r[5])) for r in rows]
lines = open(sys.argv[2]).read().splitlines()
marks = [(int(l.split()[1]), float(l.split()[2])) for l in lines if l.startswith("mark ")]
summary = [l for l in lines if l.startswith("av-sync:")]
if not rss or not marks:
    print("soak: no samples or no marks")
    sys.exit(1)
t0 = rss[0][2]
print("   t s   rss MiB  (anon, files, of which rings)   av offset ms (marks in the 10 s before)")
prev = None
for (t, k, ns), (anon, files, rings) in zip(rss, split):
    window = [o for m, o in marks if (prev is None or m > prev) and m <= ns]
    off = f"{sum(window) / len(window):7.1f} ({len(window)})" if window else "      -"
    print(f"{t:6.1f} {k / 1024:9.2f}  ({anon / 1024:6.2f}, {files / 1024:6.2f}, {rings / 1024:5.2f})   {off}")
    prev = ns
minute = [r for r in rss if r[0] >= 60.0]
base = minute[0]
b = split[rss.index(base)]
growth = (rss[-1][1] - base[1]) / 1024
peak = (max(k for _, k, _ in minute) - base[1]) / 1024
print(f"rss growth after the first minute: {growth:.2f} MiB (at {base[0]:.0f} s "
      f"{base[1] / 1024:.2f} MiB, at {rss[-1][0]:.0f} s {rss[-1][1] / 1024:.2f} MiB, "
      f"highest {peak:+.2f} MiB above the first-minute figure); target <= 1 MiB: "
      f"{'met' if growth <= 1.0 else 'missed'}")
print(f"  of which anonymous {(split[-1][0] - b[0]) / 1024:+.2f} MiB, file-backed "
      f"{(split[-1][1] - b[1]) / 1024:+.2f} MiB, the rings' shared memory "
      f"{(split[-1][2] - b[2]) / 1024:+.2f} MiB")
xs = [(m - t0) / 1e9 for m, _ in marks]
ys = [o for _, o in marks]
first = [o for x, o in zip(xs, ys) if x < 60]
last = [o for x, o in zip(xs, ys) if x >= xs[-1] - 60]
n = len(xs)
mx, my = sum(xs) / n, sum(ys) / n
sxx = sum((x - mx) ** 2 for x in xs)
slope = sum((x - mx) * (y - my) for x, y in zip(xs, ys)) / sxx * 60 if sxx else 0.0
fm = sum(first) / len(first) if first else float("nan")
lm = sum(last) / len(last) if last else float("nan")
drift = abs(lm - fm) > 5 or abs(slope * (xs[-1] - xs[0]) / 60) > 5
print(f"av offset: first minute mean {fm:.1f} ms, last minute mean {lm:.1f} ms, slope "
      f"{slope:+.3f} ms/min over {n} marks and {(xs[-1] - xs[0]) / 60:.1f} min: "
      f"{'drifts' if drift else 'no drift'} (more than 5 ms either way counts as drift)")
for line in summary:
    print(line)
EOF
