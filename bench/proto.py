#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Writes the schemas of the benchmark as protobuf messages, from what the built command says of them.

usage: proto.py KEELGATE FILE
A field's number is its position, counted from 1: that is how the benchmark finds it.
"""
import json
import pathlib
import subprocess
import sys

ROOTS = ["VespOstrelProtocolPayload", "WaymarkSchema", "VespSampleMessageSchema"]
TYPES = {"int": "int64", "uint": "uint64", "data": "bytes", "date": "double", "uuid": "bytes"}

keelgate, target = sys.argv[1:]
told = subprocess.run([keelgate, "describe", "--json"], capture_output=True, check=True)
schemas = json.loads(told.stdout)["schemas"]

text = 'syntax = "proto2";\npackage bench;\n'
wanted = list(ROOTS)
for name in wanted:
    text += f"\nmessage {name} {{\n"
    for number, field in enumerate(schemas[name], 1):
        kind = field["type"].strip("[]")
        if kind in schemas and kind not in wanted:
            wanted.append(kind)
        rule = "repeated" if field["type"] != kind else \
            "required" if field["required"] else "optional"
        text += f"  {rule} {TYPES.get(kind, kind)} {field['field']} = {number};\n"
    text += "}\n"
pathlib.Path(target).write_text(text)
