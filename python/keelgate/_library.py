# SPDX-License-Identifier: Apache-2.0
"""The C interface of the shared library."""
from __future__ import annotations

import ctypes
import os
import pathlib
from typing import Iterator, Optional

SUCCESS, REJECTED, WRONG_USE, GIVEN_UP = range(4)


class Options(ctypes.Structure):
    _fields_ = [("size", ctypes.c_size_t), ("service_path", ctypes.c_char_p),
                ("socket", ctypes.c_char_p), ("processes", ctypes.c_uint),
                ("messages_per_process", ctypes.c_size_t), ("max_message", ctypes.c_size_t),
                ("time_limit_ms", ctypes.c_uint), ("require_layers", ctypes.c_int)]


def _candidates() -> Iterator[str]:
    """KEELGATE_LIBRARY, the one that a wheel brings along, the one of the tree that this package
    was installed in, the system's."""
    if chosen := os.environ.get("KEELGATE_LIBRARY"):
        # Asked for by name: another in its place would hide a mistake.
        yield chosen
        return
    here = pathlib.Path(__file__).resolve().parent
    name = "libkeelgate.so.0"
    for folder in (here / "lib", *sorted(here.parent.parent.parent.glob("*-linux-*")),
                   here.parent.parent.parent, here.parent.parent.parent.parent / "lib64"):
        if (folder / name).exists():
            yield str(folder / name)
    yield name


def _load() -> ctypes.CDLL:
    problem: Optional[OSError] = None
    for candidate in _candidates():
        try:
            return ctypes.CDLL(candidate)
        except OSError as error:
            problem = problem or error
    raise ImportError("libkeelgate.so.0 was not found: install Keelgate, or name the library in "
                      f"KEELGATE_LIBRARY ({problem})") from problem


def _declare(library: ctypes.CDLL) -> None:
    text = ctypes.POINTER(ctypes.c_void_p)
    message = [ctypes.c_char_p, ctypes.c_size_t, text]
    for name, result, arguments in (
            ("options_init", None, [ctypes.POINTER(Options), ctypes.c_size_t]),
            ("open", ctypes.c_void_p, [ctypes.POINTER(Options), text]),
            ("unpack", ctypes.c_int, [ctypes.c_void_p, ctypes.c_char_p, *message]),
            ("unpack_typed", ctypes.c_int, [ctypes.c_void_p, *message]),
            ("unpack_client_message", ctypes.c_int,
             [ctypes.c_void_p, ctypes.c_char_p, ctypes.c_uint64, *message]),
            ("free", None, [ctypes.c_void_p]),
            ("close", None, [ctypes.c_void_p]),
            ("version", ctypes.c_char_p, [])):
        function = getattr(library, "keelgate_" + name)
        function.restype, function.argtypes = result, arguments


library = _load()
_declare(library)


def take(text: ctypes.c_void_p) -> bytes:
    """A copy of a text that the library made, which is given back."""
    if not text:
        return b""
    try:
        return ctypes.string_at(text)
    finally:
        library.keelgate_free(text)


def version() -> str:
    """Of the library, e.g. "0.1.0"."""
    found: bytes = library.keelgate_version()
    return found.decode()
