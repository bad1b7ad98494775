#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Compiles cases.cpp once as it is and once for each of its mistakes.

usage: run.py COMPILER ROOT
"""
import re
import subprocess
import sys

compiler, root = sys.argv[1:]
source = f"{root}/tests/compile_fail/cases.cpp"
command = [compiler, "-std=c++20", "-Wall", "-Wextra", "-Werror", "-fsyntax-only",
           f"-I{root}", f"-I{root}/include", source]


def compile(case):
    return subprocess.run(command + [f"-DCASE={case}"], capture_output=True, text=True)


sound = compile(0)
if sound.returncode != 0:
    sys.exit(f"the sound case does not compile:\n{sound.stderr}")

cases = [(case, message)
         for case, which, message in re.findall(r"CASE == (\d+)  // expect( g\+\+)?: (.*)",
                                                open(source).read())
         if not which or "clang" not in compiler]
failed = [case for case, message in cases
          if (result := compile(case)).returncode == 0 or not re.search(message, result.stderr)]
for case in failed:
    print(f"case {case} gives another answer:\n{compile(case).stderr[:2000] or 'it compiles'}")
print(f"{len(cases) - len(failed)} passed, {len(failed)} failed")
sys.exit(bool(failed) or not cases)
