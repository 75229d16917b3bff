#!/usr/bin/env bash
# installed_example.sh BUILD_DIR EXAMPLE_DIR: installs the build into a prefix of its own, builds the example against it
# with CMake and with pkg-config, and runs both on an empty appliance. CXX and CXXFLAGS are the build's.
set -euo pipefail
build=$1 example=$2

work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
prefix=$work/prefix
export ISCSI_HOST_STATE=$work/state ISCSI_HOST_RUN=$work/run

cmake --install "$build" --prefix "$prefix" >"$work/install.log"
libdir=$(dirname "$(find "$prefix" -name libiscsiwebapi.so)")
export LD_LIBRARY_PATH=$libdir

cmake -S "$example" -B "$work/cmake" -DCMAKE_PREFIX_PATH="$prefix" >"$work/configure.log"
cmake --build "$work/cmake" >"$work/build.log"

export PKG_CONFIG_PATH=$libdir/pkgconfig
read -ra flags <<<"$CXXFLAGS $(pkg-config --cflags --libs iscsiwebapi)"
"$CXX" -std=c++17 -Wall -Wextra -Werror "$example/luns.cpp" -o "$work/luns" "${flags[@]}"

expect() { # expect WHAT OUTPUT PATTERN
    grep -qE "$3" <<<"$2" || { printf '%s: expected %s, got:\n%s\n' "$1" "$3" "$2" >&2 && exit 1; }
}
mkdir "$work/volume"
"$prefix/sbin/iscsi-host" volume add "$work/volume"
expect "empty appliance" "$("$work/cmake/luns")" '^0 LUNs$'
expect "create" "$("$work/luns" disk 1048576 "$work/volume")" '^1 disk 1048576 [a-z]+$'
expect "second process" "$("$work/cmake/luns")" '^1 disk 1048576 [a-z]+$'
if refused=$("$work/luns" disk 1048576 "$work/volume" 2>&1); then
    echo "a second LUN of the same name was made" >&2
    exit 1
fi
expect "same name" "$refused" 'error [0-9]+ \(.+\)'
