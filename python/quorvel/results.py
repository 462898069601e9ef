"""What a recorder answers, and what it tells by itself."""
from __future__ import annotations

from dataclasses import dataclass
from typing import Any, Callable
from urllib.parse import unquote, urlsplit

from .errors import RecordingError


@dataclass(frozen=True)
class Started:
    """What is recorded: asked for, there on the device, and allowed by the user."""

    microphone: bool
    camera: bool  #: always false at present


@dataclass(frozen=True)
class State:
    """What the daemon knows of this application; all of it empty where the application is in no bundle."""

    recording: bool = False  #: from the user's consent on, in a pause too
    broadcasting: bool = False
    microphone_enabled: bool = False             #: of the recording
    system_recording: bool = False               #: whether the recording is one of the whole screen
    user_consent_for_microphone: bool = False    #: of `set_has_user_consent_for_microphone`
    user_consent_for_camera: bool = False        #: of `set_has_user_consent_for_camera`
    microphone_enabled_persistent: bool = False  #: of `set_microphone_enabled_persistent`
    broadcast_url: str | None = None             #: where the broadcast can be watched


@dataclass(frozen=True)
class BroadcastImages:
    """PNG images; empty where there is none."""

    host_app: bytes
    extension: bytes


@dataclass(frozen=True)
class BroadcastExtension:
    """An upload extension that is installed."""

    bundle_id: str
    display_name: str = ""  #: for the user; empty without
    icon: bytes = b""       #: PNG; empty without


@dataclass
class Events:
    """What happens without having been asked for: functions that are called in the event loop. Each may be None."""

    stopped: Callable[[RecordingError], None] | None = None
    """The recording ended, and neither by `stop` nor because a later start of this application's took its place. The
    error's `movie_url` is that of its movie, where this application may save or discard it."""
    interrupted: Callable[[], None] | None = None
    """The daemon went away: once for each loss. Outstanding requests have failed by then, and so has the recording. The
    next request connects anew."""
    connected: Callable[[], None] | None = None
    """A connection to the daemon was made: the first, or one after an interruption."""
    recording_state_changed: Callable[[bool], None] | None = None
    """With the system's entitlement: something begins or ends to be recorded, for whichever application."""
    broadcast_service_info_changed: Callable[[dict[str, Any]], None] | None = None
    """Whatever the extension of the broadcast tells of its service; it replaces what came before."""
    broadcast_url_changed: Callable[[str], None] | None = None
    """Where the broadcast can be watched, as its extension says."""
    recording_lock_interrupted: Callable[[RecordingError], None] | None = None
    """No daemon sends this at present."""
    recording_timer_changed: Callable[[str], None] | None = None
    """With the system's entitlement: how long that has been recorded, without pauses, as "1:05"."""


def file_path(url: str) -> str:
    """The path of a "file:///..." URL; empty for any other."""
    parts = urlsplit(url)
    return unquote(parts.path) if parts.scheme == "file" and parts.netloc in ("", "localhost") else ""
