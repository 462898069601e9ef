"""What goes wrong, and how it is told."""
from __future__ import annotations

import enum

DOMAIN = "com.tarnwick.Quorvel.QVRecordingErrorDomain"


class ErrorCode(enum.IntEnum):
    """The codes of `DOMAIN`, and what to do about them."""

    UNKNOWN = -5800                    #: anything else; the text says more: log it
    USER_DECLINED = -5801              #: the user said no: do not ask again by yourself
    DISABLED = -5802                   #: recording is switched off on this device
    FAILED_TO_START = -5803            #: not in front, no bundle, or a window that is not yours
    FAILED = -5804                     #: the recording broke off
    INSUFFICIENT_STORAGE = -5805       #: too little free space; tell the user
    INTERRUPTED = -5806                #: another recording took over, or the application left the front
    CONTENT_RESIZE = -5807             #: the picture's size changed during the recording
    INVALID_BROADCAST_SESSION = -5808  #: no broadcast was set up, or its extension is gone
    SYSTEM_DORMANCY = -5809            #: the device went to sleep
    ENTITLEMENTS = -5810               #: the application lacks the right to do this
    ACTIVE_PHONE_CALL = -5811          #: not raised at present
    FAILED_TO_SAVE = -5812             #: the movie could not be written
    DASHVEX = -5813                    #: not raised at present
    CONNECTION_INVALID = -5814         #: the daemon cannot be reached; try again later
    CONNECTION_INTERRUPTED = -5815     #: the daemon went away meanwhile; a recording is lost
    NO_CONTEXTID_MATCH = -5816         #: resumed with a window that is not yours; the recording ended
    MEDIASERVICES_FAILED = -5817       #: screen or sound capture failed
    MIXING_FAILURE = -5818             #: not raised at present


_TEXTS = {
    ErrorCode.CONNECTION_INVALID: "The recording service cannot be reached.",
    ErrorCode.CONNECTION_INTERRUPTED: "The connection to the recording service was lost.",
}


class RecordingError(Exception):
    """A request that failed, or a recording that ended by itself.

    `str()` of it is `text`.
    """

    code: int
    """An `ErrorCode` where the domain is `DOMAIN`; elsewhere the domain's own, e.g. an errno in "posix"."""
    domain: str
    text: str
    """For the user, in the user's language where it comes from the daemon; else in English."""
    movie_url: str | None
    """Of a stop: the movie that there is all the same, which ends early."""

    def __init__(self, code: int, text: str = "", domain: str = DOMAIN, movie_url: str | None = None):
        known = domain == DOMAIN and code in ErrorCode.__members__.values()
        self.code = ErrorCode(code) if known else code
        self.domain = domain
        self.movie_url = movie_url
        self.text = text or self.key
        super().__init__(self.text)

    @property
    def key(self) -> str:
        """The code's name for a log, e.g. "RECORDING_ERROR_USER_DECLINED"; that of UNKNOWN in other domains."""
        code = self.code if isinstance(self.code, ErrorCode) else ErrorCode.UNKNOWN
        return "RECORDING_ERROR_" + code.name

    def __reduce__(self) -> tuple:
        return RecordingError, (int(self.code), self.text, self.domain, self.movie_url)


def library_error(code: ErrorCode, detail: str = "") -> RecordingError:
    """An error that is raised here, where the daemon cannot be asked for a text."""
    text = _TEXTS.get(code, "Recording failed for an unknown reason.")
    return RecordingError(code, f"{text} ({detail})" if detail else text)
