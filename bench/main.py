"""Chooses what to measure, has it measured in the sandbox, and makes table and plot of it."""

import argparse
import json
import pathlib
import re
import statistics
import subprocess
import sys

from measurements import MEASUREMENTS, ROWS

ROOT = pathlib.Path(__file__).resolve().parent.parent
TOOLS = ROOT / "build" / "bench" / "bench"
ROUNDS = 11
QUICK_ROUNDS = 3
HEAD = ("what", "ours", "peer", "ratio", "to reach", "ok")


def arguments():
    parser = argparse.ArgumentParser(prog="scripts/bench", description="What the product costs, beside its peers.")
    parser.add_argument("--only", metavar="PATTERN", default="", help="only the rows that match")
    parser.add_argument("--rounds", type=int, metavar="N", help=f"how often all is measured (default {ROUNDS})")
    parser.add_argument("--quick", action="store_true", help=f"{QUICK_ROUNDS} rounds, and less of what takes long")
    parser.add_argument("--build", type=pathlib.Path, metavar="DIR", default=ROOT / "build" / "bench",
                        help="the product's build folder, if it is another than the measurements'")
    parser.add_argument("--output", type=pathlib.Path, metavar="FILE", help="write the table, in Markdown")
    return parser.parse_args()


def in_sandbox(script, order):
    run = subprocess.run([ROOT / "scripts" / "sandbox", sys.executable, ROOT / "bench" / script],
                         input=json.dumps(order), stdout=subprocess.PIPE, text=True)
    if run.returncode != 0:
        sys.exit(f"scripts/bench: {script} ended with status {run.returncode}")
    return json.loads(run.stdout)


def number(value, unit):
    if unit == "us":
        value /= 1000
    digits = 3 if value < 1 else 1 if value < 100 else 0
    return f"{value:,.{digits}f} {unit}"


def cells(row, taken):
    """A line of the table. The ratio is the median of the rounds' ratios."""
    failure = taken["failures"].get(row.ours) or taken["failures"].get(row.peer)
    if failure:
        return (row.what, failure, "", "", "", "no" if row.most or row.least else "")
    ours, peers = taken["results"][row.ours], taken["results"].get(row.peer, [])
    figure = statistics.median(ours)
    ratio = statistics.median(own / peer for own, peer in zip(ours, peers)) if peers else figure
    limit = f"≤ {row.most:g}" if row.most else f"≥ {row.least:g}" if row.least else ""
    good = "" if not limit else "yes" if (ratio <= row.most if row.most else ratio >= row.least) else "no"
    peer = f"{number(statistics.median(peers), row.unit)} ({row.peer_name})" if peers else ""
    return (row.what, number(figure, row.unit), peer, f"{ratio:.2f} x" if peers else "",
            limit + ("" if peers or not limit else f" {row.unit}"), good)


def markdown(head, lines):
    widths = [max(len(line[column]) for line in [head, *lines]) for column in range(len(head))]
    rows = [head, tuple("-" * width for width in widths), *lines]
    return "\n".join("| " + " | ".join(cell.ljust(width) for cell, width in zip(row, widths)) + " |"
                     for row in rows) + "\n"


def main():
    chosen = arguments()
    pattern = re.compile(chosen.only, re.IGNORECASE)
    rows = [row for row in ROWS if pattern.search(row.what)]
    wanted = {name for row in rows for name in (row.ours, row.peer)}
    rounds = chosen.rounds or (QUICK_ROUNDS if chosen.quick else ROUNDS)
    order = {"product": str(chosen.build.resolve()), "tools": str(TOOLS), "rounds": rounds, "quick": chosen.quick,
             "names": [name for name in MEASUREMENTS if name in wanted]}
    table = markdown(HEAD, [cells(row, taken) for taken in [in_sandbox("measure.py", order)] for row in rows])
    print(table, end="")
    if chosen.output:
        chosen.output.write_text(table)


if __name__ == "__main__":
    main()
