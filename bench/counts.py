"""
Counts instructions, which hardly differ from run to run: the daemon runs under
valgrind's callgrind, does something so many times, and twice as often; the
difference is what it costs. In the sandbox; order and result as in measure.py.
"""

import json
import pathlib
import re
import statistics
import subprocess
import sys
import time

from callgrind import Profile, difference
from world import Daemon, World

TIMES = 300
TICKS = 4
TICK_SECONDS = 2
LISTED = 10
SCAN = "queue_scan_next_to_launch"
DISPATCH = "dispatchRequest"
OUTSIDE = "event loop and frames"
SPLIT_ABOVE = 0.4  # of the whole: a step that costs more is shown as the steps that it is made of
SHOWN_ABOVE = 0.01


class CountedDaemon:
    """The daemon under callgrind, with the backup queue's place taken."""

    def __init__(self, world, *options):
        self.result = world.clean_folder("callgrind") / "out"
        self.daemon = Daemon(world, under=["valgrind", "--tool=callgrind", f"--callgrind-out-file={self.result}",
                                           *options])
        self.daemon.hold()

    def parts(self):
        """What was counted from one wait for events to the next, in order."""
        files = self.result.parent.glob("out.*")
        return [total(path) for path in sorted(files, key=lambda path: int(path.suffix[1:]))]

    def end(self):
        self.daemon.process.terminate()
        self.daemon.process.wait()
        return Profile(self.result.read_text())


def total(path):
    return int(re.search(r"^(?:summary|totals): (\d+)", path.read_text(), re.MULTILINE).group(1))


def counted(world, act):
    """The profile of TIMES actions, of which `act` does a number."""
    profiles = []
    for times in (TIMES, 2 * TIMES):
        run = CountedDaemon(world)
        act(run.daemon, times)
        profiles.append(run.end())
    return difference(profiles[1], profiles[0])


def enqueue(daemon, times):
    daemon.new("enqueue", times)


def get(daemon, times):
    daemon.time("get", times)


def list_ten(daemon, times):
    daemon.new("enqueue", LISTED - 1)
    daemon.time("list", times)


def start_and_tick(world):
    """The instructions until the daemon listens, and those of a pass with one running job."""
    run = CountedDaemon(world, "--dump-before=epoll_wait")
    time.sleep(TICK_SECONDS)
    before = len(run.parts())
    time.sleep(TICKS * TICK_SECONDS)
    parts = run.parts()
    run.end()
    return parts[0], statistics.median(parts[before:])


def stripped_size(world):
    copy = world.folder / "stripped.so"
    library = world.product / "library" / "libmarubackup-si.so.6"
    subprocess.run(["strip", "-s", "-o", str(copy), str(library)], check=True)
    return copy.stat().st_size


def steps(profile, function, path=()):
    """What the calls below a function cost; the large ones as what they are made of."""
    found = []
    for callee, cost in profile.calls[function].items():
        if cost > SPLIT_ABOVE * profile.total and callee not in path:
            below = steps(profile, callee, (*path, callee))
            found += below
            found.append((callee + " itself", cost - sum(part for _, part in below)))
        else:
            found.append((callee, cost))
    return found


def where_it_goes(profile):
    dispatch = next(name for name in profile.calls if DISPATCH in name)
    below = [*steps(profile, dispatch), (OUTSIDE, profile.total - profile.inclusive(DISPATCH))]
    below = [(name, cost) for name, cost in below if cost > SHOWN_ABOVE * profile.total]
    return {
        "total": profile.total / TIMES,
        "steps": sorted(([name, cost / TIMES] for name, cost in below), key=lambda step: -step[1]),
        "objects": [[pathlib.Path(name).name, cost / TIMES] for name, cost in profile.by_object.most_common()
                    if cost > SHOWN_ABOVE * profile.total],
    }


def count(world):
    start, tick = start_and_tick(world)
    enqueues = counted(world, enqueue)
    return {
        "rows": [
            ["job_enqueue", enqueues.total / TIMES],
            ["job_get", counted(world, get).total / TIMES],
            [f"job_list of {LISTED}", counted(world, list_ten).total / TIMES],
            ["a scan that starts nothing", enqueues.inclusive(SCAN) / TIMES],
            ["a tick, with one job running", tick],
            ["start-up, until the daemon listens", start],
        ],
        "size": stripped_size(world),
        "enqueue": where_it_goes(enqueues),
    }


def main():
    order = json.load(sys.stdin)
    world = World(order)
    try:
        print(json.dumps(count(world)))
    finally:
        world.stop()


if __name__ == "__main__":
    main()
