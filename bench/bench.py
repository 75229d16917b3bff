#!/usr/bin/env python3
"""Every benchmark, as ratios of what ours takes to what its peer takes. Runs inside demo/world.sh."""
import json
import os
import re
import sys

import clones
import conformance
import replication
import snapshots
import web
from machines import MIB, PLAIN_TARGET, VOLUME, PlainTgtd, appliance, make_lun, run
from report import alternate, heading, misses, row, seconds

HERE = os.path.dirname(os.path.abspath(__file__))


def records():
    heading("The library on the fake platform, beside the same work done by hand")
    report = json.loads(run(f"{HERE}/bench_records", "--benchmark_format=json", "--benchmark_repetitions=9",
                            "--benchmark_min_time=0.1", "--benchmark_report_aggregates_only=true",
                            "--benchmark_enable_random_interleaving=true", "--benchmark_filter=-Memory"))
    unit = {"ns": 1e-3, "ms": 1e3}
    median = {entry["run_name"]: entry["cpu_time"] * unit[entry["time_unit"]] for entry in report["benchmarks"]
              if entry["aggregate_name"] == "median"}
    for what, ours, peer, answer in (("ListLUN, 1,024 LUNs", "listLUN", "plainLoop", "platformAnswer"),
                                     ("ListSnapshot, 65,536", "listSnapshot", "plainSnapshotWalk", "snapshotAnswer")):
        ours, peer, answer = median[ours], median[peer], median[answer]
        row(what, ours, peer, "us", ours / peer, 1.5)
        row("  the same without the platform's answer", ours - answer, peer - answer, "us",
            (ours - answer) / (peer - answer))
    for what, ours, peer in (("toString of one LUN", "recordToString", "plainToString"),
                             ("toJsonFormat of one LUN", "recordToJson", "plainToJson")):
        row(what, median[ours], median[peer], "us", median[ours] / median[peer])
    counted = json.loads(run(f"{HERE}/bench_records", "--benchmark_format=json", "--benchmark_filter=Memory"))
    used = {key: counted["benchmarks"][0][key] / MIB for key in ("list", "peak", "records")}
    row("ListSnapshot's peak; the SDK's list + records", used["peak"], used["list"] + used["records"], "MiB",
        used["peak"] / (used["list"] + used["records"]))
    row("  above the list; the records", used["peak"] - used["list"], used["records"], "MiB",
        (used["peak"] - used["list"]) / used["records"], 1.3)


def listing(count=1024, targets=16):
    heading(f"Whole processes with {count} LUNs mapped to {targets} targets")
    for tid in range(1, targets + 1):
        run("iscsictl", "target", "create", f"list{tid}", "--iqn", f"iqn.2026-01.com.example:list{tid}")
    present = len(json.loads(run("iscsictl", "lun", "list", "--json")))
    for number in range(count - present):
        name = f"list-{number}"
        run("iscsictl", "lun", "create", name, "--location", VOLUME, "--size", "16M")
        run("iscsictl", "lun", "map", name, f"list{number % targets + 1}")
    assert len(json.loads(run("iscsictl", "lun", "list", "--json"))) == count

    with PlainTgtd() as plain:
        for tid in range(2, targets + 1):
            plain.admin("--op", "new", "--mode", "target", "--tid", str(tid), "-T", f"{PLAIN_TARGET}{tid}")
        os.mkdir(f"{VOLUME}/plain-list")
        for number in range(count):
            path = f"{VOLUME}/plain-list/{number}"
            with open(path, "wb") as file:
                file.truncate(16 * MIB)
            plain.admin("--op", "new", "--mode", "logicalunit", "--tid", str(number % targets + 1),
                        "--lun", str(number // targets + 1), "-b", path)
        show = ("tgtadm", "--lld", "iscsi", "--op", "show", "--mode", "target")
        shown = run(*show, env=plain.environment)
        assert len(re.findall(r"Backing store path: /", shown)) == count
        for options, limit in (([], 2), (["--status"], None)):
            command = ["iscsictl", "lun", "list", "--json", *options]
            ours, peer = alternate(seconds(*command), seconds(*show, env=plain.environment), rounds=15)
            row(" ".join(command), ours * 1000, peer * 1000, "ms", ours / peer, limit)


def transfers(size=512 * MIB):
    heading("I/O through a LUN of ours, beside a plain tgtd's on the same volume (time of the same work)")
    ours_url = make_lun("transfers", size, "transfers", "iqn.2026-01.com.example:transfers")
    with PlainTgtd() as plain:
        peer_url = plain.add(f"{VOLUME}/plain-transfers", size)

        def work(*options):
            bench = ("qemu-img", "bench", "-f", "raw", "-t", "none", *options)
            return alternate(seconds(*bench, ours_url), seconds(*bench, peer_url), rounds=9)

        work("-w", "-c", str(size // (256 << 10)), "-s", "256k", "-d", "8")  # allocates both
        for what, options in (
                ("write, 256 KiB, 8 in flight", ("-w", "-c", "4000", "-s", "256k", "-d", "8")),
                ("read, 256 KiB, 8 in flight", ("-c", "4000", "-s", "256k", "-d", "8")),
                ("write, 4 KiB, 32 in flight", ("-w", "-c", "30000", "-s", "4k", "-d", "32", "-S", "68k")),
                ("read, 4 KiB, 32 in flight", ("-c", "30000", "-s", "4k", "-d", "32", "-S", "68k"))):
            ours, peer = work(*options)
            row(what, ours, peer, "s", ours / peer)


def main():
    records()
    with appliance("8G"):
        transfers()
        snapshots.taking()
        snapshots.exports()
        print("\nThe SCSI test suite (iscsi-test-cu, one process a suite)")
        if conformance.compare():
            misses.append("iscsi-test-cu")
        web.api_calls()
        listing()
    clones.remote_clones()
    replication.replications()
    if misses:
        print(f"\nAbove the limit: {', '.join(misses)}")
    return 1 if misses else 0


if __name__ == "__main__":
    sys.exit(main())
