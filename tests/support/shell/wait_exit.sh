# Sourced by the whole-process scripts.
# wait_exit PID: true once the process has gone, false after 60 s.
wait_exit() {
    for _ in $(seq 1 600); do
        kill -0 "$1" 2>/dev/null || return 0
        sleep 0.1
    done
    return 1
}
