#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""The built command, end to end: exit statuses, what goes to which stream, order, and long streams.

usage: run.py ROOT KEELGATE FAKE_SERVICE
"""
import base64
import fcntl
import json
import os
import pathlib
import pty
import re
import shutil
import struct
import subprocess
import sys
import tempfile
import termios
import time

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
    chroot, say), which these tests are not about."""
    return b"".join(line for line in said.splitlines(keepends=True)
                    if not line.startswith(b"keelgate: Running without: "))


def run(*words, stdin=b"", **more):
    done = subprocess.run([keelgate, *map(str, words)], input=stdin, capture_output=True,
                          timeout=240, **more)
    return done.returncode, done.stdout, heard(done.stderr).decode()


def started(*words):
    """In the background; nothing that is written to it waits."""
    return subprocess.Popen([keelgate, *map(str, words)], bufsize=0, stdin=subprocess.PIPE,
                            stdout=subprocess.PIPE, stderr=subprocess.PIPE)


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
                  ["unpack", "--service", b"\xff", "--command", "1"],
                  ["unpack", *record, "--pretty", "--compact"], ["unpack", *record, "-", "-"],
                  ["stream", "extra"], ["stream", "check"], ["describe", "Nothing"], ["--verbose"],
                  ["unpack", *record, "--typed"],
                  ["unpack", *record, "--files0-from", "/nonexistent"],
                  ["unpack", *record, "--files0-from", "/dev/null", "x"],
                  ["stream", "--metrics", "/nonexistent/file"],
                  *([*words, option, value]
                    for *words, option, values in (
                        ("unpack", "--service", "x", "--command", "-1 0x10 18446744073709551616"),
                        ("check", "--time-limit", "0 nan 1.2.3 1e3 1000000001"),
                        ("check", "--processes", "0 129"), ("check", "--log-level", "all"),
                        ("check", "--messages-per-process", "0 4294967296"),
                        ("check", "--max-message", "0 4294967297 5G 1KK"))
                    for value in values.split()),
                  ["describe", "--json", "--json-schema"]):
        done = subprocess.run([keelgate, *words], capture_output=True, stdin=subprocess.DEVNULL)
        check((done.returncode, done.stdout) == (2, b""), f"{words}: {done}")
        check(done.stderr.startswith(b"keelgate: "), f"{words}: {done.stderr}")
    for words, hint in ((["describe", "VespInvitatoin"], "VespInvitation"),
                        (["unpak", "x"], "did you mean unpack?"),
                        (["stream", "--proceses=3"], "did you mean --processes?"),
                        (["stream", "--processes", "0"], "--processes: \"0\" is not")):
        check(hint in run(*words)[2], f"{words} without a hint")
    check("did you mean" not in run("install")[2], "a hint that nobody needs")
    for words in (["--help"], ["--version"], ["unpack", "--help"], ["stream", "--help"],
                  ["describe", "--help"], ["--version", "--verbose"],
                  ["stream", "--metrics=", "--service-path="],
                  ["check", "--max-message", "4g", "--messages-per-process", "4294967295",
                   "--time-limit", "1000000000", messages / "check-in.xml"]):
        status, out, err = run(*words)
        silent = words[0] == "check" or "--metrics=" in words
        check((status, out == b"", err) == (0, silent, ""), f"{words}: {status} {err}")


def many_files():
    good, bad = messages / "command-response.xml", messages / "damaged.bplist"
    record = ["unpack", "--record", "VespCommandResponse"]
    status, out, err = run(*record, *[good] * 20, "/nonexistent", bad, messages, good)
    replies = objects(out)
    check(status == 2, f"an unreadable file: {status}")
    check([r["file"] for r in replies] == [str(good)] * 20 + [str(bad), str(good)], "order of files")
    check(all(next(iter(r)) == "file" for r in replies), "file comes first")
    check(all("record" in r for r in replies[:20] + replies[21:]), "good files beside bad ones")
    check([line.split(":")[1].strip() for line in err.splitlines()[:-1]]
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
    endless = objects(run(*record, "/dev/zero")[1])[0]
    check(host_error(endless) == "messageTooLarge", f"input without end: {endless}")
    with tempfile.TemporaryDirectory() as folder:
        # Longer than what workers are forked ahead for, and up to the limit; short ones between.
        # The first is the last to be answered.
        sizes = [20 << 20, 1 << 18, (1 << 18) + 1, len(data), (1 << 18) - 1]
        files = [pathlib.Path(folder, str(size)) for size in sizes]
        for file, size in zip(files, sizes):
            file.write_bytes(data.ljust(size))
        for reuse in (1, 3):
            status, out, _ = run(*record, "--max-message", 20 << 20, "--messages-per-process",
                                 reuse, *files)
            check(status == 0 and [r["file"] for r in objects(out)] == [*map(str, files)],
                  f"long messages: {out[:500]}")


def said_of_a_run():
    good, bad = messages / "command-response.xml", messages / "damaged.bplist"
    record = ["--record", "VespCommandResponse"]
    for words, status, expected in (
            ([good] * 1001 + [bad, bad], 1, r"1,003 messages, 2 rejected, \d+\.\d\d s"),
            ([good, "/nonexistent"], 2, r"1 message, \d+\.\d\d s"),
            ([good, messages / "push-payload.xml", "--max-message", "1k"], 1,
             r"2 messages, 1 failed, \d+\.\d\d s")):
        for command in ("unpack", "check"):
            done, out, err = run(command, *record, *words)
            lines = err.splitlines()
            files = sum(not str(word).startswith(("--", "/nonexistent", "1k")) for word in words)
            check(done == status and re.fullmatch(expected, lines[-1]), f"{command}: {lines[-1:]}")
            check(all(line.startswith("keelgate: ") for line in lines[:-1]), f"{command}: {err}")
            check(len(out.splitlines()) == (files if command == "unpack" else 0), f"{command}")
            quiet = run(command, *record, "--quiet", *words)
            check(quiet[0] == status and quiet[2].splitlines() == lines[:-1], f"quiet {command}")
    check(run("check", *record, good, good)[:2] == (0, b""), "all sound")
    check(run("unpack", *record, good)[2] == "", "one file needs no sum-up")

    unknown = ["unpack", "--service", "com.tessen.private.braid.rtcengine.rtctester", "--command",
               "999", messages / "sample-message.xml"]
    for words, logged in (([], True), (["--log-level", "error"], True), (["--quiet"], False),
                          (["--log-level", "none"], False)):
        check(("\nInvalid" in "\n" + run(*unknown, *words)[2]) == logged, f"log with {words}")

    with tempfile.TemporaryDirectory() as folder:
        names = pathlib.Path(folder, "names")
        odd = os.path.join(os.fsencode(folder), b"a\n\xff\x1b[1m")
        pathlib.Path(os.fsdecode(odd)).write_bytes(bad.read_bytes())
        for end in (b"", b"\0"):
            names.write_bytes(b"\0".join([os.fsencode(good), odd]) + end)
            _, out, err = run("unpack", *record, "--files0-from", names)
            check([os.fsencode(r["file"]) for r in objects(out)] == [os.fsencode(good), odd], "names")
            check(b"\x1b" not in out + err.encode() and "byte" in err, f"an odd name: {err}")
        done, out, _ = run("unpack", *record, "--files0-from", "-", stdin=os.fsencode(good))
        check(done == 0 and "file" not in objects(out)[0], "names from standard input")
        check(run("check", *record, "--files0-from", "/dev/null") == (0, b"", ""), "no names")
        for wrong in (b"-", b"a\0\0b", b"\0"):
            check(run("check", *record, "--files0-from", "-", stdin=wrong)[0] == 2, f"{wrong}")


def measured(*words, stdin=subprocess.DEVNULL, **more):
    """The status, what is written, and the memory that it took, in bytes."""
    process = subprocess.Popen([keelgate, *map(str, words)], stdin=stdin, stdout=subprocess.PIPE,
                               stderr=subprocess.DEVNULL, **more)
    out = process.stdout.read()
    _, status, usage = os.wait4(process.pid, 0)
    return os.waitstatus_to_exitcode(status), out, usage.ru_maxrss * 1024


def long_replies():
    """What indents to more than its message may have costs that message alone."""
    deep, wide = 400, 100_000
    with tempfile.NamedTemporaryFile(suffix=".plist") as file:
        file.write(b"<plist>" + b"<array>" * deep + b"<true/>" * wide + b"</array>" * deep
                   + b"</plist>")
        file.flush()
        good = messages / "check-in.xml"
        words = ["unpack", "--record", "PropertyList", good, file.name, good]
        status, out, memory = measured(*words, "--pretty", "--time-limit", 60)
        check(status == 1 and out.count(b'"reason": "resourcesExhausted"') == 1
              and out.count(b'"record"') == 2, f"long replies: {status}")
        check(memory < 300_000_000, f"a long reply takes {memory} bytes")
    # On the stacks of the service and of the command.
    payload = b"<dict><key>c</key><integer>1</integer>"
    deepest = (payload + b"<key>mml</key><array>") * 255 + payload + b"</dict></array>" * 255
    check(run("unpack", "--record", "PulseUserPayload", "-", stdin=b"<plist>" + deepest
              + b"</dict></plist>")[0] == 0, "the deepest message")


def metrics():
    def counters(text):
        return {line.rpartition(" ")[0]: float(line.rpartition(" ")[2])
                for line in text.splitlines() if not line.startswith("#")}

    with tempfile.TemporaryDirectory() as folder:
        file = pathlib.Path(folder, "metrics.prom")
        process = started("stream", "--metrics", file)
        process.stdin.write((request(0) + "\n" + request(1, "") + "\n\n").encode())
        replies = [process.stdout.readline() for _ in range(3)]
        expected = {'keelgate_messages_total{outcome="record"}': 1.0,
                    'keelgate_messages_total{outcome="rejected"}': 1.0,
                    "keelgate_invalid_requests_total": 1.0,
                    "keelgate_reply_bytes_total": float(sum(map(len, replies)))}
        # While the stream waits for its next request.
        end = time.monotonic() + 30
        while time.monotonic() < end and not expected.items() <= counters(file.read_text()).items():
            time.sleep(0.1)
        text = file.read_text()
        check(expected.items() <= counters(text).items(), f"metrics: {text}")
        check(all(value == 0 for name, value in counters(text).items() if name not in expected),
              f"metrics: {text}")
        check(os.listdir(folder) == ["metrics.prom"], f"drafts: {os.listdir(folder)}")
        # What is in the command's memory is nobody else's business; such files are root's.
        proc = pathlib.Path(f"/proc/{process.pid}")
        check(re.search(r"core file size +0 +0 ", (proc / "limits").read_text()), "a core file")
        check(os.getuid() == 0 or os.stat(proc / "environ").st_uid == 0, "a debugger")
        check(run("stream", "--metrics", folder)[0] == 2 and not list(
            pathlib.Path(folder).parent.glob(f"{pathlib.Path(folder).name}.*")), "a draft that stays")
        process.communicate(request(2).encode(), timeout=60)
        check(counters(file.read_text())['keelgate_messages_total{outcome="record"}'] == 2,
              "metrics at the end")


def memory():
    """A file costs the command little more than its size."""
    size = 256 << 20
    with tempfile.NamedTemporaryFile() as file:
        file.write((messages / "command-response.xml").read_bytes())
        file.truncate(size)
        file.flush()
        words = ["check", "--record", "VespCommandResponse", "--max-message", "1G"]
        feeder = subprocess.Popen(["cat", file.name], stdout=subprocess.PIPE)
        for source, taken in (("file", measured(*words, file.name)),
                              ("pipe", measured(*words, stdin=feeder.stdout))):
            check(taken[2] < size * 6 // 5, f"{size} bytes from a {source} take {taken[2]}")


def without_service():
    fine = messages / "command-response.xml"
    record = ["unpack", "--record", "VespCommandResponse"]
    for words in ([*record, fine], [*record, "/nonexistent"], ["stream"]):
        for where in (["--service-path", "/bin/true"], ["--service-path", "/nonexistent"],
                      ["--connect", "/nonexistent"]):
            status, out, err = run(*words, *where)
            check((status, out) == (3, b"") and err.startswith("keelgate: "), f"{where}: {status}")
    with tempfile.TemporaryDirectory() as folder:
        alone = subprocess.run([shutil.copy(keelgate, folder), *record, fine], capture_output=True)
        check(alone.returncode == 3 and b"There is no VespKeelgateService at" in alone.stderr, alone)
    pause, raise_signal = 3, 4
    script = lambda operation, amount: struct.pack("<BxxxI", operation, amount)
    with tempfile.TemporaryDirectory() as folder:
        crash, wait = (pathlib.Path(folder, name) for name in ("crash", "wait"))
        crash.write_bytes(script(raise_signal, 11))
        wait.write_bytes(script(pause, 60_000))
        status, out, err = run(*record, "--service-path", fake, "--time-limit", 2, crash, wait, crash)
        reasons = [host_error(reply) for reply in objects(out)]
        check((status, reasons) == (1, ["crashed", "timedOut", "crashed"]), f"{reasons}")
        check("3 messages, 2 crashed, 1 timed out, " in err, f"the sum of it: {err}")
        check(err.count("--time-limit") == 1, f"what helps: {err}")

        # A service that cannot be had again: its file is gone when its process has crashed.
        line = request(1, base64.b64encode(crash.read_bytes()).decode()).encode() + b"\n"
        for words, lines in ((["stream"], 50), ([*record, *[crash] * 50], 0)):
            service = shutil.copy(fake, folder)
            process = started(*words, "--service-path", service)
            process.stdin.write(b"started?\n" if lines else b"")
            process.stdout.readline()
            os.unlink(service)
            out, err = process.communicate(line * lines, timeout=60)
            reasons = {host_error(reply) for reply in objects(out)}
            check(process.returncode == 3, f"not kept: {process.returncode}")
            check(reasons <= {"crashed", "startFailed"} and "startFailed" in reasons,
                  f"not kept: {reasons}")
            rest = 49 - len(objects(out))
            check((f"{rest} of 50 messages were not unpacked" in err.decode()) == (lines == 0)
                  and b"could not be started" in err, f"not kept: {err}")


good_message = base64.b64encode((messages / "command-response.bplist").read_bytes()).decode()


def request(identity, message=good_message):
    return json.dumps({"record": "VespCommandResponse", "message": message, "id": identity})


def stream():
    # Which takes no stack.
    nest = "[" * 10**6 + "]" * 10**6
    line = f'{{"record":"Nothing","message":"","id":{nest}}}'
    out = run("stream", stdin=line.encode())[1].decode()
    check(nest in out and "unknown record" in out, "a deep id")
    check(run("stream", stdin=request(1, "").encode())[:1] == (0,), "rejection is an answer")
    check(run("stream") == (0, b"", ""), "an empty stream")
    status, out, _ = run("stream", stdin=b"\xef\xbb\xbf" + request(1).encode())
    check(status == 0 and "record" in objects(out)[0], "a byte order mark before the first line")
    # What a line may have is derived from what a message may have; the stream goes on behind it.
    longest = (1 << 20) + 3 * 512
    lines = [request(0).ljust(longest), request(1).ljust(longest + 1), request(2)]
    status, out, _ = run("stream", "--max-message", "1k", stdin="\n".join(lines).encode())
    check(status == 2 and [r.get("id") for r in objects(out)] == [0, None, 2], f"long lines: {out}")
    check(f"{longest} bytes" in objects(out)[1]["error"]["description"], f"a long line: {out}")
    # A message that is too long to be kept leaves the rest of its line, in whatever order.
    long, members = "A" * (2 << 20), ['"record" :"VespInvitation"', '"id":{"message": "\\"{", "n":1E400}']
    for lines, reason in (([f'{{{members[0]},"message" : "{long}\\/", {members[1]}}}'], "messageTooLarge"),
                          ([f'{{{members[1]},"message":"{long}", {members[0]}}}'], "messageTooLarge"),
                          ([f'{{{members[1]},"message":"{long}"}}'], None),
                          ([f'{{"id":{{"message":"{long}"}}}}'], None)):
        status, out, _ = run("stream", "--max-message", "1k", stdin="\n".join(lines * 2).encode())
        check([host_error(reply) for reply in objects(out)] == [reason] * 2, f"long messages: {out}")
        check(out.count(b'{"id":{"message":"\\"{","n":1E400},') == 2 * ("n" in lines[0]), f"their ids: {out}")
        check((b'"id"' in out) == ("n" in lines[0]), f"an id that is not whole: {out}")
    reply = objects(run("stream", "--max-message", "1K", stdin=request(1, "AAAA" * 342).encode())[1])
    check((reply[0]["id"], host_error(reply[0])) == (1, "messageTooLarge"), f"too large: {reply}")

    process = started("stream")
    for identity in range(3):
        process.stdin.write(request(identity).encode() + b"\n")
        check(json.loads(process.stdout.readline())["id"] == identity, "a reply while input is open")
    process.stdin.write(b"\xef\xbb\xbf" + request(3).encode() + b"\n")
    check(b'"kind":"request"' in process.stdout.readline(), "a byte order mark before another line")
    # The reader goes away while the input stays open and silent.
    process.stdout.close()
    check(process.wait(60) == 2 and heard(process.stderr.read()) == b"", "the reader goes away")
    process.stdin.close()


def unblocked():
    """Standard streams that do not block are waited for."""
    given, taken = os.pipe(), os.pipe()
    for end in (given[0], taken[1]):
        os.set_blocking(end, False)
    process = subprocess.Popen([keelgate, "unpack", "--record", "PropertyList"], stdin=given[0],
                               stdout=taken[1])
    for end in (given[0], taken[1]):
        os.close(end)
    text = "x" * 200_000
    for end, mode in ((given[1], "wb"), (taken[0], "rb")):
        time.sleep(0.2)
        with open(end, mode) as file:
            if mode == "wb":
                file.write(f"<plist><string>{text}</string></plist>".encode())
            else:
                check(json.load(file)["value"] == text, "streams that do not block")
    check(process.wait(60) == 0, "streams that do not block")


def long_stream():
    """Memory does not grow with the input."""
    count = 50_000
    feeder = subprocess.Popen(f"yes '{request(1)}' | head -{count}", shell=True, stdout=subprocess.PIPE)
    # A sanitizer would keep what was freed.
    status, out, memory = measured("stream", "--messages-per-process", 5000, stdin=feeder.stdout,
                                   env=os.environ | {"ASAN_OPTIONS": "quarantine_size_mb=1"})
    check((out.count(b'{"id":1,"record":'), status) == (count, 0) and memory < 60_000_000,
          f"{len(out)} bytes, status {status}, {memory} of memory")


def described():
    everything = json.loads(run("describe", "--json")[1])
    # Which tables have which columns, and what they hold, docs/wire-format.md pins.
    for section in everything:
        for name in everything[section] if isinstance(everything[section], dict) else ():
            one = json.loads(run("describe", name, "--json")[1])
            check(one[section] == {name: everything[section][name]}, f"describe {name}")
    answered = json.loads(run("describe", "245", "--json")[1])
    check([row["name"] for row in answered["commands"]] == ["livePhoto"] and
          all(row.get("command", 245) == 245 for service in answered["services"]
              for row in service["commands"]), f"describe 245: {answered}")
    check(run("describe", "999")[0] == 2, "a number that is not a command's")
    rows = run("describe", "VespSessionAcceptSchema")[1].decode().splitlines()[1:]
    check(len({re.match(r"  \w+ +\S+ +", row).end() for row in rows}) == 1, f"columns: {rows}")


def json_schema():
    import jsonschema  # Debian's python3-jsonschema.
    schema = json.loads(run("describe", "--json-schema")[1])
    check(set(json.loads(run("describe", "--json")[1])["records"]) <= set(schema["$defs"]),
          "every record has a definition")
    replies = jsonschema.Draft202012Validator(schema)
    replies.check_schema(schema)

    def spoilt(value):
        """The value with one thing more or of no type, wherever that can be."""
        yield [[None]]
        if isinstance(value, dict):
            yield {**value, "more": 1}
        if isinstance(value, (dict, list)):
            for key in value if isinstance(value, dict) else range(len(value)):
                for part in spoilt(value[key]):
                    whole = value.copy()
                    whole[key] = part
                    yield whole

    errors = [{"error": error} for error in (
        {"kind": "keyNotFound", "codingPath": [1, "a"], "description": "", "key": "k"},
        {"kind": "unpacking", "domain": "", "code": 0, "case": "noUnpackerForService"},
        {"kind": "host", "reason": "crashed", "description": ""})]
    for reply in errors + [json.loads(file.read_text()) for file in sorted(messages.glob("*.json"))
                           if not file.name.startswith("property-list")]:
        check(replies.is_valid({"id": [], **reply}), f"{reply} against the schema of replies")
        for wrong in (*spoilt(reply), {key: reply[key] for key in list(reply)[1:]}):
            check(not replies.is_valid(wrong), f"{wrong} against the schema of replies")
        if "record" in reply:
            own = json.loads(run("describe", "--json-schema", reply["record"])[1])
            value = jsonschema.Draft202012Validator(own)
            check(value.is_valid(reply["value"]), f"{reply} against {reply['record']}")
            check(not value.is_valid({**reply["value"], "more": 1}), f"{reply} with more")
    check(run("describe", "--json-schema", "VespSessionInvitationSchema")[0] == 2, "not printed")


def on_terminal(*words, window=0, **environment):
    """Everything that the command says when both streams are one terminal of this width."""
    main, side = pty.openpty()
    fcntl.ioctl(side, termios.TIOCSWINSZ, struct.pack("HHHH", 0, window, 0, 0))
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
    for columns, window, expected in (("", 0, 80), ("0", 0, 80), ("70", 0, 70), ("", 60, 60),
                                      ("70", 60, 60), ("50", 60, 50)):
        said = on_terminal("describe", window=window, COLUMNS=columns, NO_COLOR="1")
        check(said == on_terminal("describe", COLUMNS=str(expected), NO_COLOR="1"),
              f"{columns} in a window of {window}")
    for words in (["unpack", "--help"], ["describe"], ["describe", "VespOstrelProtocolPayload"],
                  ["describe", "com.tessen.private.braid.viso.audio"], ["describe", "CommandType"]):
        said = on_terminal(*words, COLUMNS="60", NO_COLOR="1").decode()
        check(all(len(line) <= 60 and line == line.rstrip() for line in said.splitlines())
              and set(said.split()) == set(run(*words)[1].decode().split()), f"{words} in 60 columns")
    check(b"\033" not in on_terminal("describe", NO_COLOR="1"), "NO_COLOR")


def completed(shell, *words):
    """What the shell offers for the last word."""
    scripts = {
        "bash": 'source "$0/keelgate.bash"; COMP_WORDS=("$@"); COMP_CWORD=$(($# - 1)); '
                '_keelgate "$1"; printf "%s\\n" "${COMPREPLY[@]}"',
        # The function that takes the candidates stands in for the shell's own.
        "zsh": 'compadd() { [[ $1 == -- ]] && shift; print -l -- ${(M)@:#$words[CURRENT]*} }; '
               'dir=$0; words=("$@"); CURRENT=$#; source $dir/_keelgate',
        "fish": 'source $argv[1]/keelgate.fish; set line (string escape -- $argv[3..-2]); '
                'complete -C (string join " " -- keelgate $line $argv[-1]) | cut -f 1'}
    path = {**os.environ, "PATH": f"{pathlib.Path(keelgate).parent}:{os.environ['PATH']}"}
    done = subprocess.run([shell, "-c", scripts[shell], root / "cli", keelgate, *words],
                          capture_output=True, text=True, env=path)
    return sorted(done.stdout.split()) if not done.stderr else done.stderr


def completion():
    for words, expected in (
            (["st"], ["stream"]),
            (["unpack", "--ti"], ["--time-limit"]), (["stream", "--log-level", "w"], ["warning"]),
            (["unpack", "--record", "Pu"], ["PulseUserPayload"]),
            (["check", "--service", "com.tessen.private.braid.w"],
             ["com.tessen.private.braid.waymark"]),
            (["unpack", "--service", "x", "--command", "24"], ["245"]),
            (["describe", "WMM"], ["WMMessageType"])):
        for shell in ("bash", "zsh", "fish"):
            check(completed(shell, *words) == expected,
                  f"{shell} completes {words}: {completed(shell, *words)}")


for group in (wrong_usage, many_files, said_of_a_run, long_replies, metrics, memory,
              without_service, stream, unblocked, long_stream, described, json_schema, terminal,
              completion):
    group()
print(f"{count - len(failures)} passed, {len(failures)} failed")
sys.exit(bool(failures))
