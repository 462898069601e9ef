"""The way to the daemon: a connection that is made when a request needs it, lost at most once, and made anew."""
from __future__ import annotations

import asyncio
import time
from typing import Any, Callable

from ._connection import SERVICE, Answered, CallError, Connection, ConnectionLost
from .errors import ErrorCode, library_error

_FIRST_RETRY = 0.25  # seconds
_LONGEST_RETRY = 30.0


class Link:
    """Requests to one interface of the daemon.

    Threading: one event loop, that of the first request.
    """

    def __init__(self, interface: str, receive: Callable[[str, tuple], None] = lambda member, values: None,
                 connected: Callable[[], None] = lambda: None, lost: Callable[[], None] = lambda: None):
        """`receive` gets the daemon's calls. `connected` and `lost` tell of each connection; outstanding requests have
        ended when it is lost."""
        self._interface = f"{SERVICE}.{interface}"
        self._receive, self._connected, self._lost = receive, connected, lost
        self._connection: Connection | None = None
        self._connecting: asyncio.Task[Connection] | None = None
        self._keeper: asyncio.Task[None] | None = None
        self._disconnected = asyncio.Event()
        self._is_closed = False

    async def request(self, member: str, signature: str = "", *values: Any) -> tuple:
        """The values of the answer. RecordingError where there is none."""
        return await self.send(await self.connection(), member, signature, *values)

    async def send(self, connection: Connection, member: str, signature: str = "", *values: Any,
                   answered: Answered = lambda values: None) -> tuple:
        """On a connection that stands. `answered` as in Connection.call."""
        try:
            return await connection.call(self._interface, member, signature, *values, answered=answered)
        except ConnectionLost:
            raise library_error(ErrorCode.CONNECTION_INTERRUPTED) from None
        except CallError as error:
            raise library_error(ErrorCode.UNKNOWN, str(error)) from None

    async def connection(self) -> Connection:
        """The one that stands, or a new one. RecordingError where the daemon cannot be reached."""
        if self._is_closed:
            raise library_error(ErrorCode.CONNECTION_INVALID, "the recorder is closed")
        if self._connection is not None:
            return self._connection
        if self._connecting is None:
            self._connecting = asyncio.ensure_future(self._connect())
            self._connecting.add_done_callback(self._connect_ended)
        # Whoever is cancelled does not take it from the others.
        connecting = self._connecting
        await asyncio.wait([connecting])
        if connecting.cancelled():
            raise library_error(ErrorCode.CONNECTION_INVALID, "the recorder is closed")
        try:
            return connecting.result()
        except OSError as error:
            raise library_error(ErrorCode.CONNECTION_INVALID) from error

    async def _connect(self) -> Connection:
        connection = Connection(self._receive, self._on_loss)
        await connection.open()
        self._connection = connection
        self._disconnected.clear()
        self._connected()
        return connection

    def _connect_ended(self, task: asyncio.Task) -> None:
        self._connecting = None
        if not task.cancelled():
            task.exception()  # it is told whoever waits; perhaps nobody does any more

    def _on_loss(self) -> None:
        self._connection = None
        self._disconnected.set()
        self._lost()

    def keep_connected(self, keep: bool) -> None:
        if self._keeper is not None:
            self._keeper.cancel()
        self._keeper = asyncio.ensure_future(self._keep()) if keep and not self._is_closed else None

    async def _keep(self) -> None:
        pause = _FIRST_RETRY
        while True:
            try:
                await self.connection()
            except Exception:  # pylint: disable=broad-except
                await asyncio.sleep(pause)
                pause = min(2 * pause, _LONGEST_RETRY)
                continue
            since = time.monotonic()
            await self._disconnected.wait()
            # A daemon that takes connections and drops them at once counts as not there.
            if time.monotonic() - since > _LONGEST_RETRY:
                pause = _FIRST_RETRY
            else:
                await asyncio.sleep(pause)
                pause = min(2 * pause, _LONGEST_RETRY)

    async def close(self) -> None:
        """Ends the connection; outstanding requests fail."""
        self._is_closed = True
        self.keep_connected(False)
        if self._connecting is not None:
            self._connecting.cancel()
        connection, self._connection = self._connection, None
        if connection is not None:
            connection.close()
        await asyncio.sleep(0)  # those who waited hear of it
