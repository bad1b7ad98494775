# SPDX-License-Identifier: Apache-2.0
"""Run by systemd inside the machine that boot.sh made: the units as an administrator meets them."""
import os
import pathlib
import socket
import subprocess
import time

UNPACK = ["keelgate", "unpack", "--record", "VespCommandResponse",
          "/opt/messages/command-response.xml", "--connect"]
SHARED = "/run/keelgate/socket"
counts = {True: 0, False: 0}


def check(sound, what):
    counts[bool(sound)] += 1
    if not sound:
        print(f"failed: {what}", flush=True)


def run(*words, **options):
    return subprocess.run([str(word) for word in words], capture_output=True, text=True, **options)


def unpacks(place, *more, **options):
    done = run(*UNPACK, place, *more, **options)
    return done.returncode == 0 and done.stdout.startswith('{"record":"VespCommandResponse"')


def shown(unit, name):
    return run("systemctl", "show", "--value", "-p", name, unit).stdout.strip()


def idle(place, **options):
    """A client that has a service and gives it nothing to do, once it has one."""
    client = subprocess.Popen(["keelgate", "stream", "--processes", "1", "--connect", place],
                              stdin=subprocess.PIPE, stdout=subprocess.PIPE,
                              stderr=subprocess.DEVNULL, text=True, **options)
    client.stdin.write("?\n")
    client.stdin.flush()
    return client if client.stdout.readline() else None


def instances():
    listed = run("systemctl", "list-units", "--plain", "--no-legend", "keelgate@*.service").stdout
    return [line.split()[0] for line in listed.splitlines()]


def settle():
    """Until the services of those who have left are gone, which on a slow machine takes a while."""
    deadline = time.monotonic() + 60
    while instances() and time.monotonic() < deadline:
        time.sleep(0.1)


def layers_and_root():
    check(unpacks(SHARED, "--require-layers"), "all layers through the socket")
    client = idle(SHARED)
    launcher = shown(instances()[0], "MainPID")
    seen = pathlib.Path(f"/proc/{launcher}/root")
    check(sorted(os.listdir(seen)) == ["dev", "proc", "run", "sys", "usr"], "its root directory")
    check([str(path.relative_to(seen)) for path in seen.glob("usr/**/*") if path.is_file()]
          == ["usr/libexec/keelgate/VespKeelgateService"], "the files in it")
    user = run("id", "-u", "_keelgate").stdout.strip()
    identity = pathlib.Path(f"/proc/{launcher}/status").read_text()
    check(user and f"Uid:\t{user}\t{user}" in identity, "the service's user")
    check("CapBnd:\t0000000000000000" in identity, "its capabilities")
    check(shown(instances()[0], "OOMPolicy") == "continue", "what a worker without memory costs")
    check(shown("keelgate.slice", "MemoryMax") != "infinity", "the memory of all")
    client.communicate()


def bursts():
    bare = [socket.socket(socket.AF_UNIX, socket.SOCK_SEQPACKET) for _ in range(400)]
    for one in bare:
        one.settimeout(5)
        try:
            one.connect(SHARED)
        except OSError:
            pass
    for one in bare:
        one.close()
    settle()
    check(shown("keelgate.socket", "ActiveState") == "active", "the socket after a burst")
    check(unpacks(SHARED), "a client after a burst")


def groups_and_users():
    run("groupadd", "keelgate")
    for name in ("alice", "bob", "carol"):
        run("useradd", name)
    run("usermod", "-aG", "keelgate", "carol")
    folder = pathlib.Path("/etc/systemd/system/keelgate.socket.d")
    folder.mkdir()
    (folder / "group.conf").write_text("[Socket]\nSocketGroup=keelgate\n")
    run("systemctl", "daemon-reload")
    run("systemctl", "restart", "keelgate.socket")
    check(unpacks(SHARED), "root, with a group named keelgate")
    check(unpacks(SHARED, user="carol", extra_groups=["keelgate"]), "a member of the group")
    check(not unpacks(SHARED, user="alice", extra_groups=[]), "a user outside of the group")

    run("systemctl", "start", "keelgate@alice.socket", "keelgate@bob.socket")
    check(not unpacks("/run/keelgate/bob", user="alice", extra_groups=[]), "another's socket")
    held = [idle("/run/keelgate/alice", user="alice", extra_groups=[]) for _ in range(16)]
    check(all(held), "as many connections as a user may have")
    refused = run(*UNPACK, "/run/keelgate/alice", user="alice", extra_groups=[])
    check(refused.returncode == 3 and refused.stderr.startswith("keelgate: the service could not be"),
          f"one more: {refused.stderr}")
    check(unpacks("/run/keelgate/bob", user="bob", extra_groups=[]), "another user meanwhile")
    for client in held:
        client.communicate()


def packages():
    client = idle(SHARED)
    again = run("dpkg", "-i", *pathlib.Path("/opt/packages").glob("keelgate_*.deb"))
    check(again.returncode == 0, again.stderr)
    client.stdin.write("?\n")
    client.stdin.flush()
    check(client.stdout.readline(), "a client while the package is upgraded")
    check(unpacks(SHARED), "a client after it")
    gone = run("dpkg", "-r", "python3-keelgate", "libkeelgate-dev", "libkeelgate0", "keelgate")
    check(gone.returncode == 0, gone.stderr)
    check(not instances() and not os.path.exists(SHARED), "what runs after the removal")
    check(shown("keelgate.socket", "LoadState") == "not-found", "the unit after the removal")
    check(not list(pathlib.Path("/etc/systemd/system").rglob("sockets.target.wants/keelgate*")),
          "links after the removal")
    client.kill()


def first_boot():
    check(run("systemctl", "is-active", "keelgate.socket").stdout.strip() == "inactive",
          "nothing listens before somebody wants it")
    run("systemctl", "enable", "--now", "keelgate.socket", "keelgate@bob.socket")


def second_boot():
    check(unpacks(SHARED, "--require-layers"), "the socket after a reboot")


REBOOTED = pathlib.Path("/opt/rebooted")
tests = ((second_boot, packages) if REBOOTED.exists() else
         (first_boot, layers_and_root, bursts, groups_and_users))
for test in tests:
    try:
        test()
    except Exception as error:  # The others are worth seeing all the same.
        check(False, f"{test.__name__}: {error!r}")
print(f"{counts[True]} passed, {counts[False]} failed")
REBOOTED.touch()
