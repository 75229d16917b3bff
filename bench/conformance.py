#!/usr/bin/env python3
"""The SCSI test suite of libiscsi, one process a suite, on a LU of ours and on one of a plain tgtd.

Exit status 1 when a test fails on ours that passes on the plain one. Runs inside demo/world.sh.
"""
import re
import subprocess
import sys
from concurrent.futures import ThreadPoolExecutor

from machines import MIB, VOLUME, PlainTgtd, appliance, make_lun

SIZE = 1024 * MIB


def suites():
    listing = subprocess.run(["iscsi-test-cu", "--list", "iscsi://none/none/1"], stdout=subprocess.PIPE, text=True)
    found = [line for line in listing.stdout.split() if re.fullmatch(r"ALL\.[^.]+", line)]
    if not found:
        raise SystemExit("iscsi-test-cu lists no suite")
    return found


def results(url):
    """{"Suite.Test": "passed", "FAILED" or "skipped"} of every suite; a suite that died is one FAILED test."""
    outcome = {}
    for suite in suites():
        name = suite.split(".")[1]
        try:
            done = subprocess.run(["iscsi-test-cu", "--dataloss", f"--test={suite}", url], stdin=subprocess.DEVNULL,
                                  stdout=subprocess.PIPE, stderr=subprocess.DEVNULL, timeout=120)
        except subprocess.TimeoutExpired:
            outcome[f"{name}.(does not end)"] = "FAILED"
            continue
        text = done.stdout.decode(errors="replace")
        tests = re.split(r"^  Test: ", text.split("Run Summary")[0], flags=re.M)[1:]
        for test in tests:
            verdict = re.findall(r"(?:\.\.\.|^)\s*(passed|FAILED)", test, flags=re.M)
            skipped = "[SKIPPED]" in test
            outcome[f"{name}.{test.split()[0]}"] = (
                "FAILED" if not verdict or verdict[-1] == "FAILED" else "skipped" if skipped else "passed")
        if not tests:
            outcome[f"{name}.(runs nothing)"] = "FAILED"
    return outcome


def compare():
    """Runs both; what ours does worse."""
    ours_url = make_lun("conformance", SIZE, "conformance", "iqn.2026-01.com.example:conformance")
    with PlainTgtd() as plain, ThreadPoolExecutor() as pool:
        peer_url = plain.add(f"{VOLUME}/plain-conformance", SIZE)
        ours, peer = pool.map(results, (ours_url, peer_url))
    for name, outcome in (("ours", ours), ("plain tgtd", peer)):
        counts = [list(outcome.values()).count(verdict) for verdict in ("passed", "FAILED", "skipped")]
        print("  {:<12}{:>5} pass{:>5} fail{:>5} skip".format(name, *counts))
    worse = sorted(test for test in peer if peer[test] == "passed" and ours.get(test) != "passed")
    for test in worse:
        print(f"  worse: {test}: {ours.get(test, 'not run')} on ours, passed on a plain tgtd")
    if "passed" not in peer.values():
        raise SystemExit("no test passes on a plain tgtd: the comparison says nothing")
    return worse


if __name__ == "__main__":
    with appliance():
        sys.exit(1 if compare() else 0)
