# SPDX-License-Identifier: Apache-2.0
"""What is raised when a message gives no record. Texts can quote what the sender chose: escape them
before they reach a terminal or a log."""
from __future__ import annotations

from typing import Any, Optional, Union


class Error(Exception):
    """What all of them share. str() gives one sentence for people."""

    def __reduce__(self) -> Any:
        # The constructors take keywords, which the default of Exception would lose.
        return _restore, (type(self), self.args, self.__dict__)


def _restore(kind: type, arguments: tuple[Any, ...], fields: dict[str, Any]) -> Error:
    error: Error = kind.__new__(kind)
    error.args = arguments
    error.__dict__.update(fields)
    return error


class DecodingError(Error):
    """The message does not have the form that its schema demands."""

    def __init__(self, *, kind: str, coding_path: list[Union[str, int]], description: str,
                 key: Optional[str] = None) -> None:
        path = ".".join(map(str, coding_path))
        super().__init__(description + (f" (at {path})" if path else ""))
        #: "keyNotFound", "typeMismatch", "valueNotFound" or "dataCorrupted".
        self.kind = kind
        #: The wire key that is missing; None but for keyNotFound.
        self.key = key
        #: Wire keys and array positions, outermost first.
        self.coding_path = coding_path
        self.description = description


class Breach(Error):
    """A rule of the framework or of the program was broken."""

    def __init__(self, *, domain: str, error_type: str, key_path: Optional[str] = None) -> None:
        super().__init__(f"{error_type} [{domain}]")
        self.domain = domain
        self.error_type = error_type
        self.key_path = key_path


class UnpackingError(Error):
    """No unpacker is there for the message; nothing of it was decoded."""

    def __init__(self, *, domain: str, code: int, case: str, command: Optional[int] = None,
                 service: Optional[str] = None) -> None:
        super().__init__(f"the service does not implement command {command}" if service is None
                         else f'no unpacker for the service "{service}"')
        self.domain = domain
        self.code = code
        #: "unimplementedCommand" (then `command` is there) or "noUnpackerForService" (`service`).
        self.case = case
        self.command = command
        self.service = service


class HostError(Error):
    """The host gave the message up; nothing is known of its content."""

    def __init__(self, *, reason: str, description: str) -> None:
        super().__init__(f"{reason}: {description}")
        #: "crashed", "timedOut", "messageTooLarge", "resourcesExhausted", "protocolViolation" or
        #: "startFailed".
        self.reason = reason
        self.description = description


def from_reply(error: dict[str, Any]) -> Error:
    """The exception that the `error` of a reply object stands for."""
    kind = error["kind"]
    if kind == "breach":
        return Breach(domain=error["domain"], error_type=error["errorType"],
                      key_path=error.get("keyPath"))
    if kind == "unpacking":
        return UnpackingError(domain=error["domain"], code=error["code"], case=error["case"],
                              command=error.get("command"), service=error.get("service"))
    if kind == "host":
        return HostError(reason=error["reason"], description=error["description"])
    return DecodingError(kind=kind, key=error.get("key"), coding_path=error["codingPath"],
                         description=error["description"])
