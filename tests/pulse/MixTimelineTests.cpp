#include <gtest/gtest.h>

#include <thread>

#include "platform/pulse/MixTimeline.h"
#include "platform/threads/Clock.h"

namespace qv::platform {
namespace {

constexpr uint32_t kRate = 44100;

TEST(MixTimeline, SumsClipsAndIsSilentElsewhere) {
  MixTimeline timeline(kRate);
  const auto now = systemClock().hostTime().value;
  const int64_t frame = timeline.frameAt(now) + 100;
  timeline.add(frame, std::vector<int16_t>{100, 300, 30000, 30000});
  timeline.add(frame + 1, std::vector<int16_t>{20000, 20000, -8, -4});
  std::vector<int16_t> mono(5);
  timeline.read(static_cast<uint64_t>(now) + 100'000'000'000 / kRate - 22'675, 1, mono);
  EXPECT_EQ(mono, (std::vector<int16_t>{0, 200, 32767, -6, 0}));
}

TEST(MixTimeline, LeavesOutWhatComesTooLateOrTooEarly) {
  MixTimeline timeline(kRate);
  const auto now = systemClock().hostTime().value;
  const int64_t frame = timeline.frameAt(now);
  std::vector<int16_t> stereo(2 * kRate);
  timeline.read(static_cast<uint64_t>(now), 2, stereo);
  timeline.add(frame + 10, std::vector<int16_t>(200, 77));  // read already
  timeline.add(frame + 4 * kRate, std::vector<int16_t>(200, 77));
  for (int second = 1; second < 6; ++second) {
    timeline.read(static_cast<uint64_t>(now + second * 1'000'000'000LL), 2, stereo);
    EXPECT_EQ(stereo, std::vector<int16_t>(2 * kRate)) << second;
  }
}

TEST(MixTimeline, ForgetsWhatALongHoldUpSkipped) {
  MixTimeline timeline(kRate);
  const auto now = systemClock().hostTime().value;
  timeline.add(timeline.frameAt(now), std::vector<int16_t>(2 * kRate, 55));
  std::vector<int16_t> mono(kRate);
  for (const int64_t second : {10, 11, 12}) {
    timeline.read(static_cast<uint64_t>(now + second * 1'000'000'000), 1, mono);
    EXPECT_EQ(mono, std::vector<int16_t>(kRate)) << second;
  }
}

TEST(MixTimeline, AwaitsStreamsThatRunAndNoOthers) {
  constexpr std::chrono::milliseconds kStalled(120);
  constexpr std::chrono::hours kLong(1);
  MixTimeline timeline(kRate);
  const auto now = systemClock().hostTime().value + 10'000'000;
  const int64_t frame = timeline.frameAt(now);
  const int steady = 0, stalled = 0, gone = 0;
  timeline.reached(&stalled, frame - kRate / 5);
  timeline.reached(&gone, frame - 100);
  timeline.reached(&steady, frame - 100);
  std::vector<int16_t> mono(100);
  std::thread reader([&] {
    timeline.await(static_cast<uint64_t>(now), kStalled, kLong);
    timeline.read(static_cast<uint64_t>(now), 1, mono);
  });
  timeline.forget(&gone);
  timeline.reached(&steady, frame - 50);
  timeline.add(frame, std::vector<int16_t>(200, 77));
  timeline.reached(&steady, frame);
  reader.join();
  EXPECT_EQ(mono, std::vector<int16_t>(100, 77));
  timeline.reached(&steady, frame - 50);
  timeline.await(static_cast<uint64_t>(now), kStalled, std::chrono::milliseconds(1));  // not for ever
}

}  // namespace
}  // namespace qv::platform
