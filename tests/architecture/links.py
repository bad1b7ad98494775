# SPDX-License-Identifier: Apache-2.0
"""Link lines are the arrows: what a target's files include is what it links, no less and no more."""
import itertools
import pathlib
import re

# What a file that includes this needs, for libraries that are not ours.
FOREIGN = {"gtest/": "GTest::gtest_main", "benchmark/": "benchmark::benchmark", "fmt/": "fmt::fmt",
           "CLI/": "CLI11::CLI11", "sodium.h": "PkgConfig::sodium", "expat.h": "EXPAT::EXPAT",
           "pugixml.hpp": "pugixml::pugixml"}


class Target:
    """One line of targets.txt, with the headers that belong to it."""

    def __init__(self, line):
        self.name, folder, sources, links, interface = line.split("|")
        self.folder = pathlib.Path(folder)
        self.sources = [(self.folder / source).resolve()
                        for source in sources.split(";") if source and "$<" not in source]
        self.headers = {source for source in self.sources if source.suffix == ".h"}
        self.composed = "$<TARGET_OBJECTS" in sources
        self.library = self.name.startswith("keelgate_")
        self.public = {plain(link) for link in interface.split(";")
                       if link and "LINK_ONLY" not in link}
        self.links = {plain(link) for link in links.split(";") if link} | self.public


def plain(link):
    return re.sub(r"^Keelgate::(\w+)$", lambda match: f"keelgate_{match[1].lower()}", link)


def includes(path):
    return re.findall(r'^\s*#\s*include\s+["<]([^">]+)[">]', path.read_text(), re.M)


class Tree:
    def __init__(self, root, lines):
        self.root = root
        self.targets = {target.name: target
                        for target in (Target(line) for line in lines)}
        self.failures = []
        self.owners = {}
        for path in sorted(root.rglob("*.h")):
            if "build" not in path.relative_to(root).parts:
                self.owners[path] = self.owner(path)

    def owner(self, header):
        """The target that names the header; else the one that compiles the source of its name; else
        the first library with sources in its folder; else the library without sources above it.
        None for what the programs of a folder share."""
        targets = self.targets.values()
        libraries = [] if re.search(r"^test_|_testing\.h$", header.name) else \
            [target for target in targets if target.library and not target.composed]
        return next(itertools.chain(
            (target for target in targets if header in target.headers),
            (target for target in targets if header.with_suffix(".cpp") in target.sources),
            (target for target in libraries
             if any(source.parent == header.parent and source.suffix == ".cpp"
                    for source in target.sources)),
            (target for target in libraries
             if not target.sources and target.folder in header.parents)), None)

    def fail(self, path, what):
        self.failures.append(f"{path.relative_to(self.root)} {what}")

    def resolve(self, path, name):
        for base in (self.root, self.root / "include", path.parent):
            if (base / name).is_file():
                return (base / name).resolve()
        return None

    def used(self, path, target, seen):
        """The targets that a file includes from, with the include. A header that no target owns
        counts as a part of the file that includes it."""
        for name in includes(path):
            header = self.resolve(path, name)
            if header is None:
                for prefix, foreign in FOREIGN.items():
                    if name.startswith(prefix):
                        yield foreign, name
            elif self.owners[header] is not None:
                if self.owners[header] is not target:
                    yield self.owners[header].name, name
            elif header not in seen:
                seen.add(header)
                yield from self.used(header, target, seen)

    def reach(self, links):
        """What links give: the targets themselves and what these pass on."""
        found = set()
        while links:
            name = links.pop()
            found.add(name)
            if name in self.targets:
                links |= self.targets[name].public - found
        return found

    def check(self):
        for target in self.targets.values():
            if target.composed or not (target.sources or target.links):
                continue
            headers = [path for path, owner in self.owners.items() if owner is target]
            needed = {"public": set(), "private": set()}
            for path in [*headers, *(s for s in target.sources if s.suffix != ".h")]:
                for name, include in self.used(path, target, set()):
                    kind = "public" if path.suffix == ".h" and target.library else "private"
                    needed[kind].add(name)
                    allowed = self.reach(set(target.public if kind == "public" else target.links))
                    if name not in allowed:
                        self.fail(path, f"includes {include}, but {target.name} does not link {name}"
                                  + (" PUBLIC" if name in self.reach(set(target.links)) else ""))
            for link in sorted(target.links - needed["public"] - needed["private"]):
                self.failures.append(f"{target.name} links {link} and includes nothing of it")
            for link in sorted(target.public & needed["private"] - needed["public"]):
                self.failures.append(f"{target.name} links {link} PUBLIC, but no header needs it")
        return self.failures
