"""Chooses what to measure, has it measured in the sandbox, and tells what came out."""

import argparse
import json
import pathlib
import re
import subprocess
import sys

import report
from measurements import JOBS, MEASUREMENTS, QUICK_JOBS, ROWS

ROOT = pathlib.Path(__file__).resolve().parent.parent
TOOLS = ROOT / "build" / "bench" / "bench"
README = ROOT / "README.md"
PERFORMANCE = ROOT / "docs" / "performance.md"
PLOT = ROOT / "docs" / "performance.svg"
ROUNDS = 33
QUICK_ROUNDS = 3


def arguments():
    parser = argparse.ArgumentParser(
        prog="scripts/bench", description="What the product costs, beside a floor and its peers.",
        epilog="Times mean little on a busy machine; the ratios, which are taken round by round, mean more.")
    parser.add_argument("--only", metavar="PATTERN", default="", help="only the rows that match")
    parser.add_argument("--rounds", type=int, metavar="N", help=f"how often all is measured (default {ROUNDS})")
    parser.add_argument("--quick", action="store_true", help=f"{QUICK_ROUNDS} rounds, and less of what takes long")
    parser.add_argument("--build", type=pathlib.Path, metavar="DIR", default=ROOT / "build" / "bench",
                        help="measure the product in this build folder")
    parser.add_argument("--output", type=pathlib.Path, metavar="FILE", help="write the tables there too, in Markdown")
    parser.add_argument("--plot", type=pathlib.Path, metavar="FILE.svg",
                        help="measure and draw how cost grows with jobs, connections and message size")
    parser.add_argument("--counts", action="store_true", help="instead, count instructions with callgrind")
    parser.add_argument("--docs", action="store_true",
                        help="all of it, written into README.md, docs/performance.md and docs/performance.svg")
    return parser.parse_args()


def in_sandbox(script, chosen, **order):
    order |= {"product": str(chosen.build.resolve()), "tools": str(TOOLS), "quick": chosen.quick,
              "rounds": chosen.rounds or (QUICK_ROUNDS if chosen.quick else ROUNDS)}
    run = subprocess.run([ROOT / "scripts" / "sandbox", sys.executable, "-B", ROOT / "bench" / script],
                         input=json.dumps(order), stdout=subprocess.PIPE, text=True)
    if run.returncode != 0:
        sys.exit(f"scripts/bench: {script} ended with status {run.returncode}")
    return json.loads(run.stdout)


def timed(chosen):
    """The table of times."""
    pattern = re.compile(chosen.only, re.IGNORECASE)
    rows = [row for row in ROWS if pattern.search(row.what)]
    wanted = {name for row in rows for name in (row.ours, row.peer)}
    if not rows:
        sys.exit(f"scripts/bench: no row is like {chosen.only}")
    taken = in_sandbox("measure.py", chosen, names=[name for name in MEASUREMENTS if name in wanted])
    note = f"\nWith --quick, {QUICK_JOBS:,} jobs stand for {JOBS:,}.\n" if chosen.quick else ""
    return report.table(rows, taken) + note


def draw(chosen, path):
    from plot import draw_curves  # needs what the tables do not
    draw_curves(in_sandbox("curves.py", chosen), path)


def write_docs(chosen):
    draw(chosen, PLOT)
    report.put_between(PERFORMANCE, "times", timed(chosen))
    counts = in_sandbox("counts.py", chosen)
    for path in (README, PERFORMANCE):
        report.put_between(path, "counts", report.counts_table(counts))
    report.put_between(PERFORMANCE, "profile of an enqueue", report.profile_table(counts))


def main():
    chosen = arguments()
    if chosen.docs:
        write_docs(chosen)
        return
    if chosen.counts:
        counts = in_sandbox("counts.py", chosen)
        text = report.counts_table(counts) + "\nWhere an enqueue goes:\n\n" + report.profile_table(counts)
    elif chosen.plot and not chosen.only:
        text = ""
    else:
        text = timed(chosen)
    print(text, end="")
    if chosen.output:
        chosen.output.write_text(text)
    if chosen.plot:
        draw(chosen, chosen.plot)


if __name__ == "__main__":
    main()
