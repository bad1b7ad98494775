#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Who may know whom, checked on the sources and on the built programs.

usage: run.py ROOT BUILD
"""
import pathlib
import re
import subprocess
import sys

import links

root, build = pathlib.Path(sys.argv[1]), pathlib.Path(sys.argv[2])
failures = []


def check(sound, what):
    if not sound:
        failures.append(what)


def sources(folder):
    return [path for path in sorted((root / folder).rglob("*"))
            if path.suffix in (".h", ".cpp")
            # The rooms that stand alone do so in their tests, too.
            and (folder in ("text", "plist") or not re.search("_test|test_", path.name))]


def included(folder):
    return [(path, name) for path in sources(folder)
            for name in re.findall(r'^#include ["<]([^">]+)[">]', path.read_text(), re.M)]


# Who may include from whom: the link lines say it.
failures += links.Tree(root, (build / "targets.txt").read_text().splitlines()).check()

# What they must not say: the privileged side reads no format of the network, the parser knows no
# schema and no record, the framework no unpacker, and only `service/` the server.
for folder, forbidden in {"plist": ["include", "program", "framework", "fuzz", "tests"],
                          "text": ["include", "plist", "program", "framework"],
                          "framework": ["program", "plist", "cli"],
                          "framework/client": ["framework/server", "framework/sandbox"],
                          "framework/sandbox": ["framework/server", "framework/client"],
                          "framework/transport": ["framework/server", "framework/sandbox"],
                          "program": ["framework/transport", "framework/sandbox",
                                      "framework/client", "cli"],
                          **{f"program/{room}": ["framework/server"] for room in
                             ("schema", "service_unpacker", "session", "payload", "invitation",
                              "waymark")},
                          "cli": ["plist", "framework/server", "framework/sandbox"]}.items():
    for path, name in included(folder):
        where = "include" if name.startswith("keelgate/") else name
        check(not any(f"{where}/".startswith(f"{other}/") for other in forbidden),
              f"{path.relative_to(root)} includes {name}")

# Schemas are data, so that what prints them links no decoder.
for path, name in included("program"):
    if re.search(r"schemas?\.h$|protocol_payload\.h$", path.name):
        check(re.fullmatch("[a-z_]+", name) or name.startswith("keelgate/")
              or re.search(r"schemas?\.h$|schema/values\.h$", name),
              f"{path.relative_to(root)} is not data alone: it includes {name}")

# No process that holds privileges has a parser of the network's formats in it.
for program in ("bin/keelgate", "lib/libkeelgate.so"):
    symbols = subprocess.run(["nm", "-C", build / program], capture_output=True, text=True)
    check(symbols.returncode == 0 and symbols.stdout, f"{program}: nm shows nothing")
    # The record of that name has no parser.
    check(not re.search(r"(?<!Keelgate::)\bPropertyList::", symbols.stdout),
          f"{program} has a property-list parser in it")
    # It counts for one message and one thread at a time.
    check(not re.search(r" T operator new\(unsigned long\)$", symbols.stdout, re.M),
          f"{program} allocates like a service")

# The writers serve tests and tools, never the service.
symbols = subprocess.run(["nm", "-C", build / "bin/VespKeelgateService"],
                         capture_output=True, text=True).stdout
check("PropertyList::Document" in symbols, "VespKeelgateService has no parser in it")
check(re.search(r" T operator new\(unsigned long\)$", symbols, re.M),
      "VespKeelgateService does not count what it allocates")
check("PropertyList::write" not in symbols, "VespKeelgateService has a writer in it")

# The public headers define macros of their own prefix alone.
for path in sources("include"):
    for name in re.findall(r"^#\s*define (\w+)", path.read_text(), re.M):
        check(name.startswith("KEELGATE_"), f"{path.relative_to(root)} defines {name}")

for folder in ("include", "text", "plist", "program", "framework", "cli", "tests", "fuzz", "bench",
               "examples"):
    for path in (root / folder).rglob("*"):
        if path.suffix in (".h", ".cpp"):
            text = path.read_text()
            check("SPDX-License-Identifier: Apache-2.0" in text.split("\n", 1)[0], f"{path}: no licence")
            check(len(text.splitlines()) <= 400, f"{path} is too long to read")

# What the pages point to is there; in the tour each row's function is in the file that it names.
for page in [*root.glob("*.md"), *(root / "docs").glob("*.md")]:
    text = page.read_text()
    for target in re.findall(r"\]\(([^)#:]+)(?:#[^)]*)?\)", text):
        check((page.parent / target).exists(), f"{page.name} points to {target}, which is not there")
    for target, function in re.findall(r"\]\(([^)#]+)\)(?: \| |,\s+)`([\w:]+)`",
                                       text):
        source = page.parent / target
        check(source.is_file() and re.search(rf"\b{function}\(", source.read_text()),
              f"{page.name}: {target} has no {function}")

for failure in failures:
    print(failure)
print("0 failed" if not failures else f"{len(failures)} failed")
sys.exit(bool(failures))
