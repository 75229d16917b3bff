# shellcheck shell=bash
# The verbs that the chapters are written in. Initiators run here; appliances are machines of their own, 'one' the first of them.

PORTAL=192.0.2.11

# switch_on NAME ADDRESS: a machine, with the build installed and nothing running.
switch_on() {
    local maker
    exec {maker}< <(exec python3 -B tests/pair/pair.py machine "$1" "$2")
    read -r _ <&"$maker" || wrong "the machine '$1' did not start"
}

# on NAME COMMAND...: runs a command on a machine.
on() {
    local name=$1
    shift
    nsenter -t "$(<"/run/world/machines/$name")" -m -u -i -n -p --wd=/ -- env -u ISCSI_HOST_STATE -u ISCSI_HOST_RUN "$@"
}
iscsictl() { on one iscsictl "$@"; }
iscsi-host() { on one iscsi-host "$@"; }

title() { printf '\n%s\n%s\n' "$1" "${1//?/=}"; }
tell() { printf '\n%s\n' "$*"; }

indented() { sed 's/^/    /'; }

# do_it COMMAND...: shows a command and what it prints; it has to succeed.
do_it() {
    printf '  $ %s\n' "$*"
    "$@" 2>&1 | indented
}

# watch_it COMMAND...: the same for a command that has a progress bar for a terminal.
watch_it() {
    printf '  $ %s\n' "$*"
    if [[ -t 2 ]]; then "$@"; else "$@" 2>&1 | indented; fi
}

# refused PATTERN COMMAND...: shows a command that has to fail and say so.
refused() {
    local pattern=$1 output
    shift
    printf '  $ %s\n' "$*"
    if output=$("$@" 2>&1); then
        indented <<<"$output"
        wrong "this was to be refused"
    fi
    indented <<<"$output"
    grep -qiE "$pattern" <<<"$output" || wrong "refused, but not with '$pattern'"
}

same() { # same WHAT A B
    [[ $2 == "$3" ]] || wrong "$1: $2 is not $3"
}

wrong() {
    printf '\nNOT AS TOLD: %s\n' "$*" >&2
    exit 1
}

# as INITIATOR TARGET_IQN LUN [ADDRESS]: a LUN as qemu's iSCSI initiator is told of it.
as() {
    printf 'driver=raw,file.driver=iscsi,file.transport=tcp,file.portal=%s:3260,file.initiator-name=%s,file.target=%s,file.lun=%d' \
        "${4:-$PORTAL}" "$1" "$2" "$3"
}

checksum() { sha256sum "$1" | cut -d ' ' -f 1; }
