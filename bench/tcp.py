#!/usr/bin/env python3
"""Processor time of those who take 1.5 GB from a TCP connection of this machine:

    bench/tcp.py BRENIX READER RESULT

`brenix read tcp`, a plain loop of read() into one buffer (bench/ReadLoop.c), and socat, one after the other.
The result has the form of the other measurements: seconds of the reader, in user and system mode."""

import json
import os
import socket
import subprocess
import sys
import threading

SIZE = 1_500_000_000
BLOCK = 256 << 10


def serve(listener):
    """Sends the bytes to whoever comes first."""
    connection, _ = listener.accept()
    block = bytes(BLOCK)
    with connection:
        for sent in range(0, SIZE, BLOCK):
            connection.sendall(block[:min(BLOCK, SIZE - sent)])


def seconds(command):
    with socket.create_server(("127.0.0.1", 0)) as listener:
        port = str(listener.getsockname()[1])
        sender = threading.Thread(target=serve, args=[listener])
        sender.start()
        reader = subprocess.Popen([part.replace("PORT", port) for part in command])
        _, status, usage = os.wait4(reader.pid, 0)
        sender.join()
    if status != 0:
        sys.exit(f"{command[0]} failed")
    return usage.ru_utime + usage.ru_stime


def main():
    brenix, loop, result = sys.argv[1:]
    readers = {
        "ours": [brenix, "read", "tcp", "-o", "Host=127.0.0.1", "-o", "Port=PORT", "-o",
                 f"BlockSize={BLOCK}", "--limit", str(16 * BLOCK), "--format", "raw", "--to", "/dev/null", "-q"],
        "read": [loop, "PORT", str(BLOCK)],
        "socat": ["socat", "-u", "-b", str(BLOCK), "TCP:127.0.0.1:PORT", "OPEN:/dev/null"],
    }
    runs = [{"name": f"tcp/{who}", "real_time": seconds(command)} for who, command in readers.items()]
    with open(result, "w", encoding="ascii") as file:
        json.dump({"benchmarks": runs}, file)


main()
