"""The samples of a capture, on their way from the daemon to whoever iterates over them."""
from __future__ import annotations

from .samples import (AudioSample, SampleStream, SoundTimeline, StreamSlot, VideoFrame, picture_from, sound_from,
                      time_from)

_MOST_WAITING_FRAMES = 3  # each holds one of the daemon's few
_MOST_WAITING_SOUND = 64  # about a second and a half of two sources


class Capture:
    """The streams of pictures and sound, and the timeline of one connection's samples.

    Threading: that of the event loop.
    """

    def __init__(self) -> None:
        self.frames: StreamSlot[VideoFrame] = StreamSlot(_MOST_WAITING_FRAMES)
        self.sounds: StreamSlot[AudioSample] = StreamSlot(_MOST_WAITING_SOUND)
        self.dropped = 0
        self.begin()

    def begin(self) -> None:
        """On a new connection."""
        self._timeline, self._pauses = SoundTimeline(), 0

    def end(self) -> None:
        """With the recording."""
        self.frames.end()
        self.sounds.end()

    def receive_frame(self, sample: tuple, timing: bytes) -> None:
        stream = self.frames.stream
        if stream is None:
            return
        frame = picture_from(sample, timing)
        if frame is not None:
            self._put(stream, frame)

    def receive_sound(self, data: bytes, description: bytes, count: int, kind: int, timing: bytes) -> None:
        sample = sound_from(data, description, count, kind, timing)
        # Also what nobody listens to has its place on the timeline.
        if sample is None or not self._timeline.place(sample, self._pauses):
            return
        if (stream := self.sounds.stream) is not None:
            self._put(stream, sample)

    def receive_pauses(self, pauses: bytes) -> None:
        known = time_from(pauses)
        if known is not None:
            self._pauses = known

    def _put(self, stream: SampleStream, sample: AudioSample | VideoFrame) -> None:
        before = stream.dropped
        stream.put(sample)
        self.dropped += stream.dropped - before
