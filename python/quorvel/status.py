"""What the recording daemon does, for status displays, tools and operators. Nothing here changes anything."""
from __future__ import annotations

from typing import Any

from ._link import Link
from .values import from_dictionary


class StatusReader:
    """Asks the daemon. Making it does nothing yet: the first question connects, and one after a loss connects anew.

        async with quorvel.StatusReader() as status:
            for recording in await status.recordings():
                print(recording["state"], recording["seconds"])

    Use it in a process of no bundle. In an application that records, its connection and the Recorder's would replace
    each other: the daemon has one for each bundle.

    A question that fails raises RecordingError: CONNECTION_INVALID, CONNECTION_INTERRUPTED, or UNKNOWN from an older
    daemon that has no such question. docs/protocol.md, "Status", has the keys of each answer, and who sees what; keys
    may be added.

    Threading: one event loop.
    """

    def __init__(self) -> None:
        self._link = Link("Status")

    async def __aenter__(self) -> "StatusReader":
        return self

    async def __aexit__(self, *_: Any) -> None:
        await self.close()

    async def close(self) -> None:
        """Questions that are awaited fail."""
        await self._link.close()

    async def recordings(self) -> list[dict[str, Any]]:
        """What records now."""
        return [from_dictionary(entry) for entry in (await self._link.request("getRecordings"))[0]]

    async def start_conditions(self, bundle_id: str, *, system: bool = False,
                               microphone: bool = False) -> list[dict[str, Any]]:
        """What a start by this bundle would find now. It takes some seconds where a server hangs, as the next two."""
        answer = await self._link.request("getStartConditions", "sbb", bundle_id, system, microphone)
        return [from_dictionary(entry) for entry in answer[0]]

    async def movies(self) -> list[dict[str, Any]]:
        """What lies in the temporary store."""
        return [from_dictionary(entry) for entry in (await self._link.request("getMovies"))[0]]

    async def device(self) -> dict[str, Any]:
        """The daemon's version and user, its display, sound, encoder, store and free space."""
        return from_dictionary((await self._link.request("getDevice"))[0])
