#!/bin/sh
# SPDX-License-Identifier: Apache-2.0
# A service that init starts for each connection: the command uses it through --connect, many
# connections at once, and a crashed one harms no other.
# usage: run.sh ROOT KEELGATE SERVICE
set -eu
root=$1 keelgate=$2 service=$3
work=$(mktemp -d)
systemd-socket-activate --seqpacket --accept --listen="$work/socket" "$service" 2>"$work/log" &
activator=$!
trap 'kill $activator 2>/dev/null; rm -rf "$work"' EXIT
tries=0
until [ -S "$work/socket" ]; do
  tries=$((tries + 1))
  [ $tries -lt 100 ] || { cat "$work/log"; exit 1; }
  sleep 0.1
done

unpack() {
  "$keelgate" unpack --connect "$work/socket" --record VespCommandResponse \
    "$root/examples/messages/command-response.xml"
}
expected=$("$keelgate" unpack --service-path "$service" --record VespCommandResponse \
  "$root/examples/messages/command-response.xml")

for i in 1 2 3 4 5 6 7 8; do
  unpack >"$work/$i" &
  clients="${clients:-} $!"
done
for client in $clients; do wait "$client"; done
passed=0
for i in 1 2 3 4 5 6 7 8; do
  [ "$(cat "$work/$i")" = "$expected" ] || { echo "client $i: $(cat "$work/$i")"; exit 1; }
  passed=$((passed + 1))
done

"$keelgate" --version --verbose --connect "$work/socket" >"$work/report"
grep -q 'strict system call filter *present' "$work/report" || { cat "$work/report"; exit 1; }
echo "$((passed + 1)) passed, 0 failed"
