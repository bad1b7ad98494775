# SPDX-License-Identifier: Apache-2.0
from __future__ import annotations

import asyncio
import ctypes
import os
import threading
from concurrent.futures import ThreadPoolExecutor
from types import TracebackType
from typing import Any, Callable, Optional, Union

from . import _values
from ._errors import HostError, from_reply
from ._library import GIVEN_UP, REJECTED, SUCCESS, Options, library, take

Buffer = Union[bytes, bytearray, memoryview]

_UINT_MAX = 2**(8 * ctypes.sizeof(ctypes.c_uint)) - 1
_SIZE_MAX = 2**(8 * ctypes.sizeof(ctypes.c_size_t)) - 1


def _number(name: str, value: int, most: int) -> int:
    if not 0 <= value <= most:
        raise ValueError(f"{name} is a number from 0 to {most}, not {value}")
    return value


def _text(name: str, value: str) -> bytes:
    if "\0" in value:
        raise ValueError(f"{name} contains a null character")
    return value.encode()


class Client:
    """A running service. All methods may be called from many threads at once; each call holds one
    of the service's processes, and waits for one while all are taken.

    processes: how many messages are processed at a time; 0 stands for the number of processors.
    messages_per_process: with 1, every message gets a sealed process that has seen no other.
    max_message: bytes; a larger message is refused before anything is sent.
    time_limit: seconds from the call until the record.
    require_layers: refuse to run where namespaces or Landlock are missing.
    service_path: the VespKeelgateService to start; None for the installed one.
    socket: the path of an activated service's socket, used instead of starting one.

    Raises HostError (startFailed) if no service can be started.
    """

    def __init__(self, *, processes: Optional[int] = None,
                 messages_per_process: Optional[int] = None, max_message: Optional[int] = None,
                 time_limit: Optional[float] = None, require_layers: bool = False,
                 service_path: Union[str, os.PathLike[str], None] = None,
                 socket: Union[str, os.PathLike[str], None] = None) -> None:
        # First, so that closing works whatever fails below.
        self._handle: Optional[int] = None
        self._state = threading.Condition()
        self._calls = 0
        self._closed = False
        self._executor: Optional[ThreadPoolExecutor] = None

        options = Options()
        library.keelgate_options_init(ctypes.byref(options), ctypes.sizeof(options))
        if processes is not None:
            options.processes = _number("processes", processes, _UINT_MAX)
        if messages_per_process is not None:
            options.messages_per_process = _number("messages_per_process", messages_per_process,
                                                   _SIZE_MAX)
        if max_message is not None:
            options.max_message = _number("max_message", max_message, _SIZE_MAX)
        if time_limit is not None:
            # Written so that nan is refused as well.
            if not 0 < time_limit <= _UINT_MAX / 1000:
                raise ValueError(f"time_limit is a positive number of seconds, not {time_limit}")
            options.time_limit_ms = max(1, round(time_limit * 1000))
        options.require_layers = bool(require_layers)
        # ctypes keeps the bytes alive as long as the structure.
        if service_path is not None:
            options.service_path = os.fsencode(service_path)
        if socket is not None:
            options.socket = os.fsencode(socket)

        sentence = ctypes.c_void_p()
        self._handle = library.keelgate_open(ctypes.byref(options), ctypes.byref(sentence))
        if self._handle is None:
            raise HostError(reason="startFailed",
                            description=take(sentence).decode("utf-8", "replace"))

    def unpack(self, record: str, message: Buffer) -> Any:
        """The record that a message holds: a dict; of a "PropertyList", its top object.

        record: a name that `keelgate unpack --help` lists.

        Raises DecodingError, Breach or HostError; ValueError for an unknown record.
        """
        if record == "PropertyList":
            typed = self._call(library.keelgate_unpack_typed, (), message, "")
            return _values.property_list(typed)
        return _values.record(record, self._call(library.keelgate_unpack,
                                                 (_text("record", record),), message,
                                                 f"unknown record: {record!r}"))

    def unpack_client_message(self, message: Buffer, *, command: int, service: str) -> Any:
        """The one-key dict of a client message, which comes with the command and the service that it
        arrived under. Raises UnpackingError too."""
        context = _text("service", service), _number("command", command, 2**64 - 1)
        return _values.record("VespClientMessageResult",
                              self._call(library.keelgate_unpack_client_message, context, message,
                                         "wrong use"))

    async def unpack_async(self, record: str, message: Buffer) -> Any:
        """unpack() for an event loop. A call that is cancelled leaves its message to its time
        limit."""
        return await self._run(lambda: self.unpack(record, message))

    async def unpack_client_message_async(self, message: Buffer, *, command: int,
                                          service: str) -> Any:
        return await self._run(lambda: self.unpack_client_message(message, command=command,
                                                                  service=service))

    def close(self) -> None:
        """Ends the service when the calls under way have returned. May be called again."""
        with self._state:
            self._closed = True
            while self._calls > 0:
                self._state.wait()
            handle, self._handle = self._handle, None
            executor, self._executor = self._executor, None
        if executor is not None:
            # What still waits there finds the client closed.
            executor.shutdown(wait=False)
        if handle is not None:
            library.keelgate_close(handle)

    def __enter__(self) -> Client:
        return self

    def __exit__(self, kind: Optional[type[BaseException]], error: Optional[BaseException],
                 trace: Optional[TracebackType]) -> None:
        self.close()

    def __del__(self) -> None:
        # Nobody else holds it, so no call is under way.
        handle, self._handle = getattr(self, "_handle", None), None
        if handle is not None:
            library.keelgate_close(handle)

    def _call(self, function: Callable[..., int], context: tuple[Any, ...], message: Buffer,
              wrong_use: str) -> Any:
        """The value of the reply."""
        data = bytes(memoryview(message))
        reply = ctypes.c_void_p()
        with self._state:
            if self._closed:
                raise ValueError("the client is closed")
            self._calls += 1
        try:
            status = function(self._handle, *context, data, len(data), ctypes.byref(reply))
        finally:
            with self._state:
                self._calls -= 1
                self._state.notify_all()
        text = take(reply)
        if status == SUCCESS:
            return _values.loads(text)["value"]
        if status in (REJECTED, GIVEN_UP):
            raise from_reply(_values.loads(text)["error"])
        raise ValueError(wrong_use)

    async def _run(self, work: Callable[[], Any]) -> Any:
        with self._state:
            if self._closed:
                raise ValueError("the client is closed")
            if self._executor is None:
                # The loop's own executor may be taken by others for longer than a time limit.
                self._executor = ThreadPoolExecutor(thread_name_prefix="keelgate")
            executor = self._executor
        return await asyncio.get_running_loop().run_in_executor(executor, work)
