#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# Installs a build into an empty folder, and makes the Debian packages; then is the user of both: a
# foreign project finds the client by CMake and by pkg-config, or builds it as a part of itself, and
# unpacks a message with it.
# usage: run.sh ROOT BUILD WORK COMPILER     (BUILD: of the preset "package")
set -eu
root=$1 build=$2 work=$3 compiler=$4
rm -rf "$work"
mkdir -p "$work"
message=$root/examples/messages/push-payload.bplist
expected="command 100, 2 messages inside"

expect() {
  [ "$2" = "$3" ] || { printf '%s: got "%s"\n' "$1" "$2"; exit 1; }
  passed=$((${passed:-0} + 1))
}

# Configured for /usr, installed elsewhere, and moved from there.
cmake --install "$build" --prefix "$work/first" >"$work/install.log"
mv "$work/first" "$work/tree"
prefix=$work/tree
libraries=$(dirname "$(find "$prefix" -name libkeelgate.so)")

configure() {
  cmake -S "$root/tests/install" -B "$work/$1" -G Ninja -DSOURCE="$root/examples/unpack.cpp" \
    -DCMAKE_CXX_COMPILER="$compiler" -DCMAKE_CXX_STANDARD=20 "${@:2}" >"$work/$1.log"
  cmake --build "$work/$1" >>"$work/$1.log" || { cat "$work/$1.log"; exit 1; }
}
configure found -DCMAKE_PREFIX_PATH="$prefix"
expect "found by CMake" "$("$work/found/foreign" "$message")" "$expected"

flags=$(PKG_CONFIG_PATH=$libraries/pkgconfig pkg-config --cflags --libs keelgate)
# shellcheck disable=SC2086
"$compiler" -std=c++20 "$root/examples/unpack.cpp" $flags -o "$work/by-pkg-config"
expect "found by pkg-config" \
  "$(LD_LIBRARY_PATH=$libraries "$work/by-pkg-config" "$message")" "$expected"
# shellcheck disable=SC2086
expect "an older C++ is told" "$("$compiler" -std=c++17 -fsyntax-only "$root/examples/unpack.cpp" \
  $flags 2>&1 | grep -om 1 "Keelgate's headers need C++20")" "Keelgate's headers need C++20"

# As a distribution would: its own hardening level, no warning an error, one static program.
configure part -DKEELGATE_TREE="$root" -DBUILD_SHARED_LIBS=OFF -DCMAKE_BUILD_TYPE=Release \
  -DCMAKE_CXX_FLAGS="-D_FORTIFY_SOURCE=3 -Wunused-macros"
expect "a part of another project" "$("$work/part/foreign" "$message")" "$expected"
expect "and nothing else of it" "$(find "$work/part" -name keelgate -type f -perm -1)" ""

other=$(nm -DC --defined-only "$libraries/libkeelgate.so" | awk '{$1=$2=""; print}' |
  grep -vE 'Keelgate::|VespKeelgateService::|^ *KEELGATE|^ *keelgate_' || true)
expect "exports beside the API" "$other" ""

# A stranger's service beside a copy of the command: as root nobody else's is started.
unpack="unpack --record VespCommandResponse $root/examples/messages/command-response.xml"
# shellcheck disable=SC2086
expect "the moved command" "$("$prefix/bin/keelgate" $unpack | cut -c 1-32)" \
  '{"record":"VespCommandResponse",'
if [ "$(id -u)" -eq 0 ]; then
  cp -r "$prefix" "$work/strange"
  chown 12345 "$work/strange/libexec/keelgate"
  # shellcheck disable=SC2086
  expect "a stranger's service" \
    "$("$work/strange/bin/keelgate" $unpack 2>&1 | grep -c 'belongs to user 12345')" 1
fi

(cd "$work" && cpack -G DEB --config "$build/CPackConfig.cmake" -B "$work/packages" >cpack.log) ||
  { cat "$work/cpack.log"; exit 1; }
complaints=$(lintian --allow-root --fail-on error,warning "$work"/packages/*.deb 2>&1 |
  grep '^[EW]:' || true)
expect "lintian" "$complaints" ""
for package in keelgate libkeelgate0 libkeelgate-dev python3-keelgate; do
  dpkg-deb -x "$work/packages/${package}_"*.deb "$work/deb"
done
expect "the packaged command" "$("$work/deb/usr/bin/keelgate" $unpack | cut -c 1-32)" \
  '{"record":"VespCommandResponse",'
expect "the packaged Python package" \
  "$(PYTHONPATH=$work/deb/usr/lib/python3/dist-packages /usr/bin/python3 -c \
    'import keelgate; print(keelgate.__version__)')" "$("$work/deb/usr/bin/keelgate" --version | sed 's/^keelgate //')"
depends=$(dpkg-deb -f "$work"/packages/libkeelgate0_*.deb Depends)
expect "the library's dependencies" \
  "$(echo "$depends" | grep -c '^keelgate (= .*libstdc++6')" 1
# Some kernels give a program of 2 MiB and more nine bits of randomness less.
expect "the service is smaller than 2 MiB" \
  "$(($(size -A "$work/deb/usr/libexec/keelgate/VespKeelgateService" | awk '/^Total/ {print $2}') < 2 << 20))" 1

echo "$passed passed, 0 failed"
