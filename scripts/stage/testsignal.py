"""Reads the headless device's test picture, which platform/headless/TestSignal.h describes."""

COLUMNS, ROWS = 16, 9
CHECK_MASK = 0xA5
PERIOD = 1.0          # seconds from one flash and beep to the next
FLASH_DURATION = 0.1  # seconds
FRAME_INTERVAL = 1 / 60


class Picture:
    """Pixels of one byte (`pixel_size` 1: luma) or four (blue, green, red, unused)."""

    def __init__(self, pixels, width, height, stride, pixel_size=1):
        self.pixels, self.width, self.height, self.stride, self.pixel_size = pixels, width, height, stride, pixel_size

    def is_white(self, column, row, columns=1, rows=1):
        """Whether the middle of a block of cells is: the mean of 4 x 4 pixels, green for luma."""
        x = (2 * column + columns) * self.width // (2 * COLUMNS) - 2
        y = (2 * row + rows) * self.height // (2 * ROWS) - 2
        channel = 1 if self.pixel_size == 4 else 0
        total = 0
        for line in range(y, y + 4):
            first = line * self.stride + x * self.pixel_size + channel
            total += sum(self.pixels[first:first + 4 * self.pixel_size:self.pixel_size])
        return total > 127 * 16

    def number(self):
        """The frame's number, or None where the check fails."""
        code = 0
        for cell in range(40):
            code = code << 1 | self.is_white(1 + cell % 8, 1 + cell // 8)
        number, checksum = code >> 8, code & 0xFF
        folded = number ^ number >> 8 ^ number >> 16 ^ number >> 24
        return number if checksum == (folded & 0xFF) ^ CHECK_MASK else None

    def shows_flash(self):
        return self.is_white(10, 1, 5, 5)
