"""Records this application's own screen and sound."""
from __future__ import annotations

import asyncio
import logging
from collections import deque
from dataclasses import dataclass
from typing import Any, BinaryIO, Callable, Coroutine, Mapping, Sequence

from ._capture import Capture
from ._link import Link
from .errors import ErrorCode, RecordingError, library_error
from .results import BroadcastExtension, BroadcastImages, Events, Started, State
from .samples import AudioSample, SampleStream, VideoFrame
from .values import BroadcastConfiguration, Value, error_from, from_dictionary, to_dictionary

log = logging.getLogger("quorvel")


@dataclass
class _Start:
    """One start on its way."""

    number: int
    is_abandoned: bool = False  # whoever awaited it was cancelled
    is_recording: bool = False


class Recorder:
    """Records this application through the device's recording daemon.

    One for an application. Making it does nothing yet: the first request connects. One recording goes on at a time on
    the device: a start ends any other, also an own one.

        async with quorvel.Recorder() as recorder:
            await recorder.did_become_active()
            await recorder.start([window], 1280, 720)
            await asyncio.sleep(10)
            url = await recorder.stop()
            with await recorder.open_movie(url) as movie:
                shutil.copyfileobj(movie, open("movie.mp4", "wb"))

    A request that fails raises RecordingError. Its code may always be CONNECTION_INVALID (the daemon cannot be
    reached), CONNECTION_INTERRUPTED (it went away meanwhile) or UNKNOWN (it refused the call; the text has the reason).

    A task that awaits a request may be cancelled. The daemon goes on with what it was asked: only a cancelled `start`
    is taken back, as soon as it has succeeded, and its movie is discarded.

    Threading: one event loop, in which events are called, too.
    """

    def __init__(self, events: Events | None = None):
        self.events = events or Events()
        self._link = Link("QVDaemonProtocol", self._receive, self._on_connection, self._on_loss)
        self._capture = Capture()
        self._is_recording = False
        self._starts = 0  # that were asked for
        self._number = 0  # of the recording that was started last
        self._replaced: deque[int] = deque()  # ended by a later start of ours; the daemon's word of it is still to come
        self._active: bool | None = None
        self._alone: set[asyncio.Task] = set()  # what nobody awaits

    async def __aenter__(self) -> "Recorder":
        return self

    async def __aexit__(self, *_: Any) -> None:
        await self.close()

    async def close(self) -> None:
        """Ends the connection, and with it the recording, whose movie is deleted: stop first. Requests that are awaited
        fail; no event is called any more. Frames that you hold stay yours."""
        for task in list(self._alone):
            task.cancel()
        await self._link.close()
        self._capture.end()

    # Recording

    async def start(self, windows: Sequence[int], width: float, height: float, *, microphone: bool = False,
                    camera: bool = False, broadcast: bool = False, system: bool = False, capture: bool = False,
                    listener_endpoint: int | None = None) -> Started:
        """Asks the user where needed, and starts; so it may take long.

        `windows` are X11 window ids on X11, 64 at most, each of this application; none for a recording of the `system`,
        which needs the entitlement "com.tarnwick.private.quorvel". The picture's size is in pixels. `broadcast` sends
        to the extension of `setup_broadcast` instead of into a movie. With `capture` there is no movie: the samples
        come to `frames()` and `sounds()`. `listener_endpoint` is a descriptor, a broadcast extension's; it stays yours.

        The application must be in front, unless it records the system. Once windows, size and rights are found good,
        whatever records on the device is ended, also where this start is refused later on.

        USER_DECLINED; FAILED_TO_START: not in front, no bundle, a window that is not this application's, another start
        on its way; INSUFFICIENT_STORAGE; ENTITLEMENTS; INVALID_BROADCAST_SESSION; INTERRUPTED.
        """
        endpoint = [] if listener_endpoint is None else [listener_endpoint]
        connection = await self._link.connection()
        self._starts += 1
        replaces = [self._number] if self._is_recording else []
        self._replaced += replaces
        attempt = _Start(self._starts)
        try:
            error, has_microphone, has_camera = await self._link.send(
                connection, "startRecordingWindowLayerContextIDs", "au(dd)bbbbbah", list(windows),
                (float(width), float(height)), microphone, camera, broadcast, system, capture, endpoint,
                answered=lambda values: self._start_answered(attempt, values))
        except asyncio.CancelledError:
            attempt.is_abandoned = True
            self._abandon(attempt)
            raise
        except ValueError:  # it was not sent
            if replaces:
                self._replaced.pop()
            raise
        _raise(error)
        return Started(has_microphone, has_camera)

    def _start_answered(self, attempt: "_Start", values: tuple | None) -> None:
        if values is None or values[0]:
            return
        self._is_recording = attempt.is_recording = True
        self._number += 1
        self._abandon(attempt)

    def _abandon(self, attempt: "_Start") -> None:
        """Where nobody waits any more for a start that went well. A later one has ended what it began."""
        if attempt.is_abandoned and attempt.is_recording and attempt.number == self._starts:
            self._do_alone(self._take_back())

    def _do_alone(self, work: Coroutine[Any, Any, None]) -> None:
        task = asyncio.ensure_future(work)
        self._alone.add(task)
        task.add_done_callback(self._alone.discard)

    async def _take_back(self) -> None:
        try:
            if await self.stop():
                await self.discard()
        except RecordingError as error:
            log.info("a start that was cancelled is taken back: %s", error)

    async def stop(self, start_clip: float = 0, end_clip: float = 0) -> str | None:
        """Ends the recording; returns when its movie is complete: its URL, or None after a capture or a broadcast.

        Cuts so many seconds off the movie's start and end, where both are positive.

        FAILED_TO_SAVE: there is no movie, or, with the error's `movie_url`, one that ends early; UNKNOWN: nothing is
        being recorded.
        """
        connection = await self._link.connection()
        if start_clip or end_clip:
            url, error = await self._link.send(connection, "stopRecordingWithStartClipDuration", "dd",
                                               float(start_clip), float(end_clip), answered=self._stop_answered)
        else:
            url, error = await self._link.send(connection, "stopRecordingWithHandler", answered=self._stop_answered)
        _raise(error, url)
        return url or None

    def _stop_answered(self, _values: tuple | None) -> None:
        """A loss of the daemon ends the recording, too: told by this answer alone."""
        self._ended()

    async def pause(self) -> None:
        """Nothing is recorded until `resume`: the pause is not in the movie, and a capture gets no samples. A broadcast
        stays paused until its stop. No effect on a system recording, and while nothing records."""
        await self._link.request("pauseRecording")

    async def resume(self, window: int) -> None:
        """`window` is recorded from here on; it must be this application's, or the recording ends (`Events.stopped`)
        with NO_CONTEXTID_MATCH and its movie."""
        await self._link.request("resumeRecordingWithWindowLayerContextID", "u", window)

    async def set_microphone_enabled(self, enabled: bool) -> None:
        """During a recording: false puts silence in place of the microphone's sound. It does not bring a microphone
        into an application's recording that was started without."""
        await self._link.request("setMicrophoneEnabled", "b", enabled)

    async def update_process_id_for_audio_capture(self, pid: int) -> None:
        """During a recording: records the sound of process `pid` from here on, of nobody with 0 or less. It must be of
        this application's bundle."""
        await self._link.request("updateProcessIDForAudioCaptureWithPID", "i", pid)

    async def discard(self) -> None:
        """Deletes the movie that this application was handed last, unless it is saved; no error where there is none.

        UNKNOWN: during a recording, or for an application in no bundle.
        """
        await self._link.request("discardRecordingWithHandler")

    async def save_video_to_camera_roll(self, movie_url: str) -> None:
        """Moves a movie to the user's photo library, its sound mixed into one track.

        FAILED_TO_SAVE: not this application's movie, gone, saved already, or being saved. Any other error is the
        library's, e.g. of the domain "posix": the movie stays, and can be saved again.
        """
        _raise((await self._link.request("saveVideoToCameraRoll", "s", movie_url))[0])

    async def open_movie(self, movie_url: str) -> BinaryIO:
        """Opens a movie that this application was handed: a file for reading, at its start, that you close.

        The file at the URL is for the daemon alone, so this is how an application reads its movie. What is open stays
        readable, also when the movie is saved, discarded or replaced meanwhile.

        FAILED_TO_SAVE: not this application's movie, gone, saved already, or being saved.
        """
        files, error = await self._link.request("openMovieAtURL", "s", movie_url)
        _raise(error)
        if not files:
            raise library_error(ErrorCode.UNKNOWN, "the movie did not come with the answer")
        return files[0]

    async def current_state(self) -> State:
        """What the daemon knows of this application now."""
        known = from_dictionary((await self._link.request("synchronousGetCurrentState"))[0])
        flags = {"recording": "isRecording", "broadcasting": "isBroadcasting",
                 "microphone_enabled": "microphoneEnabled", "system_recording": "isSystemRecording",
                 "user_consent_for_microphone": "hasUserConsentForMicrophone",
                 "user_consent_for_camera": "hasUserConsentForCamera",
                 "microphone_enabled_persistent": "microphoneEnabledPersistent"}
        return State(**{name: bool(known.get(key)) for name, key in flags.items()},
                     broadcast_url=known.get("broadcastURL"))

    # Capture

    def frames(self) -> SampleStream[VideoFrame]:
        """The pictures of a capture: `async for frame in recorder.frames():`. Ask before the start; it ends with the
        capture. One comes when what is shown has changed (60 a second at most), and of a screen that stands still at
        least two a second. Where three wait, a new one is dropped."""
        return self._capture.frames.open()

    def sounds(self) -> SampleStream[AudioSample]:
        """The sound of a capture, of both sources. Where 64 wait, a new one is dropped."""
        return self._capture.sounds.open()

    # The application's place

    async def did_become_active(self) -> None:
        """Tell when the application comes to the front; it is repeated on each new connection. The user's consent
        lapses when the application comes to the front, or connects, more than 480 s after it went to the background."""
        await self._tell_active(True)

    async def did_resign_active(self) -> None:
        """Tell when the application leaves the front."""
        await self._tell_active(False)

    async def _tell_active(self, active: bool) -> None:
        try:
            connection = await self._link.connection()
        finally:
            self._active = active  # each new connection is told
        await self._link.send(connection, "clientDidBecomeActive" if active else "clientDidResignActive")

    async def _tell_active_again(self) -> None:
        try:
            await self._tell_active(bool(self._active))
        except RecordingError as error:
            log.info("the application's place was not told: %s", error)

    def keep_connected(self, keep: bool) -> None:
        """While on, a lost daemon is looked for again (after 0.25 s, then less and less often, every 30 s at last). Off
        by default: then only the next request connects."""
        self._link.keep_connected(keep)

    # Broadcasts

    async def setup_broadcast(self, host_bundle_id: str, extension_bundle_id: str,
                              configuration: BroadcastConfiguration | None = None,
                              user_info: Mapping[str, Value] | None = None) -> None:
        """Names the extension of the next broadcast, and what it is told. For one broadcast; a later set-up replaces
        it.

        `host_bundle_id` is this application's own. Of `extension_bundle_id` all but the last component counts: the
        first installed upload extension whose identifier begins so is taken.

        INVALID_BROADCAST_SESSION: no such extension; ENTITLEMENTS: of another application, without the right.
        """
        archive = (configuration or BroadcastConfiguration()).archived()
        _raise((await self._link.request("setupBroadcastWithHostBundleID", "ssaya{sv}", host_bundle_id,
                                         extension_bundle_id, archive, to_dictionary(user_info or {})))[0])

    async def current_broadcast_images(self) -> BroadcastImages:
        """The icons of the application and the extension that were set up last on this device, until the next stop."""
        return BroadcastImages(*(await self._link.request("getCurrentBroadcastImages")))

    async def system_broadcast_extensions(self) -> list[BroadcastExtension]:
        """The installed upload extensions, of all applications."""
        extensions, error = await self._link.request("getSystemBroadcastExtensionInfo")
        _raise(error)
        return [BroadcastExtension(known.get("extBundleID", ""), known.get("displayName", ""),
                                   known.get("extAppImgData", b"")) for known in map(from_dictionary, extensions)]

    async def set_broadcast_url(self, url: str) -> None:
        """Sets `State.broadcast_url`; the empty text takes it away. It has no other effect."""
        await self._link.request("setBroadcastURL", "s", url)

    # Remembered by the daemon for this application, while it is connected

    async def set_has_user_consent_for_camera(self, consent: bool) -> None:
        """Sets `State.user_consent_for_camera`. It has no other effect."""
        await self._link.request("setHasUserConsentForCamera", "b", consent)

    async def set_has_user_consent_for_microphone(self, consent: bool) -> None:
        """Sets `State.user_consent_for_microphone`. It has no other effect."""
        await self._link.request("setHasUserConsentForMicrophone", "b", consent)

    async def set_microphone_enabled_persistent(self, enabled: bool) -> None:
        """Sets `State.microphone_enabled_persistent`. It has no other effect."""
        await self._link.request("setMicrophoneEnabledPersistent", "b", enabled)

    async def report_camera_usage(self, camera_position: int) -> None:
        """During a recording: the application uses a camera, 1 the back one, 2 the front one. It goes into the
        recording's metrics; other positions are ignored."""
        await self._link.request("reportCameraUsage", "i", camera_position)

    @property
    def dropped_samples(self) -> int:
        """Captured samples that were dropped because nobody took them in time, pictures and sound together."""
        return self._capture.dropped

    # What the daemon tells

    def _on_connection(self) -> None:
        self._capture.begin()
        if self._active is not None:
            self._do_alone(self._tell_active_again())
        self._tell(self.events.connected)

    def _on_loss(self) -> None:
        self._replaced.clear()
        was_recording = self._is_recording  # a stop on its way has ended it
        self._ended()
        if was_recording:
            self._tell(self.events.stopped, library_error(ErrorCode.CONNECTION_INTERRUPTED))
        self._tell(self.events.interrupted)

    def _ended(self) -> None:
        self._is_recording = False
        self._capture.end()

    @staticmethod
    def _tell(event: Callable[..., None] | None, *values: Any) -> None:
        if event is not None:
            try:
                event(*values)
            except Exception:  # pylint: disable=broad-except
                log.exception("an event's function failed")

    def _receive(self, member: str, values: tuple) -> None:
        handler = _HANDLERS.get(member)
        if handler is not None:
            handler(self, *values)

    def _receive_stop(self, dictionary: dict, url: str) -> None:
        error = error_from(dictionary) or library_error(ErrorCode.UNKNOWN)
        error.movie_url = url or None
        if self._is_word_of_replaced(error):
            return
        self._ended()
        self._tell(self.events.stopped, error)

    def _is_word_of_replaced(self, error: RecordingError) -> bool:
        """Whether it tells the end of a recording in whose place another of ours already goes on."""
        if error.code != ErrorCode.INTERRUPTED or not self._replaced:
            return False
        return self._replaced.popleft() != self._number


_HANDLERS: dict[str, Callable[..., None]] = {
    "captureHandlerWithSample": lambda self, *values: self._capture.receive_frame(*values),
    "captureHandlerWithAudioSample": lambda self, *values: self._capture.receive_sound(*values),
    "captureTimelineDidChange": lambda self, *values: self._capture.receive_pauses(*values),
    "stopRecordingWithError": Recorder._receive_stop,
    "updateScreenRecordingState": lambda self, on: self._tell(self.events.recording_state_changed, bool(on)),
    "updateBroadcastServiceInfo": lambda self, info: self._tell(self.events.broadcast_service_info_changed,
                                                                from_dictionary(info)),
    "updateBroadcastURL": lambda self, url: self._tell(self.events.broadcast_url_changed, url),
    "recordingLockInterrupted": lambda self, error: self._tell(self.events.recording_lock_interrupted,
                                                               error_from(error)),
    "recordingTimerDidUpdate": lambda self, text: self._tell(self.events.recording_timer_changed, text),
}


def _raise(dictionary: Mapping[str, Any], movie_url: str = "") -> None:
    error = error_from(dictionary)
    if error is not None:
        error.movie_url = movie_url or None
        raise error
