#!/usr/bin/env bash
# pair.sh up BUILD_DIR | down | status | shell NAME | exec NAME COMMAND [ARG...]: a pair of appliances to try things on (pair.py), kept
# running in the background. Needs root. All of a pair's processes share one lock on $place/lock, so whether it runs is asked of the
# kernel, and nothing that died can be taken for it.
set -euo pipefail
here=$(dirname "$(realpath "$0")")
place=/run/iscsi-pair

die() {
    printf './run pair: %s\n' "$*" >&2
    exit 1
}

is_up() { [[ -e $place/lock ]] && ! flock --nonblock "$place/lock" true; }

show() {
    local name address password
    while read -r name address password; do
        printf '%s  %s  https://%s:5443/api/v1  account admin, password %s\n' "$name" "$address" "$address" "$password"
    done <"$place/machines"
}

up() {
    local build=$1 log=$place/log
    if is_up; then
        [[ -s $place/machines ]] || die "another 'up' is at work"
        printf 'The pair is up:\n'
        show
        return
    fi
    rm -rf "$place"
    mkdir -m 0700 "$place"
    mkfifo "$place/words"
    exec 9>"$place/lock"
    flock --nonblock 9 || die "another 'up' is at work"
    # The pair ends by itself when this script ends before it has said "stay".
    setsid "$here/../../demo/world.sh" "$build" python3 -B tests/pair/pair.py <"$place/words" >"$place/starting" 2>"$log" &
    echo $! >"$place/world"
    exec 8>"$place/words" 9>&-
    trap stop EXIT
    while [[ $(grep -c . "$place/starting") -lt 2 ]]; do
        is_up || { cat "$log" >&2 && die "the pair did not come up"; }
        sleep 0.1
    done
    mv "$place/starting" "$place/machines"
    echo stay >&8
    trap - EXIT
    cat <<TEXT
Two appliances are up. The machine itself is unchanged; './run pair down' ends them and all they hold, which lies in memory.

$(show)

Try:
  ./run pair exec one iscsi-host status
  ./run pair exec one iscsictl node join 192.0.2.12 --account admin
  ./run pair shell two              (its log is in /var/log/syslog)
TEXT
}

# The first process of the world's namespaces; what made them waits for its end, and for all of theirs.
first() { xargs <"/proc/$(<"$place/world")/task/$(<"$place/world")/children"; }

stop() {
    exec 8>&-
    ! is_up || kill -KILL "$(first)" || true
    flock --timeout 120 "$place/lock" rm -rf "$place" || die "some of the pair's processes do not end"
}

down() {
    is_up || die "no pair is up"
    stop
}

# enter NAME COMMAND...: first into the world, then into the machine.
enter() {
    local name=$1
    shift
    is_up || die "no pair is up ('./run pair up')"
    grep -q "^$name " "$place/machines" || die "no machine '$name'; there are: $(cut -d ' ' -f 1 "$place/machines" | xargs)"
    # shellcheck disable=SC2016 # the inner shell expands it, in the world
    exec env -u ISCSI_HOST_STATE -u ISCSI_HOST_RUN nsenter -t "$(first)" -m -u -i -n -p --wd=/ -- \
        sh -c 'exec nsenter -t "$(cat "/run/world/machines/$0")" -m -u -i -n -p --wd=/ -- "$@"' "$name" "$@"
}

case ${1:-} in
    up) up "$2" ;;
    down) down ;;
    status) if ! is_up; then echo "no pair is up"; elif [[ -e $place/machines ]]; then show; else echo "coming up"; fi ;;
    shell) enter "${2:?which machine: one or two}" bash ;;
    exec) shift && enter "$@" ;;
    *) die "usage: ./run pair up | down | status | shell NAME | exec NAME COMMAND [ARG...]" ;;
esac
