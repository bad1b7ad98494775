#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# Makes the container image and runs it under our profile and under none. What becomes of the service
# under profiles that lack something, the tests of containment show.
# usage: run.sh ROOT PACKAGE WORK
set -euo pipefail
root=$(realpath "$1") package=$(realpath "$2") work=$(realpath "$3")
image=$work/image bundle=$work/bundle

skip() {
  echo "skipped: no container can be run here: $1"
  exit 0
}
for tool in mmdebstrap umoci runc jq; do
  command -v "$tool" >/dev/null || skip "$tool is missing"
done
[ "$(id -u)" -eq 0 ] || skip "runc is run as root here"

rm -rf "$work"
mkdir -p "$work"
"$root/packaging/container/build" "$package" "$image"
umoci unpack --image "$image:keelgate" "$bundle"
cp "$bundle/config.json" "$work/made.json"

# The image as it should be run: nobody, no capability, nothing to write to, no network.
run() {
  jq '.process += {terminal: false, noNewPrivileges: true, capabilities: {},
        args: (["/usr/bin/keelgate"] + $words)}
      | .root.readonly = true | .linux += $profile[0]' \
    --slurpfile profile "$work/profile.json" --argjson words "$1" "$work/made.json" \
    >"$bundle/config.json"
  runc run --bundle "$bundle" "keelgate-$$"
}
echo '{}' >"$work/profile.json"
run '["--version"]' >/dev/null 2>"$work/log" || skip "runc says $(cat "$work/log")"
for profile in "$(jq '{seccomp: .}' "$root/packaging/container/seccomp.json")" '{}'; do
  echo "$profile" >"$work/profile.json"
  run '["unpack", "--record", "VespCommandResponse", "--require-layers"]' \
    <"$root/examples/messages/command-response.xml" | grep '^{"record":"VespCommandResponse"'
done
echo "2 passed, 0 failed"
