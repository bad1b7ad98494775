#!/bin/sh
# SPDX-License-Identifier: Apache-2.0
# Installs a build into an empty folder and uses it from C and from Python, as an installed tree and
# as a wheel in a fresh environment.
# usage: run.sh ROOT BUILD WORK
set -eu
root=$1 build=$2 work=$3
rm -rf "$work"
mkdir -p "$work"
prefix=$work/prefix
cmake --install "$build" --prefix "$prefix" >"$work/install.log"
libraries=$(dirname "$(find "$prefix" -name libkeelgate.so)")
service=$prefix/libexec/keelgate/VespKeelgateService

cc -std=c11 -Wall -Wextra -Wpedantic -Wconversion -Werror \
  -I"$prefix/include" "$root/tests/bindings/keelgate_test.c" -L"$libraries" -lkeelgate \
  -o "$work/keelgate_test"
LD_LIBRARY_PATH=$libraries "$work/keelgate_test" "$service"

cc -std=c11 -Wall -Wextra -Wpedantic -Wconversion -Werror \
  -I"$prefix/include" "$root/examples/unpack.c" -L"$libraries" -lkeelgate -o "$work/unpack"
LD_LIBRARY_PATH=$libraries "$work/unpack" "$root/examples/messages/push-payload.bplist" |
  grep -q '^{"record":"PulseUserPayload","value":{"command":100,'

symbols=$(nm -D --defined-only "$libraries/libkeelgate.so" | awk '/ keelgate_/ {print $3}' | sed 's/@.*//' | sort)
[ "$symbols" = "$(sort "$root/tests/bindings/symbols.txt")" ] ||
  { printf 'The C interface exports\n%s\n' "$symbols"; exit 1; }

python3 "$root/tests/bindings/abi.py" "$root" "$work"

export KEELGATE_MESSAGES="$root/examples/messages"
python=/usr/bin/python3
echo "The package of the installed tree"
PYTHONPATH=$prefix/lib/python3/dist-packages $python -m pytest -q -p no:cacheprovider \
  "$root/tests/bindings"

PYTHONPATH=$prefix/lib/python3/dist-packages $python "$root/examples/unpack.py" \
  "$root/examples/messages/sample-message.xml" | grep -q "rtc-tester & friends"

echo "The wheel, in an environment of its own"
"$root/scripts/wheel" "$prefix" "$work/dist"
$python -m venv --system-site-packages "$work/venv"
"$work/venv/bin/pip" install --quiet --no-index --no-deps "$work"/dist/keelgate-*.whl
"$work/venv/bin/python" -m pytest -q -p no:cacheprovider "$root/tests/bindings"
