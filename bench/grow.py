#!/usr/bin/env python3
"""How the cost of messages grows with writers and readers, each a process of its own, over one nats-server:

    bench/grow.py BRENIX [RESULT]

Writers publish blocks of 4 KiB to subjects of their own, and each reader reads them all. Prints what was measured as
a table, what one message costs by the model that docs/distributed.md explains, which is fitted to five of the points,
and how far the model is off at the others. Exits with 1 where that is more than 20 %."""

import itertools
import json
import os
import pathlib
import socket
import statistics
import subprocess
import sys
import tempfile
import time
import urllib.request

NUMBERS = [1, 2, 4, 8]
FITTED = [(1, 1), (1, 8), (4, 4), (8, 1), (8, 8)]  # writers, readers
MESSAGES = 16384                   # of all writers together
BYTES = 4096
ROUNDS = 5
TICKS = os.sysconf("SC_CLK_TCK")
PROCESSORS = len(os.sched_getaffinity(0))


def free_port():
    with socket.socket() as probe:
        probe.bind(("127.0.0.1", 0))
        return probe.getsockname()[1]


class Server:
    """A nats-server that drops nobody while these measurements last."""

    def __init__(self, folder):
        self.port, self.monitor = free_port(), free_port()
        config = pathlib.Path(folder, "server.conf")
        config.write_text(f"listen: 127.0.0.1:{self.port}\nhttp: 127.0.0.1:{self.monitor}\n"
                          "max_pending: 1GB\n", encoding="ascii")
        self.process = subprocess.Popen(["nats-server", "-c", config], stderr=subprocess.DEVNULL)
        self.url = f"nats://127.0.0.1:{self.port}"

    def subscriptions(self):
        try:
            with urllib.request.urlopen(f"http://127.0.0.1:{self.monitor}/subsz") as answer:
                return json.load(answer)["num_subscriptions"]
        except OSError:
            return -1

    def seconds(self):
        """Processor time since its start."""
        fields = pathlib.Path(f"/proc/{self.process.pid}/stat").read_text(encoding="ascii")
        user, system = fields.rpartition(")")[2].split()[11:13]
        return (int(user) + int(system)) / TICKS

    def end(self):
        self.process.terminate()
        self.process.wait()


def wait_for(condition):
    end = time.monotonic() + 20
    while not condition():
        if time.monotonic() > end:
            sys.exit("grow: waited in vain")
        time.sleep(0.01)


def run(brenix, server, data, writers, readers, messages):
    """Seconds: of the clock, and of processor time of all writers, of the server and of all readers."""
    none = server.subscriptions()
    common = ["-q", "-o", f"Servers={server.url}"]
    reading = [subprocess.Popen([brenix, "read", "nats", *common, "-o", "Subject=grow.*", "-o",
                                 f"Writers={writers}", "--limit", "1000000000", "--fail-on-loss",
                                 "--format", "raw",
                                 "--to", "/dev/null"])
               for _ in range(readers)]
    wait_for(lambda: server.subscriptions() >= none + readers)
    served = server.seconds()
    start = time.monotonic()
    each = messages // writers * BYTES // 8
    writing = [subprocess.Popen([brenix, "write", "nats", *common, "-o", "Mode=write", "-o",
                                 f"Subject=grow.{number}", "-t", "double", "-b", str(BYTES // 8),
                                 "--format", "raw", "--from", data, "-n", str(each)])
               for number in range(writers)]

    def processor_time(processes):
        total = 0
        for process in processes:
            _, status, usage = os.wait4(process.pid, 0)
            if status != 0:
                sys.exit(f"grow: {' '.join(process.args)}: status {status}")
            total += usage.ru_utime + usage.ru_stime
        return total

    written, read = processor_time(writing), processor_time(reading)
    clock = time.monotonic() - start
    return clock, written, server.seconds() - served, read


def measure(brenix):
    """The median over the rounds, by (writers, readers): as run(), for one message each."""
    samples = {point: [] for point in itertools.product(NUMBERS, NUMBERS)}
    with tempfile.TemporaryDirectory() as folder:
        data = pathlib.Path(folder, "data.raw")
        data.write_bytes(os.urandom(BYTES) * MESSAGES)
        server = Server(folder)
        try:
            wait_for(lambda: server.subscriptions() >= 0)
            for _ in range(ROUNDS):
                for point in samples:
                    whole = run(brenix, server, data, *point, MESSAGES)
                    start = run(brenix, server, data, *point, point[0])  # what processes cost
                    samples[point].append([(all_ - few) / (MESSAGES - point[0])
                                           for all_, few in zip(whole, start)])
        finally:
            server.end()
    return {point: [statistics.median(values) for values in zip(*rounds)]
            for point, rounds in samples.items()}


class Model:
    """Processor time of a message: of its writer, of the server once and for each reader, and of each reader."""

    def __init__(self, points):
        self.write = statistics.mean(points[point][1] for point in FITTED)
        self.each, self.once = statistics.linear_regression(
            [point[1] for point in FITTED], [points[point][2] for point in FITTED])
        self.read = statistics.mean(points[point][3] / point[1] for point in FITTED)

    def seconds(self, _, readers):
        return self.write + self.once + readers * (self.each + self.read)


def main():
    brenix = sys.argv[1]
    points = measure(brenix)
    model = Model(points)
    micro = 1e6
    print(f"{PROCESSORS} processors; a message of {BYTES} bytes takes its writer {model.write * micro:.1f} us, the "
          f"server {model.once * micro:.1f} us and {model.each * micro:.1f} us for each reader, and each reader "
          f"{model.read * micro:.1f} us\n")
    print("| writers | readers | messages a second | delivered a second | writers, us | server, us | each reader, us | "
          "together, us | by the model | off |\n|---|---|---|---|---|---|---|---|---|---|")
    worst = 0.0
    for (writers, readers), (clock, write, serve, read) in points.items():
        together, expected = write + serve + read, model.seconds(writers, readers)
        off = expected / together - 1
        fitted = (writers, readers) in FITTED
        worst = max(worst, 0 if fitted else abs(off))
        print(f"| {writers} | {readers} | {1 / clock:.0f} | {readers / clock:.0f} | {write * micro:.1f} | "
              f"{serve * micro:.1f} | {read / readers * micro:.1f} | {together * micro:.1f} | {expected * micro:.1f} | "
              f"{'fitted' if fitted else f'{off:+.0%}'} |")
    print(f"\nThe model is off by {worst:.0%} at most where it was not fitted.")
    if len(sys.argv) > 2:
        pathlib.Path(sys.argv[2]).write_text(json.dumps({f"{w}x{r}": point for (w, r), point in points.items()}),
                                             encoding="ascii")
    return 0 if worst <= 0.2 else 1


sys.exit(main())
