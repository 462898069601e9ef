"""Captured pictures and sound.

All times are nanoseconds of CLOCK_MONOTONIC (`time.monotonic_ns()`) at the capture, less the pauses so far.
"""
from __future__ import annotations

import asyncio
import enum
import mmap
import os
import struct
import weakref
from collections import deque
from dataclasses import dataclass
from typing import TYPE_CHECKING, Any, Generic, TypeVar

if TYPE_CHECKING:
    import numpy

_TIME = struct.Struct("=qiIq")  # value, timescale, flags (bit 0: valid), epoch
_SOUND = struct.Struct("=d8I")
_IS_FLOAT, _IS_BIG_ENDIAN, _IS_SIGNED = 1, 2, 4
_LONGEST_OVERLAP = 2_000_000_000  # ns; sound that lies further back is no overlap
_BGRX = 1


def _nanoseconds(value: int, timescale: int, flags: int) -> int | None:
    return value * 1_000_000_000 // timescale if flags & 1 and timescale > 0 else None


def time_from(data: bytes) -> int | None:
    """One time of 24 bytes."""
    return _nanoseconds(*_TIME.unpack(data)[:3]) if len(data) == _TIME.size else None


def _timing(data: bytes) -> tuple[int | None, int | None]:
    """Duration and presentation time; the decode time comes last."""
    if len(data) != 3 * _TIME.size:
        return None, None
    return time_from(data[:24]), time_from(data[24:48])


class _Surface(mmap.mmap):
    """The memory of a picture, and the right to it. The right ends with the last of whatever lies upon the memory."""

    _lease = -1

    @classmethod
    def map(cls, memory: int, size: int, lease: int) -> "_Surface":
        surface = cls(memory, size, flags=mmap.MAP_SHARED, prot=mmap.PROT_READ)
        surface._lease = os.dup(lease)
        return surface

    @property
    def is_held(self) -> bool:
        return self._lease >= 0

    def give_back(self) -> None:
        lease, self._lease = self._lease, -1
        if lease >= 0:
            os.close(lease)

    def __del__(self) -> None:
        self.give_back()


class VideoFrame:
    """A captured picture, in memory that is shared with the daemon: nothing is copied.

    The daemon has few such frames (fourteen). A frame goes back to it

    - at the end of `with frame:`, or by `release()`: arrays that still lie upon it can be read without harm, but show
      another picture sooner or later;
    - otherwise when the frame and every array that was made of it are gone.

    So let go of it within a picture or two, and copy what you keep: `frame.pixels.copy()`, or `frame.rgb()`.
    """

    width: int
    """Of the picture, in pixels of 4 bytes."""
    height: int
    stride: int
    """Bytes from one row to the next, at least 4 * width."""
    presentation_time: int
    """When it is shown, in nanoseconds."""
    duration: int | None
    """How long, in nanoseconds, where that is known; mostly it is not."""

    def __init__(self, surface: _Surface, width: int, height: int, stride: int, presentation_time: int,
                 duration: int | None):
        self._surface = surface
        self.width, self.height, self.stride = width, height, stride
        self.presentation_time, self.duration = presentation_time, duration

    @property
    def memory(self) -> mmap.mmap:
        """`height` rows of `stride` bytes, from the top; read-only. For those without NumPy."""
        return self._surface

    @property
    def pixels(self) -> "numpy.ndarray":
        """An array (height, width, 4) of bytes upon the shared memory: blue, green, red, and one without meaning."""
        import numpy  # pylint: disable=import-outside-toplevel
        return numpy.ndarray((self.height, self.width, 4), numpy.uint8, self._surface, strides=(self.stride, 4, 1))

    def rgb(self) -> "numpy.ndarray":
        """A copy: an array (height, width, 3) of red, green, blue. It is yours."""
        return self.pixels[:, :, 2::-1].copy()

    @property
    def is_released(self) -> bool:
        """Whether it was given back: its pixels may change then."""
        return not self._surface.is_held

    def release(self) -> None:
        """Gives the frame back now. May be called again."""
        self._surface.give_back()

    def __enter__(self) -> "VideoFrame":
        return self

    def __exit__(self, *_: Any) -> None:
        self.release()

    def __repr__(self) -> str:
        return f"<VideoFrame {self.width}x{self.height} at {self.presentation_time / 1e9:.3f} s>"


class AudioSource(enum.Enum):
    """Whose sound it is."""

    APPLICATION = 2
    MICROPHONE = 3


@dataclass(frozen=True)
class AudioFormat:
    """Linear PCM. It may be another in each sample."""

    sample_rate: float     #: frames a second
    channels: int          #: interleaved: a frame has a number of each
    bits_per_channel: int  #: of one number
    bytes_per_frame: int
    is_float: bool         #: IEEE numbers, otherwise integers
    is_signed: bool        #: of integers
    is_big_endian: bool    #: the order of the bytes of a number

    @property
    def dtype(self) -> str:
        """NumPy's name for one number, e.g. ">i2"."""
        kind = "f" if self.is_float else "i" if self.is_signed else "u"
        return (">" if self.is_big_endian else "<") + kind + str(self.bits_per_channel // 8)


@dataclass
class AudioSample:
    """A run of captured sound."""

    source: AudioSource
    data: bytes
    format: AudioFormat
    frame_count: int
    presentation_time: int  #: of its first frame, in nanoseconds
    duration: int | None    #: where it is known; it follows from frames and rate otherwise

    @property
    def samples(self) -> "numpy.ndarray":
        """An array (frame_count, channels) upon `data`, read-only."""
        import numpy  # pylint: disable=import-outside-toplevel
        numbers = numpy.frombuffer(self.data, self.format.dtype, self.frame_count * self.format.channels)
        return numbers.reshape(self.frame_count, self.format.channels)

    def cut_off(self, frames: int) -> None:
        """Leaves out so many frames at its beginning."""
        length = frames_length(frames, self.format.sample_rate)
        self.data = self.data[frames * self.format.bytes_per_frame:]
        self.frame_count -= frames
        self.presentation_time += length
        if self.duration is not None and self.duration > length:
            self.duration -= length


def frames_length(frames: int, sample_rate: float) -> int:
    """In nanoseconds."""
    return round(frames / sample_rate * 1e9)


def picture_from(sample: tuple, timing: bytes) -> VideoFrame | None:
    """What came over the wire; None where it makes no sense. Its descriptors stay the caller's."""
    memory, lease, width, height, stride, pixel_format = sample
    duration, time = _timing(timing)
    if pixel_format != _BGRX or time is None or not (0 < width and 4 * width <= stride and 0 < height):
        return None
    surface = _Surface.map(memory.fileno(), stride * height, lease.fileno())
    return VideoFrame(surface, width, height, stride, time, duration)


def sound_from(data: bytes, description: bytes, count: int, kind: int, timing: bytes) -> AudioSample | None:
    """What came over the wire; None where it makes no sense."""
    duration, time = _timing(timing)
    if time is None or len(description) != _SOUND.size or kind not in (2, 3):
        return None
    rate, _, flags, _, _, frame_size, channels, bits, _ = _SOUND.unpack(description)
    if count < 0 or frame_size == 0 or count * frame_size > len(data):
        return None
    form = AudioFormat(rate, channels, bits, frame_size, bool(flags & _IS_FLOAT), bool(flags & _IS_SIGNED),
                       bool(flags & _IS_BIG_ENDIAN))
    return AudioSample(AudioSource(kind), data, form, count, time, duration)


class SoundTimeline:
    """Puts sound on the timeline of the pictures: the time of its capture less the pauses so far.

    A pause takes away what lies between the last picture before it and the first one after it. The sound up to the
    pause was given by then, so the first that comes after overlaps it; that is cut off, so that the times of each
    source only grow.
    """

    def __init__(self) -> None:
        self._ends: dict[AudioSource, int] = {}

    def place(self, sample: AudioSample, pauses: int) -> bool:
        """False where nothing is left of it."""
        if not 0 <= pauses <= sample.presentation_time:
            return False
        sample.presentation_time -= pauses
        rate = sample.format.sample_rate
        if not rate >= 1:
            return True
        overlap = self._ends.get(sample.source, sample.presentation_time) - sample.presentation_time
        if overlap <= _LONGEST_OVERLAP:
            frames = round(overlap / 1e9 * rate)
            if 0 < frames and sample.frame_count <= frames:
                return False
            if frames > 0:
                sample.cut_off(frames)
        self._ends[sample.source] = sample.presentation_time + frames_length(sample.frame_count, rate)
        return True


Sample = TypeVar("Sample", VideoFrame, AudioSample)


class SampleStream(Generic[Sample]):
    """Samples of a capture as they come, for `async for`. It ends with the capture.

    Where `longest` wait, a new one is dropped, and counted. One task at a time.
    """

    def __init__(self, longest: int):
        self._longest = longest
        self._waiting: deque[Sample] = deque()
        self._waiter: asyncio.Future[None] | None = None
        self._is_over = False
        self.dropped = 0
        """How many were dropped because nobody took them in time."""

    def __aiter__(self) -> "SampleStream[Sample]":
        return self

    async def __anext__(self) -> Sample:
        while not self._waiting:
            if self._is_over:
                raise StopAsyncIteration
            if self._waiter is not None:
                raise RuntimeError("another task waits for these samples")
            self._waiter = asyncio.get_running_loop().create_future()
            try:
                await self._waiter
            finally:
                self._waiter = None
        return self._waiting.popleft()

    def put(self, sample: Sample) -> None:
        """Of the recorder."""
        if len(self._waiting) >= self._longest:
            self.dropped += 1
            return
        self._waiting.append(sample)
        self._wake()

    def end(self) -> None:
        """Of the recorder: nothing comes any more."""
        self._is_over = True
        self._wake()

    def _wake(self) -> None:
        if self._waiter is not None and not self._waiter.done():
            self._waiter.set_result(None)


class StreamSlot(Generic[Sample]):
    """Place for the one stream of a kind that somebody iterates over; what nobody holds any more gets nothing."""

    def __init__(self, longest: int):
        self._longest = longest
        self._stream: weakref.ref[SampleStream[Sample]] | None = None

    @property
    def stream(self) -> SampleStream[Sample] | None:
        return self._stream() if self._stream is not None else None

    def open(self) -> SampleStream[Sample]:
        if self.stream is not None:
            raise RuntimeError("these samples go to another stream already")
        stream: SampleStream[Sample] = SampleStream(self._longest)
        self._stream = weakref.ref(stream)
        return stream

    def end(self) -> None:
        if (stream := self.stream) is not None:
            stream.end()
        self._stream = None
