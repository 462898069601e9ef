#include <gtest/gtest.h>

#include <algorithm>
#include <vector>

#include "platform/headless/TestPattern.h"
#include "platform/headless/TestSignal.h"

namespace qv::platform {
namespace {

using testsignal::Picture;

FrameLayout layoutOf(uint32_t width, uint32_t height) { return {width, height, width * 4, PixelFormat::BGRX}; }

Picture pictureOf(const SharedFrame& frame) {
  const FrameLayout& layout = frame.layout();
  return {frame.bytes(), layout.width, layout.height, layout.stride};
}

/// Every `factor`th pixel, as limited-range luma with noise, the way a decoder would return it.
std::vector<uint8_t> noisyLuma(const SharedFrame& frame, uint32_t factor) {
  std::vector<uint8_t> luma;
  uint32_t noise = 1;
  for (uint32_t y = 0; y < frame.layout().height; y += factor) {
    for (uint32_t x = 0; x < frame.layout().width; x += factor) {
      noise = noise * 1664525 + 1013904223;
      const uint32_t green = frame.bytes()[size_t{y} * frame.layout().stride + x * 4 + 1];
      luma.push_back(static_cast<uint8_t>(std::min(16 + green * 219 / 255 + (noise >> 24) % 60 - 16, 255u)));
    }
  }
  return luma;
}

TEST(TestSignal, NumbersSurviveScalingAndNoise) {
  TestPattern pattern;
  for (const auto& [width, height] : {std::pair{1280u, 720u}, {1920u, 1080u}, {258u, 146u}, {720u, 1280u}}) {
    for (const uint32_t number : {0u, 1u, 77u, 0xDEADBEEFu, 0xFFFFFFFFu}) {
      const auto frame = pattern.paint(layoutOf(width, height), number, 500'000'000);
      ASSERT_TRUE(frame);
      EXPECT_EQ(testsignal::decodeFrameNumber(pictureOf(*frame)), number);
      const auto luma = noisyLuma(*frame, 2);
      const Picture half{luma, width / 2, height / 2, width / 2, Picture::Format::Luma8};
      EXPECT_EQ(testsignal::decodeFrameNumber(half), number) << width << "x" << height;
    }
  }
}

TEST(TestSignal, ReusedFramesShowOnlyTheNewPicture) {
  TestPattern reused;
  const auto layout = layoutOf(640, 360);
  const SharedFrame* first = nullptr;
  for (uint32_t number = 0; number < 40; ++number) {
    const uint64_t time = uint64_t{number} * 70'000'000;
    const auto frame = reused.paint(layout, number, time);
    ASSERT_TRUE(frame);
    if (number == 0) first = frame.get();
    EXPECT_EQ(frame.get(), first) << "the test is about a frame that is painted again";
    EXPECT_EQ(testsignal::decodeFlash(pictureOf(*frame)), time % 1'000'000'000 < 100'000'000);
    TestPattern fresh;
    const auto expected = fresh.paint(layout, number, time);
    EXPECT_TRUE(std::equal(frame->bytes().begin(), frame->bytes().end(), expected->bytes().begin())) << number;
  }
}

TEST(TestSignal, PlainAndTruncatedPicturesHaveNoNumber) {
  for (const uint8_t level : {uint8_t{0}, uint8_t{128}, uint8_t{255}}) {
    const std::vector<uint8_t> bytes(size_t{320} * 180 * 4, level);
    EXPECT_FALSE(testsignal::decodeFrameNumber({bytes, 320, 180, 1280})) << int{level};
  }
  EXPECT_FALSE(testsignal::decodeFrameNumber({std::vector<uint8_t>(100, 255), 320, 180, 1280}));
  TestPattern pattern;
  EXPECT_TRUE(pattern.paint(layoutOf(1, 1), 5, 0)) << "tiny pictures are painted without a readable number";
}

}  // namespace
}  // namespace qv::platform
