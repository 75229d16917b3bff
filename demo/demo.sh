#!/usr/bin/env bash
# demo.sh BUILD_DIR: the whole demonstration, on a throw-away machine. Needs root.
set -euo pipefail

if [[ ${1:-} != --inside ]]; then
    here=$(dirname "$(realpath "$0")")
    exec "$here/world.sh" "$1" demo/demo.sh --inside
fi

# shellcheck source=demo/story.sh
. demo/story.sh
switch_on one "$PORTAL"
for chapter in demo/chapters/*.sh; do
    # shellcheck source=/dev/null
    . "$chapter"
done
printf '\nEverything was as told. The machine is unchanged.\n'
