#include "Scene.h"

#include <algorithm>
#include <cmath>

namespace comet {

namespace {

constexpr int kComets = 12;
constexpr uint32_t kWhite = 0xffffff;

struct Canvas {
  std::span<uint32_t> pixels;
  uint32_t width, height;

  void fill(int64_t x, int64_t y, int64_t w, int64_t h, uint32_t color) {
    const int64_t left = std::clamp<int64_t>(x, 0, width), right = std::clamp<int64_t>(x + w, 0, width);
    const int64_t top = std::clamp<int64_t>(y, 0, height), bottom = std::clamp<int64_t>(y + h, 0, height);
    for (int64_t row = top; row < bottom; ++row)
      std::fill_n(pixels.begin() + row * width + left, std::max<int64_t>(right - left, 0), color);
  }
};

void drawSky(Canvas& canvas) {
  for (uint32_t row = 0; row < canvas.height; ++row) {
    const uint32_t shade = 16 + row * 64 / canvas.height;
    canvas.fill(0, row, canvas.width, 1, shade / 3 << 16 | shade / 2 << 8 | shade);
  }
}

/// Comet `index` crosses the sky once in a few seconds, with a tail of fading blocks.
void drawComet(Canvas& canvas, int index, double seconds) {
  const double period = 2.0 + index % 5;
  const double phase = std::fmod(seconds / period + index * 0.37, 1.0);
  const int64_t size = std::max<int64_t>(4, canvas.height / 40) + index % 3 * 2;
  const double x = phase * (canvas.width + 8.0 * size), y = canvas.height * (0.08 + 0.07 * index);
  for (int tail = 7; tail >= 0; --tail) {
    const uint32_t light = 255 - tail * 30;
    const uint32_t color = light << 16 | light * (3 + index % 3) / 6 << 8 | (index % 2 ? light / 2 : light / 5);
    canvas.fill(std::lround(x) - (tail + 1) * size, std::lround(y + std::sin(phase * 9) * size), size, size, color);
  }
}

}  // namespace

void drawScene(std::span<uint32_t> pixels, uint32_t width, uint32_t height, Instant instant, bool flash) {
  Canvas canvas{pixels, width, height};
  drawSky(canvas);
  const double seconds = std::chrono::duration<double>(instant % std::chrono::hours(1)).count();
  for (int index = 0; index < kComets; ++index) drawComet(canvas, index, seconds);
  if (flash) canvas.fill(width / 8, height / 6, width * 3 / 4, height * 2 / 3, kWhite);
}

}  // namespace comet
