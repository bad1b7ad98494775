#!/bin/sh
# SPDX-License-Identifier: Apache-2.0
# link_check.sh OBEDIENT SHIPPED...: no shipped file carries the unpacker that obeys. The obedient
# service itself has to be found guilty first, or the check could not find anybody.
set -eu
guilty() { LC_ALL=C grep -q -a -E 'ObedientUnpacker|unpacker that obeys' "$1"; }

guilty "$1" || { echo "$1 carries no obedient unpacker: the check is blind" >&2; exit 1; }
shift
for file in "$@"; do
  test -f "$file" || { echo "$file does not exist" >&2; exit 1; }
  if guilty "$file"; then
    echo "$file carries the obedient unpacker" >&2
    exit 1
  fi
done
