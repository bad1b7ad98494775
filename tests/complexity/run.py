#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""What hostile messages cost, in instructions: no more than so many for a byte, and twice as many
bytes cost about twice as much. Instructions are counted, since a time says nothing on a busy machine.

usage: run.py HOSTILE_COST
"""
import re
import shutil
import subprocess
import sys

# 1 us is at least 3,000 instructions on the machines that this runs on; a check of 16 KB may also
# cost 1 ms of its own, which is not used here.
LIMIT_PER_BYTE = 3000
# A sort or an ordered set gains a little with each doubling; what is quadratic doubles it.
LIMIT_OF_GROWTH = 1.4
SIZES = (16_000, 64_000)

if not shutil.which("valgrind"):
    print("skipped: valgrind is not installed")
    sys.exit(77)
program = sys.argv[1]


def instructions_per_byte(kind, size):
    run = subprocess.run(
        ["valgrind", "--tool=callgrind", "--callgrind-out-file=/dev/null",
         "--toggle-collect=PropertyList::Document::Document*",
         "--toggle-collect=PropertyList::describe*", program, kind, str(size)],
        capture_output=True, text=True, check=True)
    return int(re.search(r"Collected : (\d+)", run.stderr).group(1)) / size


failures = 0
kinds = subprocess.run([program, "--names"], capture_output=True, text=True, check=True)
for kind in kinds.stdout.split():
    small, large = (instructions_per_byte(kind, size) for size in SIZES)
    sound = 0 < large <= LIMIT_PER_BYTE and large <= LIMIT_OF_GROWTH * small
    failures += not sound
    print(f"{kind:18} {small:8.1f} {large:8.1f} instructions a byte{'' if sound else '  TOO MANY'}")
print(f"{failures} failed")
sys.exit(bool(failures))
