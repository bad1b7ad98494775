#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# Boots a small Debian with a real systemd as PID 1, installs the packages in it, and lets inside.py
# try the units there.
# usage: boot.sh ROOT PACKAGES WORK     (PACKAGES: the folder of the .deb files)
set -euo pipefail
root=$1 packages=$(realpath "$2") work=$3

skip() {
  echo "skipped: no systemd can be had as PID 1 here: $1"
  exit 0
}
[ "$(id -u)" -eq 0 ] || skip "only root can boot a container"
command -v systemd-nspawn >/dev/null || skip "systemd-nspawn is missing (systemd-container)"
command -v mmdebstrap >/dev/null || skip "mmdebstrap is missing"

rm -rf "$work"
mkdir -p "$work"
machine=$work/machine
mmdebstrap --quiet --variant=minbase --include=systemd,systemd-sysv,python3-minimal \
  --customize-hook="mkdir \"\$1/opt/packages\"" \
  --customize-hook="cp $packages/*.deb \"\$1/opt/packages\"" \
  --customize-hook='chroot "$1" sh -c "apt-get -qq install -y --no-install-recommends /opt/packages/*.deb"' \
  bookworm "$machine" >"$work/install.log" 2>&1 || { cat "$work/install.log"; exit 1; }
cp -r "$root/examples/messages" "$root/tests/activation/inside.py" "$machine/opt"
cat >"$machine/etc/systemd/system/inside.service" <<'UNIT'
[Service]
Type=oneshot
ExecStart=/usr/bin/python3 /opt/inside.py
StandardOutput=append:/opt/result
StandardError=journal
ExecStopPost=-/usr/bin/systemctl --no-block poweroff
UNIT

# Landlock is not among what a container may call by default. The second boot finds what the first one
# has set up.
cp -a "$machine" "$machine.fresh"
for log in first second; do
  timeout 180 systemd-nspawn --quiet --boot --register=no --keep-unit --private-network \
    --link-journal=no --console=read-only --directory="$machine" \
    --system-call-filter="landlock_create_ruleset landlock_add_rule landlock_restrict_self" \
    systemd.wants=inside.service </dev/null >"$work/$log.log" 2>&1 || true
  [ -e "$machine/opt/result" ] || { cat "$work/$log.log"; exit 1; }
done
result=$(cat "$machine/opt/result")
echo "$result"
rm -rf "$machine"
mv "$machine.fresh" "$machine"
[ "$(echo "$result" | grep -c ' passed, 0 failed$')" = 2 ]
