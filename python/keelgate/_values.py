# SPDX-License-Identifier: Apache-2.0
"""From the JSON of a reply to Python's own types.

JSON has no type for data, dates and identifiers. Which field holds what stands in `_tables.json`,
which the build writes from the tables that the service itself decodes with.
"""
from __future__ import annotations

import base64
import json
import pathlib
import re
import uuid
from datetime import datetime, timedelta, timezone
from typing import Any, Callable, Iterable, Optional, Union

#: What the records' dates count from.
REFERENCE = datetime(2001, 1, 1, tzinfo=timezone.utc)


class UID(int):
    """The UID of a property list: a number that refers to something its sender knows."""

    def __repr__(self) -> str:
        return f"UID({int(self)})"


def date(seconds: float) -> Union[datetime, float]:
    """An aware datetime, or the number itself where the calendar ends."""
    try:
        return REFERENCE + timedelta(seconds=seconds)
    except OverflowError:
        return seconds


def _date(value: Union[str, int, float]) -> Union[datetime, float]:
    # A date outside of the calendar is a number in the reply.
    if not isinstance(value, str):
        return float(value)
    whole, _, fraction = value.rstrip("Z").partition(".")
    moment = datetime.strptime(whole, "%Y-%m-%dT%H:%M:%S").replace(tzinfo=timezone.utc)
    return moment + timedelta(microseconds=int(fraction.ljust(6, "0")) if fraction else 0)


def _same(value: Any) -> Any:
    return value


#: Values that are not already what json.loads makes of them. JSON has no number for "nan" and the
#: infinities, which arrive as strings that float() understands.
_converters: dict[str, Callable[[Any], Any]] = {
    "data": base64.b64decode,
    "date": _date,
    "double": float,
    "uuid": uuid.UUID,
}


def _load_tables() -> dict[str, dict[str, str]]:
    text = pathlib.Path(__file__).with_name("_tables.json").read_text("utf-8")
    records: dict[str, list[dict[str, Any]]] = json.loads(text)["records"]
    return {name: {field["field"]: field["type"] for field in fields}
            for name, fields in records.items()}


_tables = _load_tables()


_token = re.compile(r'[][{}]|"(?:[^"\\]|\\.)*"|[^][{}:,"\s]+')


def loads(text: bytes) -> Any:
    """json.loads for a reply of any depth. A document nests 512 containers, which a typed reply
    doubles; the interpreter has a limit of its own, of which the caller may have used up a part."""
    try:
        return json.loads(text)
    except RecursionError:
        return _loads_flat(text.decode())


def _loads_flat(text: str) -> Any:
    """The same without recursion, for JSON that the library made."""
    root: list[Any] = []
    containers: list[Any] = [root]
    key: Optional[str] = None
    for token in _token.findall(text):
        if token in "]}":
            containers.pop()
            continue
        holder = containers[-1]
        if isinstance(holder, dict) and key is None:
            key = json.loads(token)
            continue
        value = {} if token == "{" else [] if token == "[" else json.loads(token)
        if key is None:
            holder.append(value)
        else:
            holder[key] = value
            key = None
        if token in "[{":
            containers.append(value)
    return root[0]


#: What is still to be converted: where it goes, its type, and the value.
_Pending = list[tuple[Any, Any, Any, Any]]


def _convert(kind: Any, value: Any, step: Callable[[Any, Any, _Pending], Any]) -> Any:
    """Walks a tree without recursion; `step` makes one value, and leaves what is in it pending."""
    root: list[Any] = [None]
    pending: _Pending = [(root, 0, kind, value)]
    while pending:
        holder, place, its_kind, held = pending.pop()
        holder[place] = step(its_kind, held, pending)
    return root[0]


def _members(made: Any, places: Iterable[tuple[Any, Any, Any]], pending: _Pending) -> Any:
    pending.extend((made, place, kind, held) for place, kind, held in places)
    return made


def _record_step(kind: str, value: Any, pending: _Pending) -> Any:
    if kind.startswith("["):
        return _members([None] * len(value),
                        ((i, kind[1:-1], held) for i, held in enumerate(value)), pending)
    fields = _tables.get(kind)
    # An enumeration may have the name of a record: its value is a string.
    if fields is None or not isinstance(value, dict):
        return _converters.get(kind, _same)(value)
    # The keys take their places, and so their order, before the values are there.
    return _members(dict.fromkeys(value),
                    ((field, fields[field], held) for field, held in value.items()), pending)


def record(name: str, value: Any) -> Any:
    """The value of a record, by the name that the tables know it under."""
    # The one record that is not an object of its fields: it is its case.
    kind = _tables[name]["result"] if name == "VespClientMessageResult" else name
    return _convert(kind, value, _record_step)


_typed: dict[str, Callable[[Any], Any]] = {
    "real": float,
    "data": base64.b64decode,
    "date": lambda seconds: date(float(seconds)),
    "uid": lambda number: UID(number, 16) if isinstance(number, str) else UID(number),
}


def _typed_step(_: None, node: dict[str, Any], pending: _Pending) -> Any:
    kind, value = node["type"], node["value"]
    if kind == "dictionary":
        return _members(dict.fromkeys(value), ((key, None, held) for key, held in value.items()),
                        pending)
    if kind in ("array", "set"):
        return _members([None] * len(value), ((i, None, held) for i, held in enumerate(value)),
                        pending)
    return _typed.get(kind, _same)(value)


def property_list(node: dict[str, Any]) -> Any:
    """The tree of a typed reply."""
    return _convert(None, node, _typed_step)
