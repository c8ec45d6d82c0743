#!/bin/bash
# A whole run as a host application makes it: a fixture recording, zaf-host starting the real
# extension under Xvfb, the editor driven with the keyboard.
#
#   whole_process.sh ZAF_HOST EXTENSION ZAF_FIXTURE SCRATCH_DIR [SCENARIO] [MOVIE]
#
# SCENARIO "cancel" (the default) presses Escape. "trim-save" trims with the keyboard (the playhead
# to 1 s, I, to 2.5 s, O, Return to apply), waits for the trim, then saves with Ctrl+S into
# SCRATCH_DIR/Videos; "open-trim-save" does the same on a movie opened as a user's own (--open), whose
# private clone goes into SCRATCH_DIR/cache. "two-editors" runs two hosts at once on the same user's temporary root: the
# first editor applies the same trim, the second is cancelled while the first stays open, then
# the first saves. "kill-mid-trim" applies the trim and kills the extension (SIGKILL) while the trim
# writes into its temporary directory, then opens and cancels a second editor, whose start sweeps
# what the killed one left. "host-dies" applies the trim and kills zaf-host (SIGKILL): the
# extension must exit by itself.
#
# EXTENSION "installed" runs an installed zaf-host as a user would: it finds the extension itself, with
# no ZAF_* variable set, from another folder, with HOME at SCRATCH_DIR/home.
#
# MOVIE "fixture" (the default) is a 3 s 640x360 recording with two audio tracks; "tiny" is a 4x4
# H.264 movie; "garbage" is random bytes named .mp4.
#
# Writes into SCRATCH_DIR: movie.mp4, temp/ (the per-user temporary root), host.out, host.err,
# host.status (zaf-host's exit status), extension.pid (the editor window's process), movie.sha256
# (the recording's digest before the run), for "two-editors" and "kill-mid-trim" also second.out,
# second.err and second.status, for "kill-mid-trim" killed.files (what the temporary directory held
# at the kill), and result ("ok" or what went wrong). Exits 0 when the script itself ran to its end; the caller judges the outputs.
set -u
. "$(dirname "$0")/../support/shell/wait_exit.sh"

if [ "${1:-}" = "--inside" ]; then
    host=$2 extension=$3 scratch=$4 scenario=$5

    # start_host NAME: a host presenting the editor on the movie; its output goes to NAME.out/.err.
    start_host() {
        local given=(--extension "$extension")
        [ "$extension" = installed ] && given=()
        local movie=(--movie "$scratch/movie.mp4" --app-name "Whole Process" --bundle-id org.example.WholeProcess)
        [ "$scenario" = open-trim-save ] && movie=(--open "$scratch/movie.mp4")
        "$host" "${movie[@]}" --tint '#3366CC' "${given[@]}" >"$scratch/$1.out" 2>"$scratch/$1.err" &
    }
    # new_window KNOWN: waits up to 60 s for an editor window other than KNOWN and prints it.
    new_window() {
        for _ in $(seq 1 600); do
            for w in $(xdotool search --name "Zafrel Video Editor" 2>/dev/null); do
                [ "$w" != "$1" ] && { echo "$w"; return 0; }
            done
            sleep 0.1
        done
        return 1
    }
    # No window manager under Xvfb: the window gets the keyboard focus directly.
    trim_keys() {
        xdotool windowfocus --sync "$1"
        xdotool key --delay 20 --repeat 30 Right
        xdotool key i
        xdotool key --delay 20 --repeat 45 Right
        xdotool key o Return
    }
    trim_with_keys() {
        trim_keys "$1"
        sleep 4
    }
    # cancel_second_editor KNOWN: a second host's editor (a window other than KNOWN) is cancelled
    # with Escape; sets result when it goes wrong.
    cancel_second_editor() {
        start_host second
        second_pid=$!
        second_window=$(new_window "$1")
        if [ -z "$second_window" ]; then
            result="the second editor window did not appear"
        else
            sleep 2
            xdotool windowfocus --sync "$second_window"
            xdotool key Escape
            wait_exit "$second_pid" || result="the second zaf-host did not exit within 60 s of Escape"
        fi
        [ "$result" = ok ] || kill "$second_pid" 2>/dev/null
        wait "$second_pid"
        echo $? >"$scratch/second.status"
    }

    start_host host
    host_pid=$!
    result=ok
    window=$(new_window none)
    if [ -z "$window" ]; then
        result="the editor window did not appear"
    else
        xdotool getwindowpid "$window" >"$scratch/extension.pid" 2>/dev/null
        # Let the editor finish opening the movie before the keys arrive.
        sleep 2
        case "$scenario" in
        trim-save | open-trim-save)
            trim_with_keys "$window"
            xdotool key ctrl+s
            ;;
        two-editors)
            trim_with_keys "$window"
            cancel_second_editor "$window"
            xdotool windowfocus --sync "$window"
            xdotool key ctrl+s
            ;;
        kill-mid-trim)
            trim_keys "$window"
            # Kill as soon as the trim's temporary output appears (or after 3 s).
            for _ in $(seq 1 300); do
                [ -n "$(find "$scratch/temp" -name '.*partial*' 2>/dev/null)" ] && break
                sleep 0.01
            done
            find "$scratch/temp" -mindepth 2 >"$scratch/killed.files"
            kill -KILL "$(cat "$scratch/extension.pid")"
            wait_exit "$host_pid" || result="zaf-host did not exit within 60 s of the extension's death"
            # The killed editor's window has gone, and the X server may give its id to the next.
            [ "$result" = ok ] && cancel_second_editor none
            ;;
        host-dies)
            trim_with_keys "$window"
            kill -KILL "$host_pid"
            wait_exit "$(cat "$scratch/extension.pid")" || result="the extension did not exit within 60 s of its host's death"
            ;;
        *)
            xdotool windowfocus --sync "$window"
            xdotool key Escape
            ;;
        esac
        if [ "$result" = ok ]; then
            wait_exit "$host_pid" || result="zaf-host did not exit within 60 s of the last key"
        fi
    fi
    [ "$result" = ok ] || kill "$host_pid" 2>/dev/null
    echo "$result" >"$scratch/result"
    wait "$host_pid"
    echo $? >"$scratch/host.status"
    exit 0
fi

host=$1 extension=$2 fixture=$3 scratch=$4 scenario=${5:-cancel} movie=${6:-fixture}
mkdir -p "$scratch/temp" "$scratch/Videos"
case "$movie" in
tiny)
    ffmpeg -v error -f lavfi -i testsrc=size=4x4:rate=30 -t 2 -c:v libx264 -pix_fmt yuv420p \
        "$scratch/movie.mp4" 2>"$scratch/fixture.err"
    ;;
garbage)
    head -c 65536 /dev/urandom >"$scratch/movie.mp4"
    ;;
*)
    "$fixture" "$scratch/movie.mp4" --seconds 3 --size 640x360 --audio-tracks 2 2>"$scratch/fixture.err"
    ;;
esac
if [ ! -s "$scratch/movie.mp4" ]; then
    echo "the $movie movie could not be made" >"$scratch/result"
    exit 0
fi
sha256sum "$scratch/movie.mp4" | cut -d' ' -f1 >"$scratch/movie.sha256"
if [ "$extension" = installed ]; then
    # As a user runs the installed programs: no ZAF_* variable, from another folder, with a home of
    # its own (the temporary root is then $scratch/home/.cache/Zafrel, the library $scratch/home/Videos).
    for variable in $(env | sed -n 's/^\(ZAF_[A-Za-z0-9_]*\)=.*/\1/p'); do unset "$variable"; done
    export HOME="$scratch/home"
    unset XDG_CACHE_HOME XDG_CONFIG_HOME XDG_DATA_HOME XDG_RUNTIME_DIR
    mkdir -p "$HOME"
    cd /
else
    export ZAF_TEMP_DIRECTORY="$scratch/temp/"
    export ZAF_VIDEO_LIBRARY="$scratch/Videos"
    export XDG_CACHE_HOME="$scratch/cache"
fi
export QT_QPA_PLATFORM=xcb
exec xvfb-run -a -s "-screen 0 1280x800x24" "$0" --inside "$host" "$extension" "$scratch" "$scenario"
