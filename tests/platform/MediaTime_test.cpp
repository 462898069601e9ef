#include "platform/base/MediaTime.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>

namespace qv::platform {
namespace {

constexpr int64_t kMax = std::numeric_limits<int64_t>::max();

TEST(MediaTimeTest, ConversionRoundsToNearestAndSaturates) {
  EXPECT_EQ(MediaTime::make(1, 2).valueAt(3), 2) << "half away from zero";
  EXPECT_EQ(MediaTime::make(-1, 2).valueAt(3), -2);
  EXPECT_EQ(MediaTime::make(1, 3).valueAt(kHostTimescale), 333333333);
  EXPECT_EQ(MediaTime::make(kMax, 1).valueAt(kHostTimescale), kMax);
  EXPECT_EQ(MediaTime::make(-kMax, 1).valueAt(2), std::numeric_limits<int64_t>::min());
  EXPECT_EQ(MediaTime::invalid().valueAt(10), 0);
  EXPECT_EQ(MediaTime::make(5, 1).valueAt(0), 0);
}

TEST(MediaTimeTest, SecondsThatFitNoTimeAreInfiniteOrInvalid) {
  EXPECT_EQ(MediaTime::fromSeconds(1.5, 600).value, 900);
  EXPECT_TRUE(MediaTime::fromSeconds(1e300, 600).flags & MediaTime::kPositiveInfinity);
  EXPECT_TRUE(MediaTime::fromSeconds(-1e300, 600).flags & MediaTime::kNegativeInfinity);
  EXPECT_FALSE(MediaTime::fromSeconds(std::nan(""), 600).isValid());
  EXPECT_FALSE(MediaTime::fromSeconds(1, 0).isValid());
  EXPECT_EQ(MediaTime::fromSeconds(1e300, 600).seconds(), 0.0);
}

TEST(MediaTimeTest, ComparesAcrossTimescales) {
  EXPECT_EQ(MediaTime::make(1, 3), MediaTime::make(100, 300));
  EXPECT_LT(MediaTime::make(kMax - 1, kHostTimescale), MediaTime::make(kMax, kHostTimescale));
  EXPECT_LT(MediaTime::make(1, kHostTimescale), MediaTime::make(1, 44100));
  EXPECT_LT(MediaTime::invalid(), MediaTime::make(-5, 1));
  EXPECT_LT(MediaTime::make(kMax, 1), MediaTime::fromSeconds(INFINITY, 1));
}

TEST(MediaTimeTest, SumsAreExactWhereAnyTimescaleHoldsThem) {
  const MediaTime sum = MediaTime::make(1, 30) + MediaTime::make(1, 44100);
  EXPECT_EQ(sum.timescale, 44100);
  EXPECT_EQ(sum.value, 1471);
  EXPECT_FALSE(sum.flags & MediaTime::kHasBeenRounded);
  const MediaTime rounded = MediaTime::make(1, 44100) + MediaTime::make(1, kHostTimescale);
  EXPECT_EQ(rounded.timescale, kHostTimescale);
  EXPECT_EQ(rounded.value, 22676 + 1);
  EXPECT_TRUE(rounded.flags & MediaTime::kHasBeenRounded);
  EXPECT_EQ((MediaTime::make(kMax, 1) + MediaTime::make(kMax, 1)).value, kMax);
  EXPECT_FALSE((MediaTime::invalid() + MediaTime::zero()).isValid());
  EXPECT_TRUE((MediaTime::zero() - MediaTime::fromSeconds(INFINITY, 1)).flags & MediaTime::kNegativeInfinity);
}

}  // namespace
}  // namespace qv::platform
