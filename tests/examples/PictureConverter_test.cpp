#include "examples/live-upload/PictureConverter.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <vector>

namespace upload {
namespace {

using quorvel::Orientation;

/// Greys of the four quarters: upper left, upper right, lower left, lower right.
using Quarters = std::array<uint8_t, 4>;
constexpr Quarters kUpright = {40, 90, 140, 200};
constexpr uint8_t kBlack = 16;

quorvel::VideoFrame frameOf(const Quarters& quarters, uint32_t width, uint32_t height) {
  const auto bytes = std::make_shared<std::vector<uint8_t>>(size_t{4} * width * height);
  for (uint32_t y = 0; y < height; ++y)
    for (uint32_t x = 0; x < width; ++x)
      std::fill_n(bytes->begin() + 4 * (ptrdiff_t{y} * width + x), 4,
                  quarters[(y >= height / 2 ? 2u : 0u) + (x >= width / 2 ? 1u : 0u)]);
  return {*bytes, width, height, width * 4, {}, {}, bytes};
}

Frame streamPicture(int width, int height) {
  Frame picture(av_frame_alloc());
  picture->format = AV_PIX_FMT_YUV420P;
  picture->width = width;
  picture->height = height;
  EXPECT_EQ(av_frame_get_buffer(picture.get(), 0), 0);
  return picture;
}

uint8_t lumaAt(const AVFrame& picture, int x, int y) { return picture.data[0][y * picture.linesize[0] + x]; }

/// In the middles of its quarters.
Quarters quartersOf(const AVFrame& picture, int left, int top, int width, int height) {
  const int x[] = {left + width / 4, left + width * 3 / 4}, y[] = {top + height / 4, top + height * 3 / 4};
  return {lumaAt(picture, x[0], y[0]), lumaAt(picture, x[1], y[0]), lumaAt(picture, x[0], y[1]),
          lumaAt(picture, x[1], y[1])};
}

/// Of BT.709 in the range of television.
Quarters lumaOf(const Quarters& greys) {
  Quarters luma;
  for (size_t i = 0; i < 4; ++i) luma[i] = static_cast<uint8_t>(16 + greys[i] * 219 / 255.0 + 0.5);
  return luma;
}

void expectNear(const Quarters& found, const Quarters& expected) {
  for (size_t i = 0; i < 4; ++i) EXPECT_NEAR(found[i], expected[i], 2) << "quarter " << i;
}

/// Where EXIF says the first row and the first column of a picture are when it stands upright.
struct Case {
  Orientation orientation;
  Quarters stored;
  bool isSideways;
};

TEST(PictureConverter, EveryOrientationComesOutUpright) {
  const auto [a, b, c, d] = kUpright;
  const Case cases[] = {
      {Orientation::Up, {a, b, c, d}, false},            // row: top, column: left
      {Orientation::UpMirrored, {b, a, d, c}, false},    // top, right
      {Orientation::Down, {d, c, b, a}, false},          // bottom, right
      {Orientation::DownMirrored, {c, d, a, b}, false},  // bottom, left
      {Orientation::LeftMirrored, {a, c, b, d}, true},   // left, top
      {Orientation::Right, {b, d, a, c}, true},          // right, top
      {Orientation::RightMirrored, {d, b, c, a}, true},  // right, bottom
      {Orientation::Left, {c, a, d, b}, true},           // left, bottom
  };
  for (const Case& picture : cases) {
    SCOPED_TRACE(static_cast<int>(picture.orientation));
    const PictureSize stored = picture.isSideways ? PictureSize{36, 64} : PictureSize{64, 36};
    ASSERT_EQ(uprightSize(stored, picture.orientation), (PictureSize{64, 36}));
    const Frame stream = streamPicture(64, 36);
    PictureConverter converter;
    ASSERT_TRUE(converter.convert(
        frameOf(picture.stored, static_cast<uint32_t>(stored.width), static_cast<uint32_t>(stored.height)),
        picture.orientation, *stream));
    expectNear(quartersOf(*stream, 0, 0, 64, 36), lumaOf(kUpright));
  }
}

TEST(PictureConverter, AChangeOfOrientationKeepsTheStreamsSize) {
  const Frame stream = streamPicture(128, 72);
  PictureConverter converter;
  const auto wide = frameOf(kUpright, 128, 72);
  ASSERT_TRUE(converter.convert(wide, Orientation::Up, *stream));
  // Now on its side, so 40 wide and 72 high in the middle.
  ASSERT_TRUE(converter.convert(wide, Orientation::Right, *stream));
  const auto [a, b, c, d] = kUpright;
  expectNear(quartersOf(*stream, 44, 0, 40, 72), lumaOf({c, a, d, b}));
  for (const int x : {0, 40, 87, 127}) EXPECT_EQ(lumaAt(*stream, x, 36), kBlack) << x;
  ASSERT_TRUE(converter.convert(wide, Orientation::Up, *stream));
  expectNear(quartersOf(*stream, 0, 0, 128, 72), lumaOf(kUpright));
}

}  // namespace
}  // namespace upload
