"""Values of any kind, as user information has them, and their form on the wire."""
from __future__ import annotations

import struct
from dataclasses import dataclass, field
from typing import Any, Mapping, Union

from .errors import DOMAIN, ErrorCode, RecordingError, library_error

Value = Union[None, bool, int, float, str, bytes, list, Mapping[str, Any]]
"""One entry of user information: nothing, a flag, a number (of 64 bits), a text, bytes, or a container of these."""

_INTEGERS = range(-2**63, 2**63)


def to_variant(value: Value) -> tuple[str, Any]:
    """As jeepney takes a variant: its signature and its content."""
    if isinstance(value, bool):
        return "b", value
    if isinstance(value, int):
        if value not in _INTEGERS:
            raise ValueError(f"{value} does not fit into 64 bits")
        return "x", value
    if isinstance(value, float):
        return "d", value
    if isinstance(value, str):
        return "s", value
    if isinstance(value, (bytes, bytearray, memoryview)):
        return "ay", bytes(value)
    if isinstance(value, Mapping):
        return "a{sv}", to_dictionary(value)
    if isinstance(value, (list, tuple)):
        return "av", [to_variant(entry) for entry in value]
    raise TypeError(f"{type(value).__name__} cannot be sent: {value!r}")


def to_dictionary(values: Mapping[str, Value]) -> dict[str, tuple[str, Any]]:
    """An absent key is how None stands in a dictionary."""
    if any(not isinstance(key, str) for key in values):
        raise TypeError("the keys of a dictionary must be texts")
    return {key: to_variant(value) for key, value in values.items() if value is not None}


def from_variant(variant: tuple[str, Any]) -> Any:
    """URLs become texts, dates seconds since 1970."""
    signature, content = variant
    if signature == "a{sv}":
        return from_dictionary(content)
    if signature == "av":
        return [from_variant(entry) for entry in content]
    if signature in ("(s)", "(d)"):
        return content[0]
    return content


def from_dictionary(dictionary: Mapping[str, tuple[str, Any]]) -> dict[str, Any]:
    """Descriptors have no form here, and are left out."""
    return {key: from_variant(value) for key, value in dictionary.items() if value[0] != "h"}


def error_from(dictionary: Mapping[str, tuple[str, Any]]) -> RecordingError | None:
    """Of the empty dictionary none."""
    if not dictionary:
        return None
    error = from_dictionary(dictionary)
    if not isinstance(error.get("code"), int):
        return library_error(ErrorCode.UNKNOWN, "malformed error")
    text = (error.get("userInfo") or {}).get("localizedDescription", "")
    return RecordingError(error["code"], text, error.get("domain", DOMAIN))


# The archive that a broadcast's configuration crosses in (docs/protocol.md).

def _archived_text(text: str) -> bytes:
    encoded = text.encode()
    return struct.pack("<I", len(encoded)) + encoded


def _archived_value(value: Value) -> bytes:
    if isinstance(value, bool):
        return b"b" + struct.pack("<B", value)
    if isinstance(value, int):
        return b"x" + struct.pack("<q", value)
    if isinstance(value, float):
        return b"d" + struct.pack("<d", value)
    if isinstance(value, str):
        return b"s" + _archived_text(value)
    if isinstance(value, Mapping):
        return b"m" + _archived_dictionary(value)
    raise TypeError(f"{type(value).__name__} has no place in a configuration")


def _archived_dictionary(values: Mapping[str, Value]) -> bytes:
    entries = (_archived_text(key) + _archived_value(value) for key, value in values.items())
    return struct.pack("<I", len(values)) + b"".join(entries)


@dataclass
class BroadcastConfiguration:
    """The settings of a broadcast."""

    clip_duration: float = 0
    """Length of each movie clip in seconds, 0.5 to 600; 0: five seconds."""
    video_compression_properties: dict[str, Value] = field(default_factory=dict)
    """Of clips: "AverageBitRate" (bits a second), "ExpectedSourceFrameRate", "MaxKeyFrameInterval" (pictures),
    "ProfileLevel". docs/protocol.md has their bounds; other keys have no effect."""

    def archived(self) -> bytes:
        """The form in which the daemon takes it."""
        fields: dict[str, Value] = {"clipDuration": float(self.clip_duration),
                                    "videoCompressionProperties": self.video_compression_properties}
        return b"QVKA\x01" + _archived_text("QVBroadcastConfiguration") + _archived_dictionary(fields)
