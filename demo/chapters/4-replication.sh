# shellcheck shell=bash
# A LUN is replicated to the second appliance, fails over to it, and comes back.

LEDGER=iqn.2026-01.com.example:ledger
LEDGER_MIB=128

# at ADDRESS -c COMMAND...: alice's machine works on the LUN at that appliance.
at() {
    local address=$1
    shift
    qemu-io --image-opts "$(as "$ALICE" "$LEDGER" 1 "$address")" "$@"
}
read_at() { qemu-img convert --image-opts -O raw "$(as "$ALICE" "$LEDGER" 1 "$1")" "$2"; }

# sees WHAT FILE ADDRESS: what alice reads there is what is in the file.
sees() {
    read_at "$3" /tmp/seen
    do_it sha256sum "$2" /tmp/seen
    same "$1" "$(checksum /tmp/seen)" "$(checksum "$2")"
}

# task: where the one replication of a machine is.
TASK=rep#1

title "Replication"
tell "A ledger on the first appliance, and its replica on the second."
head -c ${LEDGER_MIB}M /dev/urandom >/tmp/ledger
do_it iscsictl lun create ledger --location /mnt/volume1 --size ${LEDGER_MIB}M
do_it iscsictl target create ledger --iqn "$LEDGER"
do_it iscsictl lun map ledger ledger
do_it iscsictl target masks ledger --set "$ALICE=rw"
qemu-img convert -n -f raw --target-image-opts /tmp/ledger "$(as "$ALICE" "$LEDGER" 1 "$PORTAL")"
do_it iscsictl replication create ledger --node "$PEER" --location /mnt/volume1 --name ledger
do_it on two iscsictl target create ledger --iqn "$LEDGER"
do_it on two iscsictl target masks ledger --set "$ALICE=rw"

tell "The first snapshot goes over whole."
do_it iscsictl snapshot take ledger --name monday
watch_it iscsictl replication send "$TASK" ledger_monday --watch
do_it on two iscsictl snapshot list ledger

tell "alice changes one hundredth of the ledger; no more than that goes over."
do_it at "$PORTAL" -c 'write -P 0x11 10M 640k' -c 'write -P 0x22 70M 640k'
do_it iscsictl snapshot take ledger --name tuesday
do_it iscsictl replication unsynced "$TASK" ledger_tuesday --base ledger_monday
watch_it iscsictl replication send "$TASK" ledger_tuesday --watch
read_at "$PORTAL" /tmp/ledger

tell "While it is a replica nobody else may write to it."
do_it on two iscsictl lun map ledger ledger
sees "what alice reads from the replica" /tmp/ledger "$PEER"
refused 'write.protected' at "$PEER" -c 'write 0 64k'
do_it on two iscsictl lun unmap ledger ledger

title "Failing over, and back"
tell "The first appliance is given up for now: the second one takes over, and alice goes on there."
do_it iscsictl lun unmap ledger ledger
do_it on two iscsictl replication promote "$TASK"
do_it on two iscsictl lun map ledger ledger
sees "what alice reads after failing over" /tmp/ledger "$PEER"
do_it at "$PEER" -c 'write -P 0x33 100M 320k'
read_at "$PEER" /tmp/ledger

tell "The first one is back. It becomes the replica, and receives what was written meanwhile."
do_it iscsictl replication demote "$TASK"
do_it on two iscsictl snapshot take ledger --name wednesday
watch_it on two iscsictl replication send "$TASK" ledger_wednesday --watch

tell "Everything as it was, with the latest ledger."
do_it on two iscsictl lun unmap ledger ledger
do_it on two iscsictl replication demote "$TASK"
do_it iscsictl replication promote "$TASK"
do_it iscsictl lun map ledger ledger
sees "what alice reads after failing back" /tmp/ledger "$PORTAL"
do_it iscsictl replication list
do_it on two iscsictl replication list
