# Sourced by the measurement scripts (after BUILD is set). find_programs NAME sets
# TSGEN, DAEMON, CTL and PLAY from $BUILD and stops with status 2, naming NAME, when
# one is missing. start_logging_service starts a tavoplayerd of their own on SOURCE (a
# demux source) with the null video sink, the WAV audio sink and both presentation
# logs in $WORK, and waits until it answers. Needs WORK, DAEMON and CTL; sets SVC
# (its socket folder) and DAEMON_PID.
start_logging_service() {
    SVC=$WORK/svc
    mkdir -p "$SVC"
    TAVOPLAYER_SERVICE_DIR=$SVC \
    TAVOPLAYER_PROP_tavoplayer_demux_source="$1" \
    TAVOPLAYER_PROP_tavoplayer_video_sink=null \
    TAVOPLAYER_PROP_tavoplayer_video_log="$WORK/video.log" \
    TAVOPLAYER_PROP_tavoplayer_audio_sink="wav:$WORK/audio.wav" \
    TAVOPLAYER_PROP_tavoplayer_audio_log="$WORK/audio.log" \
    TAVOPLAYER_PROP_tavoplayer_recordings_dir="$WORK/rec" \
        "$DAEMON" --log-level warning 2>"$WORK/tavoplayerd.log" &
    DAEMON_PID=$!
    for _ in $(seq 50); do
        "$CTL" --service-dir "$SVC" state >/dev/null 2>&1 && break
        sleep 0.1
    done
}

find_programs() {
    TSGEN=$BUILD/apps/tsgen/tsgen
    DAEMON=$BUILD/apps/tavoplayerd/tavoplayerd
    CTL=$BUILD/apps/tavoctl/tavoctl
    PLAY=$BUILD/apps/tavoplay/tavoplay
    for tool in "$TSGEN" "$DAEMON" "$CTL" "$PLAY"; do
        [ -x "$tool" ] || { echo "$1: $tool is missing; build first (README)" >&2; exit 2; }
    done
}
