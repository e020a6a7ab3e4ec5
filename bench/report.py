#!/usr/bin/env python3
"""Turns the rounds of scripts/bench into results.json, table.md and pictures in the same folder.

A figure is the median over the rounds, and so is a ratio of figures of one round; the spread is from
the least to the most.
"""

import json
import math
import pathlib
import statistics
import subprocess
import sys

PEERS = ["queue", "zmq", "nng", "gstreamer", "socketpair", "pipe"]
PROCESSORS = {"one": "one processor", "two": "two processors"}
SIZES = {"64": "64 B", "64x64": "64 B, 64 a call", "4096": "4 KiB", "65536": "64 KiB",
         "1048576": "1 MiB"}
# Where the target is not to be as fast as the peer.
ECHO_TARGETS = {("64x64", "one", "queue"): 0.5, ("1048576", "one", "queue"): 0.95,
                ("1048576", "two", "queue"): 0.95}
QUERIES = {"StreamIsOpen": "coderStreamIsOpen", "GetDataAvailable": "coderStreamGetDataAvailable",
           "GetSpaceAvailable": "coderStreamGetSpaceAvailable",
           "ChannelIsOpen": "coderChannelIsOpen"}
CASTS = {"IsDeviceDone": "coderStreamIsDeviceDone",
         "GetCountDimension": "coderStreamGetCountDimension"}


def load(folder):
    """Lists by program and name: nanoseconds, and what else was counted."""
    figures = {}
    for file in sorted((folder / "rounds").glob("*.json")):
        program = file.stem.split("-")[0]
        for run in json.loads(file.read_text())["benchmarks"]:
            name = program + ":" + run["name"].removesuffix("/real_time").removesuffix(
                "/manual_time").removesuffix("/iterations:1/real_time").removesuffix("/iterations:1")
            # One thread alone is measured by its own clock, which stops while others run.
            own = run["name"].endswith("_time") or program not in ("calls", "messages")
            figures.setdefault(name, []).append(run["real_time" if own else "cpu_time"])
            for counter in ("allocations", "bytes_per_second", "residentBytes"):
                if counter in run:
                    figures.setdefault(name + "#" + counter, []).append(run[counter])
    return figures


class Report:
    """The rows of the table."""

    def __init__(self, figures):
        self.figures = figures
        self.rows = []

    def has(self, name):
        return name in self.figures

    def combine(self, operation, *names):
        return [operation(*values) for values in zip(*(self.figures[name] for name in names))]

    def row(self, what, against, values, unit, limit, at_least=False):
        median = statistics.median(values)
        holds = median >= limit if at_least else median <= limit
        self.rows.append({"what": what, "against": against, "median": median, "least": min(values),
                          "most": max(values), "unit": unit, "limit": limit,
                          "direction": "at least" if at_least else "at most", "holds": holds})

    def left_out(self, what, peer):
        self.rows.append({"what": what, "against": peer, "left out": True})


def call_rows(report):
    def added(name):
        return report.combine(lambda face, direct: face - direct, f"calls:query/{name}/face",
                              f"calls:query/{name}/direct")

    soapy = "what the C functions of SoapySDR add to its C++ classes"
    for name, function in QUERIES.items():
        what = function + " adds to the core's call"
        if report.has("calls:query/soapy/face"):
            report.row(what, soapy, added(name), " ns", statistics.median(added("soapy")))
        else:
            report.left_out(what, soapy)
    for name, function in CASTS.items():
        report.row(function + " adds", "the core's call and a dynamic_cast", added(name), " ns", 3)
    none = max(max(report.figures[f"calls:query/{name}/face#allocations"])
               for name in [*QUERIES, *CASTS])
    report.row("allocations of a query", "", [none], "", 0)

    for what, row, limit, fixed in (("coderInputStreamReadBufferData", "copyOut", 1.05, 60),
                                    ("coderOutputStreamWriteTypedDataOld", "write", 1.1, 150)):
        reference = "memcpy" if row == "copyOut" else "new[], memcpy, delete[]"
        report.row(what + ", one element", "", report.figures[f"calls:{row}/8/face"], " ns", fixed)
        report.row(what + ", allocations", "", report.figures[f"calls:{row}/8/face#allocations"], "",
                   0 if row == "copyOut" else 5)
        for size, text in (("65536", "64 KiB"), ("1048576", "1 MiB"), ("16777216", "16 MiB")):
            report.row(f"{what}, {text}", reference, report.combine(
                lambda face, direct: face / direct, f"calls:{row}/{size}/face",
                f"calls:{row}/{size}/direct"), " x", limit)

    for what, row, least, most in (("fields of a buffer", "fields", 1, 100),
                                   ("buffers in the store", "buffers", 1, 10000),
                                   ("properties of a channel", "properties", 10, 100000)):
        doublings = math.log2(most / least)
        report.row(f"look-up: {most} {what}, added each doubling", f"{least}", report.combine(
            lambda many, few, n=doublings: (many - few) / n, f"calls:{row}/{most}",
            f"calls:{row}/{least}"), " ns", 10)

    thousand = [time / 1000 for time in report.figures["calls:readAll/1000"]]
    report.row("peek, read, copy-out and free, a small buffer of 1,000", "", thousand, " ns", 150)
    report.row("the same, a buffer of 1,000", "a buffer of 10", report.combine(
        lambda many, few: many / few, "calls:readAll/1000", "calls:readAll/10"), " x", 1.5)
    report.row("option list, an option of 32", "",
               [time / 32 for time in report.figures["calls:options/32"]], " ns", 150)
    report.row("the same, an option of 32", "an option of 10", report.combine(
        lambda many, few: many / 32 / (few / 10), "calls:options/32", "calls:options/10"), " x",
        1.5)
    report.row("a failing call and coderChannelGetLastError", "throw and catch", report.combine(
        lambda face, direct: face / direct, "calls:failure/face", "calls:failure/direct"), " x", 1.1)


def stream_rows(report):
    for size, text in SIZES.items():
        for program, processors in PROCESSORS.items():
            for peer in PEERS:
                if size == "64" and peer == "zmq":
                    continue
                what = f"echo, {text}, {processors}: bytes a second"
                name = f"{program}:echo/{size}/"
                if not report.has(name + peer):
                    report.left_out(what, peer)
                    continue
                report.row(what, peer, report.combine(
                    lambda ours, theirs: ours / theirs, f"{name}ours#bytes_per_second",
                    f"{name}{peer}#bytes_per_second"), " x",
                    ECHO_TARGETS.get((size, program, peer), 1), at_least=True)
    for program, processors in PROCESSORS.items():
        for peer in ("queue", "zmq", "nng", "gstreamer"):
            what = f"round trip, {processors}: time"
            name = f"{program}:roundTrip/"
            if not report.has(name + peer):
                report.left_out(what, peer)
                continue
            report.row(what, peer, report.combine(lambda ours, theirs: ours / theirs, name + "ours",
                                                  name + peer), " x", 1.5 if peer == "queue" else 1)
    report.row("coderOutputStreamWriteTypedDataOld, allocations with the included core", "",
               report.figures["one:write/allocations#allocations"], "", 6)
    for peer, limit in (("read", 1.5), ("socat", 1.2)):
        what = "a plain loop of read()" if peer == "read" else "socat"
        report.row("brenix read tcp, 1.5 GB: processor time", what, report.combine(
            lambda ours, theirs: ours / theirs, "tcp:tcp/ours", f"tcp:tcp/{peer}"), " x", limit)
    if report.has("alsa:alsa/ours"):
        report.row("capturing by alsa to a pipe, 8 channels: processor time", "arecord", report.combine(
            lambda ours, theirs: ours / theirs, "alsa:alsa/ours", "alsa:alsa/arecord"), " x", 1.5)
    else:
        report.left_out("capturing by alsa to a pipe, 8 channels: processor time", "arecord")
    report.row("channel, from create to destroy", "",
               [time / 1e6 for time in report.figures["two:channel/cycle"]], " ms", 1)
    report.row("idle channel of 1,000, resident with its thread's stack", "",
               [size / 1024 for size in report.figures["two:channel/idle#residentBytes"]], " KiB",
               100)


def message_rows(report):
    if not report.has("messages:message/64/copy"):
        report.left_out("a packet to a message and back", "memcpy")
        return
    for way, what in (("write", "a packet of doubles to a message"), ("read", "a message to a packet of doubles")):
        for size, limit in (("64", 600), ("4096", 600)):
            report.row(f"{what}, {SIZES[size]}: added", "memcpy", report.combine(
                lambda ours, copy: ours - copy, f"messages:message/{size}/{way}",
                f"messages:message/{size}/copy"), " ns", limit if way == "write" else 2.5 * limit)
        for size, limit in (("65536", 1.75), ("1048576", 1.2)):
            report.row(f"{what}, {SIZES[size]}", "memcpy", report.combine(
                lambda ours, copy: ours / copy, f"messages:message/{size}/{way}",
                f"messages:message/{size}/copy"), " x", limit)


def across_rows(report):
    for device, what, sizes in (("zmq", "zmq, push and pull over tcp", ("4096", "65536", "1048576")),
                                ("nats", "nats, core", ("4096", "65536")),
                                ("jetstream", "nats, published to a stream", ("4096", "65536"))):
        raw = {"zmq": "libzmq", "nats": "libnats", "jetstream": "js_PublishAsync"}[device]
        for size in sizes:
            name = f"across:{device}/{size}/"
            if not report.has(name + "ours") or not report.has(name + "raw"):
                report.left_out(f"{what}, {SIZES[size]}: bytes a second", raw)
            elif size == "4096":
                report.row(f"{what}, {SIZES[size]}: time of a packet beyond that of its bytes", raw, report.combine(
                    lambda ours, theirs: (ours - theirs) / 1000, name + "ours", name + "raw"), " us", 20)
            else:
                report.row(f"{what}, {SIZES[size]}: bytes a second", raw, report.combine(
                    lambda ours, theirs: ours / theirs, f"{name}ours#bytes_per_second",
                    f"{name}raw#bytes_per_second"), " x", 0.8, at_least=True)


def machine(folder):
    """One line: processor, compiler, rounds, and how busy the machine was."""
    runs = [json.loads(file.read_text())["context"] for file in (folder / "rounds").glob("two-*")]
    model = next(line.split(":")[1].strip() for line in open("/proc/cpuinfo", encoding="ascii")
                 if line.startswith("model name"))
    compiler = subprocess.run(["g++", "-dumpfullversion"], capture_output=True, text=True,
                              check=True).stdout.strip()
    load = statistics.median(run["load_avg"][0] for run in runs if run["load_avg"])
    return (f"{model}, {runs[0]['num_cpus']} processors of {runs[0]['mhz_per_cpu']} MHz; GCC "
            f"{compiler}; {len(runs)} rounds; load {load:.1f}\n\n")


def table(rows):
    lines = ["| what | against | measured | spread | target | holds |",
             "|---|---|---|---|---|---|"]
    for row in rows:
        if "left out" in row:
            lines.append(f"| {row['what']} | {row['against']} | left out: not installed | | | |")
            continue
        lines.append("| {what} | {against} | {median:.2f}{unit} | {least:.2f} to {most:.2f} | "
                     "{direction} {limit:.2f}{unit} | {verdict} |".format(
                         **row, verdict="yes" if row["holds"] else "**no**"))
    return "\n".join(lines) + "\n"


def pictures(folder, figures):
    """Writes one gnuplot program a picture: bars by block size or for the round trip."""
    everybody = ["ours", *PEERS]
    for program, processors in PROCESSORS.items():
        there = [who for who in everybody if f"{program}:roundTrip/{who}" in figures]
        values = "\n".join(
            f'"{text}" ' + " ".join(str(statistics.median(
                figures[f"{program}:echo/{size}/{who}#bytes_per_second"]) / 1e9) for who in there)
            for size, text in SIZES.items())
        trips = "\n".join(
            f'"{who}" {statistics.median(figures[f"{program}:roundTrip/{who}"]) / 1000}'
            for who in there)
        plots = ", ".join(f'$data using {i + 2}:xtic(1) title "{who}"'
                          for i, who in enumerate(there))
        common = ("set terminal svg size 800,400 background 'white'\nset style fill solid 0.8\n"
                  "set grid ytics\n")
        (folder / f"echo-{program}.gnuplot").write_text(
            f"$data << END\n{values}\nEND\n{common}set output '{folder}/echo-{program}.svg'\n"
            f"set title 'Echo, {processors}'\nset ylabel 'GB/s'\nset logscale y\n"
            f"set style data histograms\nset key outside\nplot {plots}\n")
        (folder / f"round-trip-{program}.gnuplot").write_text(
            f"$data << END\n{trips}\nEND\n{common}set output '{folder}/round-trip-{program}.svg'\n"
            f"set title 'Round trip of one double, {processors}'\nset ylabel 'us'\n"
            "set yrange [0:*]\nset style data histograms\n"
            'plot $data using 2:xtic(1) notitle\n')


def main():
    folder = pathlib.Path(sys.argv[1])
    report = Report(load(folder))
    call_rows(report)
    stream_rows(report)
    message_rows(report)
    across_rows(report)
    (folder / "results.json").write_text(
        json.dumps({"figures": report.figures, "rows": report.rows}, indent=1))
    text = machine(folder) + table(report.rows)
    (folder / "table.md").write_text(text)
    print(text)
    pictures(folder, report.figures)


main()
