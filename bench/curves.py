"""How cost grows with jobs, connections and message size. In the sandbox; order and result as in measure.py."""

import json
import os
import sys

from measure import pin
from measurements import get_of_held
from world import World

WAITING = (1, 10, 100, 1000, 10000, 100000)
QUICK_WAITING = WAITING[:-1]
CONNECTIONS = (1, 2, 4, 8, 16, 32, 64, 128, 256, 512)
SIZES = (250, 500, 1000, 2000, 4000, 8000, 16000)
BATCH = 300
CONNECTED_BATCH = 2048
ROUNDS = 9


def own_put(count, **options):
    return lambda world: world.waiting(count).enqueue(BATCH, **options)


def own_get(count):
    return lambda world: world.waiting(count).time("get", BATCH, id=world.waiting(count).last_id)


def beanstalkd_put(count, **options):
    return lambda world: world.beanstalkd(count).put(BATCH, **options)


def by_jobs(counts):
    return counts, {
        "job_enqueue": [own_put(count) for count in counts],
        "job_get of the last": [own_get(count) for count in counts],
        "beanstalkd put": [beanstalkd_put(count) for count in counts],
    }


def by_connections():
    def each(server, op):
        return [lambda world, width=width: server(world).time(op, CONNECTED_BATCH, connections=width)
                for width in CONNECTIONS]

    return CONNECTIONS, {
        "job_get": [lambda world, width=width: get_of_held(world, CONNECTED_BATCH, connections=width)
                    for width in CONNECTIONS],
        "floor": each(lambda world: world.floor, "record"),
        "beanstalkd peek": each(lambda world: world.beanstalkd(1), "peek"),
    }


def by_size():
    def floor(size):
        return lambda world: world.floor.time("record", BATCH, size=size)

    return SIZES, {
        "job_enqueue": [own_put(0, size=size) for size in SIZES],
        "floor": [floor(size) for size in SIZES],
        "beanstalkd put": [beanstalkd_put(1, size=size) for size in SIZES],
    }


def medians(world, places, series):
    """The curves, point by point: the points of one place are taken in turn."""
    points = {name: [] for name in series}
    for place in range(len(places)):
        rounds = []
        for take in series.values():
            take[place](world)  # servers start and fill
        pin(world, {max(os.sched_getaffinity(0))})
        for _ in range(ROUNDS):
            rounds.append([take[place](world) for take in series.values()])
        pin(world, range(os.cpu_count()))
        for name, values in zip(series, zip(*rounds)):
            points[name].append(sorted(values)[ROUNDS // 2])
    return {"places": places, "points": points}


def main():
    order = json.load(sys.stdin)
    world = World(order)
    try:
        panels = {
            "jobs waiting": by_jobs(QUICK_WAITING if world.quick else WAITING),
            "connections": by_connections(),
            "bytes of a job": by_size(),
        }
        print(json.dumps({name: medians(world, *panel) for name, panel in panels.items()}))
    finally:
        world.stop()


if __name__ == "__main__":
    main()
