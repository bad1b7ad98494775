#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Holds the C interface against that of the last release. The header alone says what it is; a
library with empty functions of it has no other types in its debug information than these.

usage: abi.py ROOT WORK            fails where a program that was built before would break
       abi.py ROOT WORK --write    makes the interface of today the one that is kept
"""
import pathlib
import re
import subprocess
import sys

root, work = pathlib.Path(sys.argv[1]), pathlib.Path(sys.argv[2])
kept = root / "packaging/abi/libkeelgate.so.0.abi"
source, library, dump = (work / name for name in ("abi.c", "libkeelgate.so.0", "abi.xml"))

header = (root / "include/keelgate.h").read_text()
functions = re.findall(r"^KEELGATE_C_API\s+([^;]+);", header, re.M)
source.write_text("#include <keelgate.h>\n#include <stdlib.h>\n" +
                  "".join(f"{function} {{ abort(); }}\n" for function in functions))
subprocess.run(["cc", "-std=c11", "-g", "-shared", "-fPIC", "-w", f"-I{root}/include", source, "-o",
                library, "-Wl,-soname,libkeelgate.so.0"], check=True)
subprocess.run(["abidw", "--no-corpus-path", "--no-comp-dir-path", "--no-show-locs", "--out-file",
                dump, library], check=True)
if "--write" in sys.argv:
    kept.parent.mkdir(exist_ok=True)
    kept.write_text(dump.read_text())
# Additions are allowed; abidiff says by its status whether there is one.
status = subprocess.run(["abidiff", "--no-added-syms", kept, dump]).returncode
print(f"{len(functions)} functions, {'0' if status == 0 and functions else '1'} failed")
sys.exit(status != 0 or not functions)
