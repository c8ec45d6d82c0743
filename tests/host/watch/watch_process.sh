#!/bin/bash
# zaf-host --watch as a user's session runs it, with a recorder that cannot start the editor: under
# Xvfb, on a session bus of its own, with the real extension and a real notification service.
#
#   watch_process.sh ZAF_HOST EXTENSION ZAF_FIXTURE SCRATCH_DIR
#
# The recorder's steps, each judged here as it happens (the first thing that goes wrong is the result):
#   1. No notification service yet. A movie is written slowly into the watched folder, in chunks, the
#      file held open; meanwhile a hidden partial copy and random bytes named .mp4 arrive. Nothing may
#      look at the movie before it is closed; then its editor opens, and Escape cancels it. The
#      notification cannot be shown and is logged. The movie is closed once more, unchanged: it is
#      not offered again.
#   2. The notification service starts (dunst), with dbus-monitor recording the Notify calls.
#   3. Two movies arrive together: one renamed into place from a ".part" name, one copied in. One
#      editor opens; the second opens only after the first has been saved with Ctrl+S and has ended;
#      Escape cancels it.
#   4. Two more arrive; while the first one's editor is open, zaf-host gets SIGTERM: the editor
#      ends with it and the waiting one is dropped.
#
# Writes into SCRATCH_DIR: source.mp4 (every movie the recorder writes is a copy of it), watched/
# (the watched folder), Videos/ (the editor's library), cache/ (where the clones go), temp/ (the
# editor's temporary root), watch.out, watch.err (zaf-host's log, the editor's too), watch.status
# (zaf-host's exit status), notify.log (dbus-monitor's record), and result ("ok" or what went
# wrong). Exits 0 when the script itself ran to its end; the caller judges the outputs.
set -u
. "$(dirname "$0")/../../support/shell/wait_exit.sh"

if [ "${1:-}" = "--inside" ]; then
    host=$2 extension=$3 scratch=$4
    watched=$scratch/watched
    log=$scratch/watch.err
    result=ok
    fail() {
        [ "$result" = ok ] && result=$1
        return 1
    }
    windows() { xdotool search --name "Zafrel Video Editor" 2>/dev/null; }
    # new_window: waits up to 60 s for an editor window and prints it.
    new_window() {
        for _ in $(seq 1 600); do
            windows | head -n 1 | grep . && return 0
            sleep 0.1
        done
        return 1
    }
    # wait_log TEXT [COUNT]: true once zaf-host's log holds TEXT (COUNT times), false after 60 s.
    wait_log() {
        for _ in $(seq 1 600); do
            [ "$(grep -cF -- "$1" "$log")" -ge "${2:-1}" ] && return 0
            sleep 0.1
        done
        return 1
    }
    # close_editor WINDOW KEY: presses KEY in the editor and waits for its process to end.
    close_editor() {
        local pid
        pid=$(xdotool getwindowpid "$1")
        sleep 2 # let the editor finish opening the movie before the key arrives
        xdotool windowfocus --sync "$1"
        xdotool key "$2"
        wait_exit "$pid" || fail "the editor did not end after $2"
    }
    copy_in() { cp "$scratch/source.mp4" "$1"; }

    helpers=()
    "$host" --watch "$watched" --extension "$extension" >"$scratch/watch.out" 2>"$log" &
    host_pid=$!
    run() {
        wait_log "watching $watched for finished recordings" || fail "zaf-host did not start watching" || return

        # 1. A slow recorder, a hidden partial file and random bytes; no notification service.
        local size chunk window
        size=$(stat -c %s "$scratch/source.mp4")
        chunk=$(((size + 4) / 5))
        exec 3>"$watched/slow.mp4"
        for i in 0 1 2 3 4; do
            dd if="$scratch/source.mp4" bs="$chunk" skip="$i" count=1 status=none >&3 # the same open file: no close
            [ "$i" = 1 ] && copy_in "$watched/.slow.mp4.part"
            [ "$i" = 2 ] && head -c 65536 /dev/urandom >"$watched/garbage.mp4" && wait_log "ignored $watched/garbage.mp4"
            sleep 0.3
        done
        grep -qF "$watched/slow.mp4" "$log" && { fail "zaf-host looked at the movie while it was being written"; return; }
        exec 3>&-
        window=$(new_window) || fail "no editor opened for the finished movie" || return
        close_editor "$window" Escape || return
        wait_log "no desktop notification" || fail "the notification without a service was not logged" || return
        : >>"$watched/slow.mp4" # opened for writing and closed, unchanged
        wait_log "ignored $watched/slow.mp4: offered already" || fail "the unchanged movie was not known as offered" || return

        # 2. The notification service, and a record of what it is asked.
        dunst -config "$scratch/dunstrc" >"$scratch/dunst.log" 2>&1 &
        helpers+=($!)
        for _ in $(seq 1 100); do
            dbus-send --session --print-reply --dest=org.freedesktop.DBus /org/freedesktop/DBus org.freedesktop.DBus.NameHasOwner \
                string:org.freedesktop.Notifications 2>/dev/null | grep -q true && break
            sleep 0.1
        done
        dbus-monitor --session "type='method_call',interface='org.freedesktop.Notifications',member='Notify'" >"$scratch/notify.log" 2>&1 &
        helpers+=($!)
        for _ in $(seq 1 100); do
            [ -s "$scratch/notify.log" ] && break
            sleep 0.1
        done

        # 3. Two movies at once: one editor, then the other.
        copy_in "$watched/moved.mp4.part"
        mv "$watched/moved.mp4.part" "$watched/moved.mp4"
        copy_in "$watched/together.mp4"
        window=$(new_window) || fail "no editor opened for the renamed movie" || return
        wait_log "queued $watched/together.mp4" || fail "the second movie was not queued" || return
        sleep 1
        [ "$(windows | wc -l)" = 1 ] || fail "a second editor opened while the first was open" || return
        close_editor "$window" ctrl+s || return
        window=$(new_window) || fail "no editor opened for the second movie after the first" || return
        close_editor "$window" Escape || return
        wait_log "notified (notification" 2 || fail "the notification service did not take two notifications" || return

        # 4. SIGTERM while an editor is open and a movie waits.
        copy_in "$watched/last.mp4"
        copy_in "$watched/waiting.mp4"
        window=$(new_window) || fail "no editor opened for the last movie" || return
        wait_log "queued $watched/waiting.mp4" || fail "the waiting movie was not queued" || return
        local editor
        editor=$(xdotool getwindowpid "$window")
        sleep 1
        kill -TERM "$host_pid"
        wait_exit "$host_pid" || fail "zaf-host did not end within 60 s of SIGTERM" || return
        kill -0 "$editor" 2>/dev/null && fail "the editor outlived zaf-host"
    }
    run
    kill "$host_pid" 2>/dev/null
    wait "$host_pid"
    echo $? >"$scratch/watch.status"
    for helper in "${helpers[@]}"; do
        kill "$helper" 2>/dev/null
        wait "$helper"
    done
    echo "$result" >"$scratch/result"
    exit 0
fi

host=$1 extension=$2 fixture=$3 scratch=$4
mkdir -p "$scratch/temp" "$scratch/Videos" "$scratch/cache" "$scratch/watched"
if ! "$fixture" "$scratch/source.mp4" --seconds 2 --size 320x180 --audio-tracks 1 >"$scratch/fixture.out" 2>&1; then
    echo "the fixture movie could not be made" >"$scratch/result"
    exit 0
fi
: >"$scratch/dunstrc"
# A session bus that starts no service by itself, so the notification service is there only once
# the script starts it.
cat >"$scratch/bus.conf" <<EOF
<!DOCTYPE busconfig PUBLIC "-//freedesktop//DTD D-Bus Bus Configuration 1.0//EN"
 "http://www.freedesktop.org/standards/dbus/1.0/busconfig.dtd">
<busconfig>
  <type>session</type>
  <listen>unix:tmpdir=$scratch</listen>
  <auth>EXTERNAL</auth>
  <policy context="default">
    <allow send_destination="*" eavesdrop="true"/>
    <allow eavesdrop="true"/>
    <allow own="*"/>
  </policy>
</busconfig>
EOF
export ZAF_TEMP_DIRECTORY="$scratch/temp/"
export ZAF_VIDEO_LIBRARY="$scratch/Videos"
export XDG_CACHE_HOME="$scratch/cache"
export QT_QPA_PLATFORM=xcb
exec xvfb-run -a -s "-screen 0 1280x800x24" dbus-run-session --config-file="$scratch/bus.conf" -- \
    bash "$(readlink -f "$0")" --inside "$host" "$extension" "$scratch" 2>"$scratch/session.err"
