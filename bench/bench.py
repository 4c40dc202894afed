"""Measures the daemon beside a bare GDBus service and prints one table of ratios."""

import argparse
import json
import os
import shutil
import signal
import statistics
import subprocess
import sys
import tempfile
import time
from pathlib import Path
from typing import Callable, Iterable, NamedTuple, Optional

sys.path.insert(0, str(Path(__file__).resolve().parent.parent / "tests/service"))

from harness import Device, SystemBus, become_root, hwdesc, port, wait_for  # noqa: E402
from harness.device import CONTROL, CONTROL_PATH, POLICY  # noqa: E402

BARE = [f"bench.Bare{n}" for n in range(4)]
BARE_CALL = (BARE[0], "/bench/Bare", "bench.Bare")
CONTROL_CALL = (CONTROL, CONTROL_PATH, CONTROL)
# The last name that the daemon asks for at its start.
LAST_NAME = "com.kelv.Configuration.Legacy.IOControl1.IOPort"
SOCKET = "/run/dbus/system_bus_socket"
SYNC_MS = 20
POLL_MS = 10
STEP_MS = 2
INSTRUCTED_CALLS = 1000


class Row(NamedTuple):
    """One line of the table: a ratio or a figure, and what it should be."""

    what: str
    against: str
    value: float
    aim: Optional[float]
    at_least: bool = False
    unit: str = ""
    detail: str = ""

    @property
    def kept(self) -> bool:
        if self.aim is None:
            return True
        return self.value >= self.aim if self.at_least else self.value <= self.aim


class BenchDevice(Device):
    """A device whose programs may run with a preloaded library, and which may run the bare service."""

    def __init__(self, folder: Path, build: Path):
        super().__init__(folder, build / "src/portd")
        self.build = build
        names = "".join(f'<allow own="{name}"/>' for name in BARE)
        policy = folder / "bench.conf"
        policy.write_text(
            f'<busconfig><policy user="root">{names}</policy><policy context="default">'
            f'<allow send_destination="{BARE[0]}"/></policy></busconfig>'
        )
        self.bus = SystemBus(self.sandbox, [POLICY, policy])

    def preload(self, library: str, **variables: str) -> None:
        self.environment = {"LD_PRELOAD": str(self.build / "bench" / library), **variables}

    def start_bare(self, *options: str, launcher: Iterable[str] = ()) -> subprocess.Popen:
        self.bus.start()
        program = str(self.build / "bench/bare-service")
        process = self.sandbox.spawn(
            [*launcher, program, *options, *BARE], self._environment(),
            subprocess.DEVNULL, subprocess.DEVNULL,
        )  # fmt: skip
        for name in BARE:
            self.bus.wait_name(name)
        return process

    def client(self, call: tuple[str, str, str], method: str, arguments: str, count: int,
               in_flight: int | str = 1, pause_us: int = 0) -> subprocess.Popen:  # fmt: skip
        socket = f"/proc/{self.sandbox.pid}/root{SOCKET}"
        words = [socket, *call, method, arguments, str(count), str(in_flight), str(pause_us)]
        return subprocess.Popen([str(self.build / "bench/bus-client"), *words],
                                stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True)  # fmt: skip

    def measure(self, *args, **options) -> dict[str, float]:
        return finish(self.client(*args, **options))


def finish(client: subprocess.Popen) -> dict[str, float]:
    output, _ = client.communicate()
    if client.returncode != 0:
        raise RuntimeError(f"the client ended with status {client.returncode}")
    return json.loads(output)


def outputs(count: int, events: bool = False) -> str:
    extra = '<event declaration="IOPort"/>' if events else ""
    return hwdesc(*(port(f"out{n}", n, "output", "null", extra=extra) for n in range(count)))


def checked_outputs(count: int) -> str:
    return hwdesc(*(port(f"out{n}", n, "output", "check") for n in range(count)))


def ratio_of(pairs: Iterable[tuple[float, float]]) -> float:
    """The median of the rounds' ratios: what disturbs one round disturbs both of its halves."""
    return statistics.median(mine / other for mine, other in pairs)


class Bench:
    """The rows, each a method that yields what it measured."""

    def __init__(self, build: Path, rounds: int, calls: int):
        self._build = build
        self._rounds = rounds
        self._calls = calls
        self._folder = Path(tempfile.mkdtemp(prefix="portd-bench-"))
        self._devices = 0

    def close(self) -> None:
        shutil.rmtree(self._folder, ignore_errors=True)

    def device(self, conf: str) -> BenchDevice:
        self._devices += 1
        folder = self._folder / str(self._devices)
        folder.mkdir()
        device = BenchDevice(folder, self._build)
        device.conf(conf)
        return device

    def slow(self, conf: str, sync_ms: int) -> tuple[BenchDevice, Path]:
        """A device on which an fsync takes its time, and where its syncs and renames are noted."""
        device = self.device(conf)
        counts = device.write("/run/counts", "")
        counts.chmod(0o666)
        device.preload("slow-sync.so", BENCH_SYNC_MS=str(sync_ms), BENCH_COUNTS="/run/counts")
        return device, counts

    # Calls

    def calls(self) -> Iterable[Row]:
        device = self.device(checked_outputs(10))
        device.start()
        bare = device.start_bare()
        get, get_64, set_, flips = [], [], [], []
        for _ in range(self._rounds):
            empty = device.measure(BARE_CALL, "Empty", "(uint32 1,)", self._calls)
            one = device.measure(CONTROL_CALL, "GetState", "(uint32 1,)", self._calls)
            get.append((one["median_us"], empty["median_us"]))
            put = device.measure(CONTROL_CALL, "SetState", "(uint32 1, true)", self._calls)
            set_.append((put["median_us"], empty["median_us"]))
            many = device.measure(BARE_CALL, "Empty", "(uint32 1,)", self._calls, 64)
            mine = device.measure(CONTROL_CALL, "GetState", "(uint32 1,)", self._calls, 64)
            get_64.append((many["seconds"], mine["seconds"]))
            flips.append(one["median_us"])
        bare.terminate()
        device.close()
        yield Row("GetState, one client", "an empty method", ratio_of(get), 1.05,
                  detail=f"{statistics.median(flips):.0f} us")  # fmt: skip
        yield Row("GetState, 64 in flight", "its throughput", ratio_of(get_64), 0.95, at_least=True)
        yield Row("SetState until the reply", "an empty method", ratio_of(set_), 1.4)

    def flood(self) -> Iterable[Row]:
        """What a client that reads waits while another one sends states and wants no answers."""
        device = self.device(checked_outputs(10))
        device.start()
        bare = device.start_bare("--discard")
        pairs = []
        for _ in range(self._rounds):
            thrown_away = self.longest_wait(device, (BARE_CALL, "Swallow"), (BARE_CALL, "Empty"))
            served = self.longest_wait(device, (CONTROL_CALL, "SetState"), (CONTROL_CALL, "GetState"))
            pairs.append((served, thrown_away))
        bare.terminate()
        device.close()
        yield Row("longest GetState beside 100,000 SetState", "a service that discards", ratio_of(pairs),
                  1.5, detail=f"{statistics.median(mine for mine, _ in pairs):.0f} ms")  # fmt: skip

    def longest_wait(self, device: BenchDevice, flooded: tuple, asked: tuple) -> float:
        """Milliseconds that the longest call of `asked` takes while `flooded` is called."""
        reader = device.client(*asked, "(uint32 1,)", 1_000_000, 1, 1000)
        time.sleep(0.2)  # until it asks
        finish(device.client(*flooded, "(uint32 2, true)", 100_000, "none"))
        device.measure(*asked, "(uint32 1,)", 1)
        time.sleep(0.2)
        assert reader.stdin is not None
        reader.stdin.close()
        reader.stdin = None
        return finish(reader)["max_us"] / 1000

    def many_ports(self) -> Iterable[Row]:
        few, many = self.device(outputs(10)), self.device(outputs(1000))
        few.start()
        many.start()
        pairs = []
        for _ in range(self._rounds):
            last_of_many = many.measure(CONTROL_CALL, "GetState", "(uint32 999,)", self._calls)
            last_of_few = few.measure(CONTROL_CALL, "GetState", "(uint32 9,)", self._calls)
            pairs.append((last_of_many["median_us"], last_of_few["median_us"]))
        few.close()
        many.close()
        yield Row("GetState, last of 1,000 ports", "of 10", ratio_of(pairs), 1.10)

    def instructions(self) -> Iterable[Row]:
        """What a call costs in instructions, which no other program disturbs."""
        if not shutil.which("valgrind"):
            return
        mine = self._instructions_of(CONTROL_CALL, "GetState", lambda device, launcher:
                                     device.start(launcher=launcher))  # fmt: skip
        empty = self._instructions_of(BARE_CALL, "Empty", lambda device, launcher:
                                      device.start_bare(launcher=launcher))  # fmt: skip
        yield Row("instructions of a GetState", "an empty method", mine / empty, None,
                  detail=f"{mine:.0f}")  # fmt: skip

    def _instructions_of(self, call: tuple[str, str, str], method: str, start: Callable) -> float:
        totals = []
        for count in (INSTRUCTED_CALLS, 2 * INSTRUCTED_CALLS):
            device = self.device(checked_outputs(10))
            counted = device.write("/run/callgrind", "")
            counted.chmod(0o666)  # the daemon gives its rights up
            tool = ("valgrind", "--tool=callgrind", "--callgrind-out-file=/run/callgrind")
            process = start(device, tool)
            device.measure(call, method, "(uint32 1,)", count)
            if process is device:
                device.stop()
            else:
                process.terminate()
                process.wait()
            totals.append(int(counted.read_text().rsplit("totals: ", 1)[1].split()[0]))
            device.close()
        return (totals[1] - totals[0]) / INSTRUCTED_CALLS

    # Storage

    def set_states(self) -> Iterable[Row]:
        device, counts = self.slow(checked_outputs(10), 0)
        device.start()
        counts.write_text("")
        for n in range(2):
            device.measure(CONTROL_CALL, "SetState", f"(uint32 {n}, true)", 250)
            device.measure(CONTROL_CALL, "SetState", f"(uint32 {n}, false)", 250)
        device.stop()
        replaced = counts.read_text().count("r")
        device.close()
        yield Row("files replaced by 1,000 SetState", "", replaced, 0)

    def saves(self) -> Iterable[Row]:
        """A name until it is on storage, beside what has to be done for that at least."""
        device, counts = self.slow(checked_outputs(10), 0)
        device.start()
        device.call("SetName", "ubs", 0, False, "the first name")
        pairs = []
        for n in range(self._rounds * 10):
            wait_for(lambda: quiet_for(device.pid, 0.05), "the daemon to come to rest")
            counts.write_text("")
            begun = time.perf_counter()
            device.call("SetName", "ubs", 0, False, f"name {n}")
            while counts.stat().st_size < len("srs"):
                pass
            mine = time.perf_counter() - begun
            pairs.append((mine, replace_file(device.folder / "least", device.read_settings())))
        device.close()
        detail = f"{statistics.median(mine for mine, _ in pairs) * 1000:.2f} ms"
        yield Row("SetName until saved, 10 ports", "write+fsync+rename+fsync", ratio_of(pairs), 1.5,
                  detail=detail)  # fmt: skip

    def polls(self) -> Iterable[Row]:
        """How much later than its interval a polled input is seen while settings are stored."""
        polled = port("flag", 16, backend="sysfs",
                      device={"path": "/run/flag", "timeout": str(POLL_MS)})  # fmt: skip
        named = [port(f"out{n}", n, "output", "check") for n in range(16)]
        device, _counts = self.slow(hwdesc(*named, polled), SYNC_MS)
        device.write("/run/flag", "0")
        device.start()
        quiet = self._longest_poll(device, lambda turn: None)
        worst = self._longest_poll(device, lambda turn: [
            device.begin_call("SetName", "ubs", n, False, f"name {turn}") for n in range(16)
        ])  # fmt: skip
        device.close()
        yield Row("lateness of a polled input beside the same", "", worst - POLL_MS, 5, unit="ms",
                  detail=f"quiet {quiet - POLL_MS:.2f} ms")  # fmt: skip

    def _longest_poll(self, device: BenchDevice, disturb: Callable[[int], object]) -> float:
        longest = 0.0
        with device.signals() as changes:
            for turn in range(self._rounds * 10):
                disturb(turn)
                time.sleep(turn % 10 / 1000)  # anywhere in the interval
                begun = time.perf_counter()
                device.write("/run/flag", str(1 - turn % 2))
                changes.wait(lambda change: change.port == 16)
                longest = max(longest, (time.perf_counter() - begun) * 1000)
                changes.received.clear()
        return longest

    def storm_of_names(self) -> Iterable[Row]:
        """What a client that reads sees while another one renames ports on slow storage."""
        worst, quiet = [], []
        for _ in range(self._rounds):
            device, _counts = self.slow(checked_outputs(17), SYNC_MS)
            device.start()
            still = device.measure(CONTROL_CALL, "GetState", "(uint32 16,)", 200, 1, 1000)
            quiet.append(still["max_us"] / 1000)
            reader = device.client(CONTROL_CALL, "GetState", "(uint32 16,)", 1_000_000, 1, 1000)
            for turn in range(3):
                pending = [device.begin_call("SetName", "ubs", n, False, f"name {turn}")
                           for n in range(16)]  # fmt: skip
                wait_for(lambda calls=pending: all(call.done for call in calls), "the names")
            time.sleep(0.2)  # until the reader has seen what came after the replies
            assert reader.stdin is not None
            reader.stdin.close()
            reader.stdin = None
            worst.append(finish(reader)["max_us"] / 1000)
            device.close()
        yield Row("longest GetState beside 16 SetName, 20 ms a sync", "", statistics.median(worst),
                  5, unit="ms", detail=f"quiet {statistics.median(quiet):.2f} ms")  # fmt: skip

    def names_at_once(self) -> Iterable[Row]:
        device, counts = self.slow(checked_outputs(200), SYNC_MS)
        device.start()
        counts.write_text("")
        pending = [device.begin_call("SetName", "ubs", n, False, "a new name") for n in range(200)]
        wait_for(lambda: all(call.done for call in pending), "the names", 60)
        device.stop()
        syncs = counts.read_text().count("s")
        stored = device.read_settings().count("output_name=a new name")
        device.close()
        assert stored == 200, f"only {stored} of 200 names are stored"
        yield Row("200 SetName at once: syncs", "400", syncs, 20)

    # Start

    def until(self, device: BenchDevice, name: str, begin: Callable[[], object]) -> float:
        """Milliseconds from a start until the bus knows the name."""
        found = []
        connection = device.bus.connection
        subscription = connection.signal_subscribe(
            "org.freedesktop.DBus", "org.freedesktop.DBus", "NameOwnerChanged",
            "/org/freedesktop/DBus", name, 0,
            lambda *_: found.append(time.monotonic()),
        )  # fmt: skip
        device.bus.has_owner(name)  # the subscription is through
        begun = time.monotonic()
        begin()
        wait_for(lambda: found, f"the name {name}", 60)
        connection.signal_unsubscribe(subscription)
        return (found[0] - begun) * 1000

    def start_of(self, device: BenchDevice, bare: bool) -> float:
        if bare:
            processes = []
            taken = self.until(device, BARE[3], lambda: processes.append(device.start_bare()))
            processes[0].terminate()
            processes[0].wait()
            wait_for(lambda: not device.bus.has_owner(BARE[3]), "the end of the bare service")
            return taken
        taken = self.until(device, LAST_NAME, lambda: device.start(wait=False))
        device.stop()
        return taken

    def starts(self) -> Iterable[Row]:
        device, counts = self.slow(outputs(8), 0)
        device.start().stop()
        pairs = []
        for _ in range(self._rounds * 3):
            bare = self.start_of(device, True)
            pairs.append((self.start_of(device, False), bare))
        counts.write_text("")
        device.start().stop()
        syncs = len(counts.read_text())
        device.close()
        detail = f"{statistics.median(mine for mine, _ in pairs):.1f} ms"
        yield Row("start, 8 ports", "a service with four names", ratio_of(pairs), 1.3, detail=detail)
        yield Row("syncs and renames of an unchanged start", "", syncs, 0)

    def start_per_port(self) -> Iterable[Row]:
        """Time that each further port adds, from a few to 128 and from 128 to 2,048."""
        times = {}
        for count in (8, 128, 2048):
            device = self.device(outputs(count, events=True))
            device.start().stop()
            times[count] = min(self.start_of(device, False) for _ in range(self._rounds))
            device.close()
        few = (times[128] - times[8]) / 120
        many = (times[2048] - times[128]) / 1920
        yield Row("start, time per port at 2,048", "at 128 ports", many / few, 1.2,
                  detail=f"{times[2048]:.0f} ms")  # fmt: skip

    # Memory and rest

    def memory(self) -> Iterable[Row]:
        device = self.device(outputs(64))
        device.start()
        bare = device.start_bare()
        pairs = [(rollup(device.pid, "Pss"), rollup(bare.pid, "Pss"))]
        bare_rss = rollup(bare.pid, "Rss")
        bare.terminate()
        device.close()
        yield Row("PSS, 64 ports", "the bare service", ratio_of(pairs), 1.15,
                  detail=f"{pairs[0][0]} kB")  # fmt: skip
        device = self.device(outputs(1024, events=True))
        answer = device.write("/run/heap", "")
        answer.chmod(0o666)
        device.preload("heap-probe.so", BENCH_HEAP="/run/heap")
        device.start()
        rss = rollup(device.pid, "Rss")
        os.kill(device.pid, signal.SIGUSR2)
        wait_for(lambda: answer.read_text().endswith("\n"), "the size of the heap")
        heap = int(answer.read_text()) // 1024
        device.close()
        yield Row("RSS, 1,024 ports with an event each", "live heap + bare service",
                  rss / (heap + bare_rss), 1.5, detail=f"{rss} kB, {heap} kB live")  # fmt: skip

    def steps(self) -> Iterable[Row]:
        """How late the steps of a sequence are, beside a thread of the daemon that only sleeps."""
        device = self.device(checked_outputs(1))
        answer = device.write("/run/steps", "")
        answer.chmod(0o666)
        device.preload("step-probe.so", BENCH_STEPS="/run/steps")
        device.start()
        count = self._calls // 4
        with device.signals("ActionSequenceDone") as done:
            steps = [(bool(n % 2), STEP_MS) for n in range(count)]
            device.call("StartActionSequence", "uba(bi)", 0, False, steps)
            wait_for(lambda: done.received, "the end of the sequence", 120)
        device.stop()
        late = {"step": [], "work": [], "sleep": []}
        for line in answer.read_text().splitlines():
            kind, ns = line.split()
            late[kind].append(int(ns) / 1000)
        device.close()
        step, work, sleep = (percentile_99(late[kind]) for kind in ("step", "work", "sleep"))
        yield Row("step lateness p99, 2 ms steps", "clock_nanosleep beside it", step / sleep, 1.5,
                  detail=f"{step:.0f} us; the step itself takes {work:.0f} us")  # fmt: skip

    def idle(self) -> Iterable[Row]:
        ports = [port(f"p{n}", n, "output", ("null", "virtual", "check")[n % 3]) for n in range(64)]
        device = self.device(hwdesc(*ports))
        device.start()
        device.call("GetNbrPorts")
        wait_for(lambda: quiet_for(device.pid, 0.5), "the daemon to come to rest")
        before = wakeups(device.pid)
        time.sleep(5)
        woken = wakeups(device.pid) - before
        device.close()
        yield Row("idle wake-ups in 5 s, 64 ports", "", woken, 0)

    def size(self) -> Iterable[Row]:
        stripped = self._folder / "portd"
        subprocess.run(["strip", "-o", stripped, self._build / "src/portd"], check=True)
        yield Row("stripped, this machine, release", "", stripped.stat().st_size / 1024, None,
                  unit="KiB")  # fmt: skip

    def rows(self) -> list[Callable[[], Iterable[Row]]]:
        return [self.calls, self.flood, self.many_ports, self.instructions, self.set_states,
                self.saves, self.storm_of_names, self.polls, self.names_at_once, self.starts,
                self.start_per_port, self.memory, self.idle, self.steps, self.size]  # fmt: skip


def replace_file(path: Path, text: str) -> float:
    """Seconds that it takes at least to have these contents on storage."""
    temporary = path.with_suffix(".tmp")
    begun = time.perf_counter()
    fd = os.open(temporary, os.O_WRONLY | os.O_CREAT | os.O_TRUNC, 0o644)
    os.write(fd, text.encode())
    os.fsync(fd)
    os.close(fd)
    os.rename(temporary, path)
    fd = os.open(path.parent, os.O_RDONLY)
    os.fsync(fd)
    os.close(fd)
    return time.perf_counter() - begun


def percentile_99(values: list[float]) -> float:
    return statistics.quantiles(values, n=100)[98]


def rollup(pid: int, field: str) -> int:
    for line in Path(f"/proc/{pid}/smaps_rollup").read_text().splitlines():
        if line.startswith(f"{field}:"):
            return int(line.split()[1])
    raise ValueError(field)


def wakeups(pid: int) -> int:
    total = 0
    for status in Path(f"/proc/{pid}/task").glob("*/status"):
        for line in status.read_text().splitlines():
            if line.startswith(("voluntary_ctxt_switches", "nonvoluntary_ctxt_switches")):
                total += int(line.split()[1])
    return total


def quiet_for(pid: int, seconds: float) -> bool:
    before = wakeups(pid)
    time.sleep(seconds)
    return wakeups(pid) == before


def shown(row: Row) -> str:
    aim = "" if row.aim is None else f"{'>=' if row.at_least else '<='} {row.aim:g}"
    verdict = "" if row.aim is None else ("" if row.kept else "short")
    value = f"{row.value:.2f}" if row.value != int(row.value) else f"{int(row.value)}"
    return (f"{row.what:<50} {row.against:<26} {value:>9} {row.unit:<4} {aim:>8}  {verdict:<6}"
            f"{row.detail}").rstrip()  # fmt: skip


def main() -> None:
    parser = argparse.ArgumentParser(prog="bench/run", description=__doc__)
    parser.add_argument("--short", action="store_true", help="fewer rounds: two minutes")
    parser.add_argument("--json", type=Path, help="write the table to this file too")
    parser.add_argument("--only", default="", help="only the groups of rows with this in their name")
    parser.add_argument("--build", type=Path, required=True, help=argparse.SUPPRESS)
    options = parser.parse_args()
    become_root()
    bench = Bench(options.build.absolute(), 3 if options.short else 9, 2000 if options.short else 10000)
    rows = []
    try:
        for group in bench.rows():
            if options.only in group.__name__:
                for row in group():
                    print(shown(row), flush=True)
                    rows.append(row)
    finally:
        bench.close()
    if options.json:
        table = [{**row._asdict(), "kept": row.kept} for row in rows]
        options.json.write_text(json.dumps({"cores": os.cpu_count(), "rows": table}, indent=2) + "\n")


main()
