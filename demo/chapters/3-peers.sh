# shellcheck shell=bash
# A second appliance: the two join, and a LUN is cloned to the other one.

COPIES=iqn.2026-01.com.example:copies
PEER=192.0.2.12
SIGN_IN=/tmp/sign-in

title "A second appliance"
tell "Another machine on the same network: a volume, the iSCSI service."
switch_on two "$PEER"
do_it on two iscsi-host portal set "$PEER"
do_it on two iscsi-host volume create /mnt/volume1 --size 1G
do_it on two iscsi-host boot

tell "The two talk through their web APIs, over TLS; who joins them needs an administrator's account on the other one."
for machine in one two; do
    on "$machine" iscsi-host web run </dev/null >/dev/null 2>&1 &
done
head -c 12 /dev/urandom | base64 >"$SIGN_IN"
do_it on two iscsi-host account add admin --role admin --password-file - <"$SIGN_IN"
for address in "$PORTAL" "$PEER"; do
    until (exec 3<>"/dev/tcp/$address/5443") 2>/dev/null; do sleep 0.1; done
done
do_it on two iscsi-host certificate show
fingerprint=$(on two iscsi-host certificate show | awk '$1 == "fingerprint" { print $2 }')

tell "A wrong fingerprint is refused: somebody else may be answering there."
refused 'key|fingerprint' iscsictl node join "$PEER" --account admin --password-file - \
    --fingerprint "sha256//$(head -c 32 /dev/zero | base64)" <"$SIGN_IN"

tell "With the right one, each appliance knows the other."
do_it iscsictl node join "$PEER" --account admin --password-file - --fingerprint "$fingerprint" <"$SIGN_IN"
do_it iscsictl node list
do_it on two iscsictl node list

title "A clone on the other appliance"
tell "The LUN with the file system goes to the second appliance, over iSCSI between the two."
watch_it iscsictl lun remote-clone keep --node "$PEER" --name copy --location /mnt/volume1 --watch
do_it on two iscsictl lun list --status
do_it on two iscsictl target create copies --iqn "$COPIES"
do_it on two iscsictl lun map copy copies
do_it on two iscsictl target masks copies --set "$ALICE=rw"

tell "alice reads it there: the same file system, the same files."
qemu-img convert --image-opts -O raw "$(as "$ALICE" "$COPIES" 1 "$PEER")" /tmp/copy
read_image "$KEEPER" "$COPY"
do_it sha256sum "$COPY" /tmp/copy
same "what alice read on the second appliance" "$(checksum /tmp/copy)" "$(checksum "$COPY")"
do_it e2fsck -fn /tmp/copy

tell "The two are LUNs of their own: what is written to the one is not on the other."
do_it qemu-io --image-opts "$(as "$ALICE" "$KEEPER" 1)" -c 'write -P 0xee 0 8M'
qemu-img convert --image-opts -O raw "$(as "$ALICE" "$COPIES" 1 "$PEER")" /tmp/copy
same "the copy" "$(checksum /tmp/copy)" "$(checksum "$COPY")"
