#include "platform/headless/TestSignal.h"

#include <cmath>
#include <numbers>

namespace qv::platform::testsignal {
namespace {

constexpr uint32_t kCells = 40;

/// The mean brightness of the middle of a rectangle: its inner half in both directions.
uint32_t brightness(const Picture& picture, const PixelRect& rect) {
  const uint32_t marginX = (rect.x1 - rect.x0) / 4;
  const uint32_t marginY = (rect.y1 - rect.y0) / 4;
  const uint32_t pixelSize = picture.format == Picture::Format::BGRX ? 4 : 1;
  const uint32_t channel = picture.format == Picture::Format::BGRX ? 1 : 0;  // green stands for luma
  uint64_t sum = 0;
  uint64_t count = 0;
  for (uint32_t y = rect.y0 + marginY; y < rect.y1 - marginY; ++y) {
    for (uint32_t x = rect.x0 + marginX; x < rect.x1 - marginX; ++x) {
      const size_t offset = size_t{y} * picture.stride + size_t{x} * pixelSize + channel;
      if (offset >= picture.bytes.size()) return 0;
      sum += picture.bytes[offset];
      ++count;
    }
  }
  return count == 0 ? 0 : static_cast<uint32_t>(sum / count);
}

uint8_t checkOf(uint32_t number) {
  const uint32_t folded = number ^ number >> 8 ^ number >> 16 ^ number >> 24;
  return static_cast<uint8_t>(folded ^ kCheckMask);
}

}  // namespace

PixelRect gridRect(uint32_t column, uint32_t row, uint32_t columns, uint32_t rows, uint32_t width, uint32_t height) {
  return {column * width / kGridColumns, row * height / kGridRows, (column + columns) * width / kGridColumns,
          (row + rows) * height / kGridRows};
}

uint64_t encodeFrameNumber(uint32_t number) { return uint64_t{number} << 8 | checkOf(number); }

std::optional<uint32_t> decodeFrameNumber(const Picture& picture) {
  uint64_t code = 0;
  for (uint32_t cell = 0; cell < kCells; ++cell) {
    const PixelRect rect = gridRect(1 + cell % 8, 1 + cell / 8, 1, 1, picture.width, picture.height);
    code = code << 1 | (brightness(picture, rect) > 127 ? 1 : 0);
  }
  const auto number = static_cast<uint32_t>(code >> 8);
  if (encodeFrameNumber(number) != code) return std::nullopt;
  return number;
}

bool decodeFlash(const Picture& picture) {
  return brightness(picture, gridRect(10, 1, 5, 5, picture.width, picture.height)) > 127;
}

int16_t beepSample(uint64_t hostTime, double frequency) {
  if (!isFlashTime(hostTime)) return 0;
  const double seconds = static_cast<double>(hostTime % kPeriod) * 1e-9;
  return static_cast<int16_t>(std::lround(kBeepAmplitude * std::sin(2 * std::numbers::pi * frequency * seconds)));
}

}  // namespace qv::platform::testsignal
