#include "Scene.h"

#include <algorithm>
#include <cmath>
#include <vector>

namespace comet {

namespace {

constexpr int kComets = 12;
constexpr int kSparks = 160;
constexpr uint32_t kWhite = 0xffffff;
/// Sides of the texture, powers of two: coordinates wrap by a mask.
constexpr uint32_t kTextureWidth = 2048, kTextureHeight = 1024;

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

/// A number from 0 to 255 that looks random and is the same for the same place every time.
uint32_t noiseAt(uint32_t x, uint32_t y) {
  uint32_t n = x * 374761393u + y * 668265263u;
  n = (n ^ (n >> 13)) * 1274126177u;
  return (n ^ (n >> 16)) & 255;
}

/// Noise at a grid of 2^shift pixels, blended between its points; wraps at the sides of the texture.
uint32_t smoothNoise(uint32_t x, uint32_t y, uint32_t shift) {
  const uint32_t cell = 1u << shift, fx = x & (cell - 1), fy = y & (cell - 1);
  const uint32_t columns = kTextureWidth >> shift, rows = kTextureHeight >> shift;
  const uint32_t left = x >> shift, right = (left + 1) % columns, top = y >> shift, bottom = (top + 1) % rows;
  const auto blend = [](uint32_t from, uint32_t to, uint32_t part, uint32_t whole) {
    return (from * (whole - part) + to * part) / whole;
  };
  return blend(blend(noiseAt(left, top), noiseAt(right, top), fx, cell),
               blend(noiseAt(left, bottom), noiseAt(right, bottom), fx, cell), fy, cell);
}

/// Dark clouds with grain, as games draw theirs: four octaves of noise in two tints.
std::vector<uint32_t> makeTexture() {
  std::vector<uint32_t> texture(size_t{kTextureWidth} * kTextureHeight);
  for (uint32_t y = 0; y < kTextureHeight; ++y) {
    for (uint32_t x = 0; x < kTextureWidth; ++x) {
      const uint32_t cloud = (smoothNoise(x, y, 7) * 4 + smoothNoise(x, y, 5) * 2 + smoothNoise(x, y, 3)) / 7;
      const uint32_t shade = cloud / 4 + smoothNoise(x, y, 1) / 12 + 6;
      texture[size_t{y} * kTextureWidth + x] = (shade * 2 / 3) << 16 | (shade * (128 + cloud / 2) / 255) << 8 | shade;
    }
  }
  return texture;
}

const uint32_t* textureRow(uint32_t y) {
  static const std::vector<uint32_t> texture = makeTexture();
  return texture.data() + size_t{y % kTextureHeight} * kTextureWidth;
}

/// The sky drifts to the left, its lower bands faster than its upper ones.
void drawSky(Canvas& canvas, uint32_t rows, double seconds) {
  for (uint32_t row = 0; row < rows; ++row) {
    const auto speed = 20.0 * (1 + row * 4 / std::max(rows, 1u));
    const auto offset = static_cast<uint32_t>(seconds * speed) % kTextureWidth;
    const uint32_t* from = textureRow(row);
    uint32_t* to = canvas.pixels.data() + size_t{row} * canvas.width;
    for (uint32_t done = 0; done < canvas.width;) {
      const uint32_t at = (offset + done) % kTextureWidth;
      const uint32_t step = std::min(canvas.width - done, kTextureWidth - at);
      std::copy_n(from + at, step, to + done);
      done += step;
    }
  }
}

/// The ground runs towards the player, larger the nearer it is. Coordinates are 16.16 fixed point.
void drawGround(Canvas& canvas, uint32_t firstRow, double seconds) {
  for (uint32_t row = firstRow; row < canvas.height; ++row) {
    const double depth = double(canvas.height) / (row - firstRow + canvas.height / 16 + 1);
    const uint32_t* from = textureRow(static_cast<uint32_t>(seconds * 400 + depth * 300));
    const auto step = static_cast<uint32_t>(depth * 0.5 * 65536);
    uint32_t at = (kTextureWidth << 15) - step * (canvas.width / 2);
    uint32_t* to = canvas.pixels.data() + size_t{row} * canvas.width;
    for (uint32_t column = 0; column < canvas.width; ++column, at += step)
      to[column] = from[(at >> 16) & (kTextureWidth - 1)] + 0x101000;
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

/// Sparks fly out of the middle, each for a second.
void drawSparks(Canvas& canvas, double seconds) {
  const int64_t size = std::max<int64_t>(2, canvas.height / 240);
  for (uint32_t index = 0; index < kSparks; ++index) {
    const double age = std::fmod(seconds + index / double(kSparks), 1.0);
    const double angle = noiseAt(index, 7) * 0.0246, reach = age * canvas.height * (0.3 + noiseAt(index, 9) / 400.0);
    const auto light = static_cast<uint32_t>(255 * (1 - age));
    canvas.fill(std::lround(canvas.width / 2.0 + std::cos(angle) * reach),
                std::lround(canvas.height / 2.0 + std::sin(angle) * reach + age * age * canvas.height / 8), size, size,
                light << 16 | light * 2 / 3 << 8 | light / 4);
  }
}

}  // namespace

void drawScene(std::span<uint32_t> pixels, uint32_t width, uint32_t height, Instant instant, bool flash,
               std::optional<uint32_t> sky) {
  Canvas canvas{pixels, width, height};
  const double seconds = std::chrono::duration<double>(instant % std::chrono::hours(1)).count();
  if (sky) {
    canvas.fill(0, 0, width, height, *sky);
  } else {
    const uint32_t horizon = height * 3 / 5;
    drawSky(canvas, horizon, seconds);
    drawGround(canvas, horizon, seconds);
  }
  for (int index = 0; index < kComets; ++index) drawComet(canvas, index, seconds);
  drawSparks(canvas, seconds);
  if (flash) canvas.fill(width / 8, height / 6, width * 3 / 4, height * 2 / 3, kWhite);
}

void drawNumber(std::span<uint32_t> pixels, uint32_t width, uint32_t height, uint32_t number) {
  constexpr int64_t kCells = 24;
  Canvas canvas{pixels, width, height};
  const uint32_t code = (number & 0xFFFF) << 8 | ((number ^ number >> 8 ^ 0xA5) & 0xFF);
  const int64_t top = height - height / 20;
  for (int64_t cell = 0; cell < kCells; ++cell) {
    const int64_t left = cell * width / kCells, right = (cell + 1) * width / kCells;
    canvas.fill(left, top, right - left, height - top, code >> (kCells - 1 - cell) & 1 ? kWhite : 0);
  }
}

}  // namespace comet
