"""Records this application's own screen and sound, through the device's recording daemon.

`Recorder` is for applications, `StatusReader` for whoever looks after the device; both are for asyncio.
`python3 -m quorvel.bundle` makes the bundle that an application has to be. docs/python.md is the guide.
"""
from .errors import DOMAIN, ErrorCode, RecordingError
from .recorder import Recorder
from .results import BroadcastExtension, BroadcastImages, Events, Started, State, file_path
from .samples import AudioFormat, AudioSample, AudioSource, SampleStream, VideoFrame
from .status import StatusReader
from .values import BroadcastConfiguration, Value

__all__ = [
    "AudioFormat", "AudioSample", "AudioSource", "BroadcastConfiguration", "BroadcastExtension", "BroadcastImages",
    "DOMAIN", "ErrorCode", "Events", "Recorder", "RecordingError", "SampleStream", "Started", "State", "StatusReader",
    "Value", "VideoFrame", "file_path",
]
