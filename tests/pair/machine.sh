#!/usr/bin/env bash
# machine.sh NAME DISK: one machine of a pair, in namespaces that pair.py has just made for it: folders of its own where an
# appliance keeps things, and nothing running. What outlives a boot lies in the folder DISK. Says "made", reads the machine's
# address from standard input when its network card is there, says "ready", and is then the machine's first process: when it
# dies, the machine is gone.
set -euo pipefail

hostname "$1"
mount --bind "$2" /mnt # the disk lies below /run, which is covered now
mount -t tmpfs -o mode=0755 tmpfs /run
# /usr is the world's and shared; the folder of the node configuration file is not.
mkdir -p /usr/norv/etc /mnt/norv
mount --bind /mnt/norv /usr/norv/etc
for folder in /etc /var; do
    mkdir -p "/mnt$folder/upper" "/mnt$folder/work"
    mount -t overlay overlay -o "lowerdir=$folder,upperdir=/mnt$folder/upper,workdir=/mnt$folder/work" "$folder"
done
# A /dev of its own, for a system log of its own.
mkdir /run/dev
mount -t tmpfs -o mode=0755 tmpfs /run/dev
cp -a /dev/{full,null,ptmx,random,tty,urandom,zero,loop-control} /run/dev/
for number in {0..63}; do
    mknod -m 0660 "/run/dev/loop$number" b 7 "$number"
done
mkdir -m 1777 /run/dev/shm
mkdir /run/dev/pts
mount --bind /dev/pts /run/dev/pts
mount --move /run/dev /dev
mkdir -p /var/lib/iscsi-host /mnt/state
chmod 700 /var/lib/iscsi-host /mnt/state
mount --bind /mnt/state /var/lib/iscsi-host # not on the overlay: it holds the volume's image
mount -t tmpfs -o mode=1777 tmpfs /tmp
mkdir -p /mnt/mnt
mount --bind /mnt/mnt /mnt
printf '127.0.0.1 localhost %s\n' "$1" >/etc/hosts
ip link set lo up

echo made
read -r address
ip address add "$address/24" dev eth0
ip link set eth0 up
echo ready
# Takes in what its daemons leave behind.
sleep infinity &
wait
