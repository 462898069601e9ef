"""Captures its own window, and writes a still of it every second as PNG.

    stills.py [COUNT [DIRECTORY]]

Start it with the interpreter of a bundle (docs/python.md). It writes still-1.png and so on, five if nothing is said.
"""
import asyncio
import os
import sys
import tkinter

import quorvel
from dancing_window import DancingWindow
from PIL import Image

WIDTH, HEIGHT = 320, 240
TIME_TO_COME_TO_FRONT = 0.3  # seconds; a device takes a moment to see who is in front
SECOND = 1_000_000_000       # in the unit of presentation times


async def write_stills(frames: quorvel.SampleStream[quorvel.VideoFrame], count: int, directory: str) -> int:
    """How many were written; fewer where the capture ended before."""
    due, written = 0, 0
    async for frame in frames:
        with frame:
            if frame.presentation_time < due:
                continue
            due = frame.presentation_time + SECOND
            picture = frame.rgb()  # a copy: the frame goes back before the file is written
        written += 1
        path = os.path.join(directory, f"still-{written}.png")
        await asyncio.to_thread(Image.fromarray(picture).save, path)
        print(path, flush=True)
        if written == count:
            break
    return written


async def main(count: int, directory: str) -> None:
    window = DancingWindow("Square Dance", WIDTH, HEIGHT)
    dance = asyncio.create_task(window.dance())
    try:
        await asyncio.wait({asyncio.create_task(window.active.wait()), dance}, timeout=3,
                           return_when=asyncio.FIRST_COMPLETED)
        await asyncio.sleep(TIME_TO_COME_TO_FRONT)
        ended: list[quorvel.RecordingError] = []
        async with quorvel.Recorder(quorvel.Events(stopped=ended.append)) as recorder:
            await recorder.did_become_active()
            frames = recorder.frames()
            await recorder.start([window.identifier], WIDTH, HEIGHT, capture=True)
            if await write_stills(frames, count, directory) < count:
                raise ended[0] if ended else quorvel.RecordingError(quorvel.ErrorCode.FAILED)
            await recorder.stop()
    finally:
        window.close()
        await dance


if __name__ == "__main__":
    try:
        asyncio.run(main(int(sys.argv[1]) if len(sys.argv) > 1 else 5, sys.argv[2] if len(sys.argv) > 2 else "."))
    except (quorvel.RecordingError, OSError) as error:
        sys.exit(f"no stills: {error}")
    except tkinter.TclError as error:
        sys.exit(f"no window: {error}")
