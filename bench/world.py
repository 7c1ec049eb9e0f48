"""The servers that are measured, started when first asked for, in the sandbox."""

import functools
import json
import os
import pathlib
import resource
import shutil
import socket
import subprocess
import time

SOCKET = pathlib.Path("/var/run/marubackupd.socket")
LOCK = pathlib.Path("/var/run/marubackupd.lock")
BACKENDS = pathlib.Path("/usr/maru/share/marubackup")
PATIENCE = 60  # seconds, for a server to come up
FILL_PATIENCE = 60  # seconds, for jobs to be put in
TOOL_PATIENCE = 150  # seconds, for one number
LARGE_BACKEND = "bulk"
LARGE_COUNT = 33000  # jobs, whose list is a reply of 10 MB
GAPS = 20  # jobs that follow each other in one round

BACKEND_TEXT = """
[{action}]
unique = {{{{BACKEND}}}}: {{{{name}}}}
command_launch = {tools}/nothing
command_stamp = {tools}/stamp {fifo}
command_gate = {tools}/stamp {fifo} {{{{gate}}}}
"""


class Failed(Exception):
    """What was to be measured could not be."""


def listens(path):
    with socket.socket(socket.AF_UNIX) as client:
        try:
            client.connect(str(path))
        except OSError:
            return False
    return True


def await_socket(process, path):
    deadline = time.monotonic() + PATIENCE
    while not listens(path):
        if process.poll() is not None or time.monotonic() > deadline:
            raise Failed(f"{process.args[0]} does not come up")
        time.sleep(0.01)


def private_bytes(pid):
    """What a process has for itself alone."""
    total = 0
    for line in pathlib.Path(f"/proc/{pid}/smaps_rollup").read_text().splitlines():
        if line.startswith(("Private_Clean:", "Private_Dirty:")):
            total += int(line.split()[1]) * 1024
    return total


class Server:
    """A server at a socket, and requests to it."""

    def __init__(self, world, path, process):
        self.world, self.path, self.process = world, path, process
        self.serial = 1

    def ask(self, op, **options):
        return self.world.tool("request_times", "--socket", self.path, "--op", op, **options)

    def time(self, op, count, **options):
        return self.ask(op, count=count, **options)["ns"]

    def new(self, op, count, **options):
        """Asks for `count` jobs of new names."""
        answer = self.ask(op, count=count, serial=self.serial, **options)
        self.serial += count
        return answer


class Daemon(Server):
    """
    marubackupd. Its socket is fixed, so that a daemon which is to live beside
    others, and therefore has a name, has it renamed.
    """

    def __init__(self, world, name="", under=()):
        for path in (LOCK, SOCKET):
            path.unlink(missing_ok=True)
        process = world.start(*under, world.program("marubackupd"))
        await_socket(process, SOCKET)
        super().__init__(world, SOCKET, process)
        self.gate = world.fifo(f"{name}.gate")
        self.fresh_bytes = self.filled = self.last_id = self.last_name = self.held_id = self.held_name = 0
        if name:
            self.path = world.folder / f"{name}.socket"
            SOCKET.rename(self.path)

    def hold(self):
        """Occupies the backup queue's one place, as soon as it is free, by a job that waits at the gate."""
        self.held_name = self.serial
        self.held_id = self.new("enqueue", 1, branch="gate", gate=self.gate)["first"]

    def queue_gaps(self):
        """Jobs that follow each other once the gate is opened, and one to hold again."""
        self.new("enqueue", GAPS, branch="stamp")
        self.hold()

    def fill(self, count):
        """Puts in jobs that wait; the last id is that of the last of them."""
        self.fresh_bytes = private_bytes(self.process.pid)
        large = min(count // 3, LARGE_COUNT)
        for backend, number in ((LARGE_BACKEND, large), ("bench", count - large)):
            if number == 0:
                continue
            before = self.serial
            answer = self.new("enqueue", number, backend=backend, fill=FILL_PATIENCE)
            put = answer["last"] - answer["first"] + 1
            self.filled += min(put, number)
            self.last_id, self.serial = answer["last"], before + number
            self.last_name = before + put - 1
            if put < number:
                raise Failed(f"only {self.filled} of {count} jobs were in after {FILL_PATIENCE} seconds")

    def bytes_a_job(self):
        return (private_bytes(self.process.pid) - self.fresh_bytes) / self.filled

    def enqueue(self, count, **options):
        """The time of an enqueue; what was put in is taken out again."""
        answer = self.new("enqueue", count, **options)
        self.ask("remove", id=answer["first"], count=count)
        return answer["ns"]

    def gap(self):
        """From the end of one job to the start of the next."""
        return self.world.tool("launch_times", "--fifo", self.world.stamps, "--gate", self.gate, "--count", GAPS,
                               "gaps")["ns"]

    def unique(self, serial):
        return f"bench: {serial:010d}"


class Beanstalkd(Server):
    def __init__(self, world, name, waiting=0):
        path = world.folder / f"{name}.socket"
        process = world.start("beanstalkd", "-l", f"unix:{path}")
        await_socket(process, path)
        super().__init__(world, path, process)
        fresh = private_bytes(process.pid)
        self.first_id = self.new("put", max(waiting, 1), fill=FILL_PATIENCE)["first"]
        self.bytes_a_job = (private_bytes(process.pid) - fresh) / max(waiting, 1)

    def put(self, count, **options):
        answer = self.new("put", count, **options)
        self.ask("delete", id=answer["first"], count=count)
        return answer["ns"]


class World:
    """Everything that the measurements use; `waiting` daemons are kept by how many jobs wait in them."""

    def __init__(self, order):
        self.product, self.tools = pathlib.Path(order["product"]), pathlib.Path(order["tools"])
        self.rounds, self.quick = order["rounds"], order["quick"]
        self.folder = pathlib.Path(os.environ["TMPDIR"]) / "bench"
        self.folder.mkdir()
        self.stamps = self.fifo("stamps")
        self.processes = []
        self.daemons = {}
        os.environ["LD_LIBRARY_PATH"] = str(self.product / "library")
        os.environ["TS_SOCKET"] = str(self.folder / "tsp.socket")
        os.environ["TS_MAXFINISHED"] = "10"
        os.environ["NQDIR"] = str(self.folder / "nq")
        self.write_backends()
        # What a shell gives its commands; some close all that they could have.
        _, most = resource.getrlimit(resource.RLIMIT_NOFILE)
        resource.setrlimit(resource.RLIMIT_NOFILE, (min(1024, most), most))

    def write_backends(self):
        text = "".join(BACKEND_TEXT.format(action=action, tools=self.tools, fifo=self.stamps)
                       for action in ("backup", "copy_to"))
        for name in ("bench", LARGE_BACKEND):
            (BACKENDS / f"{name}.conf").write_text(text)

    def fifo(self, name):
        path = self.folder / name
        if not path.exists():
            os.mkfifo(path)
        return path

    def program(self, name):
        return self.product / "programs" / name / name

    def start(self, *command):
        process = subprocess.Popen([str(word) for word in command], stdin=subprocess.DEVNULL,
                                   stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
        self.processes.append(process)
        return process

    def tool(self, name, *arguments, **options):
        """Runs one of the measuring programs; what it found."""
        command = [str(self.tools / name)] + [str(word) for word in arguments]
        for key, value in options.items():
            command += [f"--{key}", str(value)]
        try:
            run = subprocess.run(command, capture_output=True, text=True, timeout=TOOL_PATIENCE)
        except subprocess.TimeoutExpired as expired:
            raise Failed(f"{name} takes longer than {TOOL_PATIENCE} seconds") from expired
        if run.returncode != 0:
            raise Failed(run.stderr.strip() or f"{name}: status {run.returncode}")
        return json.loads(run.stdout)

    def waiting(self, count):
        """The daemon in which a job runs and so many wait."""
        if count not in self.daemons:
            daemon = Daemon(self, f"waiting{count}")
            self.daemons[count] = daemon
            daemon.hold()
            if count >= 100000:
                # One more, for the round before the first one that counts.
                for _ in range(self.rounds + 1):
                    daemon.queue_gaps()
            if count > 0:
                daemon.fill(count)
        daemon = self.daemons[count]
        if count > 0 and daemon.filled < count:
            raise Failed(f"{count} jobs could not be put in")
        return daemon

    @functools.cached_property
    def _idle(self):
        return Daemon(self, "idle")

    @property
    def idle(self):
        """The daemon without a job, which is then found at the fixed socket."""
        daemon = self._idle
        SOCKET.unlink(missing_ok=True)
        SOCKET.symlink_to(daemon.path)
        return daemon

    @functools.cached_property
    def floor(self):
        path = self.folder / "floor.socket"
        process = self.start(self.tools / "floor_server", path)
        await_socket(process, path)
        return Server(self, path, process)

    @functools.lru_cache(maxsize=None)
    def beanstalkd(self, waiting):
        return Beanstalkd(self, f"beanstalkd{waiting}", waiting)

    def clean_folder(self, name):
        path = self.folder / name
        shutil.rmtree(path, ignore_errors=True)
        path.mkdir()
        return path

    def stop(self):
        for process in self.processes:
            process.kill()
            process.wait()
