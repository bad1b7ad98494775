#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Makes the container image and runs it under our profile and under none. What becomes of the
service under profiles that lack something, the tests of containment show.

usage: run.py ROOT PACKAGE WORK
"""
import json
import os
import pathlib
import shutil
import subprocess
import sys

root, package, work = (pathlib.Path(word).resolve() for word in sys.argv[1:])
counts = {True: 0, False: 0}


def check(sound, what):
    counts[bool(sound)] += 1
    if not sound:
        print(f"failed: {what}")


def skip(reason):
    print(f"skipped: no container can be run here: {reason}")
    sys.exit(0)


for tool in ("mmdebstrap", "umoci", "runc"):
    if not shutil.which(tool):
        skip(f"{tool} is missing")
if os.geteuid() != 0:
    skip("runc is run as root here")

shutil.rmtree(work, ignore_errors=True)
work.mkdir(parents=True)
subprocess.run([root / "packaging/container/build", package, work / "image"], check=True)
subprocess.run(["umoci", "unpack", "--image", f"{work}/image:keelgate", work / "bundle"],
               check=True)
config = work / "bundle/config.json"
made = json.loads(config.read_text())
ours = json.loads((root / "packaging/container/seccomp.json").read_text())


def run(profile, *words, stdin=b""):
    """The image as it should be run: nobody, no capability, nothing to write to, no network."""
    now = json.loads(json.dumps(made))
    now["process"].update(terminal=False, noNewPrivileges=True,
                          args=["/usr/bin/keelgate", *words])
    now["process"]["capabilities"] = {}
    now["root"]["readonly"] = True
    if profile:
        now["linux"]["seccomp"] = profile
    config.write_text(json.dumps(now))
    return subprocess.run(["runc", "run", "--bundle", work / "bundle", f"keelgate-{os.getpid()}"],
                          input=stdin, capture_output=True)


first = run(None, "--version")
if first.returncode != 0:
    skip(f"runc says {first.stderr.decode(errors='replace').strip()}")
message = (root / "examples/messages/command-response.xml").read_bytes()
for name, profile in (("our profile", ours), ("no profile", None)):
    done = run(profile, "unpack", "--record", "VespCommandResponse", "--require-layers",
               stdin=message)
    check(done.returncode == 0 and done.stdout.startswith(b'{"record":"VespCommandResponse"'),
          f"all layers under {name}: {done}")
print(f"{counts[True]} passed, {counts[False]} failed")
sys.exit(counts[False] > 0)
