#!/bin/sh
# SPDX-License-Identifier: Apache-2.0
# The first process of an emulated machine: takes the steps that its kernel's command line names,
# each as root or as nobody, and switches the machine off.
# usage: inside.sh answers | layers | same | test NAME     a step by itself, on any machine

# The same on every machine: each example by itself, and some hundred messages as a stream.
answers() {
  while read -r name how; do
    case $name in
      '' | '#'*) continue ;;
      *.*) files=$name ;;
      *) files="$name.xml $name.bplist" ;;
    esac
    for file in $files; do
      # shellcheck disable=SC2086
      ./keelgate unpack --time-limit 60 --quiet $how "messages/$file" 2>&1
      echo "status $?"
    done
  done <messages/index.txt
  ./keelgate stream --quiet --time-limit 60 <requests
  echo "status $?"
}

same() {
  answers | diff expected -
}
layers() {
  ./keelgate --version --verbose
}
test_program() {
  "$(dirname "$(readlink -f keelgate)")/../tests/$1_test"
}

case ${1:-} in
  '') ;;
  test) test_program "$2"; exit ;;
  *) "$1"; exit ;;
esac

export PATH=/usr/sbin:/usr/bin:/sbin:/bin GTEST_COLOR=no
cd /opt/kernels || exit
mount -t proc proc /proc
mount -t sysfs sysfs /sys
mkdir -p /tmp /var/tmp
for folder in /tmp /var/tmp /dev/shm; do
  mkdir -p $folder && mount -t tmpfs tmpfs $folder
done
ip link set lo up
for switch in $(echo "${switches:-}" | tr , ' '); do sysctl -qw "$switch"; done
for step in $(echo "${steps:-}" | tr , ' '); do
  as=
  [ "${step#*:}" = root ] || as="setpriv --reuid=65534 --regid=65534 --clear-groups"
  echo "== $step"
  from=$(cut -d . -f 1 /proc/uptime)
  # shellcheck disable=SC2046
  $as sh ./inside.sh $(echo "${step%:*}" | tr + ' ') 2>&1
  echo "== $step: $? ($(($(cut -d . -f 1 /proc/uptime) - from)) s)"
done
busybox poweroff -f
