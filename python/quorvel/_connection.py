"""One connection to the daemon: D-Bus from peer to peer, with descriptors.

jeepney has the messages; what brings them is here, because none of the D-Bus libraries for asyncio takes two
descriptors with one message, as every picture has.
"""
from __future__ import annotations

import array
import asyncio
import logging
import os
import socket
import struct
from collections import deque
from itertools import count
from typing import Any, Callable, Iterable, Optional

import jeepney
from jeepney.auth import BEGIN, AuthenticationError, Authenticator
from jeepney.fds import FileDescriptor, fds_buf_size
from jeepney.low_level import HeaderFields, Message, MessageFlag, MessageType, Parser

log = logging.getLogger("quorvel")

SERVICE = "com.tarnwick.quorveld"
PATH = "/com/tarnwick/quorveld"
CLIENT_INTERFACE = SERVICE + ".QVClientProtocol"
Answered = Callable[[Optional[tuple]], None]
_LARGEST_READ = 1 << 18
_MESSAGES_AT_ONCE = 32  # then other work of the loop comes first


class CallError(Exception):
    """The daemon refused a call by a D-Bus error."""

    def __init__(self, name: str, message: str):
        super().__init__(f"{name}: {message}" if message else name)


class ConnectionLost(Exception):
    """The connection ended before the answer came."""


def socket_path() -> str:
    """Where the daemon listens."""
    directory = os.environ.get("XDG_RUNTIME_DIR", "")
    return os.path.join(directory if directory.startswith("/") else "/run", SERVICE)


def close_descriptors(values: Iterable[Any]) -> None:
    """Of values that nobody took."""
    for value in values:
        if isinstance(value, FileDescriptor):
            try:
                value.close()
            except RuntimeError:
                pass  # somebody did
        elif isinstance(value, (list, tuple)):
            close_descriptors(value)


class Connection:
    """Sends calls, brings their answers, and hands on the calls of the daemon.

    Threading: the one thread of the loop in which it was opened.
    """

    def __init__(self, receive: Callable[[str, tuple], None], lost: Callable[[], None]):
        """`receive` gets each call of the daemon's, `lost` is called once where the connection ends by itself."""
        self._receive, self._lost = receive, lost
        self._socket = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
        self._socket.setblocking(False)
        self._parser = Parser()
        self._serials = count(1)
        self._pending: dict[int, tuple[asyncio.Future[tuple], Answered]] = {}
        self._outbox: deque[tuple[memoryview, list[int]]] = deque()
        self._is_open = True

    async def open(self) -> None:
        """OSError where the daemon cannot be reached, or does not speak as it should."""
        self._loop = asyncio.get_running_loop()
        try:
            await self._loop.sock_connect(self._socket, socket_path())
            authenticator = Authenticator(enable_fds=True)
            for line in authenticator:
                await self._loop.sock_sendall(self._socket, line)
                authenticator.feed(await self._answer())
            await self._loop.sock_sendall(self._socket, BEGIN)
        except AuthenticationError as error:
            self.close()
            raise ConnectionRefusedError(str(error)) from error
        except BaseException:
            self.close()
            raise
        self._loop.add_reader(self._socket, self._readable)

    async def _answer(self) -> bytes:
        answer = await self._loop.sock_recv(self._socket, 1024)
        if not answer:
            raise ConnectionResetError("the daemon closed the connection")
        return answer

    def call(self, interface: str, member: str, signature: str, *values: Any,
             answered: Answered = lambda values: None) -> asyncio.Future[tuple]:
        """The values of the answer.

        `answered` gets them as soon as they are read, before anything that the daemon sent later, and also where the
        future was cancelled meanwhile; None where the call failed.
        """
        address = jeepney.DBusAddress(PATH, bus_name=SERVICE, interface=interface)
        serial = next(self._serials)
        future = self._loop.create_future()
        if not self._is_open:
            answered(None)
            future.set_exception(ConnectionLost())
            return future
        # Before it counts as pending: it raises ValueError where the values have no such form.
        self._send(jeepney.new_method_call(address, member, signature or None, values), serial)
        self._pending[serial] = future, answered
        return future

    def close(self) -> None:
        """Ends it without a word to the daemon; what is pending fails, and `lost` is not called."""
        if not self._is_open:
            return
        self._is_open = False
        if self._socket.fileno() >= 0 and hasattr(self, "_loop"):
            self._loop.remove_reader(self._socket)
            self._loop.remove_writer(self._socket)
        self._socket.close()
        close_descriptors(self._parser.fds)
        self._drop_outbox()
        pending, self._pending = self._pending, {}
        for future, answered in pending.values():
            answered(None)
            if not future.done():
                future.set_exception(ConnectionLost())

    def _fail(self) -> None:
        if self._is_open:
            self.close()
            self._lost()

    # Sending

    def _send(self, message: Message, serial: int) -> None:
        descriptors = array.array("i")
        try:
            data = message.serialise(serial, fds=descriptors)
        except (struct.error, AttributeError, TypeError, OverflowError) as error:
            raise ValueError(f"{message.body} cannot be sent: {error}") from error
        # Copies: the caller's may be closed before these are sent.
        self._outbox.append((memoryview(data), [os.dup(descriptor) for descriptor in descriptors]))
        if len(self._outbox) == 1:
            self._flush()

    def _flush(self) -> None:
        try:
            while self._outbox:
                data, descriptors = self._outbox[0]
                ancillary = [(socket.SOL_SOCKET, socket.SCM_RIGHTS, array.array("i", descriptors))]
                sent = self._socket.sendmsg([data], ancillary if descriptors else [], socket.MSG_NOSIGNAL)
                _close(descriptors)
                self._outbox[0] = data[sent:], []
                if sent == len(data):
                    self._outbox.popleft()
        except BlockingIOError:
            self._loop.add_writer(self._socket, self._flush)
        except OSError:
            # In a turn of its own: whoever sends does not expect the end of the connection in it.
            self._loop.call_soon(self._fail)
            self._drop_outbox()
        else:
            self._loop.remove_writer(self._socket)

    def _drop_outbox(self) -> None:
        for _, descriptors in self._outbox:
            _close(descriptors)
        self._outbox.clear()

    # Receiving

    def _readable(self) -> None:
        try:
            for _ in range(_MESSAGES_AT_ONCE):
                if not self._read() or not self._is_open:
                    return
        except (BlockingIOError, InterruptedError):
            return
        except OSError:
            self._fail()
        except Exception:  # pylint: disable=broad-except
            log.exception("what the recording service sent cannot be read")
            self._fail()

    def _read(self) -> bool:
        """A message, or a part of one; false at the end. No more than one, or its descriptors would meet others."""
        wanted = min(self._parser.bytes_desired(), _LARGEST_READ)
        data, ancillary, _, _ = self._socket.recvmsg(wanted, fds_buf_size(), socket.MSG_CMSG_CLOEXEC)
        if not data:
            self._fail()
            return False
        self._parser.add_data(data, FileDescriptor.from_ancdata(ancillary))
        message = self._parser.get_next_message()
        if message is not None:
            try:
                self._handle(message)
            finally:
                close_descriptors(message.body)
        return True

    def _handle(self, message: Message) -> None:
        kind = message.header.message_type
        if kind is MessageType.method_call:
            self._serve(message)
            return
        future, answered = self._pending.pop(message.header.fields.get(HeaderFields.reply_serial, 0), (None, None))
        if future is None or answered is None:
            return
        answered(message.body if kind is MessageType.method_return else None)
        if future.done():
            return
        if kind is MessageType.method_return:
            future.set_result(_taken(message.body))
        else:
            text = message.body[0] if message.body and isinstance(message.body[0], str) else ""
            future.set_exception(CallError(message.header.fields.get(HeaderFields.error_name, ""), text))

    def _serve(self, message: Message) -> None:
        fields = message.header.fields
        known = fields.get(HeaderFields.interface) in (CLIENT_INTERFACE, "org.freedesktop.DBus.Peer")
        if fields.get(HeaderFields.interface) == CLIENT_INTERFACE:
            try:
                self._receive(fields[HeaderFields.member], message.body)
            except Exception:  # pylint: disable=broad-except
                log.exception("a handler of %s failed", fields[HeaderFields.member])
        if self._is_open and not message.header.flags & MessageFlag.no_reply_expected:
            reply = (jeepney.new_method_return(message) if known else
                     jeepney.new_error(message, "org.freedesktop.DBus.Error.UnknownInterface"))
            self._send(reply, next(self._serials))


def _close(descriptors: list[int]) -> None:
    while descriptors:
        os.close(descriptors.pop())


def _taken(body: tuple) -> tuple:
    """The values of an answer; its descriptors are files from here on, closed by whoever drops them."""
    return tuple([value.to_file("rb") for value in entry] if _are_descriptors(entry) else entry for entry in body)


def _are_descriptors(entry: Any) -> bool:
    return isinstance(entry, list) and bool(entry) and all(isinstance(value, FileDescriptor) for value in entry)
