#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Adds a throw-away kind of message to a copy of the tree, by the five steps of CONTRIBUTING.md and
nothing else, builds the copy and unpacks a message of that kind through its service.

usage: run.py ROOT FOLDER [cmake arguments]
"""
import json
import pathlib
import re
import shutil
import subprocess
import sys

root, copy = pathlib.Path(sys.argv[1]), pathlib.Path(sys.argv[2])
# Steps 1 to 3 are those of a kind that exists, under another name and with other fields.
KIND = "vesp_command_response"
FIELDS = {"include/keelgate/records/{}.h": "(String, place),\n      (Optional<Double>, degrees)",
          "program/{}_schema.h": '(String, place, "p"),\n      (Optional<Double>, degrees, "d")',
          "program/{}_unpacker.h": None, "program/{}_unpacker.cpp": None}

# A file, what stands there, and what takes its place.
EDITS = [
    ("include/keelgate/records.h", "#include <keelgate/records/vesp_invitation.h>\n",
     "#include <keelgate/records/vesp_invitation.h>\n#include <keelgate/records/vesp_weather.h>\n"),
    ("include/keelgate/records.h", "PropertyList, Vesp", "PropertyList, VespWeather, Vesp"),
    ("program/service/tables.h", "PropertyListUnpacker>",
     "PropertyListUnpacker, VespWeatherUnpacker>"),
    ("program/service/tables.h", '#include "program/waymark/waymark_message_unpacker.h"\n',
     '#include "program/waymark/waymark_message_unpacker.h"\n'
     '#include "program/weather/vesp_weather_unpacker.h"\n'),
    ("program/CMakeLists.txt", "keelgate_library(program\n",
     "keelgate_library(weather SOURCES weather/vesp_weather_unpacker.cpp\n"
     "  PUBLIC Keelgate::contracts Keelgate::schema)\nkeelgate_library(program\n"),
    ("program/CMakeLists.txt", "Keelgate::property_list Keelgate::server",
     "Keelgate::property_list Keelgate::weather Keelgate::server"),
]

MESSAGE = "<plist><dict><key>p</key><string>Ulm</string><key>d</key><real>-2.5</real></dict></plist>"
EXPECTED = {"record": "VespWeather", "value": {"place": "Ulm", "degrees": -2.5}}


def run(*command, **options):
    done = subprocess.run([str(part) for part in command], capture_output=True, text=True, **options)
    if done.returncode != 0:
        sys.exit(f"{command}\n{done.stdout[-4000:]}{done.stderr[-4000:]}")
    return done.stdout


shutil.rmtree(copy, ignore_errors=True)
for name in run("git", "-C", root, "ls-files", "-co", "--exclude-standard").splitlines():
    if (root / name).is_file():
        (copy / name).parent.mkdir(parents=True, exist_ok=True)
        shutil.copy2(root / name, copy / name)
for pattern, fields in FIELDS.items():
    text = (root / pattern.format(KIND).replace("program/", "program/payload/")).read_text()
    for there, then in ((KIND, "vesp_weather"), ("VespCommandResponse", "VespWeather"),
                        ("program/payload/", "program/weather/")):
        text = text.replace(there, then)
    if fields:
        text = re.sub(r"(VespWeather\w*,\n +)\(.*\)(?=\);\n};)", lambda m: m[1] + fields, text,
                      flags=re.S)
    made = copy / pattern.format("vesp_weather").replace("program/", "program/weather/")
    made.parent.mkdir(exist_ok=True)
    made.write_text(text)
for name, there, then in EDITS:
    text = (copy / name).read_text()
    if text.count(there) != 1:
        sys.exit(f"{name} no longer has: {there}")
    (copy / name).write_text(text.replace(there, then))

build = copy / "build"
run("cmake", "-S", copy, "-B", build, "-G", "Ninja", "-DCMAKE_BUILD_TYPE=Debug",
    "-DKEELGATE_TESTS=OFF", *sys.argv[3:])
run("cmake", "--build", build, "--target", "keelgate", "VespKeelgateService")
keelgate = build / "bin/keelgate"
told = json.loads(run(keelgate, "unpack", "--record", "VespWeather", "-", input=MESSAGE))
described = json.loads(run(keelgate, "describe", "VespWeatherSchema", "--json"))
keys = [field["key"] for field in described["schemas"]["VespWeatherSchema"]]
if told != EXPECTED or keys != ["p", "d"]:
    sys.exit(f"the message gave {told}, and its keys are {keys}")
print("the new kind of message is unpacked and described")
