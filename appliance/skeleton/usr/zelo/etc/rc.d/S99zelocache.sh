#!/bin/sh
# Starts and stops the cache daemon: S99zelocache.sh start|stop|restart|status.
#
# "status" ends with 0 when the daemon runs, 1 when it does not, and 4 when that cannot be told. The
# other commands end with 0 when it is as they want it, 1 when not, 5 when it is not installed; wrong
# usage is 2.
#
# The daemon runs as long as the lock of the pid file is held: start takes the lock, and the daemon
# inherits it on descriptor 9. The pid itself proves nothing, since the system uses ids again; it
# only says to whom a signal goes. A look at the lock is shared and so never in a start's way.
set -u
umask 077

readonly daemon=/usr/zelo/sbin/zelocached
readonly pid_file=/var/run/zelocache.pid
readonly turn_file=/var/run/zelocache.lock

fail() { # STATUS MESSAGE
    echo "zelocache: $2" >&2
    exit "$1"
}

# Commands that change something do so one after the other.
take_turn() {
    mkdir -p "${turn_file%/*}"
    command exec 8>>"$turn_file" || exit 1
    flock -w 30 8 || fail 1 'another start or stop goes on for too long'
}

# 0: yes. Leaves descriptor 9 with the pid file, if there is one.
runs() {
    [ -e "$pid_file" ] || return 1
    command exec 9<"$pid_file" || exit 4
    flock -n -s 9
    case $? in
        0) return 1 ;;
        1) return 0 ;;
        *) exit 4 ;;
    esac
}

# The daemon alone writes its id, once: whoever reads the file finds it whole.
await_id() {
    local try=0
    until [ -s "$pid_file" ]; do
        [ "$((try += 1))" -le 100 ] || fail 1 "the daemon does not write its id to '$pid_file'"
        sleep 0.05
    done
}

start() {
    take_turn
    if runs; then
        echo 'zelocache runs already.'
        return
    fi
    [ -x "$daemon" ] || fail 5 "there is no program '$daemon'"
    command exec 9>>"$pid_file" || exit 1
    flock -w 5 9 || fail 1 "cannot lock '$pid_file'"
    : >"$pid_file"
    setsid "$daemon" </dev/null >/dev/null 2>&1 8>&- &
    await_id
    echo 'zelocache is started.'
}

stop() {
    local pid try=0
    take_turn
    if runs; then
        # A daemon whose start was cut off may be about to write its id.
        until read -r pid <"$pid_file" && grep -q zelocache "/proc/$pid/cmdline" 2>/dev/null; do
            [ "$((try += 1))" -le 25 ] ||
                fail 1 "the daemon runs, but '$pid_file' does not name it: end it by hand"
            sleep 0.2
        done
        kill "$pid"
        if ! flock -w 5 -s 9; then
            kill -KILL "$pid"
            flock -w 5 -s 9 || fail 1 "process $pid does not end"
        fi
    fi
    rm -f "$pid_file"
    echo 'zelocache is stopped.'
}

status() {
    if ! runs; then
        echo 'zelocache is stopped.'
        return 1
    fi
    echo "zelocache runs (process $(cat "$pid_file"))."
}

case ${1:-} in
    start | stop | status) "$1" ;;
    restart)
        stop
        start
        ;;
    *) fail 2 "usage: ${0##*/} start|stop|restart|status" ;;
esac
