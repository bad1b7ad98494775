#!/usr/bin/python3
# SPDX-License-Identifier: Apache-2.0
"""Unpacks any property list: unpack.py FILE"""
import sys

import keelgate

try:
    with open(sys.argv[1], "rb") as file, keelgate.Client() as client:
        print(client.unpack("PropertyList", file.read()))
except (IndexError, OSError, keelgate.Error) as error:
    sys.exit(f"{sys.argv[0]}: {error}")
