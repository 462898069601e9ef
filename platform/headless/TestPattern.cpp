#include "platform/headless/TestPattern.h"

#include <algorithm>
#include <cstring>

#include "platform/headless/TestSignal.h"

namespace qv::platform {
namespace {

using testsignal::gridRect;
using testsignal::PixelRect;

constexpr uint32_t kWhite = 0xFFFFFFFF;  // as B, G, R, X
constexpr uint32_t kBlack = 0xFF000000;
constexpr uint32_t kDark = 0xFF202020;
constexpr uint32_t kBarColor = 0xFFF0A020;
constexpr uint64_t kBarPeriod = 4'000'000'000;  // nanoseconds

void fill(SharedFrame& frame, const PixelRect& rect, uint32_t color) {
  const auto bytes = frame.mutableBytes();
  for (uint32_t y = rect.y0; y < rect.y1; ++y) {
    auto* row = reinterpret_cast<uint32_t*>(bytes.data() + size_t{y} * frame.layout().stride);
    std::fill(row + rect.x0, row + rect.x1, color);
  }
}

PixelRect rectIn(const SharedFrame& frame, uint32_t column, uint32_t row, uint32_t columns, uint32_t rows) {
  return gridRect(column, row, columns, rows, frame.layout().width, frame.layout().height);
}

}  // namespace

std::shared_ptr<SharedFrame> TestPattern::paint(const FrameLayout& layout, uint32_t number, uint64_t hostTime) {
  if (!(layout == layout_)) painted_.clear();
  layout_ = layout;
  auto frame = pool_.take(layout);
  if (!frame) return nullptr;
  Painted& painted = painted_[frame.get()];
  const Painted wanted{testsignal::encodeFrameNumber(number), testsignal::isFlashTime(hostTime), true};
  if (!painted.isWhole) paintGround(*frame);
  paintCode(*frame, wanted.code, painted.isWhole ? painted.code ^ wanted.code : ~uint64_t{0});
  if (!painted.isWhole || painted.isFlash != wanted.isFlash) {
    fill(*frame, rectIn(*frame, 10, 1, 5, 5), wanted.isFlash ? kWhite : kDark);
  }
  paintBar(*frame, hostTime);
  painted = wanted;
  return frame;
}

std::shared_ptr<SharedFrame> TestPattern::paintBlack(const FrameLayout& layout) {
  auto frame = pool_.take(layout);
  if (!frame) return nullptr;
  painted_.erase(frame.get());
  fill(*frame, {0, 0, layout.width, layout.height}, kBlack);
  return frame;
}

/// Stripes of dark grey, so that a picture turned upside down is seen to be so.
void TestPattern::paintGround(SharedFrame& frame) {
  for (uint32_t row = 0; row < testsignal::kGridRows; ++row) {
    const uint32_t level = 0x10 + 4 * row;
    fill(frame, rectIn(frame, 0, row, testsignal::kGridColumns, 1), kBlack | level << 16 | level << 8 | level);
  }
}

void TestPattern::paintCode(SharedFrame& frame, uint64_t code, uint64_t changed) {
  for (uint32_t cell = 0; cell < 40; ++cell) {
    const uint64_t bit = uint64_t{1} << (39 - cell);
    if (changed & bit) fill(frame, rectIn(frame, 1 + cell % 8, 1 + cell / 8, 1, 1), code & bit ? kWhite : kBlack);
  }
}

void TestPattern::paintBar(SharedFrame& frame, uint64_t hostTime) {
  const PixelRect row = rectIn(frame, 0, 7, testsignal::kGridColumns, 1);
  const uint32_t width = frame.layout().width / (2 * testsignal::kGridColumns);
  const uint64_t range = row.x1 - width;
  const auto x = static_cast<uint32_t>(hostTime % kBarPeriod * range / kBarPeriod);
  fill(frame, row, kDark);
  fill(frame, {x, row.y0, x + width, row.y1}, kBarColor);
}

}  // namespace qv::platform
