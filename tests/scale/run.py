#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""A gearman job server on loopback with two workers that run `keelgate stream`: 1,000 messages, one
worker killed on the way, every message answered once and rightly.

usage: run.py ROOT KEELGATE
"""
import base64
import concurrent.futures
import json
import os
import pathlib
import signal
import socket
import subprocess
import sys
import time

root, keelgate = pathlib.Path(sys.argv[1]), sys.argv[2]
messages, batch = 1000, 20

with socket.socket() as probe:
    probe.bind(("127.0.0.1", 0))
    port = str(probe.getsockname()[1])
server = subprocess.Popen(["gearmand", "--listen=127.0.0.1", f"--port={port}",
                           "--log-file=stderr", "--verbose=FATAL"])


def connected():
    with socket.socket() as attempt:
        return attempt.connect_ex(("127.0.0.1", int(port))) == 0


def worker():
    # A process group of its own, so that a kill takes the command along, as a lost machine would.
    return subprocess.Popen(["gearman", "-w", "-h", "127.0.0.1", "-p", port, "-f", "unpack", "--",
                             keelgate, "stream"], start_new_session=True)


def kill(process):
    os.killpg(process.pid, signal.SIGKILL)
    process.wait()


message = base64.b64encode((root / "examples/messages/command-response.bplist").read_bytes())
expected = json.loads((root / "examples/messages/command-response.json").read_text())


def run(first):
    requests = "".join(json.dumps({"record": "VespCommandResponse", "message": message.decode(),
                                   "id": first + i}) + "\n" for i in range(batch))
    done = subprocess.run(["gearman", "-h", "127.0.0.1", "-p", port, "-f", "unpack"],
                          input=requests, capture_output=True, text=True, timeout=300)
    return [json.loads(line) for line in done.stdout.splitlines()]


workers = []
try:
    deadline = time.monotonic() + 30
    while not connected():
        if time.monotonic() > deadline:
            sys.exit("gearmand does not listen")
        time.sleep(0.05)
    workers = [worker(), worker()]
    with concurrent.futures.ThreadPoolExecutor(4) as pool:
        jobs = [pool.submit(run, first) for first in range(0, messages, batch)]
        # After a tenth of the jobs, so that the worker dies with one in its hands.
        for job in jobs[:5]:
            job.result()
        kill(workers.pop())
        answers = [answer for job in jobs for answer in job.result()]
finally:
    for process in workers:
        kill(process)
    server.terminate()
    server.wait()

right = [{"id": n, **expected} for n in range(messages)]
wrong = messages - sum(a == b for a, b in zip(answers, right))
print(f"{messages - wrong} passed, {wrong} failed")
sys.exit(wrong != 0 or len(answers) != messages)
