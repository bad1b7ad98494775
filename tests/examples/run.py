#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Unpacks every example, and what stands here, with the built command, in the sandbox, and compares
the reply with the one that stands beside it. With --write the replies are written instead.

usage: run.py ROOT KEELGATE [--write]
"""
import itertools
import pathlib
import shlex
import subprocess
import sys

root = pathlib.Path(sys.argv[1])
keelgate, write = sys.argv[2], "--write" in sys.argv
passed = failed = 0

for folder, line in ((folder, line) for folder in (root / "examples/messages",
                                                   root / "tests/examples/messages")
                     for line in (folder / "index.txt").read_text().splitlines()):
    if not line or line.startswith("#"):
        continue
    name, *arguments = shlex.split(line)
    files = [name] if "." in name else [f"{name}.xml", f"{name}.bplist"]
    expected = folder / f"{name.split('.')[0]}.json"
    for file in files:
        done = subprocess.run([keelgate, "unpack", "--pretty", *arguments, folder / file],
                              capture_output=True, text=True, timeout=60)
        if write:
            expected.write_text(done.stdout)
        rejected = '"error"' in done.stdout.split("\n")[1]
        if (expected.exists() and done.stdout == expected.read_text()
                and done.returncode == rejected):
            passed += 1
        else:
            failed += 1
            print(f"{file}: status {done.returncode}\n{done.stdout}{done.stderr}")

# A line of a stream, and its reply.
requests, replies = (root / f"tests/examples/{name}.jsonl" for name in ("requests", "replies"))
done = subprocess.run([keelgate, "stream"], input=requests.read_bytes(), capture_output=True)
if write:
    replies.write_bytes(done.stdout)
if done.returncode != 2:
    failed += 1
    print(f"stream: status {done.returncode}\n{done.stderr}")
for lines in itertools.zip_longest(*(text.split(b"\n") for text in (
        requests.read_bytes(), done.stdout, replies.read_bytes()))):
    passed += lines[1] == lines[2]
    if lines[1] != lines[2]:
        failed += 1
        print(*lines, sep="\n")

print(f"{passed} passed, {failed} failed")
sys.exit(failed > 0 or passed == 0)
