"""How the benchmarks measure and print: ours, its peer, and the ratio."""
import statistics
import subprocess
import time

misses = []


def heading(text):
    print(f"\n{text}\n  {'':<44}{'ours':>11} {'peer':>11} {'':<6}{'ratio':>7}", flush=True)


def row(what, ours, peer, unit, ratio, limit=None, slack=0):
    """A ratio above the limit is a miss, which makes the run fail; `slack` is what ours may take beside it."""
    is_missed = limit is not None and ratio > limit + slack / peer
    text = "" if limit is None else f"{limit:.2f} + {slack} {unit}" if slack else f"{limit:.2f}"
    verdict = f"  ABOVE {text}" if is_missed else f"  (limit {text})" if text else ""
    if is_missed:
        misses.append(what)
    print(f"  {what:<44}{ours:>11.3f} {peer:>11.3f} {unit:<6}{ratio:>7.2f}{verdict}", flush=True)


def alternate(*measures, rounds):
    """Medians of measurements taken in turn, so that what disturbs one disturbs the others."""
    return [statistics.median(column) for column in zip(*([measure() for measure in measures] for _ in range(rounds)))]


def seconds(*command, **options):
    """A measurement: how long the command takes."""
    def measure():
        start = time.perf_counter()
        done = subprocess.run(command, stdout=subprocess.PIPE, stderr=subprocess.STDOUT, **options)
        taken = time.perf_counter() - start
        if done.returncode:
            raise SystemExit(f"{' '.join(command)}: {done.stdout.decode(errors='replace')[-2000:]}")
        return taken
    return measure
