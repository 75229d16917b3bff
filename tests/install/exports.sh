#!/usr/bin/env bash
# exports.sh LIBRARY: its dynamic symbols are members, vtables and type information of the public classes, all of them.
set -euo pipefail

symbols=$(nm -DC --defined-only "$1" | sed -E 's/^[0-9a-f]+ . //')
class='ISCSI::(LIB::LIB(LUN|Node|Replication|Target|VLUN)::ISCSILIB(LUN|Node|Replication|Target|VLUN)|ISCSI(LUN|Node|Snapshot|Target|Task|VLUN)Info)'
allowed="^(vtable for |typeinfo for |typeinfo name for )?$class(::|\$)"

if other=$(grep -vE "$allowed" <<<"$symbols"); then
    printf 'exported, but no part of a public class:\n%s\n' "$other" >&2
    exit 1
fi
for name in ISCSILIB{LUN,Node,Replication,Target,VLUN} ISCSI{LUN,Node,Snapshot,Target,Task,VLUN}Info; do
    grep -qE "^vtable for .*$name\$" <<<"$symbols" || { echo "not exported: $name" >&2 && exit 1; }
done
