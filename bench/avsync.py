#!/usr/bin/env python3
"""Lip-sync marks, as tsgen --sync-marks writes them, found where a viewer meets them.

A mark is a white picture and the start of a 1 kHz tone burst at the same PTS.

  avsync.py stream TS        checks the marks in the stream itself with FFmpeg's
                             decoders: which pictures are white and where each burst
                             starts, against the PTS they should have.
  avsync.py play VLOG ALOG WAV
                             pairs what a player presented: VLOG has one line
                             "monotonic_ns pts90k width height" per picture shown,
                             ALOG one line "monotonic_ns_first_sample_leaves bytes" per
                             audio write, WAV the samples of those writes in order.
                             Prints one line per mark ("mark <shown_ns> <offset_ms>")
                             with --marks, and the summary line
                             "av-sync: mean M ms, worst ahead A ms, worst behind B ms over N marks"
                             (offset > 0: the tone leaves after the picture is shown).

Both take --start-pts (first picture's PTS), --frame-ticks (one picture in 90 kHz
ticks) and --period (pictures from mark to mark), tsgen's defaults for 1080i at 29.97 Hz.
"""

import argparse
import array
import subprocess
import sys
import wave

# A burst peaks at half of full scale; silence is digital zero. A sample above this
# level after at least QUIET_MS of samples below it starts a burst.
ONSET_LEVEL = 2000
QUIET_MS = 200
# A picture and a burst further apart than this are not the same mark (marks are
# about a second apart).
PAIR_WINDOW_MS = 400


def is_mark(pts, args):
    delta = pts - args.start_pts
    period = args.frame_ticks * args.period
    return delta > 0 and delta % period == 0


def onsets(samples, channels, rate):
    """Indexes (in sample frames) where a burst starts, looking at channel 0."""
    mono = samples[0::channels] if channels > 1 else samples
    quiet = rate * QUIET_MS // 1000
    block = 48
    found = []
    last_loud = -quiet - 1
    n = len(mono)
    i = 0
    while i < n:
        chunk = mono[i:i + block]
        if max(chunk) < ONSET_LEVEL and -min(chunk) < ONSET_LEVEL:
            i += block
            continue
        for j, s in enumerate(chunk):
            if abs(s) >= ONSET_LEVEL:
                if i + j - last_loud > quiet:
                    found.append(i + j)
                last_loud = i + j
        i += block
    return found


def check_stream(args):
    """Returns 0 when every white picture is a mark, every mark is white and every
    burst starts at its mark's PTS (within one sample's rounding and the codec's
    smear of less than 2 ms)."""
    ts = args.file
    vf = "scale=64:36,signalstats,metadata=mode=print:key=lavfi.signalstats.YAVG:file=-"
    out = subprocess.run(
        ["ffmpeg", "-v", "error", "-copyts", "-i", ts, "-map", "0:v:0", "-vf", vf, "-f", "null",
         "-"], capture_output=True, text=True, check=True).stdout
    white, marks_missing, pictures = [], [], 0
    pts = None
    for line in out.splitlines():
        if line.startswith("frame:"):
            for item in line.split():
                if item.startswith("pts:"):
                    pts = int(item[4:])
        elif line.startswith("lavfi.signalstats.YAVG=") and pts is not None:
            pictures += 1
            bright = float(line.split("=")[1]) > 128
            if bright:
                white.append(pts)
            if is_mark(pts, args) and not bright:
                marks_missing.append(pts)
    false_white = [p for p in white if not is_mark(p, args)]

    first = subprocess.run(
        ["ffprobe", "-v", "error", "-select_streams", "a:0", "-show_entries", "frame=pts",
         "-read_intervals", "%+#1", "-of", "csv=p=0", ts],
        capture_output=True, text=True, check=True).stdout.split()
    audio_pts = int(first[0].strip(","))
    raw = subprocess.run(
        ["ffmpeg", "-v", "error", "-i", ts, "-map", "0:a:0", "-ac", "1", "-f", "s16le", "-"],
        capture_output=True, check=True).stdout
    mono = array.array("h")
    mono.frombytes(raw[:len(raw) // 2 * 2])
    rate = 48000
    starts = onsets(mono, 1, rate)
    errors_ms = []
    for s in starts:
        at = audio_pts + s * 90000 / rate
        delta = at - args.start_pts
        period = args.frame_ticks * args.period
        k = round(delta / period)
        errors_ms.append((at - (args.start_pts + k * period)) / 90.0)
    worst = max((abs(e) for e in errors_ms), default=float("nan"))
    print(f"stream: {pictures} pictures, {len(white)} white ({len(false_white)} off a mark, "
          f"{len(marks_missing)} marks not white); {len(starts)} tone bursts, first audio PTS "
          f"{audio_pts}, burst start vs. mark PTS worst {worst:.2f} ms")
    ok = (not false_white and not marks_missing and white and starts and worst < 2.0
          and abs(len(starts) - len(white)) <= 1)
    return 0 if ok else 1


def read_log(path, columns):
    rows = []
    with open(path) as f:
        for line in f:
            parts = line.split()
            if len(parts) >= columns:
                rows.append([int(p) for p in parts[:columns]])
    return rows


def play(args):
    shown = [(ns, pts) for ns, pts in read_log(args.vlog, 2) if is_mark(pts, args)]
    writes = read_log(args.alog, 2)
    with wave.open(args.wav, "rb") as w:
        channels, rate, width = w.getnchannels(), w.getframerate(), w.getsampwidth()
        if width != 2:
            print(f"avsync: {args.wav} is not 16-bit", file=sys.stderr)
            return 2
        samples = array.array("h")
        samples.frombytes(w.readframes(w.getnframes()))
    frame_bytes = channels * 2
    wav_frames = len(samples) // channels
    # Each track re-creates the file while the log is appended to: the file holds the
    # last track's writes, the tail of the log.
    total = sum(b for _, b in writes) // frame_bytes
    skip = total - wav_frames
    if skip < 0:
        print(f"avsync: the WAV has {wav_frames} frames, the log only {total}", file=sys.stderr)
        return 2
    # Leave time of every wav frame index where a write starts.
    starts_at, leave = [], []
    pos = -skip
    for ns, b in writes:
        if pos + b // frame_bytes > 0:
            starts_at.append(pos)
            leave.append(ns)
        pos += b // frame_bytes

    def leave_ns(frame):
        lo, hi = 0, len(starts_at) - 1
        while lo < hi:
            mid = (lo + hi + 1) // 2
            if starts_at[mid] <= frame:
                lo = mid
            else:
                hi = mid - 1
        return leave[lo] + (frame - starts_at[lo]) * 1_000_000_000 // rate

    tones = [leave_ns(f) for f in onsets(samples, channels, rate)]
    window = PAIR_WINDOW_MS * 1_000_000
    offsets = []
    used = set()
    t = 0
    for ns, _pts in shown:
        while t < len(tones) and tones[t] < ns - window:
            t += 1
        best = None
        for c in range(t, min(t + 3, len(tones))):
            if c in used or abs(tones[c] - ns) > window:
                continue
            if best is None or abs(tones[c] - ns) < abs(tones[best] - ns):
                best = c
        if best is None:
            continue
        used.add(best)
        offsets.append((ns, (tones[best] - ns) / 1e6))
    if args.marks:
        for ns, off in offsets:
            print(f"mark {ns} {off:.3f}")
    # On standard output too, ahead of the summary, which stays the last line.
    print(f"avsync: {len(shown)} mark pictures shown, {len(tones)} bursts heard, "
          f"{len(offsets)} paired", flush=True)
    if not offsets:
        print("av-sync: mean nan ms, worst ahead nan ms, worst behind nan ms over 0 marks")
        return 1
    values = [o for _, o in offsets]
    mean = sum(values) / len(values)
    ahead = max(0.0, -min(values))
    behind = max(0.0, max(values))
    print(f"av-sync: mean {mean:.1f} ms, worst ahead {ahead:.1f} ms, "
          f"worst behind {behind:.1f} ms over {len(values)} marks")
    return 0


def main():
    parser = argparse.ArgumentParser(description=__doc__.split("\n")[0])
    parser.add_argument("--start-pts", type=int, default=126000)
    parser.add_argument("--frame-ticks", type=int, default=3003)
    parser.add_argument("--period", type=int, default=30)
    sub = parser.add_subparsers(dest="command", required=True)
    s = sub.add_parser("stream")
    s.add_argument("file")
    p = sub.add_parser("play")
    p.add_argument("vlog")
    p.add_argument("alog")
    p.add_argument("wav")
    p.add_argument("--marks", action="store_true")
    args = parser.parse_args()
    return check_stream(args) if args.command == "stream" else play(args)


if __name__ == "__main__":
    sys.exit(main())
