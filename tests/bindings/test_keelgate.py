# SPDX-License-Identifier: Apache-2.0
"""The Python package as its users have it, against an installed tree: KEELGATE_MESSAGES names the
folder of the example messages, KEELGATE_SERVICE_STAND_IN a service that misbehaves."""
import asyncio
import base64
import concurrent.futures
import json
import math
import os
import pathlib
import pickle
import plistlib
import re
import struct
import uuid
from datetime import datetime, timezone

import pytest

import keelgate

messages = pathlib.Path(os.environ["KEELGATE_MESSAGES"])
VIDEO = "com.tessen.private.braid.viso.video"


@pytest.fixture(scope="module")
def client():
    with keelgate.Client(processes=2) as made:
        yield made


def binary(value):
    return plistlib.dumps(value, fmt=plistlib.FMT_BINARY, sort_keys=False)


def examples():
    """Every example with its reply: the name, how it is unpacked, what the command printed."""
    for line in (messages / "index.txt").read_text().splitlines():
        # Any property list has values of Python's own, for which there are other tests.
        if line and not line.startswith(("#", "property-list")):
            name, *words = line.split()
            files = [name] if "." in name else [name + ".xml", name + ".bplist"]
            for file in files:
                yield pytest.param(file, dict(zip(words[::2], words[1::2])), id=file)


def unpack(client, data, how):
    if "--record" in how:
        return client.unpack(how["--record"], data)
    return client.unpack_client_message(data, command=int(how["--command"]),
                                        service=how["--service"])


def shown(value):
    """A type that JSON has not, as replies show it."""
    if isinstance(value, bytes):
        return base64.b64encode(value).decode()
    if isinstance(value, uuid.UUID):
        return str(value).upper()
    return value.isoformat().replace("+00:00", "Z")


@pytest.mark.parametrize("file, how", examples())
def test_examples_give_the_values_of_their_replies(client, file, how):
    reply = json.loads((messages / (file.split(".")[0] + ".json")).read_text())
    data = (messages / file).read_bytes()
    if "value" in reply:
        assert json.loads(json.dumps(unpack(client, data, how), default=shown)) == reply["value"]
        return
    with pytest.raises(keelgate.Error) as caught:
        unpack(client, data, how)
    for name, field in reply["error"].items():
        snake = re.sub("([A-Z])", lambda m: "_" + m[1].lower(), name)
        if name != "kind" or isinstance(caught.value, keelgate.DecodingError):
            assert getattr(caught.value, snake) == field
    again = pickle.loads(pickle.dumps(caught.value))
    assert (str(again), vars(again)) == (str(caught.value), vars(caught.value))


def test_values_have_pythons_types(client):
    home = client.unpack("VespInvitation", bytearray((messages / "invitation-home.xml").read_bytes()))
    invitation = home["context"]["context"]["dictionary"]["vespHearthInvitation"]
    assert isinstance(invitation["homeUUID"], uuid.UUID)
    assert invitation["inviteExpiryDate"].tzinfo is timezone.utc
    assert isinstance(invitation["invitationShareToken"]["tokenData"], bytes)


def test_any_property_list_comes_back_as_it_was(client):
    tree = {"z": [True, False, 0, 1, -2**63, 2**64 - 1, 0.1, -1e300, 2.0, [], {}],
            "": {"\u00e9\U0001f600": bytes(range(70)), "a\n": "text", "b": b""},
            "d": [datetime(1, 1, 1), datetime(9999, 12, 31, 23, 59, 59), {"d": [{"d": "deep"}]}]}
    xml = re.sub(rb"<!DOCTYPE[^>]*>", b"", plistlib.dumps(tree, sort_keys=False))
    for data in (binary(tree), xml):
        # So that the order of keys counts, and a bool is not an int.
        assert repr(client.unpack("PropertyList", data)) == re.sub(
            r"(datetime\([^)]*)", r"\1, tzinfo=datetime.timezone.utc", repr(tree))


@pytest.mark.parametrize("data, expected", [
    (binary([plistlib.UID(7)]), "[UID(7)]"),
    (binary(plistlib.UID(2**64 - 1)), f"UID({2**64 - 1})"),
    (b"<plist><real>-inf</real></plist>", "-inf"), (b"<plist><real>nan</real></plist>", "nan"),
    (b"<plist><real>3</real></plist>", "3.0"), (b"<plist><string>3</string></plist>", "'3'"),
    # A date that no calendar has is a number of seconds.
    (binary(datetime(2001, 1, 1)).replace(bytes(8), struct.pack(">d", 2.0**55), 1), repr(2.0**55))])
def test_property_lists_keep_what_json_would_lose(client, data, expected):
    assert repr(client.unpack("PropertyList", data)) == expected


def test_depth_is_the_documents_and_not_the_interpreters(client):
    value = client.unpack("PropertyList", b"<plist>" + b"<array>" * 512 + b"</array>" * 512 + b"</plist>")
    depth = 1
    while value:
        value, depth = value[0], depth + 1
    assert depth == 512


def test_wrong_use_is_a_value_error(client):
    for wrong in (lambda: client.unpack("Nothing", b""),
                  lambda: client.unpack("PulseUserPayload\0", b""),
                  lambda: client.unpack_client_message(b"", command=-1, service=VIDEO),
                  lambda: client.unpack_client_message(b"", command=2**64, service=VIDEO),
                  lambda: client.unpack_client_message(b"", command=1, service="a\0b"),
                  lambda: keelgate.Client(time_limit=0), lambda: keelgate.Client(time_limit=math.nan),
                  lambda: keelgate.Client(processes=-1)):
        with pytest.raises(ValueError):
            wrong()
    with pytest.raises(TypeError):
        client.unpack("PulseUserPayload", "text")


@pytest.mark.parametrize("error, fields, call", [
    (keelgate.UnpackingError, dict(case="noUnpackerForService", code=1, command=None, service="nobody"),
     lambda client: client.unpack_client_message(b"", command=1, service="nobody")),
    (keelgate.HostError, dict(reason="messageTooLarge"),
     lambda _: keelgate.Client(max_message=9).unpack("PropertyList", bytes(10))),
    (keelgate.HostError, dict(reason="startFailed"),
     lambda _: keelgate.Client(service_path="/nowhere/VespKeelgateService"))])
def test_errors_carry_their_fields(client, error, fields, call):
    with pytest.raises(error) as caught:
        call(client)
    assert fields.items() <= vars(caught.value).items()


def test_threads_and_event_loops_share_a_client(client):
    data = [binary({"n": n}) for n in range(64)]
    expected = [{"n": n} for n in range(64)]
    with concurrent.futures.ThreadPoolExecutor(8) as pool:
        assert list(pool.map(lambda item: client.unpack("PropertyList", item), data)) == expected

    async def gather():
        calls = [client.unpack_async("PropertyList", item) for item in data]
        calls.append(client.unpack_client_message_async(b"", command=245,
                                                        service="com.tessen.private.braid.viso.lp"))
        return await asyncio.gather(*calls)
    *values, marker = asyncio.run(gather())
    assert values == expected
    assert marker == {"messageTypeRestricted": {"messageType": "restricted"}}


def test_a_closed_client_says_so():
    one = keelgate.Client()
    data = b"<plist><array>" + b"<integer>1</integer>" * 20000 + b"</array></plist>"
    with concurrent.futures.ThreadPoolExecutor(4) as pool:
        calls = [pool.submit(one.unpack, "PropertyList", data) for _ in range(4)]
        while one._calls < 4 and not all(call.done() for call in calls):
            pass
        # Calls under way are waited for.
        one.close()
        assert [len(call.result()) for call in calls] == [20000] * 4
    one.close()
    for call in (one.unpack, lambda *words: asyncio.run(one.unpack_async(*words))):
        with pytest.raises(ValueError):
            call("PropertyList", data)
