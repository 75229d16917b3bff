#!/usr/bin/env bash
# bench.sh BUILD_DIR: every benchmark on a throw-away machine. Needs root.
set -euo pipefail
here=$(dirname "$(realpath "$0")")
exec "$here/../demo/world.sh" "$1" python3 -B bench/bench.py
