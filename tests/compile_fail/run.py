#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Compiles cases.cpp once as it is and once with each of these mistakes in it.

usage: run.py COMPILER ROOT
"""
import pathlib
import subprocess
import sys

compiler, root = sys.argv[1:]

# What stands there, the mistake in its place, and what the compiler must say.
mistakes = [
    ("(Optional<Inner>, three)", '(Optional<Inner>, three), (Int, four, "1")',
     "two fields of a schema travel under one wire key"),
    ("(Optional<Inner>, three));", "(Optional<Inner>, three));\n  Int four;",
     "a member of the schema is not in its list of fields"),
    ("(Optional<Inner>, three)", "(Optional<Inner>, three), (Int, four)",
     "the schema and the record have different numbers of fields"),
    ("(Int, one),\n      (String, two),", "(String, two), (Int, one),",
     "has another name than the schema's field"),
    ("(Optional<InnerRecord>, three)", "(Optional<Int>, three)",
     "a field of the record cannot hold what the schema's field does"),
]


def compile(source):
    return subprocess.run(
        [compiler, "-std=c++20", "-Wall", "-Wextra", "-Werror", "-fsyntax-only", f"-I{root}",
         f"-I{root}/include", "-x", "c++", "-"], input=source, capture_output=True, text=True)


sound = pathlib.Path(root, "tests/compile_fail/cases.cpp").read_text()
if (told := compile(sound)).returncode != 0:
    sys.exit(f"the sound case does not compile:\n{told.stderr}")

failed = 0
for there, mistake, message in mistakes:
    assert sound.count(there) == 1, there
    told = compile(sound.replace(there, mistake))
    if told.returncode == 0 or message not in told.stderr:
        failed += 1
        print(f"{mistake or 'without ' + there}:\n{told.stderr[:2000] or 'it compiles'}")
print(f"{len(mistakes) - failed} passed, {failed} failed")
sys.exit(bool(failed))
