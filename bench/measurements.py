"""What is measured, and what the table says of it."""

import dataclasses
import pathlib
import subprocess
import time
import typing

from world import LARGE_BACKEND, World

BATCH = 300  # requests in one round
JOBS = 5000
QUICK_JOBS = 1000
SLOTS = 5
AT_REST = 10  # seconds
QUICK_AT_REST = 4
LAUNCHES = 15  # in one round
DEAR_ROUNDS = 5  # of what takes seconds


@dataclasses.dataclass(frozen=True)
class Measurement:
    """A number that is taken once in every round, or in the first few where one takes long."""

    take: typing.Callable[[World], float]
    rounds: int = 1000
    one_core: bool = False  # the client's and the server's work is added up, without the wait for another core


def requests(take):
    return Measurement(take, one_core=True)


def launch(world, *arguments, **options):
    words = []
    for key, value in options.items():
        words += [f"--{key}", value]
    return world.tool("launch_times", "--fifo", world.stamps, "--count", LAUNCHES, *words, *arguments)["ns"]


def spawned(world):
    return launch(world, "spawn", "--", world.tools / "stamp", world.stamps)


def under_task_spooler(world):
    return launch(world, "command", "--", "tsp", "-n", world.tools / "stamp", world.stamps, settle="tsp -w")


def under_nq(world):
    world.clean_folder("nq")
    return launch(world, "command", "--", "nq", "-q", world.tools / "stamp", world.stamps, settle="nq -w")


def add_job(world):
    daemon = world.idle
    daemon.serial += LAUNCHES
    return launch(world, "add", serial=daemon.serial)


def add_by_command(world):
    daemon = world.idle
    daemon.serial += LAUNCHES
    return launch(world, "command", "--", world.program("marubackupctl"), "add", "bench", "backup", "--branch", "stamp",
                  "-p", "name=@", settle="queue", serial=daemon.serial)


def rate(world, way, *options):
    nanoseconds = world.tool("job_rates", "--fifo", world.stamps, "--job", world.tools / "nothing", "--stamp",
                             world.tools / "stamp", "--count", QUICK_JOBS if world.quick else JOBS, *options, way)["ns"]
    return 1e9 / nanoseconds


def own_rate(world):
    assert world.idle
    return rate(world, "queue")


def task_spooler_rate(world):
    subprocess.run(["tsp", "-S", str(SLOTS)], check=True, stdout=subprocess.DEVNULL)
    result = rate(world, "tsp")
    subprocess.run(["tsp", "-K"], check=True)
    return result


def nq_rate(world):
    options = []
    for slot in range(SLOTS):
        options += ["--folder", world.clean_folder(f"nq{slot}")]
    return rate(world, "nq", *options)


def processor_nanoseconds(pid):
    return int(pathlib.Path(f"/proc/{pid}/schedstat").read_text().split()[0])


def at_rest(world):
    """Per cent of a core, over a whole number of the daemon's passes."""
    pid = world.waiting(10000).process.pid
    before, start = processor_nanoseconds(pid), time.monotonic()
    time.sleep(QUICK_AT_REST if world.quick else AT_REST)
    return (processor_nanoseconds(pid) - before) / (time.monotonic() - start) / 1e7


def gap_with_none(world):
    daemon = world.waiting(0)
    daemon.queue_gaps()
    return daemon.gap()


def last_of(daemon):
    return daemon.unique(daemon.last_name)


def get_of_last(world, count=BATCH, **options):
    daemon = world.waiting(100000)
    return daemon.time("get", count, id=daemon.last_id, **options)


def floor_record(connections):
    return lambda world: world.floor.time("record", BATCH * 4, connections=connections)


def get_of_held(world, count=BATCH, **options):
    daemon = world.waiting(0)
    return daemon.time("get", count, id=daemon.held_id, **options)


def own_get(connections):
    return lambda world: get_of_held(world, BATCH * 4, connections=connections)


def unique_of_held(world):
    daemon = world.waiting(0)
    return daemon.time("list", BATCH, unique=daemon.unique(daemon.held_name))


def list_of_thousand(op):
    return lambda world: world.waiting(1000).time(op, 30)


# In the order in which a round takes them: what is compared stands side by side.
MEASUREMENTS = {
    "get 1": requests(own_get(1)),
    "floor 1": requests(floor_record(1)),
    "peek": requests(lambda world: world.beanstalkd(0).time("peek", BATCH * 4, id=world.beanstalkd(0).first_id)),
    "get 8": requests(own_get(8)),
    "floor 8": requests(floor_record(8)),
    "get 64": requests(own_get(64)),
    "floor 64": requests(floor_record(64)),
    "enqueue 0": requests(lambda world: world.waiting(0).enqueue(BATCH)),
    "floor enqueue": requests(floor_record(1)),
    "enqueue 10000": requests(lambda world: world.waiting(10000).enqueue(BATCH)),
    "enqueue 100000": requests(lambda world: world.waiting(100000).enqueue(BATCH)),
    "put 0": requests(lambda world: world.beanstalkd(0).put(BATCH)),
    "put 10000": requests(lambda world: world.beanstalkd(10000).put(BATCH)),
    "put 100000": requests(lambda world: world.beanstalkd(100000).put(BATCH)),
    "get of one": requests(get_of_held),
    "get last": requests(get_of_last),
    "unique of one": requests(unique_of_held),
    "unique of last": requests(
        lambda world: world.waiting(100000).time("list", BATCH, unique=last_of(world.waiting(100000)))),
    "list 1000": requests(list_of_thousand("list")),
    "rewrite 1000": requests(list_of_thousand("rewrite")),
    "get alone": requests(lambda world: get_of_last(world, BATCH * 4)),
    "get beside": requests(lambda world: get_of_last(world, BATCH * 4, beside=LARGE_BACKEND)),
    "gap 0": Measurement(gap_with_none),
    "gap 100000": Measurement(lambda world: world.waiting(100000).gap()),
    "spawn": Measurement(spawned),
    "add": Measurement(add_job),
    "tsp": Measurement(under_task_spooler),
    "nq": Measurement(under_nq),
    "add by command": Measurement(add_by_command),
    "bytes": Measurement(lambda world: world.waiting(100000).bytes_a_job(), rounds=1),
    "beanstalkd bytes": Measurement(lambda world: world.beanstalkd(100000).bytes_a_job, rounds=1),
    "jobs": Measurement(own_rate, rounds=DEAR_ROUNDS),
    "tsp jobs": Measurement(task_spooler_rate, rounds=DEAR_ROUNDS),
    "nq jobs": Measurement(nq_rate, rounds=1),
    "loop jobs": Measurement(lambda world: rate(world, "loop"), rounds=DEAR_ROUNDS),
    "at rest": Measurement(at_rest, rounds=1),
}


@dataclasses.dataclass(frozen=True)
class Row:
    """
    One line of the table: what is ours, what it is held against, and the limit
    of their ratio; of the figure itself where there is no peer. No limit: for
    comparison only.
    """

    what: str
    unit: str
    ours: str
    peer: str = ""
    peer_name: str = ""
    most: float = 0
    least: float = 0


ROWS = [
    Row("job_get, 1 connection", "us", "get 1", "floor 1", "floor", most=0.9),
    Row("job_get, 1 connection, beside beanstalkd", "us", "get 1", "peek", "peek"),
    Row("job_get, 8 connections", "us", "get 8", "floor 8", "floor", most=0.9),
    Row("job_get, 64 connections", "us", "get 64", "floor 64", "floor", most=0.9),
    Row("job_enqueue, none waiting", "us", "enqueue 0", "floor enqueue", "floor", most=1.5),
    Row("job_enqueue, none waiting, beside beanstalkd", "us", "enqueue 0", "put 0", "put"),
    Row("job_enqueue, 10,000 waiting", "us", "enqueue 10000", "enqueue 0", "none waiting", most=1.05),
    Row("job_enqueue, 100,000 waiting", "us", "enqueue 100000", "enqueue 0", "none waiting", most=1.15),
    Row("(beanstalkd put, 10,000 waiting)", "us", "put 10000", "put 0", "none waiting"),
    Row("(beanstalkd put, 100,000 waiting)", "us", "put 100000", "put 0", "none waiting"),
    Row("job_get of the last of 100,000", "us", "get last", "get of one", "one job", most=1.15),
    Row("job_list by unique of the last of 100,000", "us", "unique of last", "unique of one", "one job", most=1.15),
    Row("a job's end to the next launch, 100,000 waiting", "us", "gap 100000", "gap 0", "none waiting", most=1.5),
    Row("job_list of 1,000", "us", "list 1000", "rewrite 1000", "jsoncpp writes it", most=1.2),
    Row("memory of a waiting job, at 100,000", "B", "bytes", most=1280),
    Row("memory of a waiting job, beside beanstalkd", "B", "bytes", "beanstalkd bytes", "beanstalkd"),
    Row("addJob to first instruction", "us", "add", "spawn", "posix_spawn", most=1.5),
    Row("(task-spooler to first instruction)", "us", "tsp", "spawn", "posix_spawn"),
    Row("(nq to first instruction)", "us", "nq", "spawn", "posix_spawn"),
    Row("marubackupctl add to first instruction", "us", "add by command", "tsp", "task-spooler", most=1),
    Row("5,000 jobs, 5 at a time", "jobs/s", "jobs", "tsp jobs", "task-spooler", least=1),
    Row("5,000 jobs, 5 at a time", "jobs/s", "jobs", "nq jobs", "nq", least=1),
    Row("5,000 jobs, 5 at a time", "jobs/s", "jobs", "loop jobs", "bare loop", least=0.7),
    Row("processor time at rest, 10,000 waiting", "%", "at rest", most=0.1),
    Row("job_get beside a slow reader of 10 MB", "us", "get beside", "get alone", "without", most=1.05),
]
