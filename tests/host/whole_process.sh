#!/bin/bash
# A whole run as a host application makes it: a fixture recording, zaf-host starting the real
# extension under Xvfb, the editor driven with the keyboard.
#
#   whole_process.sh ZAF_HOST EXTENSION ZAF_FIXTURE SCRATCH_DIR [SCENARIO]
#
# SCENARIO "cancel" (the default) presses Escape. "trim-save" trims with the keyboard (the playhead
# to 1 s, I, to 2.5 s, O, Return to apply), waits for the trim, then saves with Ctrl+S into
# SCRATCH_DIR/Videos.
#
# Writes into SCRATCH_DIR: movie.mp4, temp/ (the extension's temporary directory), host.out,
# host.err, host.status (zaf-host's exit status), extension.pid (the editor window's process) and
# result ("ok" or what went wrong). Exits 0 when the script itself ran to its end; the caller
# judges the outputs.
set -u

if [ "${1:-}" = "--inside" ]; then
    host=$2 extension=$3 scratch=$4 scenario=$5
    "$host" --movie "$scratch/movie.mp4" --app-name "Whole Process" --bundle-id org.example.WholeProcess \
        --tint '#3366CC' --extension "$extension" >"$scratch/host.out" 2>"$scratch/host.err" &
    host_pid=$!
    result=ok
    window=$(timeout 60 xdotool search --sync --name "Zafrel Video Editor" | head -n 1)
    if [ -z "$window" ]; then
        result="the editor window did not appear"
    else
        xdotool getwindowpid "$window" >"$scratch/extension.pid" 2>/dev/null
        # Let the editor finish opening the movie before the keys arrive.
        sleep 2
        # No window manager under Xvfb: give the window the keyboard focus directly.
        xdotool windowfocus --sync "$window"
        if [ "$scenario" = trim-save ]; then
            xdotool key --delay 20 --repeat 30 Right
            xdotool key i
            xdotool key --delay 20 --repeat 45 Right
            xdotool key o Return
            sleep 4
            xdotool key ctrl+s
        else
            xdotool key Escape
        fi
        for _ in $(seq 1 600); do
            kill -0 "$host_pid" 2>/dev/null || break
            sleep 0.1
        done
        kill -0 "$host_pid" 2>/dev/null && result="zaf-host did not exit within 60 s of the last key"
    fi
    [ "$result" = ok ] || kill "$host_pid" 2>/dev/null
    echo "$result" >"$scratch/result"
    wait "$host_pid"
    echo $? >"$scratch/host.status"
    exit 0
fi

host=$1 extension=$2 fixture=$3 scratch=$4 scenario=${5:-cancel}
mkdir -p "$scratch/temp" "$scratch/Videos"
if ! "$fixture" "$scratch/movie.mp4" --seconds 3 --size 640x360 --audio-tracks 2 2>"$scratch/fixture.err"; then
    echo "the fixture movie could not be made" >"$scratch/result"
    exit 0
fi
export ZAF_TEMP_DIRECTORY="$scratch/temp/"
export ZAF_VIDEO_LIBRARY="$scratch/Videos"
export QT_QPA_PLATFORM=xcb
exec xvfb-run -a -s "-screen 0 1280x800x24" "$0" --inside "$host" "$extension" "$scratch" "$scenario"
