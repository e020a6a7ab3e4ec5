#!/usr/bin/env python3
"""Processor time of those who capture half a minute of sound and write it to a pipe:

    bench/alsa.py CAPTURE_LOOP RESULT [BLOCK]

A program on the device alsa (bench/CaptureLoop.c) and arecord, at the same time, on a PulseAudio server of this program's own, with the same
blocks and buffers. The result has the form of the other measurements: seconds in user and system mode."""

import json
import os
import subprocess
import sys
import tempfile
import threading
import time

SECONDS = 30
RATE = 48000
CHANNELS = 8
BLOCK = int(sys.argv[3]) if len(sys.argv) > 3 else 6000  # which arecord has without options
BUFFER = 24000

SERVER = """load-module module-native-protocol-unix socket={folder}/socket auth-anonymous=1
load-module module-null-sink sink_name=sink rate={rate} channels={channels} format=s32le
"""


def drain(pipe):
    while pipe.read(1 << 16):
        pass


def start(command, folder):
    reader = subprocess.Popen(command, stdout=subprocess.PIPE, cwd=folder)
    threading.Thread(target=drain, args=[reader.stdout]).start()
    return reader


def seconds(reader):
    _, status, usage = os.wait4(reader.pid, 0)
    if status != 0:
        sys.exit(f"{reader.args[0]} failed")
    return usage.ru_utime + usage.ru_stime


def main():
    loop, result = sys.argv[1:3]
    readers = {
        "ours": [os.path.abspath(loop), "pulse", str(CHANNELS), str(RATE), str(BLOCK), str(BUFFER), str(SECONDS)],
        "arecord": ["arecord", "-q", "-D", "pulse", "-f", "S32_LE", "-r", str(RATE), "-c", str(CHANNELS), "-t",
                    "raw", "-d", str(SECONDS), f"--period-size={BLOCK}", f"--buffer-size={BUFFER}"],
    }
    with tempfile.TemporaryDirectory() as folder:
        with open(f"{folder}/server.pa", "w", encoding="ascii") as file:
            file.write(SERVER.format(folder=folder, rate=RATE, channels=CHANNELS))
        os.environ.update(HOME=folder, XDG_RUNTIME_DIR=folder, PULSE_SERVER=f"unix:{folder}/socket")
        server = subprocess.Popen(["pulseaudio", "-n", "-F", f"{folder}/server.pa", "--daemonize=no",
                                   "--use-pid-file=no", "--exit-idle-time=-1"], stderr=subprocess.DEVNULL)
        try:
            while not os.path.exists(f"{folder}/socket"):
                time.sleep(0.01)
            started = {who: start(command, folder) for who, command in readers.items()}
            runs = [{"name": f"alsa/{who}", "real_time": seconds(reader)} for who, reader in started.items()]
        finally:
            server.terminate()
            server.wait()
    with open(result, "w", encoding="ascii") as file:
        json.dump({"benchmarks": runs}, file)


main()
