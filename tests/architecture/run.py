#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Who may know whom, checked on the sources and on the built programs.

usage: run.py ROOT BUILD
"""
import pathlib
import re
import subprocess
import sys
import types

root, build = pathlib.Path(sys.argv[1]).resolve(), pathlib.Path(sys.argv[2])
failures = []
texts = {path: path.read_text() for folder in
         ("include", "text", "plist", "program", "framework", "cli", "tests", "fuzz", "bench",
          "examples")
         for path in sorted((root / folder).rglob("*")) if path.suffix in (".h", ".cpp")}
includes = {path: re.findall(r'^\s*#\s*include\s+["<]([^">]+)[">]', text, re.M)
            for path, text in texts.items()}
# What a file that includes this needs, for libraries that are not ours.
FOREIGN = {"gtest/": "GTest::gtest_main", "benchmark/": "benchmark::benchmark", "fmt/": "fmt::fmt",
           "CLI/": "CLI11::CLI11", "sodium.h": "PkgConfig::sodium", "expat.h": "EXPAT::EXPAT",
           "pugixml.hpp": "pugixml::pugixml"}


def check(sound, what):
    if not sound:
        failures.append(str(what).replace(f"{root}/", ""))


def names(links):
    return {re.sub(r"^Keelgate::(\w+)$", lambda match: f"keelgate_{match[1].lower()}", link)
            for link in links.split(";") if link and "LINK_ONLY" not in link}


def target(line):
    """One line of targets.txt."""
    name, folder, sources, links, interface = line.split("|")
    folder = pathlib.Path(folder)
    return types.SimpleNamespace(
        name=name, folder=folder, composed="$<TARGET_OBJECTS" in sources, public=names(interface),
        sources={(folder / source).resolve() for source in sources.split(";")
                 if source and "$<" not in source},
        library=name.startswith("keelgate_"), links=names(links) | names(interface))


def owner(header):
    """The target that names the header or compiles the source of its name; else the first library
    with sources in its folder; else the library without sources above it. None for what the
    programs of a folder share."""
    if found := next((one for one in targets.values()
                      if {header, header.with_suffix(".cpp")} & one.sources), None):
        return found
    shared = re.search(r"^test_|_testing\.h$", header.name)
    return next((one for inside in (True, False) for one in targets.values()
                 if one.library and not one.composed and not shared
                 and (any((source.parent, source.suffix) == (header.parent, ".cpp")
                          for source in one.sources) if inside
                      else not one.sources and one.folder in header.parents)), None)


def used(path, by, seen=frozenset()):
    """The targets that a file includes from, with the include. A header that no target owns counts
    as a part of the file that includes it."""
    for name in includes[path]:
        header = next((base / name for base in (root, root / "include", path.parent)
                       if base / name in texts), None)
        if header is None:
            yield from ((theirs, name) for start, theirs in FOREIGN.items() if name.startswith(start))
        elif owners[header] is None and header not in seen:
            yield from used(header, by, seen | {header})
        elif owners[header] not in (None, by):
            yield owners[header].name, name


def reach(links):
    """What links give: the targets themselves and what these pass on."""
    more = links.union(*(targets[link].public for link in links if link in targets))
    return links if more == links else reach(more)


# Link lines are the arrows: what a target's files include is what it links, no less and no more.
targets = {one.name: one
           for one in map(target, (build / "targets.txt").read_text().splitlines())}
owners = {path: owner(path) for path in texts if path.suffix == ".h"}
for one in targets.values():
    needed = {True: set(), False: set()}
    for path in one.sources | {path for path in owners if owners[path] is one}:
        public = path.suffix == ".h" and one.library
        for name, include in used(path, one):
            needed[public].add(name)
            check(name in reach(one.public if public else one.links), f"{path} includes {include}, "
                  f"but {one.name} does not link {name}{' PUBLIC' * public}")
    # More than is included from, or by headers.
    for links, reason in ((one.links, needed[True] | needed[False]), (one.public, needed[True])):
        check(one.composed or links <= reason, f"{one.name} need not link {links - reason}")

# What they must not say: the privileged side reads no format of the network, the parser knows no
# schema and no record, the framework no unpacker, and only `service/` the server.
ARROWS = {"plist": "include program framework fuzz tests", "text": "include plist program framework",
          "framework": "program plist cli",
          "framework/client": "framework/server framework/sandbox",
          "framework/sandbox": "framework/server framework/client framework/protocol framework/transport",
          "framework/transport": "framework/server framework/sandbox",
          "program": "framework/transport framework/sandbox framework/client cli",
          **{f"program/{room.name}": "framework/server" for room in (root / "program").iterdir()
             if room.is_dir() and room.name != "service"},
          "cli": "plist framework/server framework/sandbox"}
for folder, forbidden in ARROWS.items():
    for path, name in ((path, name) for path in texts if root / folder in path.parents
                       # The rooms that stand alone do so in their tests, too.
                       and (folder in ("text", "plist")
                            or not re.search("_test|test_", path.name)) for name in includes[path]):
        where = "include/" if name.startswith("keelgate/") else name
        check(not where.startswith(tuple(f"{other}/" for other in forbidden.split())),
              f"{path} includes {name}")

for path, text in texts.items():
    check("SPDX-License-Identifier: Apache-2.0" in text.split("\n", 1)[0], f"{path}: no licence")
    check(len(text.splitlines()) <= 400, f"{path} is too long to read")
    # Schemas are data, so that what prints them links no decoder.
    for name in includes[path] if re.search(r"/program/.*(schemas?|protocol_payload)\.h$",
                                            str(path)) else ():
        check(re.search(r"^[a-z_]+$|^keelgate/|schemas?\.h$|schema/values\.h$", name),
              f"{path} is not data alone: it includes {name}")
    # The public headers define macros of their own prefix alone.
    for name in re.findall(r"^#\s*define (?!KEELGATE_)\w+", text, re.M):
        check(root / "include" not in path.parents, f"{path}: {name}")

# No process that holds privileges has a parser of the network's formats in it, nor counts what it
# allocates, which is for one message and one thread at a time. The writers serve tests and tools,
# never the service; and the unpacker that obeys is found where it is, so that it would be elsewhere.
PARSER, WRITER, COUNTER = (r"(?<!Keelgate::)\bPropertyList::", "PropertyList::write",
                           r" T operator new\(unsigned long\)$")
OBEDIENT = "unpacker that obeys"
for program, there, absent in (
        ("bin/keelgate", (), (PARSER, COUNTER, OBEDIENT)),
        ("lib/libkeelgate.so", (), (PARSER, COUNTER, OBEDIENT)),
        ("bin/VespKeelgateService", ("PropertyList::Document", COUNTER), (WRITER, OBEDIENT)),
        ("bin/obedient_service", (OBEDIENT,), ())):
    listed = subprocess.run(["nm", "-C", build / program], capture_output=True, text=True)
    check(listed.returncode == 0 and listed.stdout, f"{program}: nm shows nothing")
    seen = listed.stdout + OBEDIENT * (OBEDIENT.encode() in (build / program).read_bytes())
    for pattern in (*there, *absent):
        check(bool(re.search(pattern, seen, re.M)) == (pattern in there),
              f"{program} has {'no' if pattern in there else 'a'} {pattern}")

# What the pages point to is there; in the tour each row's function is in the file that it names.
for page in [*root.glob("*.md"), *(root / "docs").glob("*.md")]:
    text = page.read_text()
    for there in re.findall(r"\]\(([^)#:]+)(?:#[^)]*)?\)", text):
        check((page.parent / there).exists(), f"{page.name} points to {there}, which is not there")
    for there, function in re.findall(r"\]\(([^)#]+)\)(?: \| |,\s+)`([\w:]+)`", text):
        source = page.parent / there
        check(source.is_file() and re.search(rf"\b{function}\(", source.read_text()),
              f"{page.name}: {there} has no {function}")

print(*failures, f"{len(failures)} failed", sep="\n")
sys.exit(bool(failures))
