#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# A gearman job server on loopback with two workers that run `keelgate stream`: 1,000 messages, one
# worker killed on the way, every message answered once and as without them.
# usage: run.sh ROOT KEELGATE
set -euo pipefail
message=$(base64 -w 0 "$1/examples/messages/command-response.bplist")
keelgate=$2 port=$((20000 + $$ % 10000)) work=$(mktemp -d)
unpack=(gearman -h 127.0.0.1 -p "$port" -f unpack)
trap 'kill $(jobs -p); rm -r "$work"' EXIT

gearmand --listen=127.0.0.1 --port="$port" --log-file=stderr --verbose=FATAL &
until (: <>"/dev/tcp/127.0.0.1/$port") 2>/dev/null; do sleep 0.1; done
# In process groups of their own, so that a kill takes the command along, as a lost machine would.
set -m
"${unpack[@]}" -w -- "$keelgate" stream &
"${unpack[@]}" -w -- "$keelgate" stream &
lost=$!
set +m

for ((id = 0; id < 1000; ++id)); do
  printf '{"record":"VespCommandResponse","message":"%s","id":%d}\n' "$message" $id
done >"$work/requests"
split -l 20 -d "$work/requests" "$work/job"
for job in "$work"/job??; do
  "${unpack[@]}" <"$job" >"$job.answers" &
  asked+=($!)
  # After a tenth of the jobs, so that the worker dies with one in its hands.
  [ ${#asked[@]} != 5 ] || wait "${asked[@]}"
  [ ${#asked[@]} != 9 ] || kill -KILL -- "-$lost"
done
wait "${asked[@]}"
cat "$work"/job??.answers | diff - <("$keelgate" stream <"$work/requests")
echo "1000 passed, 0 failed"
