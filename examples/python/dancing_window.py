"""What the examples record: a window of Tk's with a square that goes round."""
import asyncio
import math
import time
import tkinter


class DancingWindow:
    """Draws until it is closed. `identifier` is its X11 id, `active` is set once it has the focus.

    Threading: that of the event loop.
    """

    def __init__(self, title: str, width: int, height: int):
        self.width, self.height = width, height
        self.root = tkinter.Tk()
        self.root.title(title)
        self.root.resizable(False, False)
        self.canvas = tkinter.Canvas(self.root, width=width, height=height, background="#203040", highlightthickness=0)
        self.canvas.pack()
        self.square = self.canvas.create_rectangle(0, 0, 60, 60, fill="#ffc040", width=0)
        self.is_open = True
        self.root.protocol("WM_DELETE_WINDOW", self.close)
        self.active = asyncio.Event()
        self.root.bind("<FocusIn>", lambda _: self.active.set())
        self.root.update()
        self.root.focus_force()

    @property
    def identifier(self) -> int:
        return self.root.winfo_id()

    def close(self) -> None:
        self.is_open = False

    async def dance(self) -> None:
        """The main loop of Tk and asyncio together. At its end the window goes."""
        try:
            while self.is_open:
                angle = time.monotonic()
                x = self.width * (0.5 + 0.3 * math.cos(angle)) - 30
                y = self.height * (0.5 + 0.3 * math.sin(angle)) - 30
                self.canvas.moveto(self.square, x, y)
                self.root.update()
                await asyncio.sleep(1 / 60)
        finally:
            self.root.destroy()
