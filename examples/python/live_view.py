"""Captures its own window, and shows that live in another one.

    live_view.py [SECONDS]

Start it with the interpreter of a bundle (docs/python.md). It ends after so many seconds, or when a window is closed.
"""
import asyncio
import sys
import tkinter

import quorvel
from dancing_window import DancingWindow

WIDTH, HEIGHT = 320, 240
TIME_TO_COME_TO_FRONT = 0.3  # seconds; a device takes a moment to see who is in front


class Mirror:
    """A window that shows one picture after the other."""

    def __init__(self, window: DancingWindow):
        self.top = tkinter.Toplevel(window.root)
        self.top.title("Live view")
        self.top.geometry(f"+{WIDTH + 40}+0")
        self.top.protocol("WM_DELETE_WINDOW", window.close)
        self.image = tkinter.PhotoImage(width=WIDTH, height=HEIGHT)
        tkinter.Label(self.top, image=self.image, borderwidth=0).pack()
        self.shown = 0

    def show(self, frame: quorvel.VideoFrame) -> None:
        header = f"P6 {frame.width} {frame.height} 255\n".encode()
        self.image.configure(data=header + frame.rgb().tobytes(), format="ppm")
        self.shown += 1


async def mirror_frames(recorder: quorvel.Recorder, mirror: Mirror) -> None:
    async for frame in recorder.frames():
        with frame:  # here it is given back
            mirror.show(frame)


async def main(seconds: float) -> None:
    window = DancingWindow("Square Dance", WIDTH, HEIGHT)
    dance = asyncio.create_task(window.dance())
    try:
        await asyncio.wait({asyncio.create_task(window.active.wait()), dance}, timeout=3,
                           return_when=asyncio.FIRST_COMPLETED)
        await asyncio.sleep(TIME_TO_COME_TO_FRONT)
        async with quorvel.Recorder() as recorder:
            await recorder.did_become_active()
            mirror = Mirror(window)
            shows = asyncio.create_task(mirror_frames(recorder, mirror))
            await asyncio.sleep(0)  # it asks for the frames before they come
            await recorder.start([window.identifier], WIDTH, HEIGHT, capture=True)
            await asyncio.wait({dance, shows}, timeout=seconds, return_when=asyncio.FIRST_COMPLETED)
            await recorder.stop()
            await shows
        print(f"{mirror.shown} pictures shown")
    finally:
        window.close()
        await dance


if __name__ == "__main__":
    try:
        asyncio.run(main(float(sys.argv[1]) if len(sys.argv) > 1 else 3600))
    except quorvel.RecordingError as error:
        sys.exit(f"not recording: {error}")
    except tkinter.TclError as error:
        sys.exit(f"no window: {error}")
