# SPDX-License-Identifier: Apache-2.0
"""Hands untrusted property lists to a sandboxed service and gets plain Python values back.

    import keelgate

    with keelgate.Client(processes=2, time_limit=5.0) as client:
        payload = client.unpack("PulseUserPayload", data)

No byte of a message is parsed in the calling process. What comes back has the right form and is
still a stranger's: its meaning has not been checked.
"""
from ._client import Client
from ._errors import Breach, DecodingError, Error, HostError, UnpackingError
from ._library import version
from ._values import UID

__all__ = ["Breach", "Client", "DecodingError", "Error", "HostError", "UID", "UnpackingError",
           "version"]
__version__ = version()
