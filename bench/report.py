"""Makes tables of what was measured and counted."""

import pathlib
import re
import statistics

TABLE_HEAD = ("what", "ours", "peer", "ratio", "to reach", "ok")


def markdown(head, lines):
    widths = [max(len(line[column]) for line in [head, *lines]) for column in range(len(head))]
    rows = [head, tuple("-" * width for width in widths), *lines]
    return "\n".join("| " + " | ".join(cell.ljust(width) for cell, width in zip(row, widths)) + " |"
                     for row in rows) + "\n"


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


def table(rows, taken):
    return markdown(TABLE_HEAD, [cells(row, taken) for row in rows])


def counts_table(counts):
    lines = [(what, f"{cost:,.0f} instructions") for what, cost in counts["rows"]]
    lines.append(("the library, stripped", f"{counts['size']:,} bytes"))
    return markdown(("what", "costs"), lines)


def short_name(function):
    """A function without its parameters, as code; other names as they are."""
    if "(" not in function:
        return function
    name = re.sub(r"\[abi:\w+\]|MARU::Backup::|\(anonymous namespace\)::", "", function)
    return "`" + re.sub(r"\(.*\)( const)?('\d+)?", "()", name) + "`"


def profile_table(counts):
    """Where the instructions of an enqueue go: by step, then by library."""
    profile = counts["enqueue"]

    def lines(parts):
        return [(short_name(name), f"{cost:,.0f}", f"{cost / profile['total']:.0%}") for name, cost in parts]

    return (markdown(("step", "instructions", "share"), lines(profile["steps"])) + "\n" +
            markdown(("by itself", "instructions", "share"), lines(profile["objects"])))


def put_between(path, mark, text):
    """Replaces what stands between two lines of a file that are comments with that mark."""
    path = pathlib.Path(path)
    begin, end = f"<!-- {mark} -->\n", f"<!-- end of {mark} -->"
    before, found, rest = path.read_text().partition(begin)
    _, also_found, after = rest.partition(end)
    if not found or not also_found:
        raise ValueError(f"{path} has no place for {mark}")
    path.write_text(before + begin + text + end + after)
