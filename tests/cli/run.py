#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""The built command, end to end: exit statuses, what goes to which stream, order, and long streams.

usage: run.py ROOT KEELGATE FAKE_SERVICE
"""
import base64
import json
import os
import pathlib
import pty
import shutil
import struct
import subprocess
import sys
import tempfile
import threading

root, keelgate, fake = pathlib.Path(sys.argv[1]), sys.argv[2], sys.argv[3]
messages = root / "examples/messages"
failures = []
count = 0


def check(sound, what):
    global count
    count += 1
    if not sound:
        failures.append(what)
        print("FAILED:", what)


def heard(said):
    """What the command said, but for the line of a service that lacks a wall on this machine (in a
    chroot, say), which is no matter of these tests."""
    return b"".join(line for line in said.splitlines(keepends=True)
                    if not line.startswith(b"Running without: "))


def run(*words, stdin=b"", **more):
    done = subprocess.run([keelgate, *map(str, words)], input=stdin, capture_output=True,
                          timeout=240, **more)
    return done.returncode, done.stdout, heard(done.stderr).decode()


def objects(output):
    return [json.loads(line) for line in output.splitlines()]


def host_error(reply):
    return reply.get("error", {}).get("reason")


def wrong_usage():
    record = ["--record", "VespInvitation"]
    for words in ([], ["nothing"], ["unpack"], ["unpack", "--record", "Nothing"],
                  ["unpack", "--record", "VespClientMessageResult"],
                  ["unpack", "--service", "x"], ["unpack", "--command", "1"],
                  ["unpack", *record, "--command", "1", "--service", "x"],
                  ["unpack", "--service", "x", "--command", "-1"],
                  ["unpack", "--service", "x", "--command", "0x10"],
                  ["unpack", "--service", "x", "--command", "18446744073709551616"],
                  ["unpack", "--service", b"\xff", "--command", "1"],
                  ["unpack", *record, "--pretty", "--compact"], ["unpack", *record, "-", "-"],
                  ["unpack", *record, "--time-limit", "0"], ["stream", "--time-limit", "nan"],
                  ["stream", "--processes", "0"], ["stream", "--max-message", "4294967296"],
                  ["stream", "extra"], ["describe", "Nothing"], ["--verbose"]):
        done = subprocess.run([keelgate, *words], capture_output=True, stdin=subprocess.DEVNULL)
        check((done.returncode, done.stdout) == (2, b""), f"{words}: {done}")
        check(done.stderr.startswith(b"keelgate: "), f"{words}: {done.stderr}")
    check("VespInvitation" in run("describe", "VespInvitatoin")[2], "no nearest name")
    for words in (["--help"], ["--version"], ["unpack", "--help"], ["stream", "--help"],
                  ["describe", "--help"], ["--version", "--verbose"]):
        status, out, err = run(*words)
        check(status == 0 and out and not err, f"{words}: {status} {err}")


def many_files():
    good, bad = messages / "command-response.xml", messages / "damaged.bplist"
    record = ["unpack", "--record", "VespCommandResponse"]
    status, out, err = run(*record, *[good] * 20, "/nonexistent", bad, messages, good)
    replies = objects(out)
    check(status == 2, f"an unreadable file: {status}")
    check([r["file"] for r in replies] == [str(good)] * 20 + [str(bad), str(good)], "order of files")
    check(all(next(iter(r)) == "file" for r in replies), "file comes first")
    check(all("record" in r for r in replies[:20] + replies[21:]), "good files beside bad ones")
    check([line.split(":")[1].strip() for line in err.splitlines()]
          == ["/nonexistent", str(bad), str(messages)], f"what is said: {err}")

    data = good.read_bytes()
    for words in ([], ["-"]):
        status, out, _ = run(*record, *words, stdin=data)
        check(status == 0 and "file" not in objects(out)[0], "standard input")
    check([r["file"] for r in objects(run(*record, good, "-", stdin=data)[1])] == [str(good), "-"],
          "standard input beside a file")
    status, out, err = run(*record, "--max-message", len(data) - 1, good)
    check(status == 1 and host_error(objects(out)[0]) == "messageTooLarge", f"too large: {out}")
    check(run(*record, "--max-message", len(data), good)[0] == 0, "exactly the limit")
    with open("/dev/zero", "rb") as endless:
        done = subprocess.run([keelgate, *record], stdin=endless, capture_output=True)
    check(host_error(objects(done.stdout)[0]) == "messageTooLarge", "input without end")
    with tempfile.TemporaryDirectory() as folder:
        odd = os.fsencode(folder) + b"/\xff\x1b[1m"
        pathlib.Path(os.fsdecode(odd)).write_bytes(data[:-20])
        done = subprocess.run([keelgate, *record, odd, odd], capture_output=True)
        check(b"\x1b" not in done.stdout + done.stderr
              and os.fsencode(objects(done.stdout)[0]["file"]) == odd, "an odd name")
    with tempfile.TemporaryDirectory() as folder:
        # Longer than what workers are forked ahead for, and up to the limit; short ones between.
        sizes = [1 << 18, (1 << 18) + 1, len(data), 20 << 20, (1 << 18) - 1]
        files = [pathlib.Path(folder, str(size)) for size in sizes]
        for file, size in zip(files, sizes):
            file.write_bytes(data.ljust(size))
        for reuse in (1, 3):
            status, out, _ = run(*record, "--max-message", 20 << 20, "--messages-per-process",
                                 reuse, *files)
            check(status == 0 and len(objects(out)) == len(sizes), f"long messages: {out[:500]}")
    for empty in (["--service", "", "--command", "1"], ["--service=", "--command=1"]):
        reply = objects(run("unpack", *empty, stdin=data)[1])[0]
        check(reply["error"].get("service") == "", f"an empty service: {reply}")


def without_service():
    fine = messages / "command-response.xml"
    record = ["unpack", "--record", "VespCommandResponse"]
    for words in ([*record, fine], [*record, "/nonexistent"], ["stream"]):
        for where in (["--service-path", "/bin/true"], ["--service-path", "/nonexistent"],
                      ["--connect", "/nonexistent"]):
            status, out, err = run(*words, *where)
            check((status, out) == (3, b"") and err.startswith("keelgate: "), f"{where}: {status}")
    pause, raise_signal = 3, 4
    script = lambda operation, amount: struct.pack("<BxxxI", operation, amount)
    status, out, _ = run(*record, "--service-path", fake, stdin=script(raise_signal, 11))
    check((status, host_error(objects(out)[0])) == (1, "crashed"), f"crashed: {out}")
    status, out, err = run(*record, "--service-path", fake, "--time-limit", "0.2",
                           stdin=script(pause, 60_000))
    check((status, host_error(objects(out)[0])) == (1, "timedOut"), f"timed out: {out}")
    check("--time-limit" in err, f"what helps: {err}")

    # A service that cannot be had again: its file is gone when its process has crashed.
    with tempfile.TemporaryDirectory() as folder:
        service = shutil.copy(fake, folder)
        process = subprocess.Popen([keelgate, "stream", "--service-path", service],
                                   stdin=subprocess.PIPE, stdout=subprocess.PIPE,
                                   stderr=subprocess.PIPE)
        process.stdin.write(b"started?\n")
        process.stdin.flush()
        process.stdout.readline()
        os.unlink(service)
        crash = base64.b64encode(script(raise_signal, 11)).decode()
        out, err = process.communicate((request(1, crash) + "\n").encode() * 50, timeout=60)
        reasons = {host_error(reply) for reply in objects(out)}
        check(process.returncode == 3, f"not kept: {process.returncode}")
        check(reasons <= {"crashed", "startFailed"} and "startFailed" in reasons,
              f"not kept: {reasons}")
        check(b"could not be started" in err, f"not kept: {err}")


good_message = base64.b64encode((messages / "command-response.bplist").read_bytes()).decode()


def request(identity, message=good_message):
    return json.dumps({"record": "VespCommandResponse", "message": message, "id": identity})


def stream():
    lines = [request(0), "", request({"a": [1, None]}), request(2, "!"),
             '{"service": "none", "command": 1, "message": "", "id": 3.50}', request(4, "") + "\r"]
    status, out, err = run("stream", stdin="\n".join(lines).encode())
    replies = objects(out)
    check([r.get("id") for r in replies] == [0, None, {"a": [1, None]}, 2, 3.5, 4], "ids in order")
    check(all(next(iter(r)) == "id" for r in replies if "id" in r), "the id comes first")
    check(b'"id":3.50,' in out, "an id as it was written")
    check([r["error"]["kind"] if "error" in r else r["record"] for r in replies]
          == ["VespCommandResponse", "request", "VespCommandResponse", "request", "unpacking",
              "dataCorrupted"], f"outcomes: {replies}")
    check((status, err) == (2, ""), f"invalid requests: {status} {err}")
    check(run("stream", stdin=request(1, "").encode())[:1] == (0,), "rejection is an answer")
    check(run("stream") == (0, b"", ""), "an empty stream")

    process = subprocess.Popen([keelgate, "stream"], stdin=subprocess.PIPE, stdout=subprocess.PIPE,
                               stderr=subprocess.PIPE)
    for identity in range(3):
        process.stdin.write(request(identity).encode() + b"\n")
        process.stdin.flush()
        check(json.loads(process.stdout.readline())["id"] == identity, "a reply while input is open")
    # The reader goes away while the input stays open and silent.
    process.stdout.close()
    check(process.wait(60) == 0 and heard(process.stderr.read()) == b"", "the reader goes away")
    process.stdin.close()
    process = subprocess.Popen(f"yes '{request(1)}' | '{keelgate}' stream | head -3", shell=True,
                               stdout=subprocess.PIPE, stderr=subprocess.PIPE)
    out, err = process.communicate(timeout=60)
    check(len(objects(out)) == 3 and heard(err) == b"", f"a short reader: {err}")


def peak_memory(requests):
    """Answers this many requests, checks each, and gives the command's own peak in kilobytes."""
    # A sanitizer would keep what was freed.
    process = subprocess.Popen([keelgate, "stream", "--messages-per-process", "5000"],
                               stdin=subprocess.PIPE, stdout=subprocess.PIPE,
                               env=os.environ | {"ASAN_OPTIONS": "quarantine_size_mb=1"})

    def write():
        with process.stdin as pipe:
            for identity in range(requests):
                pipe.write(request(identity).encode() + b"\n")

    writer = threading.Thread(target=write)
    writer.start()
    wrong = sum(not line.startswith(b'{"id":%d,"record":' % identity)
                for identity, line in enumerate(process.stdout))
    writer.join()
    _, status, usage = os.wait4(process.pid, 0)
    check(wrong == 0 and status == 0, f"{requests} requests: {wrong} wrong, status {status}")
    return usage.ru_maxrss


def long_stream():
    few, many = peak_memory(2_000), peak_memory(100_000)
    check(many < few * 3 // 2 + 8_192, f"memory grew from {few} to {many} kB")


def described():
    everything = json.loads(run("describe", "--json")[1])
    check(list(everything) == ["messageUnpackers", "services", "commands", "schemas", "records",
                               "enumerations"], "sections")
    tables = [table for section in ("schemas", "records") for table in everything[section].values()]
    tables += [service["commands"] for service in everything["services"]]
    tables += [enumeration["cases"] for enumeration in everything["enumerations"].values()]
    tables += [everything[section] for section in ("messageUnpackers", "services", "commands")]
    # Which table has which columns, and what they hold, docs/wire-format.md pins.
    check({tuple(row) for table in tables for row in table}
          == {("record", "unpacker", "schema"), ("service", "unpacker", "commands"),
              ("command", "schema", "case"), ("schema", "case"), ("command", "case"),
              ("rawValue", "name"), ("name", "rawValue"), ("field", "key", "type", "required"),
              ("field", "type", "optional")}, "columns of tables")
    for section in everything:
        for name in everything[section] if isinstance(everything[section], dict) else ():
            one = json.loads(run("describe", name, "--json")[1])
            check(one[section] == {name: everything[section][name]}, f"describe {name}")
    for width in (40, 80, 132):
        for words in ([], ["VespOstrelProtocolPayload"], ["com.tessen.private.braid.viso.audio"]):
            out = run("describe", *words, env={**os.environ, "COLUMNS": str(width)})[1].decode()
            # Headings are whole sentences, tables are indented.
            check(all(len(line) <= width for line in out.splitlines() if line.startswith(" ")),
                  f"describe {words} in {width} columns")


def on_terminal(*words, **environment):
    """Everything that the command says when both streams are one terminal."""
    main, side = pty.openpty()
    process = subprocess.Popen([keelgate, *map(str, words)], stdin=subprocess.DEVNULL, stdout=side,
                               stderr=side, env={**os.environ, "TERM": "xterm", **environment})
    os.close(side)
    said = b""
    try:
        while chunk := os.read(main, 65536):
            said += chunk
    except OSError:
        pass  # A terminal whose last user is gone.
    process.wait()
    os.close(main)
    return heard(said)


def terminal():
    files = [messages / "command-response.xml"] * 3
    said = on_terminal("unpack", "--record", "VespCommandResponse", *files)
    check(b'{\r\n  "file": ' in said and b"2 of 3 messages" in said, f"at a terminal: {said}")
    check(b"of 1" not in on_terminal("unpack", "--record", "VespCommandResponse", files[0]),
          "progress of one file")
    compact = on_terminal("unpack", "--compact", "--record", "VespCommandResponse", files[0])
    check(compact.startswith(b'{"record":'), f"compact at a terminal: {compact}")
    check(b"\033[1m" in on_terminal("describe", NO_COLOR=""), "colour")
    check(b"\033" not in on_terminal("describe", NO_COLOR="1"), "NO_COLOR")


def completed(*words):
    script = ('source "$0"; COMP_WORDS=("$@"); COMP_CWORD=$(($# - 1)); _keelgate "$1"; '
              'printf "%s\\n" "${COMPREPLY[@]}"')
    done = subprocess.run(["bash", "-c", script, root / "cli/keelgate.bash", keelgate, *words],
                          capture_output=True, text=True)
    return done.stdout.split() if not done.stderr else done.stderr


def completion():
    for words, expected in (
            ([""], ["unpack", "stream", "describe"]), (["d"], ["describe"]),
            (["unpack", "--t"], ["--time-limit"]), (["describe", "--j"], ["--json"]),
            (["unpack", "--record", "P"], ["PulseUserPayload"]),
            (["unpack", "--service", "com.tessen.private.braid.w"],
             ["com.tessen.private.braid.waymark"]),
            (["unpack", "--service", "x", "--command", "24"], ["245"]),
            (["describe", "WMM"], ["WMMessageType"])):
        check(completed(*words) == expected, f"completion of {words}: {completed(*words)}")


for group in (wrong_usage, many_files, without_service, stream, long_stream, described,
              terminal, completion):
    group()
print(f"{count - len(failures)} passed, {len(failures)} failed")
sys.exit(bool(failures))
