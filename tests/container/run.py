#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Makes the container image and runs it under three profiles: ours, none, and one without what
builds the walls, as the usual default is.

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
# A profile that is written for programs that need no walls of their own.
bare = json.loads(json.dumps(ours))
for group in bare["syscalls"]:
    group["names"] = [name for name in group["names"] if name not in
                      ("clone", "clone3", "mount", "umount2", "pivot_root", "unshare")]
# Any clone without a flag for a namespace.
bare["syscalls"].append({"action": "SCMP_ACT_ALLOW", "names": ["clone"], "args": [
    {"index": 0, "value": 0x7E020000, "valueTwo": 0, "op": "SCMP_CMP_MASKED_EQ"}]})
bare["syscalls"].append({"action": "SCMP_ACT_ERRNO", "errnoRet": 38, "names": ["clone3"]})


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
unpack = ["unpack", "--record", "VespCommandResponse"]
for name, profile in (("our profile", ours), ("no profile", None)):
    done = run(profile, *unpack, "--require-layers", stdin=message)
    check(done.returncode == 0 and done.stdout.startswith(b'{"record":"VespCommandResponse"'),
          f"all layers under {name}: {done}")
done = run(bare, *unpack, stdin=message)
check(done.returncode == 0 and b"Running without: user namespace" in done.stderr,
      f"a profile without namespaces: {done}")
check(run(bare, *unpack, "--require-layers", stdin=message).returncode == 3, "layers required")
print(f"{counts[True]} passed, {counts[False]} failed")
sys.exit(counts[False] > 0)
