#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Compiles cases.cpp once as it is and once for each of its mistakes.

usage: run.py COMPILER ROOT
"""
import re
import subprocess
import sys

compiler, root = sys.argv[1:]

expected = {
    1: "two fields of a schema travel under one wire key",
    2: "a member of the schema is not in its list of fields",
    3: "the schema and the record have different numbers of fields",
    4: "has another name than the schema's field",
    5: "a field changes its type on the way and has no label",
    6: "fieldByField consumes its schema",
    8: "does not match declaration order|out of declaration order|specified in declaration order",
}
if "clang" not in compiler:  # clang does not see it
    expected[7] = "missing initializer for member .*two"


def compile(case):
    return subprocess.run(
        [compiler, "-std=c++20", "-Wall", "-Wextra", "-Werror", "-fsyntax-only", f"-DCASE={case}",
         f"-I{root}", f"-I{root}/include", f"{root}/tests/compile_fail/cases.cpp"],
        capture_output=True, text=True)


sound = compile(0)
if sound.returncode != 0:
    sys.exit(f"the sound case does not compile:\n{sound.stderr}")

failed = 0
for case, message in expected.items():
    result = compile(case)
    if result.returncode == 0 or not re.search(message, result.stderr):
        failed += 1
        print(f"case {case} gives another answer:\n{result.stderr[:2000] or 'it compiles'}")
print(f"{len(expected) - failed} passed, {failed} failed")
sys.exit(bool(failed))
