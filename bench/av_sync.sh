#!/usr/bin/env bash
# A/V synchronisation as a viewer meets it. tsgen writes a 1080i stream with AAC LATM
# whose pictures are dark and whose sound is silent except, about once a second, a
# white picture and a 1 kHz burst at the same PTS. tavoplayerd plays it from a file:
# demux source to the null video sink and the WAV audio sink, with the video show log
# (monotonic time and PTS of every picture shown) and the audio timing log (monotonic
# time at which the first sample of every write leaves the device, its latency
# included). For every mark the time its picture was shown is paired with the time its
# first tone sample left; the last line is
#   av-sync: mean M ms, worst ahead A ms, worst behind B ms over N marks
# with positive offsets for audio later than video.
#
# Run from the checkout root after building into build/ (README). Environment:
# BUILD (default build), DURATION (stream seconds, default 70), KEEP=1 keeps the
# work folder, AV_OFFSET (ms, default 0) shows every picture that much later, as a
# viewer's lip-sync setting does (sent as tavoctl's avsync, biased by 200). Exit status 0 when the figures meet the target (|mean| <= 10 ms,
# ahead <= 15 ms, behind <= 45 ms, ATSC IS-191, over >= 50 marks), 1 otherwise.
set -euo pipefail

BUILD=${BUILD:-build}
DURATION=${DURATION:-70}
AV_OFFSET=${AV_OFFSET:-0}
HERE=$(cd "$(dirname "$0")" && pwd)
# shellcheck source=bench/logging_service.sh
. "$HERE/logging_service.sh"
find_programs av_sync

WORK=$(mktemp -d /tmp/av_sync-XXXXXX)
DAEMON_PID=
cleanup() {
    if [ -n "$DAEMON_PID" ] && kill -0 "$DAEMON_PID" 2>/dev/null; then
        kill "$DAEMON_PID" 2>/dev/null || true
        wait "$DAEMON_PID" 2>/dev/null || true
    fi
    if [ "${KEEP:-0}" = 1 ]; then
        echo "av_sync: kept $WORK" >&2
    else
        rm -rf "$WORK"
    fi
}
trap cleanup EXIT

echo "load before: $(uptime)"

# 1. The stream, and its marks checked with FFmpeg's own decoders.
"$TSGEN" -o "$WORK/marks.ts" -d "$DURATION" --sync-marks
python3 "$HERE/avsync.py" stream "$WORK/marks.ts"

# 2. Play it in a service of its own.
URI=$("$PLAY" --probe "$WORK/marks.ts" | tail -n 1)
start_logging_service "file:$(realpath "$WORK/marks.ts")"
# The file: source stops at the end of the file; the last seconds of sound drain.
"$CTL" --service-dir "$SVC" "open 5 $URI" "avsync $((AV_OFFSET + 200))" start "wait $((DURATION + 2))" stop close \
    >"$WORK/tavoctl.log" 2>&1 || { cat "$WORK/tavoctl.log" >&2; exit 1; }
kill "$DAEMON_PID" 2>/dev/null || true
wait "$DAEMON_PID" 2>/dev/null || true
DAEMON_PID=

echo "load after: $(uptime)"

# 3. The marks as shown and heard.
python3 "$HERE/avsync.py" play "$WORK/video.log" "$WORK/audio.log" "$WORK/audio.wav" \
    | tee "$WORK/result.txt"
python3 - "$WORK/result.txt" <<'EOF'
import re, sys
line = open(sys.argv[1]).read().strip().splitlines()[-1]
m = re.match(r"av-sync: mean (\S+) ms, worst ahead (\S+) ms, worst behind (\S+) ms over (\d+) marks", line)
mean, ahead, behind, n = float(m[1]), float(m[2]), float(m[3]), int(m[4])
sys.exit(0 if abs(mean) <= 10 and ahead <= 15 and behind <= 45 and n >= 50 else 1)
EOF
