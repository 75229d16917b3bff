#!/usr/bin/env bash
# world.sh BUILD_DIR COMMAND [ARG...]: runs a command on a throw-away appliance: own network, processes and mounts; the
# build installed in an /usr that forgets; empty /tmp, /mnt and /run; all of it gone when the command ends. The command starts in
# a copy of this tree's scripts, so that it works wherever the tree lies. Needs root.
set -euo pipefail

if [[ ${1:-} != --inside ]]; then
    exec unshare --mount --uts --ipc --net --pid --fork --kill-child --mount-proc "$0" --inside "$@"
fi
shift
tree=$(dirname "$(dirname "$(realpath "$0")")")
build=$(realpath "$1")
shift

mount -t tmpfs -o mode=0755 tmpfs /run
mkdir -p /run/world/{upper,work,tree/tests}
cp -r "$tree/demo" "$tree/bench" /run/world/tree/
cp -r "$tree/tests/pair" /run/world/tree/tests/
if [[ -d $build/bench ]]; then
    find "$build/bench" -maxdepth 1 -type f -executable -exec cp -t /run/world/tree/bench {} +
fi
mount -t overlay overlay -o lowerdir=/usr,upperdir=/run/world/upper,workdir=/run/world/work /usr
cmake --install "$build" --prefix /usr >/run/world/install.log
mount -t tmpfs -o mode=1777 tmpfs /tmp
mount -t tmpfs -o mode=0755 tmpfs /mnt
ip link set lo up

export ISCSI_HOST_STATE=/run/world/state ISCSI_HOST_RUN=/run/iscsi-host
cd /run/world/tree
exec "$@"
