#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# The example of docs/scale.md: a gearman job server on loopback, two workers, and jobs whose answers
# are those of a single command.
# usage: run.sh ROOT KEELGATE
set -euo pipefail
message=$(base64 -w 0 "$1/examples/messages/command-response.bplist")
keelgate=$2 port=$((20000 + $$ % 10000)) work=$(mktemp -d)
unpack=(gearman -h 127.0.0.1 -p "$port" -f unpack)
trap 'kill $(jobs -p); rm -r "$work"' EXIT
gearmand --listen=127.0.0.1 --port="$port" --log-file=stderr --verbose=FATAL &
until (: <>"/dev/tcp/127.0.0.1/$port") 2>/dev/null; do sleep 0.1; done
for worker in 1 2; do "${unpack[@]}" -w -- "$keelgate" stream & done
printf "{\"record\":\"VespCommandResponse\",\"message\":\"$message\",\"id\":%d}\n" {1..100} >"$work/requests"
split -l 20 -d "$work/requests" "$work/job"
for job in "$work"/job??; do
  "${unpack[@]}" <"$job" >"$job.answers" &
  asked+=($!)
done
wait "${asked[@]}"
cat "$work"/job??.answers | diff - <("$keelgate" stream <"$work/requests")
echo "100 passed, 0 failed"
