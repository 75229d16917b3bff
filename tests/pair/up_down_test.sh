#!/usr/bin/env bash
# up_down_test.sh BUILD_DIR: ./run pair, as people use it. In a /run and among processes of its own, so that it meets no other pair.
set -euo pipefail
here=$(dirname "$(realpath "$0")")

if [[ ${1:-} != --inside ]]; then
    exec unshare --mount --pid --fork --kill-child --mount-proc "$0" --inside "$(realpath "$1")"
fi
build=$2
mount -t tmpfs tmpfs /run

die() {
    printf '%s\n' "$*" >&2
    exit 1
}
pair() { "$here/pair.sh" "$@"; }
nothing_runs() { # nothing_runs AFTER
    local tries=0
    while pgrep 'tgtd|lighttpd' >/dev/null || [[ $(pair status) != "no pair is up" ]]; do
        [[ $((++tries)) -lt 1200 ]] || die "after $1 there is still: $(ps axf)"
        sleep 0.1
    done
}

pair up "$build" >/dev/null
[[ $(pair up "$build") == "The pair is up:"* ]] || die "a second 'up' does not say that it is up"
for name in one two; do
    [[ $(pair exec "$name" hostname) == "$name" ]] || die "no way into $name"
    pair exec "$name" iscsi-host status | grep -q 'service: running' || die "$name does not serve"
done
if pair exec three hostname 2>/dev/null; then die "there is a third machine"; fi
pair down
nothing_runs "'down'"
[[ ! -e /run/iscsi-pair ]] || die "'down' leaves its folder"
if pair exec one hostname 2>/dev/null; then die "a machine of a pair that is down"; fi

# Killed half way, 'up' leaves no half of a pair.
"$here/pair.sh" up "$build" >/dev/null &
up=$!
until pgrep tgtd >/dev/null; do sleep 0.01; done
kill -KILL "$up"
nothing_runs "an 'up' that was killed"
pair up "$build" >/dev/null
pair down
nothing_runs "the next 'up' and 'down'"
