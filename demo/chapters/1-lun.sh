# shellcheck shell=bash
# One appliance, one LUN, three initiators: one may write, one may read, one is a stranger.

TARGET=iqn.2026-01.com.example:store
ALICE=iqn.2026-01.com.example:alice
BOB=iqn.2026-01.com.example:bob
MALLORY=iqn.2026-01.com.example:mallory

title "A LUN over iSCSI"
tell "An appliance: a volume (an XFS in an image file), and the iSCSI service."
do_it iscsi-host portal set "$PORTAL"
do_it iscsi-host volume create /mnt/volume1 --size 1G
do_it iscsi-host boot
do_it iscsi-host status

tell "A LUN of 128 MiB, and a target that shows it: alice may write, bob may read, nobody else is named."
do_it iscsictl lun create disk --location /mnt/volume1 --size 128M
do_it iscsictl target create store --iqn "$TARGET"
do_it iscsictl lun map disk store
do_it iscsictl target masks store --set "$ALICE=rw" --set "$BOB=r"

tell "alice discovers it."
do_it iscsi-ls -s -i "$ALICE" "iscsi://$PORTAL"
do_it iscsi-readcapacity16 -i "$ALICE" "iscsi://$PORTAL/$TARGET/1"

tell "alice writes 128 MiB of noise and reads them back."
head -c 128M /dev/urandom >/tmp/noise
qemu-img convert -n -f raw --target-image-opts /tmp/noise "$(as "$ALICE" "$TARGET" 1)"
qemu-img convert --image-opts -O raw "$(as "$ALICE" "$TARGET" 1)" /tmp/alice
do_it sha256sum /tmp/noise /tmp/alice
same "what alice read" "$(checksum /tmp/alice)" "$(checksum /tmp/noise)"

tell "bob reads the same, and cannot write."
qemu-img convert --image-opts -O raw "$(as "$BOB" "$TARGET" 1)" /tmp/bob
do_it sha256sum /tmp/bob
same "what bob read" "$(checksum /tmp/bob)" "$(checksum /tmp/noise)"
refused 'read-only|write protected' qemu-io --image-opts "$(as "$BOB" "$TARGET" 1)" -c 'write -P 0x55 0 64k'

tell "mallory, whom the access list does not name, sees no target and cannot log in."
do_it iscsi-ls -i "$MALLORY" "iscsi://$PORTAL"
same "targets that mallory sees" "$(iscsi-ls -i "$MALLORY" "iscsi://$PORTAL" 2>&1 | grep -c "$TARGET")" 0
refused 'login|authori' iscsi-inq -i "$MALLORY" "iscsi://$PORTAL/$TARGET/1"

tell "The LUN grows while alice keeps 16 writes in flight; none of them fails."
write_until_grown() {
    until [[ -e /tmp/grown ]]; do
        qemu-img bench -w -t none -c 20000 -d 16 -s 64k --image-opts "$(as "$ALICE" "$TARGET" 1)" >/tmp/bench 2>&1 || return
    done
}
write_until_grown &
writer=$!
until [[ -n $(ss -Htn state established "( dport = :3261 )") ]]; do
    kill -0 "$writer" || wrong "the writer did not get started"
done
do_it iscsictl lun update disk --size 256M
touch /tmp/grown
wait "$writer" || { indented </tmp/bench && wrong "a write failed while the LUN grew"; }
do_it tail -n 1 /tmp/bench
do_it iscsi-readcapacity16 -i "$ALICE" "iscsi://$PORTAL/$TARGET/1"

tell "The service restarts; target, number, access list and data are as before."
qemu-img convert --image-opts -O raw "$(as "$ALICE" "$TARGET" 1)" /tmp/before
do_it iscsi-host stop
do_it iscsi-host boot
do_it iscsictl lun list --status
do_it iscsictl target show store
qemu-img convert --image-opts -O raw "$(as "$ALICE" "$TARGET" 1)" /tmp/again
do_it sha256sum /tmp/before /tmp/again
same "what alice read after the restart" "$(checksum /tmp/again)" "$(checksum /tmp/before)"
refused 'login|authori' iscsi-inq -i "$MALLORY" "iscsi://$PORTAL/$TARGET/1"
