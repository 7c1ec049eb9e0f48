"""
Takes the measurements, in the sandbox. Standard output is one JSON object, what
is under way goes to standard error.
"""

import json
import os
import signal
import sys

from measurements import DEAR_ROUNDS, MEASUREMENTS
from world import Failed, World

ALL_CORES = os.sched_getaffinity(0)
ONE_CORE = {max(ALL_CORES)}


def pin(world, cores):
    for pid in [0] + [process.pid for process in world.processes]:
        os.sched_setaffinity(pid, cores)


def take(world, name, results, failures):
    measurement = MEASUREMENTS[name]
    print(".", end="", file=sys.stderr, flush=True)
    try:
        # The first time is not like the others: servers start and fill, caches are cold.
        if measurement.rounds > DEAR_ROUNDS and not results[name]:
            measurement.take(world)
        pin(world, ONE_CORE if measurement.one_core else ALL_CORES)
        results[name].append(measurement.take(world))
    except Failed as failure:
        failures[name] = str(failure)
    finally:
        pin(world, ALL_CORES)


def rounds_of(measurement, world):
    return 1 if world.quick and measurement.rounds <= DEAR_ROUNDS else measurement.rounds


def measure(world, names):
    results = {name: [] for name in names}
    failures = {}
    for number in range(world.rounds):
        print(f"\nround {number + 1} of {world.rounds}: ", end="", file=sys.stderr)
        for name in names:
            if name not in failures and number < rounds_of(MEASUREMENTS[name], world):
                take(world, name, results, failures)
    print(file=sys.stderr)
    return {"results": results, "failures": failures}


def main():
    # A server that was started is ended, whatever happens here.
    signal.signal(signal.SIGTERM, lambda *_: sys.exit(1))
    order = json.load(sys.stdin)
    world = World(order)
    try:
        print(json.dumps(measure(world, order["names"])))
    finally:
        world.stop()


if __name__ == "__main__":
    main()
