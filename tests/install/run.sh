#!/bin/sh
# SPDX-License-Identifier: Apache-2.0
# Installs a build into an empty folder, and makes the Debian package; then is the user of both:
# a foreign project finds the client by CMake and by pkg-config, and unpacks a message with it.
# usage: run.sh ROOT BUILD WORK COMPILER
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

DESTDIR=$work/tree cmake --install "$build" >"$work/install.log"
prefix=$work/tree$(sed -n 's/^CMAKE_INSTALL_PREFIX:PATH=//p' "$build/CMakeCache.txt")
libraries=$(dirname "$(find "$prefix" -name libkeelgate.so)")
service=$prefix/libexec/keelgate/VespKeelgateService

cmake -S "$root/tests/install" -B "$work/cmake" -G Ninja -DSOURCE="$root/examples/unpack.cpp" \
  -DCMAKE_CXX_COMPILER="$compiler" -DCMAKE_CXX_STANDARD=20 -DCMAKE_PREFIX_PATH="$prefix" \
  >"$work/cmake.log"
cmake --build "$work/cmake" >>"$work/cmake.log"
# An unpacked tree is not where its libexec folder was compiled in: the service stands beside.
cp "$service" "$work/cmake/"
expect "found by CMake" "$("$work/cmake/foreign" "$message")" "$expected"

flags=$(PKG_CONFIG_PATH=$libraries/pkgconfig PKG_CONFIG_SYSROOT_DIR=$work/tree \
  pkg-config --cflags --libs keelgate)
# shellcheck disable=SC2086
"$compiler" -std=c++20 "$root/examples/unpack.cpp" $flags -o "$work/cmake/by-pkg-config"
expect "found by pkg-config" \
  "$(LD_LIBRARY_PATH=$libraries "$work/cmake/by-pkg-config" "$message")" "$expected"

other=$(nm -DC --defined-only "$libraries/libkeelgate.so" | awk '{$1=$2=""; print}' |
  grep -vE 'Keelgate::|VespKeelgateService::|^ *KEELGATE' || true)
expect "exports beside the API" "$other" ""
expect "the library's name" \
  "$(objdump -p "$libraries/libkeelgate.so" | awk '$1 == "SONAME" {print $2}')" libkeelgate.so.0

cd "$work"
cpack -G DEB --config "$build/CPackConfig.cmake" >cpack.log
package=$(ls "$work"/keelgate_*.deb)
dpkg-deb -x "$package" "$work/deb"
for file in bin/keelgate libexec/keelgate/VespKeelgateService share/man/man1/keelgate.1 \
  share/man/man8/VespKeelgateService.8 share/bash-completion/completions/keelgate \
  lib/systemd/system/keelgate.socket lib/systemd/system/keelgate@.service; do
  expect "$file" "$(cd "$work/deb/usr" && ls "$file"* | head -n 1 | sed 's/\.gz$//')" "$file"
done
expect "the packaged command" \
  "$("$work/deb/usr/bin/keelgate" unpack --record VespCommandResponse \
    --service-path "$work/deb/usr/libexec/keelgate/VespKeelgateService" \
    "$root/examples/messages/command-response.xml" | cut -c 1-32)" \
  '{"record":"VespCommandResponse",'

expect "the unit starts what is packaged" \
  "$(sed -n 's/^ExecStart=//p' "$work/deb/usr/lib/systemd/system/keelgate@.service")" \
  /usr/libexec/keelgate/VespKeelgateService

exposure=$(systemd-analyze security --offline=yes --threshold=3 \
  "$work/deb/usr/lib/systemd/system/keelgate@.service" | sed -n 's/.*exposure level.*: \([0-9.]*\).*/\1/p')
expect "exposure of the unit, at most 0.3" \
  "$(printf '%s' "$exposure" | awk '{print ($1 != "" && $1 <= 0.3)}')" 1

echo "$passed passed, 0 failed"
