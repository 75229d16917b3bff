# shellcheck shell=bash
# A file system on a LUN: kept by a snapshot, damaged, set back, cloned, and carried elsewhere.

KEEPER=iqn.2026-01.com.example:keeper
CLONES=iqn.2026-01.com.example:clones
COPY=/tmp/read-back

# write_image FILE TARGET_IQN: over iSCSI, as alice; read_image TARGET_IQN FILE.
write_image() { qemu-img convert -n -f raw --target-image-opts "$1" "$(as "$ALICE" "$2" 1)"; }
read_image() { qemu-img convert --image-opts -O raw "$(as "$ALICE" "$1" 1)" "$2"; }

title "A snapshot, a disaster, and a restore"
tell "A file system with files in it, in an image of 64 MiB."
mkdir /tmp/files
for number in 1 2 3 4 5 6 7 8; do
    head -c 4M /dev/urandom >"/tmp/files/document-$number"
done
do_it mkfs.ext4 -q -d /tmp/files /tmp/image 64M
do_it e2fsck -fn /tmp/image

tell "alice writes it to a LUN, through iSCSI."
do_it iscsictl lun create keep --location /mnt/volume1 --size 64M
do_it iscsictl target create keeper --iqn "$KEEPER"
do_it iscsictl lun map keep keeper
do_it iscsictl target masks keeper --set "$ALICE=rw"
write_image /tmp/image "$KEEPER"
read_image "$KEEPER" "$COPY"
do_it sha256sum /tmp/image "$COPY"
same "what alice read" "$(checksum "$COPY")" "$(checksum /tmp/image)"

tell "A snapshot is taken, and locked."
do_it iscsictl snapshot take keep --name monday --note "before the disaster" --lock --watch
do_it iscsictl snapshot list
refused 'locked' iscsictl snapshot delete --yes keep_monday

tell "Disaster: alice's machine writes rubbish over the file system."
do_it qemu-io --image-opts "$(as "$ALICE" "$KEEPER" 1)" -c 'write -P 0xee 0 8M' -c 'write -P 0xee 30M 8M'
read_image "$KEEPER" "$COPY"
refused 'superblock|corrupt|bad magic' e2fsck -fn "$COPY"

tell "The LUN is set back while the target goes on showing it; the file system is whole again."
do_it iscsictl snapshot restore keep_monday --yes --watch
read_image "$KEEPER" "$COPY"
do_it sha256sum /tmp/image "$COPY"
same "what alice read after the restore" "$(checksum "$COPY")" "$(checksum /tmp/image)"
do_it e2fsck -fn "$COPY"
debugfs -R 'dump /document-5 /tmp/document' "$COPY" 2>/dev/null
do_it sha256sum /tmp/files/document-5 /tmp/document
same "a file in it" "$(checksum /tmp/document)" "$(checksum /tmp/files/document-5)"

title "A clone"
tell "A second LUN with the snapshot's data shares its space; it is mapped and read."
do_it iscsictl snapshot clone keep_monday twin --watch
do_it iscsictl target create clones --iqn "$CLONES"
do_it iscsictl lun map twin clones
read_image "$CLONES" "$COPY"
do_it sha256sum /tmp/image "$COPY"
same "what alice read from the clone" "$(checksum "$COPY")" "$(checksum /tmp/image)"
do_it iscsictl lun list --status

tell "Writing to the clone leaves the LUN as it is."
do_it qemu-io --image-opts "$(as "$ALICE" "$CLONES" 1)" -c 'write -P 0xee 0 8M'
read_image "$KEEPER" "$COPY"
same "what alice read from the LUN" "$(checksum "$COPY")" "$(checksum /tmp/image)"

title "Export, import, and what the appliance does by itself"
tell "The snapshot is exported to a directory, and imported into another LUN, which gets a snapshot of it."
do_it iscsictl snapshot export keep_monday /tmp/exported --watch
do_it on one ls -sh /tmp/exported
do_it iscsictl lun create fresh --location /mnt/volume1 --size 64M
do_it iscsictl lun import fresh /tmp/exported --watch
do_it iscsictl lun map fresh keeper
qemu-img convert --image-opts -O raw "$(as "$ALICE" "$KEEPER" 2)" "$COPY"
same "what alice read from the imported LUN" "$(checksum "$COPY")" "$(checksum /tmp/image)"

tell "Snapshots each hour, of which the newest three stay, and one of each of seven days; a locked one always stays."
do_it iscsictl schedule add --lun keep --every 1h
do_it iscsictl schedule list
for number in 1 2 3 4; do
    iscsictl snapshot take keep --name "hour-$number" >/dev/null
done
do_it iscsictl retention dry-run keep --keep 3 --daily 7
do_it iscsictl retention set keep --keep 3 --daily 7
do_it iscsictl events
